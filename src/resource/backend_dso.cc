// Plug-in workers: a shared object that another package provides, opened with dlopen.
#include <dlfcn.h>

#include <memory>
#include <string>

#include "corv/vlibc.h"
#include "corvpkg/worker.h"
#include "resource/resource_private.h"

namespace CORVPackageTool {
namespace Resource {

namespace {
constexpr const char kInitSymbol[] = "CORVPkgUtilsPluginWorkerInit";
constexpr const char kFreeSymbol[] = "CORVPkgUtilsPluginWorkerFree";
}  // namespace

using CORV::PkgUtils::PluginWorkerFree;
using CORV::PkgUtils::PluginWorkerInit;

// Owns the dlopen handle: it is closed when the last holder of the backend goes.
class DSOBackendPrivate {
  public:
    explicit DSOBackendPrivate(const std::string& p) : path(p) {}
    ~DSOBackendPrivate() {
        if (handle != nullptr) {
            dlclose(handle);
        }
    }
    DSOBackendPrivate(const DSOBackendPrivate&) = delete;
    DSOBackendPrivate& operator=(const DSOBackendPrivate&) = delete;

    std::string path;
    void* handle = nullptr;
    PluginWorkerInit init = nullptr;
    PluginWorkerFree free = nullptr;
};

namespace {

// The address of `name` in `handle`, or null with the error set when dlsym reports one.
void* lookUp(void* handle, const char* name) {
    dlerror();
    void* symbol = dlsym(handle, name);
    if (dlerror() != nullptr) {
        VLIBCErrSet(kErrMissingMember);
        return nullptr;
    }
    return symbol;
}

}  // namespace

DSOBackend::DSOBackend(const std::string& path) : d(std::make_shared<DSOBackendPrivate>(path)) {
    if (path.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return;
    }
    // NODELETE: a plug-in's code may still be referenced (a worker's vtable, a static
    // destructor) after the last handle goes, so it is never unmapped.
    d->handle = dlopen(path.c_str(), RTLD_LAZY | RTLD_NODELETE);
    if (d->handle == nullptr) {
        VLIBCErrSet(ERR_OPEN_FAILED);
        return;
    }
    void* init = lookUp(d->handle, kInitSymbol);
    if (init == nullptr) {
        return;
    }
    void* free = lookUp(d->handle, kFreeSymbol);
    if (free == nullptr) {
        return;
    }
    d->init = reinterpret_cast<PluginWorkerInit>(init);
    d->free = reinterpret_cast<PluginWorkerFree>(free);
}

DSOBackend::~DSOBackend() = default;

bool DSOBackend::IsReady() const {
    return d->init != nullptr && d->free != nullptr;
}

const std::string& DSOBackend::GetPath() const {
    return d->path;
}

std::shared_ptr<CORV::PkgUtils::IWorker> DSOBackend::CreateWorker() const {
    if (!IsReady()) {
        return std::shared_ptr<CORV::PkgUtils::IWorker>();
    }
    CORV::PkgUtils::IWorker* worker = d->init();
    if (worker == nullptr) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return std::shared_ptr<CORV::PkgUtils::IWorker>();
    }
    // The object is destroyed by the code that allocated it.
    return std::shared_ptr<CORV::PkgUtils::IWorker>(worker, d->free);
}

}  // namespace Resource
}  // namespace CORVPackageTool
