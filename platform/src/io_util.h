// Small I/O helpers shared by the reference platform's sources.
#pragma once

#include <stddef.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <string>

namespace corvplat {

// Ownership of a file descriptor: closed when the object goes away.
class UniqueFd {
  public:
    explicit UniqueFd(int fd = -1) : fd_(fd) {}
    ~UniqueFd() { reset(); }
    UniqueFd(const UniqueFd&) = delete;
    UniqueFd& operator=(const UniqueFd&) = delete;
    int get() const { return fd_; }
    // Closes now and gives close(2)'s verdict, which can be the first word of ENOSPC.
    int reset() {
        int rc = fd_ >= 0 ? close(fd_) : 0;
        fd_ = -1;
        return rc;
    }
    // Gives the descriptor up to the caller.
    int release() {
        int fd = fd_;
        fd_ = -1;
        return fd;
    }

  private:
    int fd_;
};

// Writes all of `data`, retrying after interruptions and short writes. False on an error
// (errno says which).
bool writeAll(int fd, const char* data, size_t size);

// ERR_NO_SPACE when `err` says the file system is full, else `otherwise`.
int spaceOr(int err, int otherwise);

// The whole file at `path`, of at most `limit` bytes, in `text`. With `missing`, an
// absent file is an empty text and *missing says so; without, it is a failure. False with
// the error slot set (and a log line) when the file cannot be read, is a directory or
// is larger than `limit`.
bool readWhole(const char* path, size_t limit, std::string& text, bool* missing = nullptr);

// Replaces the file `target` by `content`: written to a hidden temporary file beside it,
// given `mode` (and the owner of `owner` when not null and this process may), flushed and
// renamed over it, so that a reader sees the old file or the new one and never a part.
// False with the error slot set (and a log line); the old file is then untouched.
bool replaceWhole(const std::string& target, const std::string& content, mode_t mode,
                  const struct stat* owner,
                  const std::function<bool(const char* written)>& check = nullptr);

}  // namespace corvplat
