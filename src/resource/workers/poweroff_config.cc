// "poweroff-config": the package's power-off checks, published in the "poweroff" type's
// directory of the feasibility checker while the package runs. Each check file names its
// program, which must lie inside the package.
#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"
#include "resource/workers/worker_files.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kConfigs[] = "configs";
const char kDir[] = "/usr/local/share/feasibilitycheck/poweroff.d/";

// The check file's path when it is acceptable; false with the error set otherwise.
bool validate(const std::string& root, const std::string& relpath, std::string& source) {
    if (!CORV::PkgUtils::ResolveRelPath(root, relpath, source)) {
        return false;
    }
    Json::Value check;
    if (!fromFile(source, check)) {
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    if (!check.isObject() || !check["plugin"].isString()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    const std::string plugin = check["plugin"].asString();
    if (plugin.compare(0, root.size() + 1, root + "/") != 0) {
        VLIBCErrSet(ERR_OUTSIDE_PACKAGE);
        return false;
    }
    if (!CORV::PkgUtils::IsLegalRelPath(root, plugin.substr(root.size() + 1))) {
        return false;
    }
    const std::string base = WorkerBaseName(source);
    if (base.size() < 5 || base.compare(base.size() - 4, 4, ".cfg") != 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    return true;
}

class PowerOffConfig : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value configs = WorkerArrayOf(request, kConfigs);
        if (!configs.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        if (CORVFSMkdirP(kDir, nullptr, 1, 0, 0, 0755) < 0) {
            CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", kDir, VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        own[kConfigs] = Json::Value(Json::arrayValue);
        for (const Json::Value& config : configs) {
            if (!config.isObject() || !config["relpath"].isString()) {
                continue;
            }
            std::string source;
            if (!validate(action.GetRootDir(), config["relpath"].asString(), source)) {
                CORV_LOG_ERR("Illegal config %s, ignore it [0x%04X %s:%d]",
                             config["relpath"].asCString(), VLIBCErrGet(), VLIBCErrorGetFile(),
                             VLIBCErrorGetLine());
                continue;
            }
            const std::string name = action.GetPkgName() + "-" + WorkerBaseName(source);
            if (!CORV::PkgUtils::InstallConfigFile(source, kDir + name, 0644, true)) {
                CORV_LOG_ERR("Failed to install %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                             VLIBCErrorGetFile(), VLIBCErrorGetLine());
                return 1;
            }
            own[kConfigs].append(name);
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        return WorkerReleaseListed(own, kConfigs, kDir);
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewPowerOffConfig() {
    return new (std::nothrow) PowerOffConfig();
}

}  // namespace Resource
}  // namespace CORVPackageTool
