// Whether a package may run on this OS at all, by the maker's version limits.
#include <string>

#include "corv/service.h"
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

namespace CORVPackageTool {

unsigned int PackageManager::checkServiceStarted(unsigned int mask) {
    if (mask == 0) {
        return 0;
    }
    if ((mask & 0x08) && VLIBServiceIsEnabled("ssh-shell") != 0) {
        mask &= ~0x08u;
    }
    if ((mask & 0x10) && VLIBServiceIsRunning("pgsql") == 1) {
        mask &= ~0x10u;
    }
    return mask;
}

std::set<std::string> PackageManager::checkServiceStarted(std::set<std::string> services) {
    std::set<std::string> off;
    for (const std::string& service : services) {
        if (VLIBServiceIsEnabled(service.c_str()) != 0) {
            continue;
        }
        char display[0x200] = "";
        if (VLIBServicecfgDisplayNameGet(service.c_str(), display, sizeof(display)) < 0) {
            off.insert(service);
        } else {
            off.insert(display);
        }
    }
    return off;
}

}  // namespace CORVPackageTool
