#include "file_io.h"

#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <system_error>

#include "exit_status.h"

namespace codesign {

namespace {

std::string errorText(const std::string& what, const std::string& path) {
    return what + " " + path + ": " + strerror(errno);
}

}  // namespace

UniqueFd openRegularFile(const std::string& path) {
    UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY));
    if (!fd) {
        throw Failure(errorText("cannot open", path));
    }
    struct stat st;
    if (fstat(fd.get(), &st) != 0) {
        throw Failure(errorText("cannot stat", path));
    }
    if (!S_ISREG(st.st_mode)) {
        throw Failure(path + " is not a regular file");
    }
    return fd;
}

std::string readSmallFile(const std::string& path, size_t limit) {
    UniqueFd fd = openRegularFile(path);
    std::string content;
    char buffer[8192];
    for (;;) {
        size_t n = readFully(fd.get(), buffer, sizeof(buffer), path);
        content.append(buffer, n);
        if (content.size() > limit) {
            throw Failure(path + " is larger than " + std::to_string(limit) + " bytes");
        }
        if (n < sizeof(buffer)) {
            return content;
        }
    }
}

size_t readFully(int fd, char* buffer, size_t size, const std::string& what) {
    size_t done = 0;
    while (done < size) {
        ssize_t n = read(fd, buffer + done, size - done);
        if (n < 0 && errno == EINTR) {
            continue;
        }
        if (n < 0) {
            throw Failure(errorText("cannot read", what));
        }
        if (n == 0) {
            break;
        }
        done += static_cast<size_t>(n);
    }
    return done;
}

void writeFully(int fd, const char* data, size_t size, const std::string& what) {
    while (size > 0) {
        ssize_t n = ::write(fd, data, size);
        if (n < 0 && errno == EINTR) {
            continue;
        }
        if (n < 0) {
            throw Failure(errorText("cannot write", what));
        }
        data += n;
        size -= static_cast<size_t>(n);
    }
}

void makeDirectory(const std::string& path, mode_t mode) {
    if (mkdir(path.c_str(), mode) == 0 || (errno == EEXIST && isDirectory(path))) {
        return;
    }
    throw Failure(errorText("cannot create the directory", path));
}

bool isDirectory(const std::string& path) {
    struct stat st;
    return stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

PendingFile::PendingFile(const std::string& destination, mode_t mode) : destination_(destination) {
    const size_t slash = destination.rfind('/');
    const std::string dir = slash == std::string::npos ? "." : destination.substr(0, slash + 1);
    const std::string base =
        slash == std::string::npos ? destination : destination.substr(slash + 1);
    std::string pattern = dir + (dir == "." ? "/." : ".") + base + ".XXXXXX";
    fd_.reset(mkostemp(pattern.data(), O_CLOEXEC));
    if (!fd_) {
        throw Failure(errorText("cannot create a temporary file beside", destination));
    }
    temporary_ = pattern;
    if (fchmod(fd_.get(), mode) != 0) {
        const std::string message = errorText("cannot set the mode of", temporary_);
        unlink(temporary_.c_str());  // no destructor runs for a constructor that throws
        throw Failure(message);
    }
}

PendingFile::~PendingFile() {
    if (!committed_) {
        unlink(temporary_.c_str());
    }
}

void PendingFile::copyAttributes(int referenceFd) {
    struct stat st;
    if (fstat(referenceFd, &st) != 0) {
        throw Failure(errorText("cannot stat the original of", destination_));
    }
    if (fchmod(fd_.get(), st.st_mode & 07777) != 0) {
        throw Failure(errorText("cannot set the mode of", temporary_));
    }
    // Only root may give the file away; anyone else keeps a file of their own, as with any
    // program that rewrites a file by renaming.
    if (geteuid() == 0) {
        if (fchown(fd_.get(), st.st_uid, st.st_gid) != 0) {
            throw Failure(errorText("cannot set the owner of", temporary_));
        }
    }
}

void PendingFile::commit() {
    if (fsync(fd_.get()) != 0) {
        throw Failure(errorText("cannot write", temporary_));
    }
    fd_.reset();
    if (rename(temporary_.c_str(), destination_.c_str()) != 0) {
        throw Failure(errorText("cannot rename the new file to", destination_));
    }
    committed_ = true;
}

TempDirectory::TempDirectory() {
    char pattern[] = "/tmp/corv-codesign.XXXXXX";
    if (mkdtemp(pattern) == nullptr) {
        throw Failure(errorText("cannot create a temporary directory in", "/tmp"));
    }
    path_ = pattern;
}

TempDirectory::~TempDirectory() {
    std::error_code ignored;  // a leftover under /tmp is harmless; never throw from here
    std::filesystem::remove_all(path_, ignored);
}

}  // namespace codesign
