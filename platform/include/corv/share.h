// Shared folders of the reference platform.
//
// A share is a directory on a volume, "<volume>/<name>", owned by root with mode 0770, and
// its users' access is granted by POSIX ACL entries on it: "user:<u>:rwx" for read and
// write, "user:<u>:r-x" for read only, "user:<u>:---" for no access, each also as a
// default entry so that what is made inside inherits it. Read them back with getfacl.
//
// The platform keeps the shares in its registry /usr/corv/etc/shares.json, one JSON
// object (0644, replaced whole through a temporary file and rename, changed under the lock
// file /usr/corv/etc/shares.lock):
//   {"shares": {"<name>": {"path": "/volume1/<name>",
//                          "rw": ["user", ...], "ro": [...], "na": [...],
//                          "acl_mode": false, "skip_smb_perm": false,
//                          "encrypted": false}}}
// "rw", "ro" and "na" are the privilege lists (read and write, read only, no access);
// "acl_mode" marks a share whose permissions are set user by user (CORVShareSetAcl), the
// others are set from the lists as a whole (VLIBSharePrivListSet and CORVShareUpdate).
//
// Share names: 1 to 64 characters of letters, digits, blank and "_-.+@", not beginning
// with ".", "@" or a blank; anything else is refused with ERR_BAD_PARAMETERS, so that a name
// never leads out of its volume. Names compare exactly.
#pragma once

#include <string>
#include <vector>

enum {
    ERR_SHARE_EMPTY_TARGET = 0x1200,
    ERR_SHARE_EXISTS = 0x1300,
    ERR_SHARE_NOT_FOUND = 0x1400,
};

#define CORV_SHARE_REGISTRY "/usr/corv/etc/shares.json"

// One share as the registry holds it; the lists are comma-joined user names.
struct CORVSHARE {
    std::string name;
    std::string path;
    std::string naList;
    std::string rwList;
    std::string roList;
    bool aclMode = false;
    bool skipSmbPerm = false;
    bool encrypted = false;
};
typedef CORVSHARE* PCORVSHARE;

// Whether `name` may name a share (see above).
bool CORVShareNameIsValid(const char* name);
// The share `name` into a new record. 0, or -1 with ERR_SHARE_NOT_FOUND, ERR_BAD_PARAMETERS
// or ERR_READ_FAILED (registry unreadable); `*share` is then null.
int CORVShareGet(const char* name, PCORVSHARE* share);
void CORVShareFree(PCORVSHARE share);
// The names of all shares, sorted. Count, or -1.
int CORVShareEnum(std::vector<std::string>* names);
// 1 when the share's directory is there and can be entered, else 0.
int VLIBShareIsAccessible(const char* name);
int VLIBShareIsEncryptedGet(PCORVSHARE share, int* flag);  // 0, or -1 (null share)
int VLIBShareIsWinShareGet(PCORVSHARE share, int* flag);
int VLIBShareIsSkipSmbPermGet(PCORVSHARE share, int* flag);

// Where the shares of `volume` go: the volume's mount point. 0, or -1 (ERR_BAD_PARAMETERS
// for a path that is no volume, ERR_BUF_TOO_SMALL).
int CORVShareBinPathGet(const char* volume, char* buffer, int size);
// Makes the share `name` at `path`, which must be "<volume>/<name>" on a mounted volume:
// the directory (root, 0770, an existing directory is taken over) and its registry entry
// with empty lists. 0; -1 with ERR_SHARE_EXISTS when the registry has it,
// ERR_BAD_PARAMETERS for a bad name or path, ERR_MKDIR_FAILED, ERR_WRITE_FAILED.
int CORVShareDefaultShareCreate(const char* name, const char* path, int flags);
// The volume for a new share: the first ready volume, into `buffer`. 1, 0 when there is
// none, -1 on bad arguments.
int CORVVolumeServiceVolumeDecide(const char* name, char* buffer, int size);

// Sets one user's access on an ACL-mode share at once: `level` 2 read and write, 1 read
// only, 0 none; `type` 1 is a user (the only kind here). The user must exist
// (ERR_NO_SUCH_USER). 0, or -1.
int CORVShareSetAcl(PCORVSHARE share, int type, const char* user, int level);
// The privilege lists of the record, as comma-joined texts.
int VLIBSharePrivListGet(PCORVSHARE share, std::string* na, std::string* rw, std::string* ro);
// Replaces the record's lists (nothing is written until CORVShareUpdate).
int VLIBSharePrivListSet(PCORVSHARE share, const char* na, const char* rw, const char* ro);
// Writes the record to the registry and applies its lists to the directory as ACLs.
// Users that do not exist are left out of the ACL (they stay in the lists). 0, or -1 with
// ERR_SHARE_NOT_FOUND, ERR_NO_SUCH_FILE (directory gone), ERR_WRITE_FAILED.
int CORVShareUpdate(PCORVSHARE share);

// The real name of a user: `name` itself when such a local user exists. 0, or -1 with
// ERR_NO_SUCH_USER (also for a name with characters no user name has) or
// ERR_BUF_TOO_SMALL.
int VLIBUserRealNameGet(const char* name, char* buffer, int size);
