// Whether a path has an extended POSIX ACL.
#include "corv/acl.h"

#include <errno.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

constexpr const char kAccessAcl[] = "system.posix_acl_access";
// The kernel's xattr form of an ACL: a 4-byte version header, then 8 bytes per entry.
constexpr ssize_t kAclHeaderSize = 4;
constexpr ssize_t kAclEntrySize = 8;
constexpr ssize_t kMinimalEntries = 3;

}  // namespace

int CORVACLIsSupport(const char* path, int, int) {
    if (path == nullptr || path[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    struct stat st {};
    if (stat(path, &st) != 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to stat %s, %m", path);
        VLIBCErrSet(err == ENOENT || err == ENOTDIR ? ERR_NO_SUCH_FILE : ERR_STAT_FAILED);
        return -1;
    }
    ssize_t size = getxattr(path, kAccessAcl, nullptr, 0);
    if (size < 0) {
        // ENODATA: no ACL; ENOTSUP: the file system has none. Either way only the mode
        // bits rule.
        return 0;
    }
    return size > kAclHeaderSize + kMinimalEntries * kAclEntrySize ? 1 : 0;
}
