// The upgrade temporary folder, which carries a package's data across an upgrade.
#include <sys/stat.h>
#include <unistd.h>

#include <string.h>

#include <string>

#include "corv/log.h"
#include "corv/user.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"

namespace CORVPackageTool {
namespace Privilege {

std::string GetTmpFolderPath(const std::string& name, const char* volume) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return "";
    }
    // The volume is what the target link holds before its second "/".
    std::string vol;
    if (volume != nullptr) {
        vol = volume;
    } else {
        std::string target = PMSReadLink("/var/packages/" + name + "/target");
        vol = target.substr(0, target.find('/', 1));
    }
    if (vol.compare(0, 7, "/volume") == 0 || vol.compare(0, 19, PKG_SYSTEM_INSTALL_PATH) == 0) {
        return vol + "/@tmp/corvpkg.tmp/" + name;
    }
    return "";
}

bool CreateTmpFolder(const std::string& name, const std::string& path) {
    if (name.empty() || path.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    // A package without privilege file is root's.
    uid_t uid = 0;
    gid_t gid = 0;
    std::string user = GetUserName(name, "");
    if (user.empty()) {
        if (VLIBCErrGet() != ERR_NOT_APPLICABLE) {
            CORV_LOG_ERR("Failed to get username of %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
    } else if (CORVUserGetUGID(user.c_str(), &uid, &gid) < 0) {
        CORV_LOG_ERR("Failed to get id of %s [0x%04X %s:%d]", user.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (CORVFSMkdirP(path.c_str(), nullptr, 1, 0, 0, 0700) < 0) {
        CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", path.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (chown(path.c_str(), uid, gid) != 0) {
        CORV_LOG_ERR("Failed to chown %s (%m)", path.c_str());
        return false;
    }
    return true;
}

}  // namespace Privilege
}  // namespace CORVPackageTool
