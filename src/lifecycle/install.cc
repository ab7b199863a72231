// The one entrance for a package file: decides between a fresh installation, an upgrade
// and a repair, chooses the volume and the temporary directory, and records the event.
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "catalogue/packagemanager_private.h"
#include "corv/eventlog.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kUpgradeBootupFlag = "/var/.UpgradeBootup";
constexpr int kActionInstall = 1;
constexpr int kActionUpgrade = 2;
constexpr int kActionRepair = 4;

PKG_ERRCODE spaceOr(PKG_ERRCODE otherwise) {
    return VLIBCErrGet() == ERR_NO_SPACE ? PKG_ERR_NO_SPACE : otherwise;
}

// The event numbers of the system event log: success and failure per action.
void logEvent(int action, bool success, const std::string& displayname) {
    unsigned code = action == kActionRepair    ? 0x13700005
                    : action == kActionUpgrade ? 0x13700003
                                               : 0x13700001;
    if (success) {
        CORVLogSet1(2, 1, code, displayname.c_str(), "", "", "");
    } else {
        CORVLogSet1(2, 3, code + 1, displayname.c_str(), "", "", "");
    }
}

}  // namespace

int PackageManager::install(const char* userName, const std::string& cpkPath,
                            const std::string& volume, bool startAfterInstall,
                            const Json::Value* extra, const char* language, bool ignoreDependents,
                            bool checkSignature) {
    PackageInfo info;
    PackageInfo oldInfo;
    int action = kActionInstall;
    int outcome = 0;
    bool running = false;
    struct stat st {};
    std::string wanted;
    std::string targetVolume;
    std::string storeRoot;
    std::string tmpRoot;
    std::string registry;
    unsigned long long size = 0;

    // 1.
    if (cpkPath.empty()) {
        goto leave;
    }
    // 2.
    if (stat(cpkPath.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
        setResult(PKG_ERR_BROKEN);
        CORV_LOG_ERR("Fail to get cpk file, %s", cpkPath.c_str());
        goto leave;
    }
    // 3.
    if (!init()) {
        goto leave;
    }
    // 4.
    if (!queryPackageFileInfo(cpkPath, info, static_cast<PKG_INSTALLATION_TYPE>(0), language)) {
        setResult(PKG_ERR_BROKEN);
        CORV_LOG_ERR("Fail to get package info");
        goto leave;
    }
    // 5.
    if (checkSignature) {
        PKG_ERRCODE verdict = verifyPackageSignature(cpkPath.c_str());
        if (verdict != PKG_SIGNATURE_OK) {
            setResult(verdict);
            CORV_LOG_ERR("Check codesign failed");
            goto leave;
        }
    }
    // 6.
    if (hasCycle(info)) {
        setResult(PKG_ERR_DEPENDENCY_CYCLE);
        goto leave;
    }
    // 7.
    if (!ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", info.package.c_str());
        setResult(PKG_ERR_LOCKED);
        goto leave;
    }
    // 8.
    getServiceStatus(info.package, running, true);
    switch (getResult()) {
        case PKG_ERR_NOT_INSTALLED:
            action = kActionInstall;
            break;
        case PKG_ERR_BROKEN:
        case PKG_ERR_ARCH_MISMATCH:
        case PKG_ERR_BELOW_VERSION_LIMIT:
            action = kActionRepair;
            break;
        default:
            action = kActionUpgrade;
    }
    // 9. An INFO that no longer reads cannot be upgraded from: repair, and let the
    // registration write a good one.
    registry = PMSRegistryDir(info.package);
    if (access((registry + "/INFO").c_str(), F_OK) == 0 &&
        !getPackageInfo(info.package, oldInfo, nullptr, PKG_INFO_MASK_ALL)) {
        action = kActionRepair;
        unlink((registry + "/INFO").c_str());
    }
    // 10. Where the package lives already, unless the unit has a fixed place for it.
    if (VLIBCIsDockette()) {
        wanted = "/volume1";
    } else if (info.install_type == "system") {
        if (!PMSGetSystemInstallPath(wanted)) {
            goto leave;
        }
    } else if (action & (kActionUpgrade | kActionRepair)) {
        wanted = PMSGetPackageTarget(info.package);
        if (wanted.empty()) {
            VLIBCExec("/bin/rm", "-rf", (registry + "/target").c_str(), nullptr);
            CORV_LOG_ERR("%s, Failed to get volume", info.package.c_str());
            if (action == kActionUpgrade) {
                goto leave;
            }
        }
        if (oldInfo.install_type == "system" && info.install_type != "system") {
            wanted.clear();
        }
    }
    // 11. A saved default volume wins over the caller's choice.
    if (wanted.empty() && !PMSGetPackageDefVol(wanted)) {
        wanted = volume;
    }
    // 12.
    size = info.extractsize != 0 ? static_cast<unsigned long long>(info.extractsize)
                                 : static_cast<unsigned long long>(st.st_size) * 3 / 2;
    // 13.
    if (wanted.empty() && !PMSGetTmpDir(size, wanted)) {
        setResult(spaceOr(PKG_ERR_SYSTEM));
        CORV_LOG_ERR("No available tmp path");
        goto leave;
    }
    // 14, 15.
    if (!GetAppStoreVolume(info, wanted.c_str(), size, targetVolume)) {
        bool retried = false;
        if (action == kActionRepair && !VLIBCIsDockette() && info.install_type != "system") {
            if (!PMSGetTmpDir(size, wanted)) {
                setResult(spaceOr(PKG_ERR_SYSTEM));
                CORV_LOG_ERR("No available tmp path");
                goto leave;
            }
            retried = GetAppStoreVolume(info, wanted.c_str(), size, targetVolume);
            if (!retried) {
                CORV_LOG_ERR("Failed to get installation volume %s", wanted.c_str());
            }
        }
        if (!retried) {
            setResult(spaceOr(PKG_ERR_VOLUME_CHECK));
            if (getResult() == PKG_ERR_NO_SPACE) {
                PMSReportNoSpace(*this, wanted, size + PKG_VOLUME_MARGIN, PMSFreeBytes(wanted));
            }
            goto leave;
        }
    }
    // 16.
    storeRoot = targetVolume + "/@appstore";
    if (CORVFSMkdirP(storeRoot.c_str(), nullptr, 1, -1, -1, 0755) < 0) {
        CORV_LOG_ERR("Failed to check appstore %s", storeRoot.c_str());
        setResult(PKG_ERR_VOLUME_CHECK);
        goto leave;
    }
    // 17.
    if (!PMSGetTmpDir(0, targetVolume.c_str(), tmpRoot) && !PMSGetSystemTmpDir(0, tmpRoot)) {
        CORV_LOG_ERR("Failed to check tmpdir %s", targetVolume.c_str());
        setResult(spaceOr(PKG_ERR_SYSTEM));
        goto leave;
    }
    if (action & kActionRepair) {
        // 18.
        setResult(PKG_ERR_REPAIR_FAILED);
        outcome = upgrade_package(cpkPath, targetVolume, storeRoot, tmpRoot, true, extra, language,
                                  userName, ignoreDependents);
        if (outcome == 0 && getResult() != PKG_ERR_DOWNGRADE) {
            // 19. What cannot be upgraded is removed and installed afresh.
            getServiceStatus(info.package, running, true);
            PKG_ERRCODE status = getResult();
            if (status == PKG_ERR_NO_STATUS_SCRIPT || status == PKG_ERR_ARCH_MISMATCH ||
                status == PKG_ERR_BROKEN) {
                if (!uninstall(info.package, nullptr, language,
                               static_cast<PKG_INSTALLATION_TYPE>(4), true, nullptr)) {
                    CORV_LOG_ERR("Failed to remove package %s, err: %d", info.package.c_str(),
                                 static_cast<int>(getResult()));
                }
                outcome = install_package(cpkPath, targetVolume, storeRoot, tmpRoot, true, extra,
                                          language, userName);
                if (outcome == 0) {
                    CORV_LOG_ERR("Failed to install package %s, err: %d", info.package.c_str(),
                                 static_cast<int>(getResult()));
                }
            } else {
                CORV_LOG_ERR("Failed to repair package %s, status: %d", info.package.c_str(),
                             static_cast<int>(status));
                outcome = 0;
            }
        }
    } else if (action & kActionUpgrade) {
        // 20. The presets are crossed on purpose: each names the other road's failure.
        setResult(PKG_ERR_INSTALL_FAILED);
        outcome = upgrade_package(cpkPath, targetVolume, storeRoot, tmpRoot, false, extra, language,
                                  userName, ignoreDependents);
    } else {
        // 21.
        setResult(PKG_ERR_UPGRADE_FAILED);
        outcome = install_package(cpkPath, targetVolume, storeRoot, tmpRoot, startAfterInstall,
                                  extra, language, userName);
    }

leave:
    // 22.
    UnLock();
    // 23.
    if (outcome == 1 && !VLIBCFileExist(kUpgradeBootupFlag)) {
        pid_t pid = VLIBCProcFork();
        if (pid == 0) {
            setsid();
            PMSRunUpgradeCheck(userName, language);
            _exit(0);
        }
    }
    // 24.
    if (!info.displayname.empty()) {
        logEvent(action, outcome == 1, info.displayname);
    }
    // 25.
    CleanAllEnv();
    return outcome;
}

int PackageManager::install(const char* userName, const std::string& cpkPath,
                            const std::string& volume, bool startAfterInstall,
                            const Json::Value* extra, const char* language, bool ignoreDependents) {
    return install(userName, cpkPath, volume, startAfterInstall, extra, language, ignoreDependents,
                   true);
}

int PackageManager::installCPK(const char* userName, std::string cpkPath,
                               const std::string& volume) {
    if (cpkPath.empty() || !init()) {
        return 0;
    }
    if (!install(userName, cpkPath, volume, false, nullptr, nullptr, true)) {
        CORV_LOG_ERR("Failed to install package: %s, [%d]", cpkPath.c_str(),
                     static_cast<int>(getResult()));
        return 0;
    }
    return 1;
}

}  // namespace CORVPackageTool
