// "corvcrond": the package's scheduled jobs, handed to the platform's scheduler.
#include <new>
#include <string>

#include "corv/corvcrond.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

class CorvCrond : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string conf = request.isObject() && request["conf"].isString()
                                     ? request["conf"].asString()
                                     : std::string();
        CORV::CORVCrond::ConfigManager manager(action.GetPkgName(), 1);
        if (conf.empty()) {
            CORV_LOG_ERR("no config real path defined");
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        const std::string path = action.GetRootDir() + "/" + conf;
        if (VLIBCFileExist(path.c_str()) != 1) {
            CORV_LOG_ERR("config file %s not exist", path.c_str());
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        Json::Value jobs;
        if (!fromFile(path, jobs) || !jobs.isArray()) {
            CORV_LOG_ERR("config file %s json format error", path.c_str());
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        if (!action.GetPkgUserName().empty()) {
            CORV::CORVCrond::ConfigManager::ReplacePkgUserName(jobs, action.GetPkgUserName());
        }
        if (!manager.Save(jobs)) {
            CORV_LOG_ERR("config file %s job format error", path.c_str());
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!CORV::CORVCrond::ConfigManager(action.GetPkgName(), 1).Remove()) {
            CORV_LOG_ERR("config file remove failed");
        }
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewCorvCrond() {
    return new (std::nothrow) CorvCrond();
}

}  // namespace Resource
}  // namespace CORVPackageTool
