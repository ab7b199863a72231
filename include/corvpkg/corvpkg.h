// The whole exported interface of libcorvpkg.
#pragma once

#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgapppriv.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkginfo_json.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgschedule.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgtypes.h"
#include "corvpkg/pkgwizard.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {
// The library's own version, e.g. "1.0.0".
CORVPKG_API const char* CORVPKGLibraryVersion();
}  // namespace CORVPackageTool
