// "certificate-config": the package's services registered with the system's certificate
// tools, and the package's reloader, which those tools run when a certificate changes.
#include <errno.h>
#include <unistd.h>

#include <new>
#include <string>

#include "corv/certificate.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kRegister[] = "/usr/corv/bin/corvcrtregister";
const char kUnregister[] = "/usr/corv/bin/corvcrtunregister";
const char kReloaderKey[] = "reloader-relpath";
const char kServicesKey[] = "services";
const char* const kServiceStrings[] = {"display_name", "display_name_i18n", "service"};

std::string ReloaderPath(const std::string& pkg) {
    return std::string(CORV_CERT_PKG_RELOADER_DIR) + "/" + pkg;
}

std::string ConfigPath(const std::string& pkg) {
    return std::string(CORV_CERT_PKG_CONF_DIR) + "/" + pkg + ".cfg";
}

bool IsServiceEntry(const Json::Value& entry) {
    if (!entry.isObject()) {
        return false;
    }
    for (const char* key : kServiceStrings) {
        if (!entry[key].isString()) {
            return false;
        }
    }
    return true;
}

void UnlinkLogged(const std::string& path) {
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
    }
}

class CertConfig : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!InstallReloader(action, request)) {
            CORV_LOG_ERR("Failed to install reloader %s [0x%04X %s:%d]",
                         ReloaderPath(action.GetPkgName()).c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        Json::Value config(Json::objectValue);
        config[kServicesKey] = request.isObject()
                                   ? request.get(kServicesKey, Json::Value(Json::arrayValue))
                                   : Json::Value(Json::arrayValue);
        if (!config[kServicesKey].isArray()) {
            CORV_LOG_ERR("Bad services format");
            return 1;
        }
        if (config[kServicesKey].empty()) {
            CORV_LOG_ERR("Empty list, skip installing certificate");
            return 0;
        }
        for (const Json::Value& entry : config[kServicesKey]) {
            if (!IsServiceEntry(entry)) {
                VLIBCErrSet(ERR_MALFORMED);
                CORV_LOG_ERR("Bad service config for %s", action.GetPkgName().c_str());
                return 1;
            }
        }
        const std::string& user = action.GetPkgUserName();
        config["owner"] = user.empty() ? "root" : user;
        config["isPkg"] = true;
        if (!WriteConfig(action.GetPkgName(), config)) {
            CORV_LOG_ERR("Failed to install config [0x%04X %s:%d]", VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        if (VLIBCExecl(kRegister, 0xbb, action.GetPkgName().c_str(), nullptr) != 0) {
            CORV_LOG_ERR("Failed to register certificate for %s", action.GetPkgName().c_str());
            return 1;
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    // An upgrade keeps the registration; the files come anew with the next Acquire.
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string& pkg = action.GetPkgName();
        if (action.GetActionType() != 2 &&
            VLIBCExecl(kUnregister, 0xbb, pkg.c_str(), nullptr) != 0) {
            CORV_LOG_ERR("Failed to unregister certificate for %s", pkg.c_str());
            VLIBCErrSet(ERR_UNLINK_FAILED);
        }
        UnlinkLogged(ConfigPath(pkg));
        UnlinkLogged(ReloaderPath(pkg));
        return 0;
    }

  private:
    static bool InstallReloader(const CORV::PkgUtils::ActionInfo& action,
                                const Json::Value& request) {
        if (!request.isObject() || !request[kReloaderKey].isString()) {
            CORV_LOG_ERR("No reloader, skip reloader installation");
            return true;
        }
        std::string source;
        return CORVFSMkdirP(CORV_CERT_PKG_RELOADER_DIR, nullptr, 1, -1, -1, 0755) == 0 &&
               CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), request[kReloaderKey].asString(),
                                              source) &&
               CORV::PkgUtils::InstallExecutable(source, ReloaderPath(action.GetPkgName()), true);
    }
    static bool WriteConfig(const std::string& pkg, const Json::Value& config) {
        if (CORVFSMkdirP(CORV_CERT_PKG_CONF_DIR, nullptr, 1, -1, -1, 0777) != 0) {
            CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", CORV_CERT_PKG_CONF_DIR,
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
        if (!toFile(config, ConfigPath(pkg))) {
            VLIBCErrSet(ERR_WRITE_FAILED);
            return false;
        }
        return true;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewCertConfig() {
    return new (std::nothrow) CertConfig();
}

}  // namespace Resource
}  // namespace CORVPackageTool
