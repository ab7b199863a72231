// Access control lists on the reference platform: POSIX ACLs of the Linux file systems.
#pragma once

// Whether `path` (links followed) carries an access ACL beyond its mode bits: 1 when the
// attribute "system.posix_acl_access" is present with more than the three entries that
// the mode bits already say (owner, group, others), else 0 (no ACL, or a file system
// without ACLs). -1 when the path cannot be examined: ERR_NO_SUCH_FILE when it does not
// exist, ERR_STAT_FAILED otherwise, ERR_BAD_PARAMETERS for a null or empty path.
// The second and third arguments are accepted and ignored.
int CORVACLIsSupport(const char* path, int fd, int type);
