// "syslog-config": a running package's syslog-ng fragments and its logrotate fragment.
//
// The destinations follow from the package's name alone, so the release works from the
// request and the own section stays unused.
#include <errno.h>
#include <unistd.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kPatternDbKey[] = "patterndb-relpath";
const char kPatternIncKey[] = "patterninc";
const char kTargetDirKey[] = "target-dir";
const char kConfRelPathKey[] = "conf-relpath";
const char kLogrotateKey[] = "logrotate-relpath";

const char kPatternDbDir[] = "/usr/local/etc/syslog-ng/patterndb.d/";
const char kIncludeDir[] = "/usr/local/etc/syslog-ng/patterndb.d/include/";
const char kLogrotateDir[] = "/usr/local/etc/logrotate.d/";

std::string PatternDbPath(const std::string& pkg) {
    return kPatternDbDir + pkg + ".conf";
}
std::string IncludePath(const std::string& targetDir, const std::string& pkg) {
    return kIncludeDir + targetDir + "/" + pkg;
}
std::string LogrotatePath(const std::string& pkg) {
    return kLogrotateDir + pkg;
}

// An include point is one directory right under include/: a name that climbs or descends
// would let a package write anywhere syslog-ng's include tree reaches, and beyond.
bool IsTargetDirName(const std::string& name) {
    return !name.empty() && name != "." && name != ".." && name.find('/') == std::string::npos;
}

// An element of "patterninc" that can be installed or removed; others are passed over.
bool IsIncludeElement(const Json::Value& element) {
    return element.isObject() && element[kTargetDirKey].isString() &&
           IsTargetDirName(element[kTargetDirKey].asString());
}

// 0 when the package's file at `relpath` now stands at `destination`, -1 otherwise.
int InstallFragment(const std::string& root, const std::string& relpath,
                    const std::string& destination) {
    std::string source;
    if (!CORV::PkgUtils::ResolveRelPath(root, relpath, source)) {
        CORV_LOG_ERR("Illegal path, RootDir: %s, relpath: %s, fulpath: %s [0x%04X %s:%d]",
                     root.c_str(), relpath.c_str(), source.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    if (!CORV::PkgUtils::InstallConfigFile(source, destination, 0644, true)) {
        CORV_LOG_ERR("copy failed, fulpath: %s, lnkpath: %s[0x%04X %s:%d]", source.c_str(),
                     destination.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    return 0;
}

// True when something was removed; a file that was already gone is no failure.
bool RemoveFragment(const std::string& path) {
    if (unlink(path.c_str()) == 0) {
        return true;
    }
    if (errno != ENOENT) {
        CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
    }
    return false;
}

// syslog-ng rereads its configuration; a fragment it refuses makes the reload fail, and
// the running daemon keeps the configuration it had.
bool ReloadSyslog() {
    if (VLIBServiceReload("syslog-ng") < 0) {
        CORV_LOG_ERR("Faild to reload syslog [0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return false;
    }
    return true;
}

bool CheckField(const Json::Value& request, const char* key, bool (Json::Value::*isType)() const) {
    if (request.isMember(key) && !(request[key].*isType)()) {
        CORV_LOG_ERR("Illegal field %s", key);
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    return true;
}

class SyslogConfig : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        if (!CheckField(request, kPatternDbKey, &Json::Value::isString) ||
            !CheckField(request, kPatternIncKey, &Json::Value::isArray) ||
            !CheckField(request, kLogrotateKey, &Json::Value::isString)) {
            return 1;
        }
        const std::string& pkg = action.GetPkgName();
        const std::string& root = action.GetRootDir();
        bool installed = false;
        if (request.isMember(kPatternDbKey)) {
            if (InstallFragment(root, request[kPatternDbKey].asString(), PatternDbPath(pkg)) < 0) {
                return 1;
            }
            installed = true;
        }
        for (const Json::Value& element : request[kPatternIncKey]) {
            if (!IsIncludeElement(element) || !element[kConfRelPathKey].isString()) {
                continue;
            }
            const std::string destination = IncludePath(element[kTargetDirKey].asString(), pkg);
            if (InstallFragment(root, element[kConfRelPathKey].asString(), destination) == 0) {
                installed = true;
            }
        }
        if (installed && !ReloadSyslog()) {
            return 1;
        }
        if (request.isMember(kLogrotateKey) &&
            InstallFragment(root, request[kLogrotateKey].asString(), LogrotatePath(pkg)) < 0) {
            return 1;
        }
        return 0;
    }

    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }

    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject()) {
            return 0;
        }
        const std::string& pkg = action.GetPkgName();
        bool removed = false;
        if (request.isMember(kPatternDbKey)) {
            removed = RemoveFragment(PatternDbPath(pkg)) || removed;
        }
        for (const Json::Value& element : request[kPatternIncKey]) {
            if (IsIncludeElement(element)) {
                removed =
                    RemoveFragment(IncludePath(element[kTargetDirKey].asString(), pkg)) || removed;
            }
        }
        if (removed && !ReloadSyslog()) {
            return 1;
        }
        if (request.isMember(kLogrotateKey)) {
            RemoveFragment(LogrotatePath(pkg));
        }
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewSyslogConfig() {
    return new (std::nothrow) SyslogConfig();
}

}  // namespace Resource
}  // namespace CORVPackageTool
