// A PackageInfo as JSON, for callers that print or hand records on.
#pragma once

#include <json/json.h>

#include "corvpkg/pkginfo.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Every field under its own name; masks as numbers, OS versions as "major.minor-build",
// dependency lists as arrays of {package, version, compop}. Icons are included only when
// `withIcons` is set, since they are tens of kilobytes.
CORVPKG_API Json::Value PackageInfoToJson(const PackageInfo& info, bool withIcons);

// "<=", ">=", "<", ">", "=" or "" for a comparison operator.
CORVPKG_API const char* PMSCompOpToStr(PKG_VERSION_COMPOP op);

}  // namespace CORVPackageTool
