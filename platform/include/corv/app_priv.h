// Application privileges of the desktop, group membership and the directory services, as
// the reference platform provides them on plain Linux.
//
// Every function follows the conventions of corv/vlibc.h: a failure returns a negative
// number and leaves its cause in the calling thread's error slot; nothing throws.
#pragma once

#include "corv/vlibc.h"

// ---------------------------------------------------------------------------------------
// The privilege store: who may open which desktop application.
//
// One JSON file, APP_PRIV_STORE_PATH:
//   {
//     "users":  { "<user>":  { "allow": ["<app id>", ...], "deny": ["<app id>", ...] } },
//     "groups": { "<group>": { "allow": [...],              "deny": [...] } }
//   }
// Every member is optional; a missing file is an empty store. An application appears at
// most once per user or group, in "allow" or in "deny": a grant moves it out of "deny",
// a denial out of "allow". Arrays keep the order of the first grant or denial.
// Names are not checked against the account databases, since directory users and groups
// ("administrators@example.com", domain groups) are no local accounts; they must be
// non-empty and free of control characters, as must application ids.
// A change rereads the store, applies itself and writes a temporary file renamed over the
// store (mode 0644), all under an flock of APP_PRIV_LOCK_PATH, so that concurrent changes
// of different processes are all kept. A change that is already in place writes nothing.
// A store that is no JSON object of this shape is left alone: changes then fail with
// ERR_READ_FAILED (not JSON) or ERR_MALFORMED (wrong shape).
#define APP_PRIV_STORE_PATH "/usr/corv/etc/appprivilege.json"
#define APP_PRIV_LOCK_PATH "/usr/corv/etc/.appprivilege.json.lock"

// Allows `app` to `user`. 0, or -1.
int VLIBAppPrivUserAddOne(const char* user, const char* app);
// Allows `app` to the members of `group`. 0, or -1.
int VLIBAppPrivGroupAddOne(const char* group, const char* app);
// Denies `app` to the members of `group`. 0, or -1.
int VLIBAppPrivGroupDenyOne(const char* group, const char* app);

// ---------------------------------------------------------------------------------------
// Group membership, from the system's account databases (getgrnam, getpwent).

// The group whose members administer the system.
#define CORV_ADMIN_GROUP "administrators"

// 1 when `user` is a member of CORV_ADMIN_GROUP (listed in the group, or the group is the
// user's primary group), 0 when not. -1 with ERR_NO_SUCH_USER for an unknown user,
// ERR_NO_SUCH_GROUP when the system has no such group, ERR_BAD_PARAMETERS for a null or
// empty name. `flags` is accepted and ignored.
int VLIBGroupIsAdminGroupMem(const char* user, int flags);

// Appends the members of the system group `group` to `*list`: the names the group lists,
// then the users whose primary group it is, each name once. Returns the number appended,
// or -1: ERR_NO_SUCH_GROUP (0x1800) for an unknown group, ERR_BAD_PARAMETERS for a null
// argument, ERR_OUT_OF_MEMORY.
int CORVGroupListMember(const char* group, PVLIBSZLIST* list);

// ---------------------------------------------------------------------------------------
// Directory services: whether the device is bound to an LDAP server or has joined a
// Windows domain.
//
// The state is a key-value file (format of VLIBCFileGetKeyValue), CORV_DIRECTORY_CONF:
//   ldap_bound="yes"                 bound to LDAP; any other value or none: not bound
//   ldap_suffix="example.com"        the LDAP login suffix (user@suffix)
//   wins_joined="yes"                joined to a Windows domain; otherwise not
//   domain_admin_groups="A,B"        the domain's administrator groups, comma-separated
//   domain_admin_users="X,Y"         the domain's administrator users, comma-separated
// A missing file means neither bound nor joined. Blanks around list items are dropped.
#define CORV_DIRECTORY_CONF "/usr/corv/etc/directory.conf"

// 1 when bound to LDAP, else 0 (also when the file cannot be read; that is logged).
int CORVLDAPIsBinded();
// The login suffix into `buffer` of `size` bytes. The suffix's length, or -1:
// ERR_NOT_APPLICABLE when not bound, ERR_KEY_NOT_FOUND when no suffix is set,
// ERR_BUF_TOO_SMALL when it does not fit (a cut suffix would name another group),
// ERR_BAD_PARAMETERS.
int CORVLDAPLoginSuffixGet(char* buffer, int size);
// 1 when joined to a Windows domain, else 0 (also when the file cannot be read).
int CORVWinsIsJoined();
// Appends the domain's administrator groups to `*groups` and, when `users` is not null,
// its administrator users to `*users`. Returns the number of groups appended, or -1:
// ERR_NOT_APPLICABLE when not joined, ERR_READ_FAILED, ERR_BAD_PARAMETERS.
int CORVGroupDomainAdminListGet(PVLIBSZLIST* groups, PVLIBSZLIST* users);
