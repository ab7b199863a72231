// Orchestration of one phase: read a package's request file and own-file, pick the
// workers of the phase, run them in order and write down what they did.
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "resource/resource_private.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

typedef std::shared_ptr<CORV::PkgUtils::IWorker> WorkerPtr;
typedef std::vector<std::shared_ptr<WorkerProxy>> ProxyList;

const char* outcome(int status) {
    return status == 1 ? "fail" : "done";
}

CORV::PkgUtils::ActionInfo makeAction(const std::string& pkg, unsigned int type,
                                      const std::string& dir) {
    CORV::PkgUtils::ActionInfo action;
    action.SetPkgName(pkg);
    action.SetPkgUserName(Privilege::GetUserName(pkg, dir));
    action.SetActionType(type);
    action.SetRootDir(dir.empty() ? "/var/packages/" + pkg + "/target" : dir + "/package");
    return action;
}

// Reads a file that, when present, must hold a JSON object. `missing` tells a file that
// isn't there (0x0700 in the slot) from one that can't be used.
bool readObjectFile(const std::string& path, Json::Value& out, bool& missing) {
    missing = false;
    out = Json::Value(Json::objectValue);
    if (!ReadJsonFile(path, out)) {
        missing = VLIBCErrGet() == ERR_NO_SUCH_FILE;
        out = Json::Value(Json::objectValue);
        return false;
    }
    if (!out.isObject()) {
        CORV_LOG_ERR("%s is not a JSON object", path.c_str());
        VLIBCErrSet(ERR_MALFORMED);
        out = Json::Value(Json::objectValue);
        return false;
    }
    return true;
}

bool substitute(const Json::Value* variables, Json::Value& request) {
    const Json::Value none(Json::objectValue);
    return Util::ReplaceVariables(variables != nullptr ? *variables : none, request);
}

bool writeOwn(const std::string& path, const Json::Value& own) {
    return WriteJsonFile(path, own);
}

}  // namespace

