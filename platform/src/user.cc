// Users and groups are the system's own accounts.
#include "corv/user.h"

#include "account_db.h"
#include "corv/vlibc.h"

int CORVUserGetUGID(const char* user, uid_t* uid, gid_t* gid) {
    if (user == nullptr || user[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    int found = corvplat::lookUpUser(user, uid, gid);
    if (found <= 0) {
        if (found == 0) {
            VLIBCErrSet(ERR_NO_SUCH_USER);
        }
        return -1;
    }
    return 0;
}

int CORVGroupGetGID(const char* group, gid_t* gid) {
    if (group == nullptr || group[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    corvplat::GroupEntry entry;
    int found = corvplat::lookUpGroup(group, entry);
    if (found <= 0) {
        if (found == 0) {
            VLIBCErrSet(ERR_NO_SUCH_GROUP);
        }
        return -1;
    }
    if (gid)
        *gid = entry.gr.gr_gid;
    return 0;
}
