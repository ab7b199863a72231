// The package registry's places: /var/packages/<name> and the entries that say what state
// a package is in. One spelling for every source that reads or writes them.
#pragma once

#include <string>

namespace CORVPackageTool {

constexpr const char kRegistryRoot[] = "/var/packages";
// Entries of a package's registry directory.
constexpr const char kRegistryInfo[] = "INFO";
constexpr const char kRegistryTarget[] = "target";      // link to the payload on its volume
constexpr const char kInstallingFlag[] = "installing";  // an install or upgrade is not done
constexpr const char kEnabledFlag[] = "enabled";        // the user wants the package to run

// /var/packages/<name>
inline std::string PMSRegistryDir(const std::string& name) {
    return std::string(kRegistryRoot) + "/" + name;
}
// /var/packages/<name>/<entry>
inline std::string PMSRegistryEntry(const std::string& name, const char* entry) {
    return PMSRegistryDir(name) + "/" + entry;
}
inline std::string PMSEnabledFlagPath(const std::string& name) {
    return PMSRegistryEntry(name, kEnabledFlag);
}
inline std::string PMSInstallingFlagPath(const std::string& name) {
    return PMSRegistryEntry(name, kInstallingFlag);
}

}  // namespace CORVPackageTool
