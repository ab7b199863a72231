// The MD5 of a file by /usr/bin/openssl, in two halves, so that the hashing runs beside
// other work of the caller (on another core) instead of before it.
#pragma once

#include <stdio.h>

#include <string>

namespace CORVPackageTool {

class PendingChecksum {
  public:
    PendingChecksum() = default;
    ~PendingChecksum();
    PendingChecksum(const PendingChecksum&) = delete;
    PendingChecksum& operator=(const PendingChecksum&) = delete;

    // Runs `/usr/bin/openssl md5 <path>`. False when the file is missing or the tool
    // cannot be started.
    bool start(const char* path);
    // Waits for the tool and gives whether the checksum it printed is exactly `expected`
    // (so the INFO key must be in the tool's lower case). False when nothing was started.
    bool matches(const char* expected);

  private:
    FILE* out_ = nullptr;
    std::string path_;
};

}  // namespace CORVPackageTool
