// Small JSON documents on disk that several processes read and change: task records and
// the application privilege store. Readers never lock: every change is a whole new file
// renamed into place. Writers serialise through an flock of a lock file of their own.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>

namespace corvplat {

// An exclusive flock of `path` (created when missing), held for the object's life.
class FileLock {
  public:
    // Waits up to `seconds`. ok() tells whether the lock was taken; on failure the error
    // slot says why.
    FileLock(const std::string& path, int seconds);
    ~FileLock();
    FileLock(const FileLock&) = delete;
    FileLock& operator=(const FileLock&) = delete;
    bool ok() const { return fd_ >= 0; }

  private:
    int fd_ = -1;
};

enum class JsonRead { kOk, kMissing, kBad };

// Reads `path` as one JSON value. kMissing when there is no such file (the value is then
// null), kBad when it cannot be read or is no valid JSON (error slot set, line logged).
JsonRead readJsonFile(const std::string& path, Json::Value& value);

// Replaces `path` by `value` written to a temporary file beside it and renamed over it,
// with `mode`. The directory must exist. False with the error slot set on failure; the
// old file is then untouched.
bool writeJsonFile(const std::string& path, const Json::Value& value, mode_t mode);

}  // namespace corvplat
