// Whether a package may run on this OS at all, by the maker's version limits.
#include <string>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglimit.h"

namespace CORVPackageTool {

bool PackageManager::CanPackageStartInThisFirmware(const PackageInfo& info) {
    std::string limit;
    switch (PMSThirdPartyCheckLimit(info.package.c_str(), info.version.c_str(), limit)) {
        case 0:
            return true;
        case -3:
            setResult(PKG_ERR_LIMIT_PROHIBITED);
            return false;
        case -4:
            setResult(PKG_ERR_LIMIT_BLOCKED);
            return false;
        case -2:
            insertMapParam("oldver", limit);
            insertMapParam("curver", info.version);
            setResult(PKG_ERR_BELOW_VERSION_LIMIT);
            return false;
        default:
            setResult(PKG_ERR_LIMIT_OTHER);
            return false;
    }
}

}  // namespace CORVPackageTool
