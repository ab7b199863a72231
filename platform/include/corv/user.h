// Users and groups of the reference platform: the system's own accounts.
#pragma once

#include <sys/types.h>

// The uid and primary gid of `user`. 0, or -1 with ERR_NO_SUCH_USER (0x1D00).
int CORVUserGetUGID(const char* user, uid_t* uid, gid_t* gid);
// The gid of `group`. 0, or -1 with ERR_NO_SUCH_GROUP (0x1800).
int CORVGroupGetGID(const char* group, gid_t* gid);
