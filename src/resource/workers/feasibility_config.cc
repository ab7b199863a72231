// "feasibility-config": per check, a plug-in program and a small config file in the
// directories of the check's type, which the platform's feasibility checker runs.
#include <sys/stat.h>
#include <syslog.h>

#include <new>
#include <string>

#include "corv/feasibility.h"
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
const char kInstalledCfg[] = "installed-cfg";
const char kInstalledPlugin[] = "installed-plugin";
constexpr int kPathSize = 4096;

bool listed(const Json::Value& list, const std::string& path) {
    for (const Json::Value& item : list) {
        if (item.isString() && item.asString() == path) {
            return true;
        }
    }
    return false;
}

bool wellFormed(const Json::Value& c) {
    return c.isObject() && c["check-type"].isString() && c["name"].isString() &&
           c["task"].isString() && c["type"].isString() && c["version"].isInt() &&
           c["plugin-relpath"].isString() &&
           WorkerLastPart(c["name"].asString()) == c["name"].asString() &&
           !c["name"].asString().empty() && c["name"].asString() != "..";
}

bool writeConfig(const std::string& cfgDir, const std::string& path, const Json::Value& c,
                 const std::string& plugin) {
    if (CORVFSMkdirP(cfgDir.c_str(), nullptr, 1, 0, 0, 0755) < 0) {
        CORV_LOG_ERR("Failed to create [%s] [0x%04X %s:%d]", cfgDir.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    Json::Value config(Json::objectValue);
    config["task"] = c["task"];
    config["type"] = c["type"];
    config["version"] = c["version"];
    config["plugin"] = plugin;
    if (c["task_i18n"].isString()) {
        config["task_i18n"] = c["task_i18n"];
    }
    if (!toFile(config, path)) {
        CORV_LOG_ERR("Failed to install plugin [%s] (%m)", path.c_str());
        VLIBCErrSet(ERR_WRITE_FAILED);
        return false;
    }
    if (chmod(path.c_str(), 0644) != 0) {
        CORV_LOG_ERR("chmod error: %m");
    }
    return true;
}

// One check; 1 when the worker must fail, else 0 (a bad element is passed over).
int installCheck(const CORV::PkgUtils::ActionInfo& action, const Json::Value& c, Json::Value& own) {
    char cfgDir[kPathSize] = "";
    if (CORVFeasibilityCheckTypeValidate(c["check-type"].asCString(), 2, cfgDir, sizeof(cfgDir)) !=
        0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        CORV_LOG_ERR("Illegal config type [%s], ignore it", c["check-type"].asCString());
        return 0;
    }
    std::string pluginDir = cfgDir;
    const size_t share = pluginDir.find("share");
    if (share == std::string::npos) {
        CORV_LOG_ERR("Fail to get plugin dir with config [%s]", cfgDir);
        return 1;
    }
    pluginDir.replace(share, 5, "bin");
    std::string source;
    if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), c["plugin-relpath"].asString(),
                                        source) ||
        WorkerBaseName(source).empty()) {
        CORV_LOG_ERR("Illegal plugin [%s], ignore it [0x%04X %s:%d]",
                     c["plugin-relpath"].asCString(), VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return 0;
    }
    const std::string plugin = pluginDir + "/" + action.GetPkgName() + "-" + WorkerBaseName(source);
    if (!listed(own[kInstalledPlugin], plugin)) {
        if (CORVFSMkdirP(pluginDir.c_str(), nullptr, 1, 0, 0, 0755) < 0) {
            CORV_LOG_ERR("Failed to create [%s] [0x%04X %s:%d]", pluginDir.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        if (!CORV::PkgUtils::InstallExecutable(source, plugin, true)) {
            CORV_LOG_ERR("Failed to install [%s] [0x%04X %s:%d]", plugin.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        own[kInstalledPlugin].append(plugin);
    }
    const std::string path =
        std::string(cfgDir) + "/" + action.GetPkgName() + "-" + c["name"].asString() + ".cfg";
    if (listed(own[kInstalledCfg], path)) {
        return 0;
    }
    if (!writeConfig(cfgDir, path, c, plugin)) {
        CORV_LOG_ERR("Failed to install feasibility check config [%s] [0x%04X %s:%d]", path.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return 1;
    }
    own[kInstalledCfg].append(path);
    return 0;
}

class FeasibilityConfig : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value configs = WorkerArrayOf(request, kConfigs);
        if (!configs.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        for (const char* key : {kInstalledCfg, kInstalledPlugin}) {
            if (!own[key].isArray()) {
                own[key] = Json::Value(Json::arrayValue);
            }
        }
        for (const Json::Value& c : configs) {
            if (wellFormed(c) && installCheck(action, c, own) != 0) {
                return 1;
            }
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value cfgs = WorkerArrayOf(own, kInstalledCfg);
        const Json::Value plugins = WorkerArrayOf(own, kInstalledPlugin);
        if (!cfgs.isArray() || !plugins.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        const std::string tag = "/" + action.GetPkgName() + "-";
        for (const Json::Value* list : {&cfgs, &plugins}) {
            for (const Json::Value& path : *list) {
                // Only what this worker published: a file named after the package.
                if (!path.isString() || path.asString().find(tag) == std::string::npos ||
                    path.asString().find("..") != std::string::npos) {
                    continue;
                }
                const std::string text = path.asString();
                const size_t slash = text.rfind('/');
                Json::Value one(Json::arrayValue);
                one.append(text.substr(slash + 1));
                WorkerUnlinkAll(text.substr(0, slash), one);
            }
        }
        own.removeMember(kInstalledCfg);
        own.removeMember(kInstalledPlugin);
        return 0;
    }
    bool IsUpdatable() override { return true; }
    bool Update(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Acquire(action, request, own, resp) == 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewFeasibilityConfig() {
    return new (std::nothrow) FeasibilityConfig();
}

}  // namespace Resource
}  // namespace CORVPackageTool
