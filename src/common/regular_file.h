// Opening files that a package or a user hands us. Such a path can name a named pipe, a
// device or a socket, whose open or read would block or never end: only regular files
// are opened, and anything else counts as missing.
#pragma once

#include <string>

#include "common/unique_fd.h"

namespace CORVPackageTool {

// `path` opened for reading when it is a regular file (links followed). An invalid fd
// otherwise, with errno ENOENT for anything that is not a regular file.
UniqueFd PMSOpenRegularFile(const std::string& path);

// Whether `path` is a regular file (links followed).
bool PMSIsRegularFile(const std::string& path);

// The whole regular file at `path` into `content`. False when it is missing, not a
// regular file, or cannot be read.
bool PMSReadRegularFile(const std::string& path, std::string& content);

}  // namespace CORVPackageTool
