// The installability check of a package file, and its report for the user.
#include <stdio.h>
#include <unistd.h>

#include <string>

#include "catalogue/pkginfo_private.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgverify.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

constexpr int kPgsqlVolumeKinds = 0x41;

PKG_ERRCODE volumeError(int platformError) {
    switch (platformError) {
        case PKG_VOLERR_NO_USB_VOLUME:
            return PKG_ERR_NO_USB_VOLUME;
        case PKG_VOLERR_NO_VOLUME:
            return PKG_ERR_NO_VOLUME;
        case PKG_VOLERR_NO_SPACE:
            return PKG_ERR_NO_SPACE;
        default:
            return PKG_ERR_SYSTEM;
    }
}

// The payload against the INFO key "checksum"; false with `code` and `data` of a mismatch.
bool checkPayload(PackageManager& pm, const char* cpkFile, const PackageInfo& info,
                  PKG_ERRCODE& code, Json::Value& data) {
    if (info.checksum.empty() || pm.verifyPackageTgzFile(cpkFile, info.checksum.c_str())) {
        return true;
    }
    code = PKG_ERR_BAD_ARCHIVE;
    data = Json::Value(Json::objectValue);
    // A payload that did not fit is no damage: say so beside the fixed report.
    const Json::Value space = pm.getJsonParam("no_space");
    if (space.isObject()) {
        data["no_space"] = space;
    }
    return false;
}

// The steps up to the payload, in their fixed order; `code` says which refused.
bool checkRecord(PackageManager& pm, const char* language, const char* cpkFile, PKG_ERRCODE& code,
                 Json::Value& data, PackageInfo& info, unsigned int skip) {
    if (language == nullptr) {
        code = PKG_ERR_SYSTEM;
        return false;
    }
    // A record that the caller filled is taken as it is.
    if (info.package.empty() &&
        !pm.queryPackageFileInfo(cpkFile, info, static_cast<PKG_INSTALLATION_TYPE>(0), language)) {
        code = PKG_ERR_BROKEN;
        return false;
    }
    if (!pm.CheckVolume(cpkFile, info)) {
        code = volumeError(VLIBCErrGet());
        return false;
    }
    return (skip & PKG_FILE_CHECK_SKIP_PAYLOAD) != 0 || checkPayload(pm, cpkFile, info, code, data);
}

// The steps after the payload, in their fixed order; `code` says which refused.
bool checkRest(PackageManager& pm, const char* language, const char* cpkFile, PKG_ERRCODE& code,
               Json::Value& data, PackageInfo& info, unsigned int skip) {
    switch (PMSComparePackageAndOSVersion(info)) {
        case 1:
            code = PKG_ERR_OS_TOO_NEW;
            return false;
        case -1:
            code = PKG_ERR_OS_TOO_OLD;
            return false;
        default:
            break;
    }
    std::string names;
    if (pm.arePackagesConflict(PackageBasicInfo(info.package, info.version), info.conflict_packages,
                               names, language) &&
        !names.empty()) {
        data["instPackageList"] = names;
        code = PKG_ERR_CONFLICT_PACKAGES;
        return false;
    }
    std::set<std::string> off = pm.checkServiceStarted(PMSGetInstallDepServiceSet(info));
    if (!off.empty()) {
        if (off.count("pgsql") && VolumeCountGet(kPgsqlVolumeKinds) == 0) {
            code = PKG_ERR_VOLUME_NOT_READY;
            return false;
        }
        const std::string texts =
            std::string("/usr/corv/corvman/webui/texts/") + language + "/strings";
        if (access(texts.c_str(), F_OK) != 0 &&
            access("/usr/corv/corvman/webui/texts/enu/strings", F_OK) != 0) {
            // Without the desktop's texts there is nobody to tell: the check ends here.
            return false;
        }
        Json::Value list(Json::arrayValue);
        for (const std::string& name : off) {
            list.append(name);
        }
        data["serviceNoStarted"] = list;
        code = PKG_ERR_SERVICE_NOT_STARTED;
        return false;
    }
    Json::Value missing;
    std::string notStarted;
    if (!pm.arePackagesInstallAndStart(info.dep_packages, missing, notStarted, language)) {
        data["packages"] = missing;
        data["unStartPkgList"] = notStarted;
        code = PKG_ERR_DEPENDENCY;
        return false;
    }
    if (!PMSCheckPackageArchModelMatched(info)) {
        code = PKG_ERR_PLATFORM;
        return false;
    }
    if (PMSCheckPackagePortConflict(info)) {
        code = PKG_ERR_PORT_CONFLICT;
        return false;
    }
    // A package without upgrade scripts cannot replace an installed copy of itself.
    if (PMSCheckPackage(info.package) && (info.script_mask & (0x20 | 0x40)) == 0) {
        code = PKG_ERR_UPGRADE_FAILED;
        return false;
    }
    // A caller that installs the file unverified would only throw the verdict away, and
    // the signature tool reads the whole file once more.
    if ((skip & PKG_FILE_CHECK_SKIP_SIGNATURE) != 0) {
        return true;
    }
    PKG_ERRCODE signature = PackageManager::verifyPackageSignature(cpkFile);
    if (signature == PKG_SIGNATURE_OK) {
        return true;
    }
    code = (signature >= PKG_ERR_NOT_MAKER_SIGNED && signature <= PKG_ERR_SIGNATURE_BAD)
               ? signature
               : PKG_ERR_SYSTEM;
    return false;
}

