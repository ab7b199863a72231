// pam_corv_privilege.so (account): lets an account through only when it may use the
// application named by the argument "[<app id>]", as the privilege store
// (/usr/corv/etc/appprivilege.json, format in corv/app_priv.h) says:
// a denial to the user wins, then a grant to the user, then a denial to one of the
// user's groups, then a grant to one of them; members of the administrators group may use
// every application; anyone else may not. A store that can't be read grants nothing.
#include <grp.h>
#include <json/json.h>
#include <pwd.h>
#include <security/pam_modules.h>
#include <syslog.h>

#include <fstream>
#include <string>
#include <vector>

#include "module_common.h"

namespace {

const char kStorePath[] = "/usr/corv/etc/appprivilege.json";
const char kAdminGroup[] = "administrators";

bool Lists(const Json::Value& entry, const char* list, const std::string& app) {
    const Json::Value& apps = entry.isObject() ? entry[list] : Json::Value::nullSingleton();
    if (!apps.isArray()) {
        return false;
    }
    for (const Json::Value& item : apps) {
        if (item.isString() && item.asString() == app) {
            return true;
        }
    }
    return false;
}

std::vector<std::string> GroupsOf(const std::string& user) {
    std::vector<std::string> names;
    struct passwd* pw = getpwnam(user.c_str());
    if (pw == nullptr) {
        return names;
    }
    int count = 64;
    std::vector<gid_t> gids(count);
    if (getgrouplist(user.c_str(), pw->pw_gid, gids.data(), &count) < 0) {
        gids.resize(count);
        if (getgrouplist(user.c_str(), pw->pw_gid, gids.data(), &count) < 0) {
            return names;
        }
    }
    gids.resize(count);
    for (gid_t gid : gids) {
        if (struct group* gr = getgrgid(gid)) {
            names.push_back(gr->gr_name);
        }
    }
    // The admin group may be a second name of an id that getgrgid names otherwise.
    if (struct group* admin = getgrnam(kAdminGroup)) {
        for (gid_t gid : gids) {
            if (gid == admin->gr_gid) {
                names.push_back(kAdminGroup);
            }
        }
    }
    return names;
}

bool MayUse(const std::string& user, const std::string& app) {
    Json::Value store;
    std::ifstream in(kStorePath);
    Json::CharReaderBuilder builder;
    std::string errors;
    if (in && !Json::parseFromStream(builder, in, &store, &errors)) {
        return false;
    }
    const Json::Value& users = store.isObject() ? store["users"] : Json::Value::nullSingleton();
    const Json::Value& groups = store.isObject() ? store["groups"] : Json::Value::nullSingleton();
    const Json::Value& own = users.isObject() ? users[user] : Json::Value::nullSingleton();
    if (Lists(own, "deny", app)) {
        return false;
    }
    if (Lists(own, "allow", app)) {
        return true;
    }
    const std::vector<std::string> names = GroupsOf(user);
    bool granted = false;
    for (const std::string& name : names) {
        const Json::Value& entry = groups.isObject() ? groups[name] : Json::Value::nullSingleton();
        if (Lists(entry, "deny", app)) {
            return false;
        }
        granted = granted || Lists(entry, "allow", app) || name == kAdminGroup;
    }
    return granted;
}

}  // namespace

extern "C" {

PAM_EXTERN int pam_sm_acct_mgmt(pam_handle_t* pamh, int /*flags*/, int argc, const char** argv) {
    const std::string app = corvpam::FirstArg(argc, argv);
    const std::string user = corvpam::UserOf(pamh);
    if (app.empty() || user.empty()) {
        return PAM_PERM_DENIED;
    }
    if (!MayUse(user, app)) {
        corvpam::AuthLog(LOG_NOTICE, "User [%s] may not use [%s]", user.c_str(), app.c_str());
        return PAM_PERM_DENIED;
    }
    return PAM_SUCCESS;
}

}  // extern "C"
