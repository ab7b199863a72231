// Making package files: what package authors, the tests and the demo build with.
#pragma once

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Packs the package source `sourceDir` into the package file `output`:
//   <sourceDir>/INFO                 required; must read with every key selected
//   <sourceDir>/package/             the payload, packed into package.tgz
//   scripts/ conf/ WIZARD_UIFILES/ LICENSE PACKAGE_ICON.PNG PACKAGE_ICON_256.PNG   optional
// The MD5 of package.tgz (lower-case hex) is written into the file's INFO as "checksum";
// the source is not changed. With a `signKey`, the file is signed with the platform's
// signature tool. The file is written under a temporary name and renamed into place.
// False with a sentence for people in `error` on failure; nothing is left behind.
CORVPKG_API bool PMSBuildPackageFile(const std::string& sourceDir, const std::string& output,
                                     const std::string& signKey, std::string& error);

}  // namespace CORVPackageTool
