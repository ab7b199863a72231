// "webapi-desc" (WebAPIDescDaemon): prepares the package's web API daemon inside the
// package: the libraries it preloads, and in each library description the socket it
// listens on. Nothing outside the package changes, so there is nothing to release.
#include <errno.h>
#include <unistd.h>

#include <new>
#include <set>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kApisKey[] = "apis";
const char kApiDaemonKey[] = "apidaemon";
const char kDaemonConfigKey[] = "daemon_config";
const char kAutoPreloadKey[] = "auto_preload_webapi_libs";
const char kSockPathKey[] = "sock_path";
const char kPreloadLibsKey[] = "preload_libs";
const char kLibKey[] = "lib";
const char kSocketKey[] = "socket";

// One line at priority 3 with the process id, and the system error when there is one.
#define DAEMON_LOG(text)                                                                   \
    do {                                                                                   \
        if (errno != 0) {                                                                  \
            CORVLog(LOG_ERR, "%s:%d (%d) %s [err: %m]", CORV_SRC_FILE, __LINE__, getpid(), \
                    std::string(text).c_str());                                            \
            errno = 0;                                                                     \
        } else {                                                                           \
            CORVLog(LOG_ERR, "%s:%d (%d) %s", CORV_SRC_FILE, __LINE__, getpid(),           \
                    std::string(text).c_str());                                            \
        }                                                                                  \
    } while (0)

class WebAPIDescDaemonPrivate {
  public:
    WebAPIDescDaemonPrivate(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request)
        : action_(action), request_(request) {}

    bool IsValidConfig() {
        if (!request_[kApisKey].isArray()) {
            DAEMON_LOG("apis is not array: " + toString(request_[kApisKey]));
            return false;
        }
        const Json::Value& daemon = request_[kApiDaemonKey];
        if (!daemon.isObject() || !daemon[kDaemonConfigKey].isString() ||
            !CORV::PkgUtils::ResolveRelPath(action_.GetRootDir(),
                                            daemon[kDaemonConfigKey].asString(), configPath_)) {
            DAEMON_LOG("daemon_config is not valid" +
                       (daemon.isObject() ? toString(daemon[kDaemonConfigKey]) : std::string()));
            return false;
        }
        if (!daemon.isMember(kAutoPreloadKey)) {
            DAEMON_LOG("auto_preload_webapi_libs not exist");
            return false;
        }
        return true;
    }

    bool AppendAutoPreloadAPILibs() {
        Json::Value config;
        if (!fromFile(configPath_, config) || !config.isObject()) {
            DAEMON_LOG("cannot read config file: " + configPath_);
            return false;
        }
        if (!request_[kApiDaemonKey][kAutoPreloadKey].asBool()) {
            return true;
        }
        CollectLibPaths();
        std::set<std::string> libs;
        for (const Json::Value& lib : config[kPreloadLibsKey]) {
            if (lib.isString()) {
                libs.insert(lib.asString());
            }
        }
        config[kPreloadLibsKey] = Json::Value(Json::arrayValue);
        for (const std::string& path : libPaths_) {
            Json::Value desc;
            if (!fromFile(path, desc) || !desc.isObject()) {
                continue;
            }
            for (const std::string& member : desc.getMemberNames()) {
                if (desc[member].isObject() && desc[member][kLibKey].isString()) {
                    libs.insert(desc[member][kLibKey].asString());
                }
            }
        }
        for (const std::string& lib : libs) {
            config[kPreloadLibsKey].append(lib);
        }
        if (!toFile(config, configPath_)) {
            DAEMON_LOG("cannot save config file: " + configPath_);
            return false;
        }
        return true;
    }

    bool ModifyLibFile() {
        Json::Value config;
        if (!fromFile(configPath_, config) || !config.isObject()) {
            return false;
        }
        if (!config.isMember(kSockPathKey)) {
            DAEMON_LOG(std::string("must exist ") + kSockPathKey);
            return false;
        }
        CollectLibPaths();
        for (const std::string& path : libPaths_) {
            Json::Value desc;
            if (!fromFile(path, desc) || !desc.isObject()) {
                DAEMON_LOG("open json failed : " + path);
                return false;
            }
            for (const std::string& member : desc.getMemberNames()) {
                if (desc[member].isObject()) {
                    desc[member][kSocketKey] = config[kSockPathKey].asString();
                }
            }
            if (!toFile(desc, path)) {
                DAEMON_LOG("save json failed : " + path);
                return false;
            }
        }
        return true;
    }

  private:
    // The library descriptions of the "webapi" entries; one outside the package is left
    // out.
    void CollectLibPaths() {
        if (!libPaths_.empty()) {
            return;
        }
        for (const Json::Value& entry : request_[kApisKey]) {
            if (!entry.isObject() || entry["type"].asString() != "webapi" ||
                !entry[kLibKey].isArray()) {
                continue;
            }
            for (const Json::Value& lib : entry[kLibKey]) {
                std::string path;
                if (lib.isString() &&
                    CORV::PkgUtils::ResolveRelPath(action_.GetRootDir(), lib.asString(), path)) {
                    libPaths_.insert(path);
                }
            }
        }
    }

    const CORV::PkgUtils::ActionInfo& action_;
    const Json::Value& request_;
    std::string configPath_;
    std::set<std::string> libPaths_;
};

class WebAPIDescDaemon : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject() || !request.isMember(kApisKey) ||
            !request.isMember(kApiDaemonKey)) {
            return 0;
        }
        errno = 0;
        WebAPIDescDaemonPrivate work(action, request);
        return work.IsValidConfig() && work.AppendAutoPreloadAPILibs() && work.ModifyLibFile() ? 0
                                                                                               : 1;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                 CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
    int Release(const CORV::PkgUtils::ActionInfo&, const Json::Value&, Json::Value&,
                CORV::PkgUtils::WorkerResp&) override {
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewWebAPIDescDaemon() {
    return new (std::nothrow) WebAPIDescDaemon();
}

}  // namespace Resource
}  // namespace CORVPackageTool
