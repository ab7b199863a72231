// "sdk-plugin": the package's event hooks, installed as programs under
// /usr/local/libexec/<event>/, where the system runs every program of an event's
// directory when the event happens. The event directories stay when a package goes.
#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kPlugins[] = "plugins";
const char kLibexec[] = "/usr/local/libexec/";

bool makeDir(const std::string& path) {
    if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
        CORV_LOG_ERR("Failed to create %s (%m)", path.c_str());
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return false;
    }
    if (chmod(path.c_str(), 0755) != 0) {
        syslog(LOG_EMERG, "%s:%d chmod error: %m", __FILE__, __LINE__);
    }
    return true;
}

// /usr/local/libexec/<event>/<base name of source>, its directories made level by level.
bool destinationOf(const std::string& event, const std::string& source, std::string& out) {
    for (size_t slash = event.find('/'); slash != std::string::npos;
         slash = event.find('/', slash + 1)) {
        if (slash > 0 && !makeDir(kLibexec + event.substr(0, slash))) {
            return false;
        }
    }
    if (!makeDir(kLibexec + event)) {
        return false;
    }
    const size_t last = source.rfind('/');
    if (last == std::string::npos || last == 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    out = kLibexec + event + source.substr(last);
    return true;
}

class SDKPlugin : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value plugins = request.isObject() && request.isMember(kPlugins)
                                        ? request[kPlugins]
                                        : Json::Value(Json::arrayValue);
        if (!plugins.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        if (!makeDir(kLibexec)) {
            return 1;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        own[kPlugins] = Json::Value(Json::arrayValue);
        for (const Json::Value& plugin : plugins) {
            if (!plugin.isObject() || !plugin["event"].isString() ||
                !plugin["relpath"].isString()) {
                continue;
            }
            const std::string event = plugin["event"].asString();
            // No "." at all: no "..", and no hidden or relative levels under libexec.
            if (event.find('.') != std::string::npos || event.empty() || event[0] == '/') {
                CORV_LOG_ERR("Illegal event %s, ignore it", event.c_str());
                continue;
            }
            std::string source;
            if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), plugin["relpath"].asString(),
                                                source)) {
                CORV_LOG_ERR("Illegal path %s, ignore it [0x%04X %s:%d]",
                             plugin["relpath"].asCString(), VLIBCErrGet(), VLIBCErrorGetFile(),
                             VLIBCErrorGetLine());
                continue;
            }
            std::string destination;
            if (!destinationOf(event, source, destination) ||
                !CORV::PkgUtils::InstallExecutable(source, destination, true)) {
                return 1;
            }
            own[kPlugins].append(destination.substr(strlen(kLibexec)));
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value plugins = own.isObject() && own.isMember(kPlugins)
                                        ? own[kPlugins]
                                        : Json::Value(Json::arrayValue);
        if (!plugins.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        for (const Json::Value& entry : plugins) {
            if (!entry.isString() || entry.asString().empty() ||
                entry.asString().find("..") != std::string::npos) {
                continue;
            }
            const std::string path = kLibexec + entry.asString();
            if (unlink(path.c_str()) != 0 && errno != ENOENT) {
                CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
                VLIBCErrSet(ERR_UNLINK_FAILED);
            }
        }
        own.removeMember(kPlugins);
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewSDKPlugin() {
    return new (std::nothrow) SDKPlugin();
}

}  // namespace Resource
}  // namespace CORVPackageTool
