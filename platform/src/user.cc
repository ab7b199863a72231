// Users and groups are the system's own accounts.
#include "corv/user.h"

#include <grp.h>
#include <pwd.h>

#include <vector>

#include "corv/vlibc.h"

int CORVUserGetUGID(const char* user, uid_t* uid, gid_t* gid) {
    if (user == nullptr || user[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::vector<char> buf(16384);
    struct passwd pw {};
    struct passwd* found = nullptr;
    if (getpwnam_r(user, &pw, buf.data(), buf.size(), &found) != 0 || found == nullptr) {
        VLIBCErrSet(ERR_NO_SUCH_USER);
        return -1;
    }
    if (uid)
        *uid = pw.pw_uid;
    if (gid)
        *gid = pw.pw_gid;
    return 0;
}

int CORVGroupGetGID(const char* group, gid_t* gid) {
    if (group == nullptr || group[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::vector<char> buf(65536);
    struct group gr {};
    struct group* found = nullptr;
    if (getgrnam_r(group, &gr, buf.data(), buf.size(), &found) != 0 || found == nullptr) {
        VLIBCErrSet(ERR_NO_SUCH_GROUP);
        return -1;
    }
    if (gid)
        *gid = gr.gr_gid;
    return 0;
}
