// "pam-config": loading the descriptions, choosing which to install, and installing and
// removing the generated files. The rules themselves: pam_config_rules.cc.
#include "resource/workers/pam_config.h"

#include <errno.h>
#include <stdio.h>
#include <unistd.h>

#include <fstream>
#include <iterator>
#include <new>
#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kConfigsKey[] = "configs";
const char kDefaultsKey[] = "defaults";
const char kHelperArgsKey[] = "@helper-args";
const char kIdListKey[] = "id-list";
const char kConfigIdsKey[] = "config-ids";
const char kFilenameKey[] = "filename";
const char kAuthTypesKey[] = "auth-types";
const char kIdKey[] = "id";
const char kAutoblockKey[] = "autoblock";
const char kServiceNameKey[] = "service-name";
const char kLogSuccessKey[] = "log-success";
const char kLogFailureKey[] = "log-failure";
const char kAppPrivilegeKey[] = "app-privilege";
const char kAppIdKey[] = "app-id";

const char kPamDir[] = "/etc/pam.d/";
constexpr int kErrFileExists = 0x0800;

// A name that becomes a file right under /etc/pam.d/.
bool IsPlainFilename(const std::string& name) {
    if (name.empty() || name[0] == '.') {
        return false;
    }
    for (char c : name) {
        const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                           (c >= '0' && c <= '9') || c == '.' || c == '_' || c == '-';
        if (!plain) {
            return false;
        }
    }
    return true;
}

// A word that stands in brackets as one argument of a rule: no blank, bracket or control
// character can end the argument or the line early.
bool IsRuleWord(const std::string& word) {
    if (word.empty()) {
        return false;
    }
    for (unsigned char c : word) {
        if (c <= ' ' || c == 0x7F || c == '[' || c == ']') {
            return false;
        }
    }
    return true;
}

Json::Value ArrayOr(const Json::Value& object, const char* key) {
    if (object.isObject() && object.isMember(key)) {
        return object[key];
    }
    return Json::Value(Json::arrayValue);
}

bool SameContent(const std::string& a, const std::string& b) {
    std::ifstream first(a, std::ios::binary);
    std::ifstream second(b, std::ios::binary);
    if (!first || !second) {
        return false;
    }
    const std::string left((std::istreambuf_iterator<char>(first)),
                           std::istreambuf_iterator<char>());
    const std::string right((std::istreambuf_iterator<char>(second)),
                            std::istreambuf_iterator<char>());
    return left == right;
}

// Installs the generated file; 1 for a failure that ends the action, 0 when it stands in
// /etc/pam.d (now or from before), -1 when the name belongs to someone else's file, which
// stays and is not this package's to remove.
int InstallGenerated(const std::string& tmpPath, const std::string& filename) {
    const std::string destination = kPamDir + filename;
    const bool installed = CORV::PkgUtils::InstallConfigFile(tmpPath, destination, 0644, false);
    const int err = VLIBCErrGet();
    const bool ours = !installed && err == kErrFileExists && SameContent(tmpPath, destination);
    if (unlink(tmpPath.c_str()) != 0) {
        CORV_LOG_ERR("remove failed for '%s' (%m)", tmpPath.c_str());
    }
    if (installed) {
        return 0;
    }
    if (err == kErrFileExists) {
        CORV_LOG_ERR("File already exists: %s, ignored.", destination.c_str());
        return ours ? 0 : -1;
    }
    CORV_LOG_ERR("Failed to install: %s [0x%04X %s:%d]", destination.c_str(), err,
                 VLIBCErrorGetFile(), VLIBCErrorGetLine());
    return 1;
}

}  // namespace

PAMConfig::AUTH_TYPE GetAuthTypeFromString(const std::string& word) {
    if (word == "local") {
        return PAMConfig::AUTH_TYPE_LOCAL;
    }
    if (word == "domain") {
        return PAMConfig::AUTH_TYPE_DOMAIN;
    }
    if (word == "ldap") {
        return PAMConfig::AUTH_TYPE_LDAP;
    }
    return PAMConfig::AUTH_TYPE_UNKNOWN;
}

bool IdInArray(const std::string& id, const Json::Value& array) {
    if (!array.isArray()) {
        return false;
    }
    for (const Json::Value& item : array) {
        if (item.isString() && item.asString() == id) {
            return true;
        }
    }
    return false;
}

bool NeedInstallConfig(const std::string& id, const Json::Value& idList,
                       const Json::Value& installedIds, const Json::Value& defaults) {
    if (id.empty()) {
        return true;
    }
    for (const Json::Value* choice : {&idList, &installedIds, &defaults}) {
        if (!choice->empty()) {
            return IdInArray(id, *choice);
        }
    }
    return true;
}

PAMConfig::Params::Params()
    : autoblock(false), logSuccess(false), logFailure(false), appPrivilege(false) {}

bool PAMConfig::Params::Load(const Json::Value& config) {
    return config.isObject() && LoadFilename(config) && LoadAuthTypes(config) && LoadId(config) &&
           LoadAutoblock(config) && LoadAppPriv(config);
}

bool PAMConfig::Params::LoadFilename(const Json::Value& config) {
    if (!config[kFilenameKey].isString()) {
        CORV_LOG_ERR("Failed to load filename in pam config");
        return false;
    }
    filename = config[kFilenameKey].asString();
    if (filename.empty()) {
        return false;
    }
    if (!IsPlainFilename(filename)) {
        CORV_LOG_ERR("Illegal filename in pam config: %s", filename.c_str());
        return false;
    }
    return true;
}

