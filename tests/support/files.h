// Small file helpers for tests that build package directories and system files.
#pragma once

#include <sys/types.h>

#include <string>
#include <utility>
#include <vector>

namespace testutil {

// Writes `content` to `path`, creating the parent directories; a symbolic link at `path`
// is replaced by the file, not written through. Aborts the test program when the file
// cannot be written: every later assertion would be meaningless.
void writeFile(const std::string& path, const std::string& content);
std::string readFile(const std::string& path);
bool exists(const std::string& path);
void removeAll(const std::string& path);

// The permission bits (07777) of `path` itself, not of what a link at it points to; 0
// when there is nothing at `path`.
mode_t modeOf(const std::string& path);
// "<uid>:<gid>" of `path` itself; "" when there is nothing at `path`.
std::string ownerOf(const std::string& path);

// An INFO text from key/value pairs, one `key="value"` line each, in the given order.
std::string infoText(const std::vector<std::pair<std::string, std::string>>& keys);

}  // namespace testutil
