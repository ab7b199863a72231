// The desktop's application privilege store.
#include "corv/app_priv.h"

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "json_store.h"

namespace {

constexpr int kLockSeconds = 30;
constexpr const char kStoreDir[] = "/usr/corv/etc";
constexpr const char kAllow[] = "allow";
constexpr const char kDeny[] = "deny";

bool validName(const char* name) {
    if (name == nullptr || name[0] == '\0') {
        return false;
    }
    for (const unsigned char* p = reinterpret_cast<const unsigned char*>(name); *p; ++p) {
        if (*p < 0x20 || *p == 0x7f) {
            return false;
        }
    }
    return true;
}

bool isObjectOrAbsent(const Json::Value& parent, const char* key) {
    return !parent.isMember(key) || parent[key].isObject();
}

bool isArrayOrAbsent(const Json::Value& parent, const char* key) {
    return !parent.isMember(key) || parent[key].isArray();
}

// Removes every `app` from `list`; true when there was one.
bool removeApp(Json::Value& list, const std::string& app) {
    Json::Value kept(Json::arrayValue);
    bool removed = false;
    for (const Json::Value& item : list) {
        if (item.isString() && item.asString() == app) {
            removed = true;
        } else {
            kept.append(item);
        }
    }
    list = kept;
    return removed;
}

bool containsApp(const Json::Value& list, const std::string& app) {
    for (const Json::Value& item : list) {
        if (item.isString() && item.asString() == app) {
            return true;
        }
    }
    return false;
}

// Puts `app` into the `allow` or `deny` list of `name` in the store's section `kind`.
int changePrivilege(const char* kind, const char* name, const char* app, bool allow) {
    if (!validName(name) || !validName(app)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (CORVFSMkdirP(kStoreDir, nullptr, 1, -1, -1, 0755) != 0) {
        return -1;
    }
    corvplat::FileLock lock(APP_PRIV_LOCK_PATH, kLockSeconds);
    if (!lock.ok()) {
        CORV_LOG_ERR("Failed to lock %s", APP_PRIV_LOCK_PATH);
        return -1;
    }
    Json::Value store;
    switch (corvplat::readJsonFile(APP_PRIV_STORE_PATH, store)) {
        case corvplat::JsonRead::kBad:
            return -1;
        case corvplat::JsonRead::kMissing:
            store = Json::Value(Json::objectValue);
            break;
        case corvplat::JsonRead::kOk:
            break;
    }
    if (!store.isObject() || !isObjectOrAbsent(store, kind) ||
        !isObjectOrAbsent(store[kind], name) || !isArrayOrAbsent(store[kind][name], kAllow) ||
        !isArrayOrAbsent(store[kind][name], kDeny)) {
        CORV_LOG_ERR("%s: unexpected shape at %s/%s", APP_PRIV_STORE_PATH, kind, name);
        VLIBCErrSet(ERR_MALFORMED);
        return -1;
    }
    Json::Value& entry = store[kind][name];
    Json::Value& target = entry[allow ? kAllow : kDeny];
    Json::Value& other = entry[allow ? kDeny : kAllow];
    if (target.isNull()) {
        target = Json::Value(Json::arrayValue);
    }
    if (other.isNull()) {
        other = Json::Value(Json::arrayValue);
    }
    bool changed = removeApp(other, app);
    if (!containsApp(target, app)) {
        target.append(app);
        changed = true;
    }
    if (!changed) {
        return 0;
    }
    return corvplat::writeJsonFile(APP_PRIV_STORE_PATH, store, 0644) ? 0 : -1;
}

}  // namespace

int VLIBAppPrivUserAddOne(const char* user, const char* app) {
    return changePrivilege("users", user, app, true);
}

int VLIBAppPrivGroupAddOne(const char* group, const char* app) {
    return changePrivilege("groups", group, app, true);
}

int VLIBAppPrivGroupDenyOne(const char* group, const char* app) {
    return changePrivilege("groups", group, app, false);
}