bool PAMConfig::Params::LoadAuthTypes(const Json::Value& config) {
    if (!config[kAuthTypesKey].isArray()) {
        CORV_LOG_ERR("Failed to load auth types in pam config");
        return false;
    }
    authTypes.clear();
    for (const Json::Value& word : config[kAuthTypesKey]) {
        if (!word.isString()) {
            CORV_LOG_ERR("Auth type format error");
            return false;
        }
        const AUTH_TYPE type = GetAuthTypeFromString(word.asString());
        if (type == AUTH_TYPE_UNKNOWN) {
            CORV_LOG_ERR("Unknown auth type: %s", word.asCString());
            return false;
        }
        authTypes.insert(type);
    }
    return true;
}

bool PAMConfig::Params::LoadId(const Json::Value& config) {
    id.clear();
    if (!config.isMember(kIdKey)) {
        return true;
    }
    if (!config[kIdKey].isString()) {
        CORV_LOG_ERR("Failed to load id in pam config");
        return false;
    }
    id = config[kIdKey].asString();
    return true;
}

bool PAMConfig::Params::LoadAutoblock(const Json::Value& config) {
    autoblock = false;
    logSuccess = false;
    logFailure = false;
    serviceName.clear();
    if (!config.isMember(kAutoblockKey)) {
        return true;
    }
    const Json::Value& info = config[kAutoblockKey];
    if (!info.isObject() || !info[kServiceNameKey].isString() ||
        !IsRuleWord(info[kServiceNameKey].asString())) {
        CORV_LOG_ERR("Failed to load autoblock info in pam config");
        return false;
    }
    autoblock = true;
    serviceName = info[kServiceNameKey].asString();
    for (const auto& flag : {std::make_pair(kLogSuccessKey, &logSuccess),
                             std::make_pair(kLogFailureKey, &logFailure)}) {
        if (!info.isMember(flag.first)) {
            continue;
        }
        if (!info[flag.first].isBool()) {
            CORV_LOG_ERR("Autoblock info format error");
            return false;
        }
        *flag.second = info[flag.first].asBool();
    }
    return true;
}

bool PAMConfig::Params::LoadAppPriv(const Json::Value& config) {
    appPrivilege = false;
    appId.clear();
    if (!config.isMember(kAppPrivilegeKey)) {
        return true;
    }
    const Json::Value& info = config[kAppPrivilegeKey];
    if (!info.isObject() || !info[kAppIdKey].isString() ||
        !IsRuleWord(info[kAppIdKey].asString())) {
        CORV_LOG_ERR("Failed to load app privilege info in pam config");
        return false;
    }
    appPrivilege = true;
    appId = info[kAppIdKey].asString();
    return true;
}

int PAMConfig::Acquire(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& request,
                       Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) {
    const Json::Value configs = ArrayOr(request, kConfigsKey);
    const Json::Value defaults = ArrayOr(request, kDefaultsKey);
    const Json::Value installedIds = ArrayOr(own, kConfigIdsKey);
    const Json::Value helperArgs = request.isObject() && request.isMember(kHelperArgsKey)
                                       ? request[kHelperArgsKey]
                                       : Json::Value(Json::objectValue);
    const Json::Value idList = ArrayOr(helperArgs, kIdListKey);
    if (!configs.isArray() || !own.isObject()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 1;
    }
    own[kConfigsKey] = Json::Value(Json::arrayValue);
    own[kConfigIdsKey] = Json::Value(Json::arrayValue);
    for (const Json::Value& config : configs) {
        Params params;
        std::string tmpPath;
        if (!params.Load(config) ||
            !NeedInstallConfig(params.GetId(), idList, installedIds, defaults) ||
            !params.Generate(tmpPath)) {
            continue;
        }
        const int installed = InstallGenerated(tmpPath, params.GetFilename());
        if (installed == 1) {
            return 1;
        }
        if (installed < 0) {
            continue;
        }
        own[kConfigsKey].append(params.GetFilename());
        if (!params.GetId().empty()) {
            own[kConfigIdsKey].append(params.GetId());
        }
    }
    return 0;
}

int PAMConfig::Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                        Json::Value& own, CORV::PkgUtils::WorkerResp& resp) {
    return Release(action, request, own, resp);
}

int PAMConfig::Release(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& /*request*/,
                       Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) {
    const Json::Value configs = ArrayOr(own, kConfigsKey);
    if (!configs.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 1;
    }
    for (const Json::Value& name : configs) {
        // The own-file is only ever written by Acquire; a name that isn't plain was not.
        if (!name.isString() || !IsPlainFilename(name.asString())) {
            continue;
        }
        const std::string path = kPamDir + name.asString();
        if (unlink(path.c_str()) != 0 && errno != ENOENT) {
            CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
            VLIBCErrSet(ERR_UNLINK_FAILED);
        }
    }
    if (own.isObject()) {
        own.removeMember(kConfigsKey);
    }
    return 0;
}

CORV::PkgUtils::IWorker* NewPAMConfig() {
    return new (std::nothrow) PAMConfig();
}

}  // namespace Resource
}  // namespace CORVPackageTool
