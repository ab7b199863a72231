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
#include "lifecycle/road.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kUpgradeBootupFlag = "/var/.UpgradeBootup";
constexpr int kActionInstall = 1;
constexpr int kActionUpgrade = 2;
constexpr int kActionRepair = 4;

PKG_ERRCODE spaceOr(PKG_ERRCODE otherwise) {
    return VLIBCErrGet() == ERR_NO_SPACE ? PKG_ERR_NO_SPACE : otherwise;
}

// A refusal for want of room says which volume is full, how much was needed and how much
// was free, so that nobody takes it for a damaged file.
void refuseForSpace(PackageManager& pm, PKG_ERRCODE otherwise, const std::string& volume,
                    unsigned long long size) {
    pm.setResult(spaceOr(otherwise));
    if (pm.getResult() == PKG_ERR_NO_SPACE) {
        const std::string where = volume.empty() ? "/volume1" : volume;
        PMSReportNoSpace(pm, where, size + PKG_VOLUME_MARGIN, PMSFreeBytes(where));
    }
}

// What the dispatcher's steps share: the package file, what it holds, what is installed
// under its name, and where the operation is to run.
struct Dispatch {
    PackageManager& pm;
    const char* userName;
    const std::string& cpkPath;
    const std::string& volume;
    const bool startAfterInstall;
    const Json::Value* extra;
    const char* language;
    const bool ignoreDependents;
    const bool checkSignature;
    PackageInfo info{};
    PackageInfo oldInfo{};
    int action = kActionInstall;
    int outcome = 0;
    unsigned long long fileSize = 0;
    unsigned long long size = 0;
    std::string wanted{};
    std::string targetVolume{};
    std::string storeRoot{};
    std::string tmpRoot{};
};

