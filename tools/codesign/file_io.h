// Plain file access with errors as Failure exceptions, and files that are written under a
// temporary name and only take their final name when complete.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>

#include "unique_fd.h"

namespace codesign {

// Opens an existing file for reading; it must be a regular file.
UniqueFd openRegularFile(const std::string& path);
// Reads the whole file at `path`, refusing files larger than `limit` bytes.
std::string readSmallFile(const std::string& path, size_t limit);
// Reads up to `size` bytes; fewer only at the end of the file.
size_t readFully(int fd, char* buffer, size_t size, const std::string& what);
void writeFully(int fd, const char* data, size_t size, const std::string& what);
// Makes `path` a directory with `mode` unless it is one; parents must exist.
void makeDirectory(const std::string& path, mode_t mode);
bool isDirectory(const std::string& path);

// A file written beside its destination under a hidden temporary name. commit() renames it
// into place, atomically for readers of the destination; without commit() the temporary
// file is removed.
class PendingFile {
  public:
    explicit PendingFile(const std::string& destination, mode_t mode = 0644);
    ~PendingFile();
    PendingFile(const PendingFile&) = delete;
    PendingFile& operator=(const PendingFile&) = delete;

    int fd() const { return fd_.get(); }
    void write(const char* data, size_t size) { writeFully(fd_.get(), data, size, temporary_); }
    void write(const std::string& data) { write(data.data(), data.size()); }
    // Gives the file the permission bits and, where allowed, the owner of `reference`.
    void copyAttributes(int referenceFd);
    void commit();

  private:
    std::string destination_;
    std::string temporary_;
    UniqueFd fd_;
    bool committed_ = false;
};

// A private directory under /tmp, removed with its content when the object goes away.
class TempDirectory {
  public:
    TempDirectory();
    ~TempDirectory();
    TempDirectory(const TempDirectory&) = delete;
    TempDirectory& operator=(const TempDirectory&) = delete;
    const std::string& path() const { return path_; }

  private:
    std::string path_;
};

}  // namespace codesign
