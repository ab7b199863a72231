// Desktop application privileges for the applications of a started package.
#pragma once

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Grants the desktop applications named in `appNames` (ids separated by blanks, as in a
// package's "nosappname") to the people the desktop's application configuration entitles:
// `user` (may be null) when an administrator, the members of "administrators", or, for
// applications that are granted by group, the administrators' groups (and, for those open
// to all, the LDAP and domain administrator groups). Nothing is done when `appNames` is
// empty or `language` is null. No result: a grant that fails leaves that right as it
// was, and the others go ahead.
CORVPKG_API void PMSSetAppPrivilege(const char* user, const std::string& appNames,
                                    const char* language);

}  // namespace CORVPackageTool
