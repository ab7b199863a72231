// "service-cfg": a package's own upstart jobs, its job adapter and its service file.
#include <new>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/resource.h"
#include "corvpkg/service.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

// `fresh` rewrites what is there; a restore keeps files that are still valid.
bool Publish(const std::string& pkg, const Json::Value& request, Json::Value& own, bool fresh) {
    std::vector<std::string> jobs;
    if (!Service::EnumAvailableJobs(pkg, jobs) || !Service::InstallJobs(pkg, jobs, fresh)) {
        return false;
    }
    own["jobs"] = Json::Value(Json::arrayValue);
    for (const std::string& job : jobs) {
        own["jobs"].append(job);
    }
    return Service::GenJobAdapter(pkg, request, fresh) &&
           Service::GenServiceCfg(pkg, request, fresh);
}

class ServiceCfg : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        return Publish(action.GetPkgName(), request, own, true) ? 0 : 1;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value jobs =
            own.isObject() && own.isMember("jobs") ? own["jobs"] : Json::Value(Json::arrayValue);
        if (!jobs.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        std::vector<std::string> names;
        for (const Json::Value& job : jobs) {
            if (job.isString()) {
                names.push_back(job.asString());
            }
        }
        Service::UnlinkAllJobs(action.GetPkgName(), names);
        Service::UnlinkServiceCfg(action.GetPkgName());
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewServiceCfg() {
    return new (std::nothrow) ServiceCfg();
}

bool RestoreServiceCfg(const std::string& pkg) {
    if (pkg.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    Json::Value request(Json::objectValue);
    if (!GetRequestObject(pkg, "service-cfg", request)) {
        const int err = VLIBCErrGet();
        if (err != ERR_NO_SUCH_FILE && err != 0x2000) {
            return false;
        }
        request = Json::Value(Json::objectValue);
    }
    Json::Value own(Json::objectValue);
    return Publish(pkg, request, own, false) && ReplaceOwnObject(pkg, "service-cfg", own);
}

}  // namespace Resource
}  // namespace CORVPackageTool
