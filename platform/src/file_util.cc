// Existence checks, directory listings, reads and directory creation.
#include <dirent.h>
#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

class DirHandle {
  public:
    explicit DirHandle(const char* path) : dir_(opendir(path)) {}
    ~DirHandle() {
        if (dir_ != nullptr) {
            closedir(dir_);
        }
    }
    DirHandle(const DirHandle&) = delete;
    DirHandle& operator=(const DirHandle&) = delete;
    DIR* get() const { return dir_; }

  private:
    DIR* dir_;
};

bool endsWith(const char* name, const char* suffix, size_t suffixLen) {
    size_t len = strlen(name);
    return len >= suffixLen && memcmp(name + len - suffixLen, suffix, suffixLen) == 0;
}

bool isDirectory(const char* path) {
    struct stat st {};
    return stat(path, &st) == 0 && S_ISDIR(st.st_mode);
}

int mkdirError(int err) {
    return (err == ENOSPC || err == EDQUOT) ? ERR_NO_SPACE : ERR_MKDIR_FAILED;
}

// One level: 1 when made here, 0 when a directory was already there, -1 on failure.
int makeLevel(const std::string& path, int uid, int gid, mode_t mode) {
    if (mkdir(path.c_str(), mode) != 0) {
        int err = errno;
        // Another process may have made it between our checks: that is success too.
        if (err == EEXIST && isDirectory(path.c_str())) {
            return 0;
        }
        errno = err;
        CORV_LOG_ERR("Failed to mkdir %s, %m", path.c_str());
        VLIBCErrSet(mkdirError(err));
        return -1;
    }
    // mkdir(2) filters the mode through the umask; the caller asked for this mode exactly.
    if (chmod(path.c_str(), mode & 07777) != 0) {
        CORV_LOG_ERR("Failed to chmod %s to %o, %m", path.c_str(), mode & 07777);
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return -1;
    }
    if ((uid != -1 || gid != -1) &&
        chown(path.c_str(), static_cast<uid_t>(uid), static_cast<gid_t>(gid)) != 0) {
        CORV_LOG_ERR("Failed to chown %s to %d:%d, %m", path.c_str(), uid, gid);
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return -1;
    }
    return 1;
}

}  // namespace

int VLIBCFileExist(const char* path) {
    struct stat st {};
    return path != nullptr && stat(path, &st) == 0 && !S_ISDIR(st.st_mode) ? 1 : 0;
}

int VLIBCFileCheckDir(const char* path) {
    return path != nullptr && isDirectory(path) ? 1 : 0;
}

int VLIBCFileEnumDir(const char* dir, const char* suffix, PVLIBSZLIST* list, int) {
    if (dir == nullptr || list == nullptr || *list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    DirHandle handle(dir);
    if (handle.get() == nullptr) {
        int err = errno;
        CORV_LOG_ERR("Failed to open directory %s, %m", dir);
        VLIBCErrSet(err == ENOENT ? ERR_NO_SUCH_FILE : ERR_OPEN_FAILED);
        return -1;
    }
    const size_t suffixLen = suffix ? strlen(suffix) : 0;
    std::vector<std::string> names;
    errno = 0;
    while (struct dirent* entry = readdir(handle.get())) {
        const char* name = entry->d_name;
        if (strcmp(name, ".") == 0 || strcmp(name, "..") == 0) {
            continue;
        }
        if (suffixLen == 0 || endsWith(name, suffix, suffixLen)) {
            names.emplace_back(name);
        }
    }
    if (errno != 0) {
        CORV_LOG_ERR("Failed to read directory %s, %m", dir);
        VLIBCErrSet(ERR_READ_FAILED);
        return -1;
    }
    std::sort(names.begin(), names.end());
    for (const std::string& name : names) {
        if (VLIBCSzListPush(list, name.c_str()) != 0) {
            return -1;
        }
    }
    return static_cast<int>(names.size());
}

ssize_t VLIBCRead(int fd, void* buffer, size_t size) {
    ssize_t n;
    do {
        n = read(fd, buffer, size);
    } while (n < 0 && errno == EINTR);
    if (n < 0) {
        VLIBCErrSet(ERR_READ_FAILED);
    }
    return n;
}

int CORVFSMkdirP(const char* path, const char*, int parents, int uid, int gid, mode_t mode) {
    if (path == nullptr || path[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string target(path);
    while (target.size() > 1 && target.back() == '/') {
        target.pop_back();
    }
    if (isDirectory(target.c_str())) {
        return 0;
    }
    if (!parents) {
        return makeLevel(target, uid, gid, mode) < 0 ? -1 : 0;
    }
    // Walk down from the root; each level ends before a '/' or at the end of the path.
    size_t pos = 0;
    while (pos != std::string::npos) {
        pos = target.find('/', pos + 1);
        std::string level = target.substr(0, pos);
        if (level.empty() || level.back() == '/' || isDirectory(level.c_str())) {
            continue;  // the root, a doubled slash, or a level that is there already
        }
        // Levels above the last stay open for traversal, as with mkdir -p -m: a private
        // folder deep in a shared tree must not close the tree to its owner.
        const bool last = pos == std::string::npos;
        if (makeLevel(level, last ? uid : -1, last ? gid : -1, last ? mode : (mode | 0755)) < 0) {
            return -1;
        }
    }
    return 0;
}

int CORVEAIsHiddenDir(const char* name) {
    return name != nullptr && strcmp(name, CORV_EA_DIR_NAME) == 0 ? 1 : 0;
}
