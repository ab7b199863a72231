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
// What the check may leave out, as bits, for a caller that sees to it otherwise.
enum PKG_FILE_CHECK_SKIP : unsigned int {
    PKG_FILE_CHECK_SKIP_NONE = 0,
    // The signature: for a caller that installs the file whatever the signature says.
    PKG_FILE_CHECK_SKIP_SIGNATURE = 0x1,
    // The payload checksum, for a caller whose install checks it while unpacking
    // (PackageManager::setChecksumWhileUnpacking). When a later step refuses, the payload
    // is checked all the same, so that a mismatch is still the reason given first.
    PKG_FILE_CHECK_SKIP_PAYLOAD = 0x2,
};
// The same, leaving out what `skip` names.
CORVPKG_API bool CheckPackageFileInfoImpl(const char* language, const char* cpkFile,
                                          std::string& displayName, PKG_ERRCODE& code,
                                          Json::Value& data, PackageInfo& info, unsigned int skip);
// The same as a report: an empty array when installable, else a message key of the web UI
// followed by the texts of its placeholders.
CORVPKG_API bool CheckPackageFileInfo(const char* language, const char* cpkFile,
                                      std::string& displayName, Json::Value& report);
// The report of a refusal that CheckPackageFileInfoImpl already gave, with its `code`,
// `data` and `info`: the check need not run a second time to be told to the user.
CORVPKG_API void CheckPackageFileReport(PKG_ERRCODE code, const Json::Value& data,
                                        const PackageInfo& info, Json::Value& report);

}  // namespace CORVPackageTool
