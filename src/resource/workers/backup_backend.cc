// "backup-backend": the package's backup-application configuration, published in
// /usr/local/share/corvbackup while the package runs.
#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"
#include "resource/workers/worker_files.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kConfigs[] = "configs";
const char kDir[] = "/usr/local/share/corvbackup";

bool endsWith(const std::string& text, const std::string& tail) {
    return text.size() >= tail.size() &&
           text.compare(text.size() - tail.size(), tail.size(), tail) == 0;
}

class BackupBackend : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value configs = WorkerArrayOf(request, kConfigs);
        if (!configs.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        if (configs.empty()) {
            return 0;
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
            if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), config["relpath"].asString(),
                                                source) ||
                !endsWith(WorkerBaseName(source), ".conf")) {
                CORV_LOG_ERR("Illegal path %s, ignore it [0x%04X %s:%d]",
                             config["relpath"].asCString(), VLIBCErrGet(), VLIBCErrorGetFile(),
                             VLIBCErrorGetLine());
                continue;
            }
            const std::string name = action.GetPkgName() + "-" + WorkerBaseName(source);
            const std::string destination = std::string(kDir) + "/" + name;
            if (!CORV::PkgUtils::InstallConfigFile(source, destination, 0644, true)) {
                CORV_LOG_ERR("Failed to install %s [0x%04X %s:%d]", destination.c_str(),
                             VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
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

CORV::PkgUtils::IWorker* NewBackupBackend() {
    return new (std::nothrow) BackupBackend();
}

}  // namespace Resource
}  // namespace CORVPackageTool
