// Helpers shared by the fuzz targets: a scratch directory that lives as long as the
// process, and whole-file writes.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include <string>

namespace fuzzutil {

// A directory of its own under $TMPDIR (or /tmp), made on first use and removed at exit.
const std::string& scratchDir();

// Replaces `path` with exactly `size` bytes of `data`; aborts when it cannot, since a
// target that silently reads stale input fuzzes nothing.
void writeWhole(const std::string& path, const uint8_t* data, size_t size);

// Empties `dir` without removing it.
void clearDir(const std::string& dir);

}  // namespace fuzzutil
