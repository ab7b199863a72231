// Writing the pieces of a tar archive that corv-codesign adds itself: one regular file
// member in POSIX ustar form, block padding and the end of the archive.
#pragma once

#include <cstdint>
#include <string>

namespace codesign {

// The header block of a regular file owned by root, mode 0644. `name` must fit the
// ustar name field (at most 100 bytes).
std::string ustarFileHeader(const std::string& name, uint64_t size, int64_t mtime);
// Zero bytes that bring `size` to a whole number of blocks.
std::string blockPadding(uint64_t size);
// Two zero blocks, then zeros up to a multiple of the usual 10240-byte record, given
// that `written` bytes of the archive precede them.
std::string archiveEnd(uint64_t written);

}  // namespace codesign
