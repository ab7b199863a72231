// Internals of the wizard pages: taking one wizard file out of a package file, and
// running a wizard script.
#pragma once

#include <json/json.h>

#include <string>

#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"

namespace CORVPackageTool {

// Extracts the single member `member` (e.g. "WIZARD_UIFILES/install_uifile") of `cpkFile`
// into `dir`. True, with `path` the extracted file, when tar succeeded and the file is
// there.
bool PMSExtractUIFile(const char* cpkFile, const char* dir, const std::string& member,
                      std::string& path);

// Runs the wizard script `script` for an operation of `type` (1, 2 or 4) with the
// package's script environment and reads the JSON it wrote to the file named by
// CORVPKG_TEMP_LOGFILE into `wizard`. For an upgrade the script sees the installed record
// and CORVPKG_OLD_PKGVER. False when no result file can be made, the type is another, an
// upgrade finds nothing installed, or the script exits non-zero; true once the script
// succeeded, whatever its output was.
bool PMSRunUIScript(const PackageInfo& info, const char* cpkFile, const std::string& script,
                    const char* language, PKG_INSTALLATION_TYPE type, Json::Value& wizard);

}  // namespace CORVPackageTool
