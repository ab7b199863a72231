// The closed list of result codes with the message keys that reports attach to them.
#include "corvpkg/pkgtypes.h"

namespace CORVPackageTool {

namespace {

const PKG_ERRCODE_INFO kErrCodes[] = {
    {0, "PKG_OK", "success", nullptr, nullptr},
    {1, "PKG_STATUS_EXIT_1", "status script exit value 1", nullptr, nullptr},
    {2, "PKG_STATUS_EXIT_2", "status script exit value 2", nullptr, nullptr},
    {3, "PKG_STATUS_EXIT_3", "status script exit value 3", nullptr, nullptr},
    {150, "PKG_ERR_BROKEN", "the package is broken or no package", "pkgmgr:pkgmgr_file_not_package",
     nullptr},
    {255, "PKG_ERR_NOT_INSTALLED", "the package is not installed", nullptr,
     "pkgmgr:pkgmgr_pkg_not_available"},
    {256, "PKG_ERR_NO_STATUS_SCRIPT", "the package has no start-stop-status script", nullptr,
     nullptr},
    {257, "PKG_ERR_VOLUME_CHECK", "a volume or store directory could not be checked", nullptr,
     nullptr},
    {258, "PKG_ERR_ARCH_MISMATCH", "the architecture or model does not match", nullptr, nullptr},
    {259, "PKG_ERR_BELOW_VERSION_LIMIT", "the version is below the allowed limit", nullptr,
     "pkgmgr:install_version_less_than_limit"},
    {260, "PKG_ERR_SERVICE_NOT_STARTED", "a required service does not run",
     "pkgmgr:require_service", nullptr},
    {261, "PKG_ERR_BAD_ARCHIVE", "the package archive is damaged", "pkgmgr:broken_package",
     "pkgmgr:pkgmgr_file_not_package"},
    {262, "PKG_ERR_NOT_ENABLED", "the package is not enabled", nullptr, nullptr},
    {263, "PKG_ERR_SYSTEM", "system failure", "error:error_error_system", nullptr},
    {264, "PKG_ERR_LIMIT_BLOCKED", "the package version is blocked", nullptr, nullptr},
    {265, "PKG_ERR_LIMIT_PROHIBITED", "the package is prohibited", nullptr, nullptr},
    {266, "PKG_ERR_LIMIT_OTHER", "the version limit could not be checked", nullptr, nullptr},
    {267, "PKG_ERR_DOWNGRADE", "the installed version is newer", nullptr,
     "pkgmgr:downgrade_version"},
    {268, "PKG_ERR_DEPENDENCY", "dependencies are missing or others depend on the package",
     "pkgmgr:depend_packages", "pkgmgr:error_upgrade_dep_packages"},
    {269, "PKG_ERR_UPGRADE_BREAKS_DEPENDENT", "the upgrade would break a dependent package",
     nullptr, "pkgmgr:error_upgrade_dep_packages"},
    {270, "PKG_ERR_ALREADY_INSTALLED", "the same version is installed", nullptr,
     "pkgmgr:pkgmgr_pkg_install_already"},
    {271, "PKG_ERR_RESTART_SERVICES", "a related service failed to restart", nullptr, nullptr},
    {272, "PKG_ERR_START_FAILED", "start failed", nullptr, nullptr},
    {273, "PKG_ERR_STOP_FAILED", "stop failed", nullptr, nullptr},
    {274, "PKG_ERR_DEPENDENCY_CYCLE", "the dependencies form a cycle", nullptr,
     "pkgmgr:depend_cycle"},
    {275, "PKG_ERR_LOCKED", "another package operation holds the lock", nullptr,
     "pkgmgr:error_occupied"},
    {276, "PKG_ERR_INSTALL_FAILED", "installation failed", nullptr,
     "pkgmgr:pkgmgr_file_install_failed"},
    {277, "PKG_ERR_UPGRADE_FAILED", "upgrade failed", "pkgmgr:pkgmgr_pkg_cannot_upgrade",
     "pkgmgr:upgrade_fail"},
    {278, "PKG_ERR_REPAIR_FAILED", "repair failed", nullptr, nullptr},
    {279, "PKG_ERR_NO_SPACE", "not enough space", "pkgmgr:error_sys_no_space",
     "pkgError:error_space_not_enough"},
    {281, "PKG_ERR_PLATFORM", "the platform is not supported",
     "pkgmgr:pkgmgr_pkg_not_support_platform", nullptr},
    {282, "PKG_ERR_OS_VERSION", "the OS version is out of range", nullptr, nullptr},
    {283, "PKG_ERR_PORT_CONFLICT", "the admin port is in use", "pkgmgr:port_conflict", nullptr},
    {284, "PKG_ERR_CONFLICT_PACKAGES", "a conflicting package is installed",
     "pkgmgr:conflict_packages", nullptr},
    {285, "PKG_ERR_VOLUME_NOT_READY", "a required volume is being created",
     "pkgmgr:pkgmgr_space_not_ready", "pkgError:volume_creating"},
    {286, "PKG_ERR_SERVICE_MASK", "required services do not run", nullptr, nullptr},
    {287, "PKG_SIGNATURE_OK", "the signature check passed", nullptr, nullptr},
    {288, "PKG_ERR_NOT_MAKER_SIGNED", "the package is not signed by the maker",
     "pkgmgr:pkgmgr_not_corv_publish", nullptr},
    {289, "PKG_ERR_UNKNOWN_PUBLISHER", "the publisher is unknown",
     "pkgmgr:pkgmgr_unknown_publisher", nullptr},
    {290, "PKG_ERR_NO_SIGNATURE", "the package has no signature", "pkgmgr:pkgmgr_no_signature",
     nullptr},
    {291, "PKG_ERR_CERT_EXPIRED", "the signing certificate has expired",
     "pkgmgr:pkgmgr_cert_expired", nullptr},
    {292, "PKG_ERR_SIGNATURE_BAD", "the signature is bad", "pkgmgr:broken_package", nullptr},
    {293, "PKG_ERR_SIGNATURE_SYSTEM", "the signature could not be checked",
     "error:error_error_system", nullptr},
    {294, "PKG_ERR_ENUMERATION", "a package directory could not be read in full", nullptr, nullptr},
    {295, "PKG_ERR_SERVER", "the package server failed", nullptr, nullptr},
    {296, "PKG_ERR_NO_USB_VOLUME", "no volume on this model", nullptr, nullptr},
    {297, "PKG_ERR_NO_VOLUME", "there is no volume", "pkgmgr:pkgmgr_space_not_ready",
     "pkgError:volume_no_volumes"},
    {299, "PKG_ERR_RESOURCE_RELEASE", "releasing resources failed", nullptr, nullptr},
    {300, "PKG_ERR_PRESTART_FAILED", "the pre-start step failed", nullptr, nullptr},
    {301, "PKG_ERR_PRESTOP_FAILED", "the pre-stop step failed", nullptr, nullptr},
    {302, "PKG_ERR_OS_TOO_NEW", "the OS is newer than the package allows",
     "pkgmgr:pkgmgr_pkg_required_older_version", nullptr},
    {303, "PKG_ERR_OS_TOO_OLD", "the OS is older than the package needs",
     "pkgmgr:pkgmgr_pkg_required_newer_version", nullptr},
    {304, "PKG_ERR_FILE_ACCESS", "the package file cannot be accessed", nullptr, nullptr},
    {305, "PKG_ERR_BAD_ANSWERS", "the wizard answers are not JSON", nullptr, nullptr},
};

}  // namespace

const PKG_ERRCODE_INFO* PMSGetErrCodeInfo(int code) {
    for (const PKG_ERRCODE_INFO& entry : kErrCodes) {
        if (entry.code == code) {
            return &entry;
        }
    }
    return nullptr;
}

}  // namespace CORVPackageTool
