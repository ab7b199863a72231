#include "io_util.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>

#include "corv/file_replace.h"
#include "corv/log.h"
#include "corv/vlibc.h"

namespace corvplat {

namespace {

// A temporary file that disappears unless it was renamed into place.
class TempPath {
  public:
    explicit TempPath(std::string path) : path_(std::move(path)) {}
    ~TempPath() {
        if (!path_.empty()) {
            unlink(path_.c_str());
        }
    }
    TempPath(const TempPath&) = delete;
    TempPath& operator=(const TempPath&) = delete;
    void release() { path_.clear(); }

  private:
    std::string path_;
};

}  // namespace

bool writeAll(int fd, const char* data, size_t size) {
    while (size > 0) {
        ssize_t n = write(fd, data, size);
        if (n < 0 && errno == EINTR) {
            continue;
        }
        if (n <= 0) {
            return false;
        }
        data += n;
        size -= static_cast<size_t>(n);
    }
    return true;
}

int spaceOr(int err, int otherwise) {
    return (err == ENOSPC || err == EDQUOT) ? ERR_NO_SPACE : otherwise;
}

bool readWhole(const char* path, size_t limit, std::string& text, bool* missing) {
    if (missing) {
        *missing = false;
    }
    // O_NONBLOCK: a named pipe in a file's place must not stall the open.
    UniqueFd fd(open(path, O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (fd.get() < 0) {
        if (errno == ENOENT && missing) {
            *missing = true;
            text.clear();
            return true;
        }
        CORV_LOG_ERR("Failed to open %s, %m", path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return false;
    }
    struct stat st {};
    if (fstat(fd.get(), &st) != 0) {
        CORV_LOG_ERR("Failed to stat %s, %m", path);
        VLIBCErrSet(ERR_STAT_FAILED);
        return false;
    }
    if (S_ISDIR(st.st_mode)) {
        CORV_LOG_ERR("%s is a directory", path);
        VLIBCErrSet(ERR_IS_DIRECTORY);
        return false;
    }
    // A pipe, device or socket would be read forever or never answer: it counts as no file.
    if (!S_ISREG(st.st_mode)) {
        if (missing) {
            *missing = true;
            text.clear();
            return true;
        }
        CORV_LOG_ERR("%s is not a regular file", path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return false;
    }
    if (st.st_size > static_cast<off_t>(limit)) {
        CORV_LOG_ERR("%s is too large (%lld bytes)", path, static_cast<long long>(st.st_size));
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    // One byte beyond the stated size, so that the end shows in the first read; files
    // of /proc and the like state no size at all and grow the buffer.
    text.resize(st.st_size > 0 ? static_cast<size_t>(st.st_size) + 1 : 4096);
    size_t used = 0;
    for (;;) {
        if (used == text.size()) {
            if (used > limit) {
                CORV_LOG_ERR("%s grew too large while being read", path);
                VLIBCErrSet(ERR_READ_FAILED);
                return false;
            }
            text.resize(used * 2 > limit + 1 ? limit + 1 : used * 2);
        }
        ssize_t n = VLIBCRead(fd.get(), &text[used], text.size() - used);
        if (n < 0) {
            CORV_LOG_ERR("Failed to read %s, %m", path);
            VLIBCErrSet(ERR_READ_FAILED);
            return false;
        }
        if (n == 0) {
            break;
        }
        used += static_cast<size_t>(n);
    }
    if (used > limit) {
        CORV_LOG_ERR("%s is too large", path);
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    text.resize(used);
    return true;
}

bool replaceWhole(const std::string& target, const std::string& content, mode_t mode,
                  const struct stat* owner, const std::function<bool(const char* written)>& check) {
    // A hidden name that no reader of the directory takes for a document.
    const size_t slash = target.rfind('/');
    std::string tmp = slash == std::string::npos
                          ? "." + target
                          : target.substr(0, slash + 1) + "." + target.substr(slash + 1);
    tmp += ".XXXXXX";
    UniqueFd fd(mkostemp(&tmp[0], O_CLOEXEC));
    if (fd.get() < 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to create a temporary file for %s, %m", target.c_str());
        VLIBCErrSet(spaceOr(err, ERR_CREATE_FAILED));
        return false;
    }
    TempPath cleanup(tmp);
    if (!writeAll(fd.get(), content.data(), content.size()) || fsync(fd.get()) != 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to write %s, %m", tmp.c_str());
        VLIBCErrSet(spaceOr(err, ERR_WRITE_FAILED));
        return false;
    }
    if (fchmod(fd.get(), mode) != 0) {
        CORV_LOG_ERR("Failed to chmod %s, %m", tmp.c_str());
        VLIBCErrSet(ERR_CHOWN_FAILED);
        return false;
    }
    // Only root can give the file back to its owner; anyone else owns what it writes.
    if (owner != nullptr && (owner->st_uid != geteuid() || owner->st_gid != getegid()) &&
        fchown(fd.get(), owner->st_uid, owner->st_gid) != 0 && geteuid() == 0) {
        CORV_LOG_ERR("Failed to chown %s, %m", tmp.c_str());
    }
    if (fd.reset() != 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to close %s, %m", tmp.c_str());
        VLIBCErrSet(spaceOr(err, ERR_WRITE_FAILED));
        return false;
    }
    if (check && !check(tmp.c_str())) {
        return false;
    }
    if (rename(tmp.c_str(), target.c_str()) != 0) {
        CORV_LOG_ERR("Failed to rename %s to %s, %m", tmp.c_str(), target.c_str());
        VLIBCErrSet(ERR_RENAME_FAILED);
        return false;
    }
    cleanup.release();
    return true;
}

}  // namespace corvplat

bool CORVFileReplace(const std::string& path, const std::string& content, mode_t mode,
                     const std::function<bool(const char* written)>& check) {
    return corvplat::replaceWhole(path, content, mode, nullptr, check);
}
