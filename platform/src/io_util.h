// Small I/O helpers shared by the reference platform's sources.
#pragma once

#include <stddef.h>

namespace corvplat {

// Writes all of `data`, retrying after interruptions and short writes. False on an error
// (errno says which).
bool writeAll(int fd, const char* data, size_t size);

}  // namespace corvplat
