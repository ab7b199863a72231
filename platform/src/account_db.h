// Lookups in the system's account databases with buffers that grow until a record fits:
// a group of many members does not fit the size sysconf suggests.
#pragma once

#include <grp.h>
#include <stddef.h>
#include <sys/types.h>

#include <vector>

namespace corvplat {

constexpr size_t kFirstAccountBuffer = 16384;
constexpr size_t kMaxAccountBuffer = 16 * 1024 * 1024;

// A group as getgrnam_r gives it, with the storage its strings point into.
struct GroupEntry {
    struct group gr {};
    std::vector<char> storage;
};

// 1 found, 0 no such group, -1 lookup failure (error slot set, line logged).
int lookUpGroup(const char* name, GroupEntry& entry);
// 1 found (uid and primary gid filled where not null), 0 no such user, -1 failure.
int lookUpUser(const char* name, uid_t* uid, gid_t* gid);

}  // namespace corvplat
