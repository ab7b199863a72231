// Built-in backends and worker proxies: the library's side of the worker contract.
#include <memory>
#include <string>
#include <utility>

#include "corv/vlibc.h"
#include "corvpkg/worker.h"

namespace CORVPackageTool {
namespace Resource {

const char* TimingWord(unsigned int timing) {
    switch (timing) {
        case TIMING_PREINST:
            return "preinst";
        case TIMING_POSTINST:
            return "postinst";
        case TIMING_ENABLE:
            return "enable";
        case TIMING_STARTUP:
            return "startup";
        case TIMING_PREUNINST:
            return "preuninst";
        case TIMING_POSTUNINST:
            return "postuninst";
        case TIMING_DISABLE:
            return "disable";
        case TIMING_HALT:
            return "halt";
        default:
            return "";
    }
}

IBackend::~IBackend() = default;

class BuiltinBackendPrivate {
  public:
    explicit BuiltinBackendPrivate(WorkerFactory f) : factory(f) {}
    WorkerFactory factory;
};

BuiltinBackend::BuiltinBackend(WorkerFactory factory)
    : d(std::make_shared<BuiltinBackendPrivate>(factory)) {}

BuiltinBackend::~BuiltinBackend() = default;

bool BuiltinBackend::IsReady() const {
    return d->factory != nullptr;
}

std::shared_ptr<CORV::PkgUtils::IWorker> BuiltinBackend::CreateWorker() const {
    if (!IsReady()) {
        return std::shared_ptr<CORV::PkgUtils::IWorker>();
    }
    CORV::PkgUtils::IWorker* worker = d->factory();
    if (worker == nullptr) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return std::shared_ptr<CORV::PkgUtils::IWorker>();
    }
    return std::shared_ptr<CORV::PkgUtils::IWorker>(worker);
}

class WorkerProxyPrivate {
  public:
    explicit WorkerProxyPrivate(IBackend* b) : provider("NOS"), interval(0), backend(b) {}
    std::string resourceId;
    std::string provider;
    INTERVAL interval;
    std::shared_ptr<IBackend> backend;
};

WorkerProxy::WorkerProxy(IBackend* backend) : d(new WorkerProxyPrivate(backend)) {}

WorkerProxy::~WorkerProxy() = default;

const std::string& WorkerProxy::GetResourceID() const {
    return d->resourceId;
}
void WorkerProxy::SetResourceID(const std::string& id) {
    d->resourceId = id;
}
INTERVAL WorkerProxy::GetInterval() const {
    return d->interval;
}
void WorkerProxy::SetInterval(INTERVAL interval) {
    d->interval = interval;
}
const std::string& WorkerProxy::GetProvider() const {
    return d->provider;
}
void WorkerProxy::SetProvider(const std::string& provider) {
    d->provider = provider;
}

std::shared_ptr<CORV::PkgUtils::IWorker> WorkerProxy::CreateInstance() const {
    if (!d->backend) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return std::shared_ptr<CORV::PkgUtils::IWorker>();
    }
    return d->backend->CreateWorker();
}

}  // namespace Resource
}  // namespace CORVPackageTool
