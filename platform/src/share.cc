// Shared folders: directories on the volumes with POSIX ACLs, and the registry that names
// them (format in corv/share.h).
#include "corv/share.h"

#include <ctype.h>
#include <errno.h>
#include <pwd.h>
#include <stdio.h>
#include <string.h>
#include <sys/acl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corv/volume.h"
#include "json_store.h"

namespace {

constexpr char kRegistryLock[] = "/usr/corv/etc/shares.lock";
constexpr size_t kMaxNameLength = 64;
constexpr int kLockSeconds = 30;

std::vector<std::string> splitList(const std::string& text) {
    std::vector<std::string> out;
    size_t start = 0;
    while (start <= text.size()) {
        size_t comma = text.find(',', start);
        std::string item =
            text.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
        if (!item.empty()) {
            out.push_back(item);
        }
        if (comma == std::string::npos) {
            break;
        }
        start = comma + 1;
    }
    return out;
}

std::string joinList(const Json::Value& list) {
    std::string out;
    for (const Json::Value& item : list) {
        if (item.isString()) {
            out += (out.empty() ? "" : ",") + item.asString();
        }
    }
    return out;
}

Json::Value listValue(const std::string& text) {
    Json::Value out(Json::arrayValue);
    for (const std::string& item : splitList(text)) {
        out.append(item);
    }
    return out;
}

// The registry, an object with an object "shares"; a missing file is an empty registry.
bool loadRegistry(Json::Value& registry) {
    switch (corvplat::readJsonFile(CORV_SHARE_REGISTRY, registry)) {
        case corvplat::JsonRead::kMissing:
            registry = Json::Value(Json::objectValue);
            break;
        case corvplat::JsonRead::kBad:
            return false;
        case corvplat::JsonRead::kOk:
            break;
    }
    if (!registry.isObject()) {
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    if (!registry["shares"].isObject()) {
        registry["shares"] = Json::Value(Json::objectValue);
    }
    return true;
}

bool saveRegistry(const Json::Value& registry) {
    if (CORVFSMkdirP("/usr/corv/etc", nullptr, 1, -1, -1, 0755) != 0) {
        return false;
    }
    return corvplat::writeJsonFile(CORV_SHARE_REGISTRY, registry, 0644);
}

Json::Value entryOf(const CORVSHARE& share) {
    Json::Value entry(Json::objectValue);
    entry["path"] = share.path;
    entry["na"] = listValue(share.naList);
    entry["rw"] = listValue(share.rwList);
    entry["ro"] = listValue(share.roList);
    entry["acl_mode"] = share.aclMode;
    entry["skip_smb_perm"] = share.skipSmbPerm;
    entry["encrypted"] = share.encrypted;
    return entry;
}

bool userExists(const std::string& name) {
    char buffer[512];
    return VLIBUserRealNameGet(name.c_str(), buffer, sizeof(buffer)) == 0;
}

const char* permText(int level) {
    return level >= 2 ? "rwx" : (level == 1 ? "r-x" : "---");
}

// The directory's ACL, access and default, from the three lists; a user in several lists
// gets the entry of the last one of na, rw, ro.
int applyAcl(const CORVSHARE& share) {
    std::string text = "u::rwx,g::---,o::---";
    std::vector<std::pair<std::string, int>> users;
    for (const auto& [list, level] :
         {std::make_pair(&share.naList, 0), std::make_pair(&share.rwList, 2),
          std::make_pair(&share.roList, 1)}) {
        for (const std::string& user : splitList(*list)) {
            if (!userExists(user)) {
                continue;
            }
            auto it = std::find_if(users.begin(), users.end(),
                                   [&user](const auto& u) { return u.first == user; });
            if (it == users.end()) {
                users.emplace_back(user, level);
            } else {
                it->second = level;
            }
        }
    }
    for (const auto& [user, level] : users) {
        text += ",u:" + user + ":" + permText(level);
    }
    text += ",m::rwx";
    acl_t acl = acl_from_text(text.c_str());
    if (acl == nullptr) {
        CORV_LOG_ERR("Bad ACL for %s: %s (%m)", share.path.c_str(), text.c_str());
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    int rc = acl_set_file(share.path.c_str(), ACL_TYPE_ACCESS, acl);
    if (rc == 0) {
        rc = acl_set_file(share.path.c_str(), ACL_TYPE_DEFAULT, acl);
    }
    acl_free(acl);
    if (rc != 0) {
        CORV_LOG_ERR("Failed to set the ACL of %s (%m)", share.path.c_str());
        VLIBCErrSet(errno == ENOENT ? ERR_NO_SUCH_FILE : ERR_WRITE_FAILED);
        return -1;
    }
    return 0;
}

int writeEntry(const CORVSHARE& share, bool mustExist) {
    corvplat::FileLock lock(kRegistryLock, kLockSeconds);
    Json::Value registry;
    if (!lock.ok() || !loadRegistry(registry)) {
        return -1;
    }
    const bool present = registry["shares"].isMember(share.name);
    if (mustExist != present) {
        VLIBCErrSet(mustExist ? ERR_SHARE_NOT_FOUND : ERR_SHARE_EXISTS);
        return -1;
    }
    registry["shares"][share.name] = entryOf(share);
    return saveRegistry(registry) ? 0 : -1;
}

}  // namespace

bool CORVShareNameIsValid(const char* name) {
    // A leading "@" is the volume's own folders (@appstore, @tmp): never a share.
    if (name == nullptr || name[0] == '\0' || name[0] == '.' || name[0] == ' ' || name[0] == '@' ||
        strlen(name) > kMaxNameLength) {
        return false;
    }
    for (const char* p = name; *p != '\0'; ++p) {
        const unsigned char c = static_cast<unsigned char>(*p);
        if (!isalnum(c) && strchr(" _-.+@", c) == nullptr) {
            return false;
        }
    }
    return true;
}

int CORVShareGet(const char* name, PCORVSHARE* share) {
    if (share == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *share = nullptr;
    if (!CORVShareNameIsValid(name)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    Json::Value registry;
    if (!loadRegistry(registry)) {
        return -1;
    }
    const Json::Value& entry = registry["shares"][name];
    if (!entry.isObject()) {
        VLIBCErrSet(ERR_SHARE_NOT_FOUND);
        return -1;
    }
    auto* out = new CORVSHARE;
    out->name = name;
    out->path = entry["path"].asString();
    out->naList = joinList(entry["na"]);
    out->rwList = joinList(entry["rw"]);
    out->roList = joinList(entry["ro"]);
    out->aclMode = entry["acl_mode"].asBool();
    out->skipSmbPerm = entry["skip_smb_perm"].asBool();
    out->encrypted = entry["encrypted"].asBool();
    *share = out;
    return 0;
}

void CORVShareFree(PCORVSHARE share) {
    delete share;
}

int CORVShareEnum(std::vector<std::string>* names) {
    Json::Value registry;
    if (names == nullptr || !loadRegistry(registry)) {
        return -1;
    }
    names->clear();
    for (const std::string& name : registry["shares"].getMemberNames()) {
        names->push_back(name);
    }
    std::sort(names->begin(), names->end());
    return static_cast<int>(names->size());
}

int VLIBShareIsAccessible(const char* name) {
    PCORVSHARE share = nullptr;
    if (CORVShareGet(name, &share) != 0) {
        return 0;
    }
    struct stat st;
    const bool ok = stat(share->path.c_str(), &st) == 0 && S_ISDIR(st.st_mode) &&
                    access(share->path.c_str(), X_OK) == 0;
    CORVShareFree(share);
    return ok ? 1 : 0;
}

namespace {

int flagOf(PCORVSHARE share, int* flag, bool CORVSHARE::*member) {
    if (share == nullptr || flag == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *flag = (share->*member) ? 1 : 0;
    return 0;
}

}  // namespace

int VLIBShareIsEncryptedGet(PCORVSHARE share, int* flag) {
    return flagOf(share, flag, &CORVSHARE::encrypted);
}

int VLIBShareIsWinShareGet(PCORVSHARE share, int* flag) {
    return flagOf(share, flag, &CORVSHARE::aclMode);
}

int VLIBShareIsSkipSmbPermGet(PCORVSHARE share, int* flag) {
    return flagOf(share, flag, &CORVSHARE::skipSmbPerm);
}

int CORVShareBinPathGet(const char* volume, char* buffer, int size) {
    char parsed[4096];
    if (volume == nullptr || buffer == nullptr || VolumePathParseEx(volume, parsed) != 0 ||
        strcmp(parsed, volume) != 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (snprintf(buffer, size, "%s", parsed) >= size) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    return 0;
}

int CORVShareDefaultShareCreate(const char* name, const char* path, int /*flags*/) {
    char volume[4096];
    if (!CORVShareNameIsValid(name) || path == nullptr || VolumePathParseEx(path, volume) != 0 ||
        std::string(volume) + "/" + name != path) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    CORVMOUNTVOLINFO info;
    if (CORVMountVolInfoGet(volume, &info) != 0 || !info.ready) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    PCORVSHARE existing = nullptr;
    if (CORVShareGet(name, &existing) == 0) {
        CORVShareFree(existing);
        VLIBCErrSet(ERR_SHARE_EXISTS);
        return -1;
    }
    struct stat st;
    if (lstat(path, &st) == 0 && !S_ISDIR(st.st_mode)) {
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return -1;
    }
    if (CORVFSMkdirP(path, nullptr, 0, 0, 0, 0770) != 0 || chmod(path, 0770) != 0) {
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return -1;
    }
    CORVSHARE share;
    share.name = name;
    share.path = path;
    if (writeEntry(share, false) != 0) {
        return -1;
    }
    return applyAcl(share);
}

int CORVVolumeServiceVolumeDecide(const char* /*name*/, char* buffer, int size) {
    if (buffer == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    CORVMOUNTVOLINFO* list = CORVMountVolAllEnum(nullptr, 0xFF, nullptr);
    int found = 0;
    for (CORVMOUNTVOLINFO* v = list; v != nullptr && found == 0; v = v->next) {
        if (v->ready && snprintf(buffer, size, "%s", v->szMountPath) < size) {
            found = 1;
        }
    }
    CORVMountVolInfoFree(list);
    return found;
}

int CORVShareSetAcl(PCORVSHARE share, int type, const char* user, int level) {
    if (share == nullptr || type != 1 || user == nullptr || level < 0 || level > 2) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (!userExists(user)) {
        VLIBCErrSet(ERR_NO_SUCH_USER);
        return -1;
    }
    std::vector<std::string> lists[3] = {splitList(share->naList), splitList(share->roList),
                                         splitList(share->rwList)};
    for (auto& list : lists) {
        list.erase(std::remove(list.begin(), list.end(), user), list.end());
    }
    lists[level].push_back(user);
    auto join = [](const std::vector<std::string>& list) {
        std::string out;
        for (const std::string& item : list) {
            out += (out.empty() ? "" : ",") + item;
        }
        return out;
    };
    share->naList = join(lists[0]);
    share->roList = join(lists[1]);
    share->rwList = join(lists[2]);
    return CORVShareUpdate(share);
}

int VLIBSharePrivListGet(PCORVSHARE share, std::string* na, std::string* rw, std::string* ro) {
    if (share == nullptr || na == nullptr || rw == nullptr || ro == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    *na = share->naList;
    *rw = share->rwList;
    *ro = share->roList;
    return 0;
}

int VLIBSharePrivListSet(PCORVSHARE share, const char* na, const char* rw, const char* ro) {
    if (share == nullptr || na == nullptr || rw == nullptr || ro == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    share->naList = na;
    share->rwList = rw;
    share->roList = ro;
    return 0;
}

int CORVShareUpdate(PCORVSHARE share) {
    if (share == nullptr || !CORVShareNameIsValid(share->name.c_str())) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (writeEntry(*share, true) != 0) {
        return -1;
    }
    return applyAcl(*share);
}

int VLIBUserRealNameGet(const char* name, char* buffer, int size) {
    if (name == nullptr || buffer == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    // A user name of the local accounts: no separators, blanks or control characters.
    for (const char* p = name; *p != '\0'; ++p) {
        const unsigned char c = static_cast<unsigned char>(*p);
        if (c <= ' ' || c == ',' || c == ':' || c == '/' || c == 0x7f) {
            VLIBCErrSet(ERR_NO_SUCH_USER);
            return -1;
        }
    }
    struct passwd pwd;
    struct passwd* found = nullptr;
    std::vector<char> work(16384);
    if (name[0] == '\0' || getpwnam_r(name, &pwd, work.data(), work.size(), &found) != 0 ||
        found == nullptr) {
        VLIBCErrSet(ERR_NO_SUCH_USER);
        return -1;
    }
    if (snprintf(buffer, size, "%s", found->pw_name) >= size) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    return 0;
}
