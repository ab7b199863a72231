// Reading conf/privilege: identities of the control scripts and the package's user.
#include "corvpkg/privilege.h"

#include <string>
#include <utility>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"

namespace CORVPackageTool {
namespace Privilege {

namespace {
constexpr const char* kRegistryDir = "/var/packages/";
}

IWalker::~IWalker() = default;

CtrlScriptWalker::CtrlScriptWalker(std::string wanted) : action(std::move(wanted)) {}
CtrlScriptWalker::~CtrlScriptWalker() = default;

int CtrlScriptWalker::walk(const Json::Value& entry) {
    if (!entry.isObject() || !entry["action"].isString() || !entry["run-as"].isString()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 0;
    }
    if (entry["action"].asString() != action) {
        return 2;
    }
    identity = TranslateIdentity(entry["run-as"].asString());
    return identity != IDENTITY_INVALID ? 1 : 0;
}

bool TraversePrivilege(const Json::Value& conf, const std::string& key, IWalker& walker) {
    if (key.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (!conf.isObject() || !conf.isMember(key) || !conf[key].isArray()) {
        return true;
    }
    for (const Json::Value& element : conf[key]) {
        if (!element.isObject()) {
            continue;
        }
        int r = walker.walk(element);
        if (r != 2) {
            return r == 1;
        }
    }
    return true;
}

bool GetConfPathFrom(const std::string& dir, std::string& path) {
    std::string candidate = dir + "/conf/privilege";
    if (!VLIBCFileExist(candidate.c_str())) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return false;
    }
    path = candidate;
    return true;
}

bool GetConfPath(const std::string& name, std::string& path) {
    return GetConfPathFrom(kRegistryDir + name, path);
}

int TranslateIdentity(const std::string& text) {
    if (text == "package") {
        return IDENTITY_PACKAGE;
    }
    if (text == "system") {
        return IDENTITY_SYSTEM;
    }
    if (text == "root") {
        return IDENTITY_ROOT;
    }
    VLIBCErrSet(ERR_BAD_PARAMETERS);
    return IDENTITY_INVALID;
}

int GetDefaultIdentity(const Json::Value& conf) {
    if (conf.isObject() && conf["defaults"].isObject() && conf["defaults"]["run-as"].isString()) {
        return TranslateIdentity(conf["defaults"]["run-as"].asString());
    }
    return IDENTITY_PACKAGE;
}

namespace {

// The privilege file of a package, parsed. False (logged) when it exists but is unreadable;
// `found` tells whether there is one at all.
bool loadConf(const std::string& name, const std::string& dir, Json::Value& conf, bool& found,
              std::string& path) {
    found = dir.empty() ? GetConfPath(name, path) : GetConfPathFrom(dir, path);
    if (!found) {
        return true;
    }
    if (!fromFile(path, conf)) {
        CORV_LOG_ERR("Failed to read %s (%m)", path.c_str());
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    return true;
}

std::string userOf(const Json::Value& conf, const std::string& name) {
    if (conf.isObject() && conf["username"].isString() && !conf["username"].asString().empty()) {
        return conf["username"].asString();
    }
    return name;
}

}  // namespace

std::string GetUserName(const std::string& name, const std::string& dir) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return "";
    }
    Json::Value conf;
    bool found = false;
    std::string path;
    if (!loadConf(name, dir, conf, found, path) || !found) {
        return "";
    }
    return userOf(conf, name);
}

bool SetIdentity(CORVUtils::ProcessRunner& runner, const std::string& name,
                 const std::string& action, const std::string& dir) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    // No file: the script runs as root.
    Json::Value conf;
    bool found = false;
    std::string path;
    if (!loadConf(name, dir, conf, found, path)) {
        return false;
    }
    if (!found) {
        return true;
    }
    CtrlScriptWalker walker(action);
    if (!TraversePrivilege(conf, "ctrl-script", walker)) {
        CORV_LOG_ERR("Failed to traverse %s [0x%04X %s:%d]", path.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    int identity = walker.identity != IDENTITY_INVALID ? walker.identity : GetDefaultIdentity(conf);
    // A script meant for the package's user must never fall back to root, so an identity
    // that cannot be resolved is a failure.
    const std::string user = userOf(conf, name);
    if (identity == IDENTITY_PACKAGE || identity == IDENTITY_SYSTEM) {
        if (!runner.setRuntimeIdentity(user, identity == IDENTITY_PACKAGE)) {
            CORV_LOG_ERR("Failed to run %s of %s as %s [0x%04X %s:%d]", action.c_str(),
                         name.c_str(), user.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(),
                         VLIBCErrorGetLine());
            return false;
        }
    }
    return true;
}

}  // namespace Privilege

std::string PMSGetPkgUserName(const std::string& name) {
    return Privilege::GetUserName(name, "");
}

}  // namespace CORVPackageTool