Json::Value memberNames(const Json::Value& object) {
    Json::Value names(Json::arrayValue);
    if (object.isObject()) {
        for (const std::string& name : object.getMemberNames()) {
            names.append(name);
        }
    }
    return names;
}

}  // namespace

bool CheckPackageFileInfoImpl(const char* language, const char* cpkFile, std::string& displayName,
                              PKG_ERRCODE& code, Json::Value& data, PackageInfo& info,
                              unsigned int skip) {
    code = PKG_OK;
    data = Json::Value(Json::objectValue);
    PackageManager pm;
    const bool recordOk = checkRecord(pm, language, cpkFile, code, data, info, skip);
    const bool ok = recordOk && checkRest(pm, language, cpkFile, code, data, info, skip);
    // A payload left for later still comes before the later reasons against the file.
    if (recordOk && !ok && (skip & PKG_FILE_CHECK_SKIP_PAYLOAD) != 0) {
        checkPayload(pm, cpkFile, info, code, data);
    }
    displayName = info.displayname;
    return ok;
}

bool CheckPackageFileInfoImpl(const char* language, const char* cpkFile, std::string& displayName,
                              PKG_ERRCODE& code, Json::Value& data, PackageInfo& info) {
    return CheckPackageFileInfoImpl(language, cpkFile, displayName, code, data, info,
                                    PKG_FILE_CHECK_SKIP_NONE);
}

bool CheckPackageFileInfo(const char* language, const char* cpkFile, std::string& displayName,
                          Json::Value& report) {
    report = Json::Value(Json::arrayValue);
    PackageInfo info;
    PKG_ERRCODE code = PKG_OK;
    Json::Value data;
    if (CheckPackageFileInfoImpl(language, cpkFile, displayName, code, data, info)) {
        return true;
    }
    CheckPackageFileReport(code, data, info, report);
    return false;
}

void CheckPackageFileReport(PKG_ERRCODE code, const Json::Value& data, const PackageInfo& info,
                            Json::Value& report) {
    report = Json::Value(Json::arrayValue);
    auto add = [&](const std::string& text) { report.append(text); };
    auto osMaxVersion = [&info]() {
        PackageInfo record = info;
        return PMSOSVersionText(PMSGetOSMaxVer(record));
    };
    switch (code) {
        case PKG_ERR_BROKEN:
            add("pkgmgr:pkgmgr_file_not_package");
            break;
        case PKG_ERR_SERVICE_NOT_STARTED: {
            bool ssh = false;
            for (const Json::Value& name : data["serviceNoStarted"]) {
                ssh = ssh || name.asString() == "ssh-shell";
            }
            if (ssh) {
                add("tree:require_sshd");
            } else {
                add("pkgmgr:require_service");
                add(data["serviceNoStarted"][0].asString());
            }
            break;
        }
        case PKG_ERR_BAD_ARCHIVE:
        case PKG_ERR_SIGNATURE_BAD:
            add("pkgmgr:broken_package");
            break;
        case PKG_ERR_DEPENDENCY: {
            std::string names;
            joinJsonArray(memberNames(data["packages"]), ", ", names);
            const std::string unstarted = data["unStartPkgList"].asString();
            if (names.empty() && !unstarted.empty()) {
                add("pkgmgr:depend_unstart");
                add(unstarted);
            } else if (!names.empty() && !unstarted.empty()) {
                add("pkgmgr:depend_uninst_unstart");
                add(names);
                add(unstarted);
            } else {
                add("pkgmgr:depend_packages");
                add(names);
            }
            break;
        }
        case PKG_ERR_UPGRADE_FAILED:
            add("pkgmgr:pkgmgr_pkg_cannot_upgrade");
            break;
        case PKG_ERR_NO_SPACE:
            add("pkgmgr:error_sys_no_space");
            break;
        case PKG_ERR_PLATFORM: {
            char product[256] = "";
            if (VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "product", product, sizeof(product),
                                     0) <= 0) {
                CORV_LOG_ERR("Failed to get product");
                break;
            }
            add("pkgmgr:pkgmgr_pkg_not_support_platform");
            add(product);
            break;
        }
        case PKG_ERR_PORT_CONFLICT:
            add("pkgmgr:port_conflict");
            add(std::to_string(info.adminport));
            break;
        case PKG_ERR_CONFLICT_PACKAGES:
            add("pkgmgr:conflict_packages");
            add(data["instPackageList"].asString());
            break;
        case PKG_ERR_VOLUME_NOT_READY:
        case PKG_ERR_NO_VOLUME:
            add("pkgmgr:pkgmgr_space_not_ready");
            break;
        case PKG_ERR_NOT_MAKER_SIGNED:
            add("pkgmgr:pkgmgr_not_corv_publish");
            break;
        case PKG_ERR_UNKNOWN_PUBLISHER:
            add("pkgmgr:pkgmgr_unknown_publisher");
            break;
        case PKG_ERR_NO_SIGNATURE:
            add("pkgmgr:pkgmgr_no_signature");
            break;
        case PKG_ERR_CERT_EXPIRED:
            add("pkgmgr:pkgmgr_cert_expired");
            break;
        // The upper limit is shown in both cases, also where the lower one failed.
        case PKG_ERR_OS_TOO_NEW:
            add("pkgmgr:pkgmgr_pkg_required_older_version");
            add(osMaxVersion());
            break;
        case PKG_ERR_OS_TOO_OLD:
            add("pkgmgr:pkgmgr_pkg_required_newer_version");
            add(osMaxVersion());
            break;
        default:
            add("error:error_error_system");
            break;
    }
}

}  // namespace CORVPackageTool
