#include "account_db.h"

#include <errno.h>
#include <pwd.h>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace corvplat {

int lookUpGroup(const char* name, GroupEntry& entry) {
    for (size_t size = kFirstAccountBuffer; size <= kMaxAccountBuffer; size *= 2) {
        entry.storage.resize(size);
        struct group* found = nullptr;
        int rc = getgrnam_r(name, &entry.gr, entry.storage.data(), size, &found);
        if (rc == ERANGE) {
            continue;
        }
        if (rc != 0) {
            errno = rc;
            CORV_LOG_ERR("getgrnam_r(%s) failed, %m", name);
            VLIBCErrSet(ERR_READ_FAILED);
            return -1;
        }
        return found != nullptr ? 1 : 0;
    }
    CORV_LOG_ERR("Group %s is too large to read", name);
    VLIBCErrSet(ERR_OUT_OF_MEMORY);
    return -1;
}

int lookUpUser(const char* name, uid_t* uid, gid_t* gid) {
    for (size_t size = kFirstAccountBuffer; size <= kMaxAccountBuffer; size *= 2) {
        std::vector<char> storage(size);
        struct passwd pw {};
        struct passwd* found = nullptr;
        int rc = getpwnam_r(name, &pw, storage.data(), size, &found);
        if (rc == ERANGE) {
            continue;
        }
        if (rc != 0) {
            errno = rc;
            CORV_LOG_ERR("getpwnam_r(%s) failed, %m", name);
            VLIBCErrSet(ERR_READ_FAILED);
            return -1;
        }
        if (found == nullptr) {
            return 0;
        }
        if (uid) {
            *uid = pw.pw_uid;
        }
        if (gid) {
            *gid = pw.pw_gid;
        }
        return 1;
    }
    CORV_LOG_ERR("User %s is too large to read", name);
    VLIBCErrSet(ERR_OUT_OF_MEMORY);
    return -1;
}

}  // namespace corvplat
