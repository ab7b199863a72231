// Installability of a package file, as a report for the user.
#pragma once

#include <json/json.h>

#include <string>

#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Whether the package's admin port is taken on this machine (its own old port in an
// upgrade, and the system web server's ports, never count).
CORVPKG_API bool PMSCheckPackagePortConflict(const PackageInfo& info);

// Judges a package file from the ground up, stopping at the first failure in a fixed
// order: record, volume, payload checksum, OS range, conflicts, services, dependencies,
// platform, port, upgradability, signature. False with `code` and `data` (the members
// "instPackageList", "serviceNoStarted", "packages", "unStartPkgList"). `info` is read
// from the file when its name is empty; `displayName` is set on every path.
CORVPKG_API bool CheckPackageFileInfoImpl(const char* language, const char* cpkFile,
                                          std::string& displayName, PKG_ERRCODE& code,
                                          Json::Value& data, PackageInfo& info);
// The same as a report: an empty array when installable, else a message key of the web UI
// followed by the texts of its placeholders.
CORVPKG_API bool CheckPackageFileInfo(const char* language, const char* cpkFile,
                                      std::string& displayName, Json::Value& report);

}  // namespace CORVPackageTool
