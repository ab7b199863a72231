// The one way a file that matters is replaced, by the library and the platform alike.
#pragma once

#include <sys/types.h>

#include <functional>
#include <string>

// Replaces the file `path` by `content` in one step for every reader: the text goes to a
// hidden temporary file beside it, created private and given `mode` before it takes the
// name (an own-file of 0600 is never readable by others, not even for a moment), every
// write is checked and flushed, `check` (when given) may still refuse the written file by
// its path, and a rename puts it in place. False with the error slot set
// (ERR_NO_SPACE on a full file system) and a log line; the old file is then untouched and
// no temporary file stays.
bool CORVFileReplace(const std::string& path, const std::string& content, mode_t mode,
                     const std::function<bool(const char* written)>& check = nullptr);
