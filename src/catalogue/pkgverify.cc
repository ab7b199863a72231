// Whether a package, as a record or as a file, can go on this machine.
#include <stdio.h>
#include <unistd.h>

#include <string>

#include "catalogue/pkginfo_private.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corv/web.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgverify.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

constexpr unsigned int kPgsqlBit = 0x10;
constexpr int kPgsqlVolumeKinds = 0x41;

}  // namespace

std::string PMSOSVersionText(const int v[3]) {
    char buf[32];
    snprintf(buf, sizeof(buf), "%d.%d-%04d", v[0], v[1], v[2]);
    return buf;
}

bool PMSCheckPackagePortConflict(const PackageInfo& info) {
    // An upgrade keeps its own port.
    bool upgrade = false;
    PackageInfo old;
    if (PMSCheckPackage(info.package)) {
        PackageManager pm;
        if (!pm.getInstallPackageInfo(info.package, old, nullptr, PKG_INFO_MASK_ALL)) {
            CORV_LOG_ERR("Previous %s not installed, upgrade not possible", info.package.c_str());
            return false;
        }
        upgrade = true;
    }
    if (!info.checkport || info.adminport <= 0 || info.adminprotocol.empty()) {
        return false;
    }
    // The system web server serves its own ports and the standard ones.
    corvw3::Engine engine;
    corvw3::NOS nos(&engine);
    for (const std::string& protocol : info.adminprotocol) {
        if (protocol == "http" && (info.adminport == nos.GetHttpPort() || info.adminport == 80)) {
            continue;
        }
        if (protocol == "https" &&
            (info.adminport == 443 || info.adminport == nos.GetHttpsPort())) {
            continue;
        }
        if (upgrade && old.adminport == info.adminport) {
            continue;
        }
        if (WebUtils::IsPortConflict(protocol.c_str(), info.adminport, info.adminport)) {
            return true;
        }
    }
    return false;
}

int PackageManager::compareWithInstallPkgInfo(const PackageInfo& info) {
    if (!PMSCheckPackage(info.package)) {
        setResult(PKG_ERR_NOT_INSTALLED);
        return -1;
    }
    PackageInfo installed;
    if (!getPackageInfo(info.package, installed, nullptr, PKG_INFO_MASK_ALL)) {
        return -1;
    }
    PackageBasicInfo candidate(info.package, info.version);
    PackageBasicInfo current(installed.package, installed.version);
    if (candidate.compare(current, PKG_COMPOP_EQ)) {
        return 0;
    }
    if (candidate.compare(current, PKG_COMPOP_GT)) {
        return 1;
    }
    return 2;
}

bool PackageManager::canPackageRunAfterInstall(const PackageInfo& info) {
    return info.startable && !info.install_reboot;
}

bool PackageManager::checkPkgInfoCanInstallEx(PackageInfo& info, const char* language) {
    switch (PMSComparePackageAndOSVersion(info)) {
        case 1:
            setResult(PKG_ERR_OS_TOO_NEW, Json::Value(PMSOSVersionText(PMSGetOSMaxVer(info))));
            return false;
        case -1:
            setResult(PKG_ERR_OS_TOO_OLD, Json::Value(PMSOSVersionText(PMSGetOSMinVer(info))));
            return false;
        default:
            break;
    }
    if (!CanPackageStartInThisFirmware(info)) {
        return false;
    }
    if (PMSCheckPackagePortConflict(info)) {
        setResult(PKG_ERR_PORT_CONFLICT, Json::Value(std::to_string(info.adminport)));
        return false;
    }
    std::string names;
    if (arePackagesConflict(PackageBasicInfo(info.package, info.version), info.conflict_packages,
                            names, language) &&
        !names.empty()) {
        setResult(PKG_ERR_CONFLICT_PACKAGES, Json::Value(names));
        return false;
    }
    // PostgreSQL needs a volume for its data.
    unsigned int off = checkServiceStarted(info.install_dep_services);
    if (off != 0) {
        if ((off & kPgsqlBit) && VolumeCountGet(kPgsqlVolumeKinds) == 0) {
            setResult(PKG_ERR_VOLUME_NOT_READY);
        } else {
            setResult(PKG_ERR_SERVICE_MASK, Json::Value(off));
        }
        return false;
    }
    if (compareWithInstallPkgInfo(info) == 2) {
        setResult(PKG_ERR_DOWNGRADE);
        return false;
    }
    return true;
}

bool PackageManager::checkPkgInfoCanInstall(PackageInfo& info, const char* language) {
    bool ok = checkPkgInfoCanInstallEx(info, language);
    Json::Value data;
    PKG_ERRCODE code = getResult(data);
    // Older callers know one code for the whole OS range.
    if (!ok && (code == PKG_ERR_OS_TOO_NEW || code == PKG_ERR_OS_TOO_OLD)) {
        setResult(PKG_ERR_OS_VERSION, data);
    }
    return ok;
}

}  // namespace CORVPackageTool
