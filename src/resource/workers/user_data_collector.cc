// "userdata-collector": what the system's tool that gathers a user's data needs of a
// package: configuration files, and in the older form also a collector program.
#include <errno.h>
#include <sys/stat.h>
#include <unistd.h>

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
const char kConfDir[] = "/usr/corv/etc/user.data.conf";
const char kBinDir[] = "/usr/corv/bin/user.data.collector";

void makeSureOf(const char* dir) {
    if (access(dir, F_OK) != 0) {
        CORV_LOG_ERR("File is not exist %s, %m", dir);
        mkdir(dir, 0755);
    }
}

// The old form: one configuration file and one collector program from "dir".
int acquireSingle(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                  Json::Value& own) {
    if (!request["dir"].isString() || !request["conf"].isString() || !request["bin"].isString()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 1;
    }
    const std::string dir = request["dir"].asString();
    const struct {
        const char* key;
        const char* target;
        bool program;
    } parts[] = {{"conf", kConfDir, false}, {"bin", kBinDir, true}};
    for (const auto& part : parts) {
        makeSureOf(part.target);
        const std::string name = request[part.key].asString();
        std::string source;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), dir + "/" + name, source)) {
            CORV_LOG_ERR("path is not legal %s %s, %m", action.GetRootDir().c_str(), name.c_str());
            return 1;
        }
        // Published under its base name only, so that a name can't climb out.
        const std::string destination = std::string(part.target) + "/" + WorkerLastPart(name);
        const bool ok = part.program
                            ? CORV::PkgUtils::InstallExecutable(source, destination, true)
                            : CORV::PkgUtils::InstallConfigFile(source, destination, 0644, true);
        if (WorkerLastPart(name).empty() || !ok) {
            CORV_LOG_ERR("path is not legal %s %s, %m", action.GetRootDir().c_str(), name.c_str());
            return 1;
        }
        own[part.key] = name;
    }
    return 0;
}

int acquireConfigs(const CORV::PkgUtils::ActionInfo& action, const Json::Value& configs,
                   Json::Value& own) {
    if (!configs.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 1;
    }
    makeSureOf(kConfDir);
    own[kConfigs] = Json::Value(Json::arrayValue);
    for (const Json::Value& config : configs) {
        if (!config.isObject() || !config["relpath"].isString()) {
            continue;
        }
        std::string source;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), config["relpath"].asString(),
                                            source) ||
            WorkerBaseName(source).empty()) {
            CORV_LOG_ERR("Illegal path %s, ignore it [0x%04X %s:%d]", config["relpath"].asCString(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            continue;
        }
        const std::string name = action.GetPkgName() + "-" + WorkerBaseName(source);
        const std::string destination = std::string(kConfDir) + "/" + name;
        if (!CORV::PkgUtils::InstallConfigFile(source, destination, 0644, true)) {
            CORV_LOG_ERR("Failed to install %s [0x%04X %s:%d]", destination.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        own[kConfigs].append(name);
    }
    return 0;
}

class UserDataCollector : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject()) {
            return 1;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        if (request.isMember(kConfigs)) {
            return acquireConfigs(action, request[kConfigs], own);
        }
        return acquireSingle(action, request, own);
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!own.isObject()) {
            return 0;
        }
        if (own.isMember(kConfigs)) {
            if (!own[kConfigs].isArray()) {
                VLIBCErrSet(ERR_MALFORMED);
                return 1;
            }
            WorkerUnlinkAll(kConfDir, own[kConfigs]);
            own.removeMember(kConfigs);
            return 0;
        }
        const Json::Value& held = own;
        for (const auto& [key, dir] :
             {std::make_pair("conf", kConfDir), std::make_pair("bin", kBinDir)}) {
            if (!held.isMember(key) || !held[key].isString()) {
                continue;
            }
            const std::string name = WorkerLastPart(held[key].asString());
            if (name.empty() || name == "..") {
                CORV_LOG_ERR("path is not legal %s %s, %m", dir, held[key].asCString());
                return 1;
            }
            const std::string path = std::string(dir) + "/" + name;
            if (unlink(path.c_str()) != 0 && errno != ENOENT) {
                CORV_LOG_ERR("Failed to unlink %s, %m", path.c_str());
            }
        }
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewUserDataCollector() {
    return new (std::nothrow) UserDataCollector();
}

}  // namespace Resource
}  // namespace CORVPackageTool
