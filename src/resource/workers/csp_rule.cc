// "csp-rule": the package's content-security rules, handed to the platform, which sends
// them as the header of the package's portal while the package is enabled.
#include <new>
#include <string>

#include "corv/csp_rule.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kConfKey[] = "conf";

class CspRule : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string conf = request.isObject() && request[kConfKey].isString()
                                     ? request[kConfKey].asString()
                                     : std::string();
        CORV::NOS::CspRule rule(action.GetPkgName(), 1);
        if (conf.empty()) {
            CORV_LOG_ERR("no config real path defined");
            VLIBCErrSet(ERR_KEY_NOT_FOUND);
            return 1;
        }
        // The rules reach the web server's configuration: they must be the package's own.
        if (!CORV::PkgUtils::IsLegalRelPath(action.GetRootDir(), conf)) {
            CORV_LOG_ERR("Illegal path [%s].", conf.c_str());
            return 1;
        }
        const std::string path = action.GetRootDir() + "/" + conf;
        if (VLIBCFileExist(path.c_str()) != 1) {
            CORV_LOG_ERR("config file %s not exist", path.c_str());
            VLIBCErrSet(ERR_KEY_NOT_FOUND);
            return 1;
        }
        Json::Value rules;
        if (!fromFile(path, rules) || !rules.isObject()) {
            CORV_LOG_ERR("config file %s json format error", path.c_str());
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        return rule.Save(rules) ? 0 : 1;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        CORV::NOS::CspRule(action.GetPkgName(), 1).Delete();
        return 0;
    }
    bool IsUpdatable() override { return true; }
    bool Update(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Acquire(action, request, own, resp) == 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewCspRule() {
    return new (std::nothrow) CspRule();
}

}  // namespace Resource
}  // namespace CORVPackageTool
