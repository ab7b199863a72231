// The maker's limits on third-party packages, from /etc.defaults/corvpackageslimit.conf.
#pragma once

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

constexpr const char* PKG_LIMIT_CONF = "/etc.defaults/corvpackageslimit.conf";

// 0 allowed; -1 bad argument, unreadable file or malformed limit; -2 the version is
// barred and `limit` names the version needed; -3 not allowed on this system ("system");
// -4 not allowed at all ("non").
CORVPKG_API int PMSThirdPartyCheckLimit(const char* packageName, const char* version,
                                        std::string& limit);
CORVPKG_API int PMSThirdPartyCheckLimit(const char* packageName, const char* version);
// `a` >= `b`, comparing component by component ("." and "-" alike, missing ones as 0).
CORVPKG_API bool PMSVersionNotLess(const char* a, const char* b);

}  // namespace CORVPackageTool
