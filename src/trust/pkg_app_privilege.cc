// Rights to the desktop applications of a package, granted when the package starts.
#include <stdio.h>
#include <string.h>
#include <strings.h>

#include <algorithm>
#include <string>
#include <vector>

#include "common/vlibc_holders.h"
#include "corv/app_priv.h"
#include "corv/log.h"
#include "corv/nds_jsconfig.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgapppriv.h"

namespace CORVPackageTool {

namespace {

constexpr int kListCapacity = 512;
constexpr int kSuffixSize = 256;
constexpr const char kAdministrators[] = "administrators";
constexpr const char kAppSeparators[] = " \t";
constexpr const char kGrantPrivilege[] = "grantPrivilege";
constexpr const char kConfigablePrivilege[] = "configablePrivilege";
constexpr const char kAdvanceGrantPrivilege[] = "advanceGrantPrivilege";

// The system's own accounts never get an application by name.
bool isBuiltinAccount(const char* name) {
    return strcasecmp(name, "admin") == 0 || strcasecmp(name, "CorvelCMS") == 0;
}

// The settings of `app` in one configuration unit, when they name a grant this routine
// carries out; null otherwise.
const Json::Value* grantableEntry(const Json::Value& unit, const std::string& app) {
    if (!unit.isObject() || !unit.isMember(app)) {
        return nullptr;
    }
    const Json::Value& entry = unit[app];
    if (!entry.isObject() || !entry[kGrantPrivilege].isString()) {
        return nullptr;
    }
    const std::string grant = entry[kGrantPrivilege].asString();
    return grant == "all" || grant == "local" ? &entry : nullptr;
}

bool isTrue(const Json::Value& entry, const char* key) {
    return entry[key].isBool() && entry[key].asBool();
}

// Every member of "administrators" but the system's own accounts gets `app`.
void grantToAdministrators(const std::string& app) {
    SzList members(kListCapacity);
    if (!members || CORVGroupListMember(kAdministrators, members.addr()) < 0) {
        CORV_LOG_ERR("CORVGroupListMember(%s) failed, corverr=0x%04X\n", kAdministrators,
                     VLIBCErrGet());
        return;
    }
    for (int i = 0; i < VLIBCSzListCount(members.get()); ++i) {
        const char* member = VLIBCSzListGet(members.get(), i);
        if (member != nullptr && !isBuiltinAccount(member)) {
            VLIBAppPrivUserAddOne(member, app.c_str());
        }
    }
}

// The administrators' groups get `app`; with the grant "all" also those of the LDAP
// server and of the Windows domain.
void grantToGroups(const std::string& app, const std::string& grant) {
    VLIBAppPrivGroupAddOne(kAdministrators, app.c_str());
    if (grant != "all") {
        return;
    }
    if (CORVLDAPIsBinded()) {
        char suffix[kSuffixSize] = "";
        if (CORVLDAPLoginSuffixGet(suffix, sizeof(suffix)) < 0) {
            CORV_LOG_ERR("CORVLDAPLoginSuffixGet() failed, corverr=0x%04X", VLIBCErrGet());
            return;
        }
        char group[kSuffixSize + sizeof(kAdministrators) + 1] = "";
        snprintf(group, sizeof(group), "%s%c%s", kAdministrators, '@', suffix);
        VLIBAppPrivGroupAddOne(group, app.c_str());
    }
    if (CORVWinsIsJoined()) {
        SzList groups(kListCapacity);
        SzList users(kListCapacity);
        if (!groups || !users || CORVGroupDomainAdminListGet(groups.addr(), users.addr()) < 0) {
            CORV_LOG_ERR("CORVGroupDomainAdminListGet() failed, corverr=0x%04X", VLIBCErrGet());
            return;
        }
        for (int i = 0; i < VLIBCSzListCount(groups.get()); ++i) {
            VLIBAppPrivGroupAddOne(VLIBCSzListGet(groups.get(), i), app.c_str());
        }
    }
}

}  // namespace

void PMSSetAppPrivilege(const char* user, const std::string& appNames, const char* language) {
    if (appNames.empty() || language == nullptr) {
        return;
    }
    CORV::NDS::JSConfigParser parser(language);
    if (!parser.Parse(NULL)) {
        CORV_LOG_ERR("Failed to parse the desktop configuration [0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return;
    }
    const Json::Value configs = parser.GetJSConfigs();
    const std::vector<std::string> units = configs.getMemberNames();

    std::vector<std::string> configable;
    std::vector<std::string> grants;
    std::vector<std::string> advanced;
    std::vector<char> names(appNames.begin(), appNames.end());
    names.push_back('\0');
    char* cursor = nullptr;
    for (char* app = strtok_r(names.data(), kAppSeparators, &cursor); app != nullptr;
         app = strtok_r(nullptr, kAppSeparators, &cursor)) {
        for (const std::string& unit : units) {
            const Json::Value* entry = grantableEntry(configs[unit], app);
            if (entry == nullptr) {
                continue;
            }
            if (!entry->isMember(kConfigablePrivilege) || isTrue(*entry, kConfigablePrivilege)) {
                configable.emplace_back(app);
                grants.push_back((*entry)[kGrantPrivilege].asString());
            }
            if (isTrue(*entry, kAdvanceGrantPrivilege)) {
                advanced.emplace_back(app);
            }
            break;
        }
    }

    if (configable.empty()) {
        return;
    }

    if (user != nullptr && !isBuiltinAccount(user) && VLIBGroupIsAdminGroupMem(user, 0) == 1) {
        for (const std::string& app : configable) {
            VLIBAppPrivUserAddOne(user, app.c_str());
        }
    }

    for (size_t i = 0; i < configable.size(); ++i) {
        const std::string& app = configable[i];
        if (std::find(advanced.begin(), advanced.end(), app) == advanced.end()) {
            grantToAdministrators(app);
        } else {
            grantToGroups(app, grants[i]);
        }
    }
}

}  // namespace CORVPackageTool
