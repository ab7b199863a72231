// Internals shared by the lifecycle sources.
#pragma once

namespace CORVPackageTool {

// The CORVPKG_PKG_STATUS word of an operation type ("INSTALL", "START", ...), or null for
// the types that have none (0, restart, combinations).
const char* PMSStatusWord(int type);

}  // namespace CORVPackageTool