// Without a file there is nothing to say; a path that is not a plain file is a broken one.
bool checkFile(Dispatch& r) {
    if (r.cpkPath.empty()) {
        return false;
    }
    struct stat st {};
    if (stat(r.cpkPath.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
        r.pm.setResult(PKG_ERR_BROKEN);
        CORV_LOG_ERR("Fail to get cpk file, %s", r.cpkPath.c_str());
        return false;
    }
    r.fileSize = static_cast<unsigned long long>(st.st_size);
    return true;
}

bool initManager(Dispatch& r) {
    return r.pm.init();
}

bool readPackageFile(Dispatch& r) {
    if (!r.pm.queryPackageFileInfo(r.cpkPath, r.info, static_cast<PKG_INSTALLATION_TYPE>(0),
                                   r.language)) {
        r.pm.setResult(PKG_ERR_BROKEN);
        CORV_LOG_ERR("Fail to get package info");
        return false;
    }
    return true;
}

bool checkSignature(Dispatch& r) {
    if (!r.checkSignature) {
        return true;
    }
    const PKG_ERRCODE verdict = r.pm.verifyPackageSignature(r.cpkPath.c_str());
    if (verdict != PKG_SIGNATURE_OK) {
        r.pm.setResult(verdict);
        CORV_LOG_ERR("Check codesign failed");
        return false;
    }
    return true;
}

bool checkCycle(Dispatch& r) {
    if (r.pm.hasCycle(r.info)) {
        r.pm.setResult(PKG_ERR_DEPENDENCY_CYCLE);
        return false;
    }
    return true;
}

bool lock(Dispatch& r) {
    if (!PackageManager::ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", r.info.package.c_str());
        r.pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    return true;
}

// Install, upgrade or repair, from what the name's status says. An INFO that no longer
// reads cannot be upgraded from: repair, and let the registration write a good one.
bool chooseAction(Dispatch& r) {
    bool running = false;
    r.pm.getServiceStatus(r.info.package, running, true);
    switch (r.pm.getResult()) {
        case PKG_ERR_NOT_INSTALLED:
            r.action = kActionInstall;
            break;
        case PKG_ERR_BROKEN:
        case PKG_ERR_ARCH_MISMATCH:
        case PKG_ERR_BELOW_VERSION_LIMIT:
            r.action = kActionRepair;
            break;
        default:
            r.action = kActionUpgrade;
    }
    const std::string info = PMSRegistryEntry(r.info.package, kRegistryInfo);
    if (access(info.c_str(), F_OK) == 0 &&
        !r.pm.getPackageInfo(r.info.package, r.oldInfo, nullptr, PKG_INFO_MASK_ALL)) {
        r.action = kActionRepair;
        unlink(info.c_str());
    }
    return true;
}

// Where the package lives already, unless the unit has a fixed place for it; else a saved
// default volume, which wins over the caller's choice.
bool chooseVolume(Dispatch& r) {
    if (VLIBCIsDockette()) {
        r.wanted = "/volume1";
    } else if (r.info.install_type == "system") {
        if (!PMSGetSystemInstallPath(r.wanted)) {
            return false;
        }
    } else if (r.action & (kActionUpgrade | kActionRepair)) {
        r.wanted = PMSGetPackageTarget(r.info.package);
        if (r.wanted.empty()) {
            const std::string target = PMSRegistryEntry(r.info.package, kRegistryTarget);
            VLIBCExec("/bin/rm", "-rf", target.c_str(), nullptr);
            CORV_LOG_ERR("%s, Failed to get volume", r.info.package.c_str());
            if (r.action == kActionUpgrade) {
                return false;
            }
        }
        if (r.oldInfo.install_type == "system" && r.info.install_type != "system") {
            r.wanted.clear();
        }
    }
    if (r.wanted.empty() && !PMSGetPackageDefVol(r.wanted)) {
        r.wanted = r.volume;
    }
    return true;
}

// The space the payload needs: what the package says, else half again the file's size.
bool measureSpace(Dispatch& r) {
    r.size = r.info.extractsize != 0 ? static_cast<unsigned long long>(r.info.extractsize)
                                     : r.fileSize * 3 / 2;
    if (r.wanted.empty() && !PMSGetTmpDir(r.size, r.wanted)) {
        refuseForSpace(r.pm, PKG_ERR_SYSTEM, r.volume, r.size);
        CORV_LOG_ERR("No available tmp path");
        return false;
    }
    return true;
}

// A repair whose volume no longer fits may move to any volume with room.
bool findStoreVolume(Dispatch& r) {
    if (r.pm.GetAppStoreVolume(r.info, r.wanted.c_str(), r.size, r.targetVolume)) {
        return true;
    }
    if (r.action == kActionRepair && !VLIBCIsDockette() && r.info.install_type != "system") {
        if (!PMSGetTmpDir(r.size, r.wanted)) {
            refuseForSpace(r.pm, PKG_ERR_SYSTEM, r.volume, r.size);
            CORV_LOG_ERR("No available tmp path");
            return false;
        }
        if (r.pm.GetAppStoreVolume(r.info, r.wanted.c_str(), r.size, r.targetVolume)) {
            return true;
        }
        CORV_LOG_ERR("Failed to get installation volume %s", r.wanted.c_str());
    }
    refuseForSpace(r.pm, PKG_ERR_VOLUME_CHECK, r.wanted, r.size);
    return false;
}

bool makeStoreRoot(Dispatch& r) {
    r.storeRoot = r.targetVolume + "/@appstore";
    if (CORVFSMkdirP(r.storeRoot.c_str(), nullptr, 1, -1, -1, 0755) < 0) {
        CORV_LOG_ERR("Failed to check appstore %s", r.storeRoot.c_str());
        r.pm.setResult(PKG_ERR_VOLUME_CHECK);
        return false;
    }
    return true;
}

bool findTmpDir(Dispatch& r) {
    if (!PMSGetTmpDir(0, r.targetVolume.c_str(), r.tmpRoot) && !PMSGetSystemTmpDir(0, r.tmpRoot)) {
        CORV_LOG_ERR("Failed to check tmpdir %s", r.targetVolume.c_str());
        r.pm.setResult(spaceOr(PKG_ERR_SYSTEM));
        return false;
    }
    return true;
}

// What cannot be upgraded into shape is removed and installed afresh.
void reinstall(Dispatch& r) {
    bool running = false;
    r.pm.getServiceStatus(r.info.package, running, true);
    const PKG_ERRCODE status = r.pm.getResult();
    if (status != PKG_ERR_NO_STATUS_SCRIPT && status != PKG_ERR_ARCH_MISMATCH &&
        status != PKG_ERR_BROKEN) {
        CORV_LOG_ERR("Failed to repair package %s, status: %d", r.info.package.c_str(),
                     static_cast<int>(status));
        r.outcome = 0;
        return;
    }
    if (!r.pm.uninstall(r.info.package, nullptr, r.language, static_cast<PKG_INSTALLATION_TYPE>(4),
                        true, nullptr)) {
        CORV_LOG_ERR("Failed to remove package %s, err: %d", r.info.package.c_str(),
                     static_cast<int>(r.pm.getResult()));
    }
    r.outcome = r.pm.install_package(r.cpkPath, r.targetVolume, r.storeRoot, r.tmpRoot, true,
                                     r.extra, r.language, r.userName);
    if (r.outcome == 0) {
        CORV_LOG_ERR("Failed to install package %s, err: %d", r.info.package.c_str(),
                     static_cast<int>(r.pm.getResult()));
    }
}

// A repair is an upgrade onto the broken package; an older file is refused as such.
void repair(Dispatch& r) {
    r.pm.setResult(PKG_ERR_REPAIR_FAILED);
    r.outcome = r.pm.upgrade_package(r.cpkPath, r.targetVolume, r.storeRoot, r.tmpRoot, true,
                                     r.extra, r.language, r.userName, r.ignoreDependents);
    if (r.outcome == 0 && r.pm.getResult() != PKG_ERR_DOWNGRADE) {
        reinstall(r);
    }
}

// The presets are crossed on purpose: each names the other road's failure, and stays when
// the road gives up without a result of its own.
bool runOperation(Dispatch& r) {
    if (r.action & kActionRepair) {
        repair(r);
    } else if (r.action & kActionUpgrade) {
        r.pm.setResult(PKG_ERR_INSTALL_FAILED);
        r.outcome = r.pm.upgrade_package(r.cpkPath, r.targetVolume, r.storeRoot, r.tmpRoot, false,
                                         r.extra, r.language, r.userName, r.ignoreDependents);
    } else {
        r.pm.setResult(PKG_ERR_UPGRADE_FAILED);
        r.outcome = r.pm.install_package(r.cpkPath, r.targetVolume, r.storeRoot, r.tmpRoot,
                                         r.startAfterInstall, r.extra, r.language, r.userName);
    }
    return r.outcome == 1;
}

constexpr RoadStep<Dispatch> kDispatchSteps[] = {
    {"check-file", checkFile},
    {"init", initManager},
    {"read-package-file", readPackageFile},
    {"check-signature", checkSignature},
    {"check-cycle", checkCycle},
    {"lock", lock},
    {"choose-action", chooseAction},
    {"choose-volume", chooseVolume},
    {"measure-space", measureSpace},
    {"find-store-volume", findStoreVolume},
    {"make-store-root", makeStoreRoot},
    {"find-tmp-dir", findTmpDir},
    {"run-operation", runOperation},
};

// Released on every road, also on those that never took the lock.
bool unlock(Dispatch&) {
    PackageManager::UnLock();
    return true;
}

// A detached look for newer versions, not during the first boot after an OS upgrade.
bool checkForUpgrades(Dispatch& r) {
    if (r.outcome == 1 && !VLIBCFileExist(kUpgradeBootupFlag)) {
        pid_t pid = VLIBCProcFork();
        if (pid == 0) {
            setsid();
            PMSRunUpgradeCheck(r.userName, r.language);
            _exit(0);
        }
    }
    return true;
}

// The system event log's numbers: success and failure per action.
bool recordEvent(Dispatch& r) {
    if (r.info.displayname.empty()) {
        return true;
    }
    const unsigned code = r.action == kActionRepair    ? 0x13700005
                          : r.action == kActionUpgrade ? 0x13700003
                                                       : 0x13700001;
    if (r.outcome == 1) {
        CORVLogSet1(2, 1, code, r.info.displayname.c_str(), "", "", "");
    } else {
        CORVLogSet1(2, 3, code + 1, r.info.displayname.c_str(), "", "", "");
    }
    return true;
}

bool cleanEnv(Dispatch&) {
    CleanAllEnv();
    return true;
}

constexpr RoadStep<Dispatch> kDispatchClosingSteps[] = {
    {"unlock", unlock},
    {"check-for-upgrades", checkForUpgrades},
    {"record-event", recordEvent},
    {"clean-env", cleanEnv},
};

}  // namespace

int PackageManager::install(const char* userName, const std::string& cpkPath,
                            const std::string& volume, bool startAfterInstall,
                            const Json::Value* extra, const char* language, bool ignoreDependents,
                            bool checkSignature) {
    Dispatch r{*this, userName, cpkPath,          volume,        startAfterInstall,
               extra, language, ignoreDependents, checkSignature};
    PMSRunRoad("dispatch", r, kDispatchSteps);
    PMSRunClosingSteps("dispatch", r, kDispatchClosingSteps);
    return r.outcome;
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
