#include "common/regular_file.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>

#include "corv/vlibc.h"

namespace CORVPackageTool {

UniqueFd PMSOpenRegularFile(const std::string& path) {
    // O_NONBLOCK: the open of a FIFO without a writer returns at once instead of waiting.
    UniqueFd fd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
    if (!fd) {
        return fd;
    }
    struct stat st {};
    if (fstat(fd.get(), &st) != 0 || !S_ISREG(st.st_mode)) {
        errno = ENOENT;
        return UniqueFd();
    }
    // Reads of a regular file never block; clear the flag anyway for callers that pass
    // the descriptor on.
    int flags = fcntl(fd.get(), F_GETFL);
    if (flags >= 0) {
        fcntl(fd.get(), F_SETFL, flags & ~O_NONBLOCK);
    }
    return fd;
}

bool PMSIsRegularFile(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

bool PMSReadRegularFile(const std::string& path, std::string& content) {
    UniqueFd fd = PMSOpenRegularFile(path);
    if (!fd) {
        return false;
    }
    std::string data;
    // Sized once: a store's list is megabytes, and each regrowth copies it and touches
    // fresh pages.
    struct stat st {};
    if (fstat(fd.get(), &st) == 0 && st.st_size > 0) {
        data.reserve(static_cast<size_t>(st.st_size));
    }
    char block[65536];
    for (;;) {
        ssize_t n = VLIBCRead(fd.get(), block, sizeof(block));
        if (n < 0) {
            return false;
        }
        if (n == 0) {
            break;
        }
        data.append(block, static_cast<size_t>(n));
    }
    content.swap(data);
    return true;
}

}  // namespace CORVPackageTool
