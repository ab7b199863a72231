// Internals shared by the lifecycle sources.
#pragma once

namespace CORVPackageTool {

// The CORVPKG_PKG_STATUS word of an operation type ("INSTALL", "START", ...), or null for
// the types that have none (0, restart, combinations).
const char* PMSStatusWord(int type);

}  // namespace CORVPackageTool

#include <string>

namespace CORVPackageTool {

// /var/packages/<name>, and the package's settings directory /usr/corv/etc/packages/<name>.
std::string PMSRegistryDir(const std::string& name);
std::string PMSPackageEtcDir(const std::string& name);
// The registry's `target` link leads to a directory on a volume that has not failed.
bool PMSCheckPayloadTarget(const std::string& registry);

}  // namespace CORVPackageTool
