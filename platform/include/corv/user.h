// Users and groups of the reference platform: the system's own accounts, changed through
// Debian's shadow tools (/usr/sbin/useradd, /usr/sbin/groupadd, /usr/bin/gpasswd).
//
// Reserved accounts are those a package may never take as its own: the ids Debian
// allocates statically (below 100) and nobody/nogroup (65534), plus the appliance's
// built-in accounts ("admin", "guest"; the groups "administrators", "users",
// "CorvelGuests", and "system", which the platform set-up adds with group id 1).
// Package users are system users (ids 100-999) and so are never reserved.
#pragma once

#include <sys/types.h>

// The uid and primary gid of `user`. 0, or -1 with ERR_NO_SUCH_USER (0x1D00).
int CORVUserGetUGID(const char* user, uid_t* uid, gid_t* gid);
// The gid of `group`. 0, or -1 with ERR_NO_SUCH_GROUP (0x1800).
int CORVGroupGetGID(const char* group, gid_t* gid);

// True when the account belongs to the system (see above). A null name is judged by the
// id alone.
bool CORVUserIsReserved(const char* user, uid_t uid);
bool CORVGroupIsReserved(const char* group, gid_t gid);

// A group with its supplementary members. Owned by the caller once CORVGroupGet filled
// it; every string and the member array are malloc'd and released by CORVGroupFree.
typedef struct _tag_CORVGROUP_ {
    char* name;
    gid_t gid;
    unsigned int nMember;
    char** ppszMember;  // nMember user names
} CORVGROUP, *PCORVGROUP;

// Reads `group` into a new CORVGROUP. 0, or -1 with ERR_NO_SUCH_GROUP (0x1800) or
// ERR_BAD_PARAMETERS; *out is then null.
int CORVGroupGet(const char* group, PCORVGROUP* out);
// Frees what CORVGroupGet returned; null is allowed.
void CORVGroupFree(PCORVGROUP group);
// Makes the supplementary members of group `name` exactly those of `group`. 0, or -1 with
// ERR_NO_SUCH_GROUP or ERR_WRITE_FAILED (the tool's exit is logged).
int CORVLocalAccountGroupSet(const char* name, const PCORVGROUP group);
// Makes sure the local group `group` and the local user `user` exist for a package: a
// missing group is created as a system group, a missing user as a system user without a
// login shell, whose primary group is `group` and whose home is `home` (not created).
// Existing accounts are left as they are. 0, or -1 with ERR_BAD_PARAMETERS or
// ERR_CREATE_FAILED.
int CORVLocalAccountUserPrepareForPkg(const char* user, const char* group, const char* home);
