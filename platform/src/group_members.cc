// Group membership from the system's account databases.
#include <errno.h>
#include <grp.h>
#include <pwd.h>
#include <string.h>

#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "account_db.h"
#include "corv/app_priv.h"
#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

// The names of the users whose primary group is `gid`. The enumeration of the password
// database has one cursor per process, hence the mutex.
bool usersWithPrimaryGroup(gid_t gid, std::vector<std::string>& names) {
    static std::mutex cursor;
    std::lock_guard<std::mutex> guard(cursor);
    std::vector<char> storage(corvplat::kFirstAccountBuffer);
    setpwent();
    bool ok = true;
    for (;;) {
        struct passwd pw {};
        struct passwd* found = nullptr;
        int rc = getpwent_r(&pw, storage.data(), storage.size(), &found);
        if (rc == ERANGE && storage.size() < corvplat::kMaxAccountBuffer) {
            storage.resize(storage.size() * 2);  // the same entry is read again
            continue;
        }
        if (rc == ENOENT || (rc == 0 && found == nullptr)) {
            break;
        }
        if (rc != 0) {
            errno = rc;
            CORV_LOG_ERR("getpwent_r failed, %m");
            VLIBCErrSet(ERR_READ_FAILED);
            ok = false;
            break;
        }
        if (pw.pw_gid == gid) {
            names.emplace_back(pw.pw_name);
        }
    }
    endpwent();
    return ok;
}

}  // namespace

int VLIBGroupIsAdminGroupMem(const char* user, int) {
    if (user == nullptr || user[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    gid_t primary = 0;
    int rc = corvplat::lookUpUser(user, nullptr, &primary);
    if (rc <= 0) {
        if (rc == 0) {
            VLIBCErrSet(ERR_NO_SUCH_USER);
        }
        return -1;
    }
    corvplat::GroupEntry admins;
    rc = corvplat::lookUpGroup(CORV_ADMIN_GROUP, admins);
    if (rc <= 0) {
        if (rc == 0) {
            VLIBCErrSet(ERR_NO_SUCH_GROUP);
        }
        return -1;
    }
    if (admins.gr.gr_gid == primary) {
        return 1;
    }
    for (char** member = admins.gr.gr_mem; member != nullptr && *member != nullptr; ++member) {
        if (strcmp(*member, user) == 0) {
            return 1;
        }
    }
    return 0;
}

int CORVGroupListMember(const char* group, PVLIBSZLIST* list) {
    if (group == nullptr || group[0] == '\0' || list == nullptr || *list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    corvplat::GroupEntry entry;
    int rc = corvplat::lookUpGroup(group, entry);
    if (rc <= 0) {
        if (rc == 0) {
            VLIBCErrSet(ERR_NO_SUCH_GROUP);
        }
        return -1;
    }
    std::vector<std::string> names;
    for (char** member = entry.gr.gr_mem; member != nullptr && *member != nullptr; ++member) {
        names.emplace_back(*member);
    }
    if (!usersWithPrimaryGroup(entry.gr.gr_gid, names)) {
        return -1;
    }
    std::set<std::string> seen;
    int count = 0;
    for (const std::string& name : names) {
        if (!seen.insert(name).second) {
            continue;
        }
        if (VLIBCSzListPush(list, name.c_str()) != 0) {
            return -1;
        }
        ++count;
    }
    return count;
}