bool AcquireWith(const CatalogueSource& source, TIMING timing, const PackageInfo& info,
                 PKG_INSTALLATION_TYPE type, CORV::PkgUtils::WorkerResp& resp,
                 const Json::Value* variables, const std::string& dir) {
    const std::string& pkg = info.package;
    const std::string requestPath = RequestFilePath(pkg, dir);
    const std::string ownPath = OwnFilePath(pkg, dir);
    const CORV::PkgUtils::ActionInfo action = makeAction(pkg, type, dir);

    Json::Value request;
    Json::Value own;
    bool missing = false;
    if (!readObjectFile(requestPath, request, missing)) {
        return missing;  // a package without resources
    }
    if (!substitute(variables, request)) {
        return false;
    }
    if (!readObjectFile(ownPath, own, missing) && !missing) {
        return false;
    }

    // Declared before the workers, so that the workers go first: a plug-in's proxy keeps
    // the code of its workers loaded.
    ProxyList proxies;
    if (!FindRunnableWorkersIn(source, timing, proxies)) {
        CORV_LOG_ERR("Failed to find runnable workers [0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    std::vector<std::pair<std::string, WorkerPtr>> created;
    bool result = true;
    for (const std::shared_ptr<WorkerProxy>& proxy : proxies) {
        const std::string& id = proxy->GetResourceID();
        if (!request.isMember(id) || !request[id].isObject()) {
            continue;
        }
        WorkerPtr worker = proxy->CreateInstance();
        if (!worker) {
            CORV_LOG_ERR("Failed to create worker for %s, ignore it [0x%04X %s:%d]", id.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            continue;
        }
        // Listed before the call: a worker that fails is rolled back too.
        created.emplace_back(id, worker);
        if (!own.isMember(id)) {
            own[id] = Json::Value(Json::objectValue);
        }
        int status = worker->Acquire(action, request[id], own[id], resp);
        CORV_LOG_ERR("Acquire %s for %s when 0x%04x (%s)", id.c_str(), pkg.c_str(),
                     static_cast<unsigned int>(type), outcome(status));
        if (status != 1) {
            continue;
        }
        result = false;
        // After installation the package stands registered; a resource that can't be had
        // is recorded, and the rest still gets its chance.
        if (timing == TIMING_POSTINST) {
            continue;
        }
        for (auto done = created.rbegin(); done != created.rend(); ++done) {
            const std::string& doneId = done->first;
            int undone = done->second->Rollback(action, request[doneId], own[doneId], resp);
            CORV_LOG_ERR("Rollback %s for %s when 0x%04x (%s)", doneId.c_str(), pkg.c_str(),
                         static_cast<unsigned int>(type), outcome(undone));
        }
        break;
    }
    if (!writeOwn(ownPath, own)) {
        result = false;
    }
    created.clear();  // workers before their proxies
    return result;
}

bool ReleaseWith(const CatalogueSource& source, TIMING timing, const PackageInfo& info,
                 PKG_INSTALLATION_TYPE type, CORV::PkgUtils::WorkerResp& resp,
                 const Json::Value* variables, const std::string& dir) {
    const std::string& pkg = info.package;
    const std::string requestPath = RequestFilePath(pkg, dir);
    const std::string ownPath = OwnFilePath(pkg, dir);
    const CORV::PkgUtils::ActionInfo action = makeAction(pkg, type, dir);

    Json::Value request;
    Json::Value own;
    bool missing = false;
    if (!readObjectFile(requestPath, request, missing) && !missing) {
        return false;
    }
    if (!substitute(variables, request)) {
        return false;
    }
    if (!readObjectFile(ownPath, own, missing)) {
        return missing;  // nothing was ever acquired
    }

    ProxyList proxies;
    if (!FindRunnableWorkersIn(source, timing, proxies)) {
        CORV_LOG_ERR("Failed to find runnable workers [0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    const Json::Value absent;
    bool result = true;
    for (auto proxy = proxies.rbegin(); proxy != proxies.rend(); ++proxy) {
        const std::string& id = (*proxy)->GetResourceID();
        // What wasn't acquired isn't released, whatever the request says now.
        if (!own.isMember(id)) {
            continue;
        }
        WorkerPtr worker = (*proxy)->CreateInstance();
        if (!worker) {
            CORV_LOG_ERR("Failed to create worker for %s, ignore it [0x%04X %s:%d]", id.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            continue;
        }
        const Json::Value& section = request.isMember(id) ? request[id] : absent;
        int status = worker->Release(action, section, own[id], resp);
        CORV_LOG_ERR("Release %s for %s when 0x%04x (%s)", id.c_str(), pkg.c_str(),
                     static_cast<unsigned int>(type), outcome(status));
        if (status == 1) {
            result = false;  // best effort: the others still run
        }
    }
    if (!writeOwn(ownPath, own)) {
        result = false;
    }
    return result;
}

bool UpdateWith(const CatalogueSource& source, const PackageInfo& info, const std::string& id,
                const Json::Value& args, CORV::PkgUtils::WorkerResp& resp) {
    const std::string& pkg = info.package;
    const std::string requestPath = RequestFilePath(pkg, "");
    const std::string ownPath = OwnFilePath(pkg, "");

    std::unique_ptr<WorkerProxy> proxy(FindRunnableWorkerIn(source, id));
    if (!proxy) {
        CORV_LOG_ERR("Failed to find runnable worker for %s [0x%04X %s:%d]", id.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    const CORV::PkgUtils::ActionInfo action = makeAction(pkg, PKG_UPGRADE, "");
    WorkerPtr worker = proxy->CreateInstance();
    if (!worker) {
        CORV_LOG_ERR("Failed to create worker for %s [0x%04X %s:%d]", id.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    // Decided before anything is read: a worker that can't update never sees a request.
    if (!worker->IsUpdatable()) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return false;
    }

    Json::Value request;
    Json::Value own;
    bool missing = false;
    if (!readObjectFile(requestPath, request, missing)) {
        return missing;
    }
    if (!request.isMember(id)) {
        return true;
    }
    if (!substitute(nullptr, request)) {
        return false;
    }
    if (!readObjectFile(ownPath, own, missing) && !missing) {
        return false;
    }
    // A section of another type is passed over, as in Acquire. One that substitution
    // emptied away still takes the arguments.
    if (request.isMember(id) && !request[id].isObject()) {
        return true;
    }
    if (!own.isMember(id)) {
        own[id] = Json::Value(Json::objectValue);
    }
    request[id]["@helper-args"] = args;
    CORV_LOG_ERR("Update %s for %s", id.c_str(), pkg.c_str());
    if (!worker->Update(action, request[id], own[id], resp)) {
        return false;
    }
    return writeOwn(ownPath, own);
}

bool Acquire(TIMING timing, const PackageInfo& info, PKG_INSTALLATION_TYPE type,
             CORV::PkgUtils::WorkerResp& resp, const Json::Value* variables,
             const std::string& dir) {
    return AcquireWith(DefaultCatalogue(), timing, info, type, resp, variables, dir);
}

bool Release(TIMING timing, const PackageInfo& info, PKG_INSTALLATION_TYPE type,
             CORV::PkgUtils::WorkerResp& resp, const Json::Value* variables,
             const std::string& dir) {
    return ReleaseWith(DefaultCatalogue(), timing, info, type, resp, variables, dir);
}

bool Update(const PackageInfo& info, const std::string& id, const Json::Value& args,
            CORV::PkgUtils::WorkerResp& resp) {
    return UpdateWith(DefaultCatalogue(), info, id, args, resp);
}

}  // namespace Resource
}  // namespace CORVPackageTool
