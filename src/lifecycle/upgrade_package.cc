// Upgrade (and repair) of an installed package from a package file: the old version and
// its dependents stop, the old version is uninstalled with its data and resource record
// kept aside, and the new one goes the road of an installation.
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/packagemanager_private.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "lifecycle/install_private.h"
#include "lifecycle/lifecycle_private.h"
#include "lifecycle/road.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kUpgradeBootupFlag = "/var/.UpgradeBootup";
constexpr PKG_INSTALLATION_TYPE kUpgrade = static_cast<PKG_INSTALLATION_TYPE>(2);
constexpr int kCopyTries = 30;
constexpr int kShellWordSize = 4096;

// What the steps of an upgrade share. `running` and `wasEnabled` are the old package's state
// at entry; `order` the packages stopped with it, which are started again with the new one.
struct UpgradeRoad {
    PackageManager& pm;
    PackageInfo& managerInfo;  // what the manager describes after a success
    const std::string& cpkPath;
    const std::string& volume;
    const std::string& storeRoot;
    const std::string workDir;
    const bool repair;
    const Json::Value* extra;
    const char* language;
    const char* userName;
    const bool ignoreDependents;
    InstallCommands cmd;
    PackageInfo newInfo{};
    PackageInfo oldInfo{};
    std::string name{};
    std::string registry{};
    std::vector<std::string> order{};
    bool running = false;
    bool wasEnabled = false;
    bool withDependents = true;
    bool postinstAcquireFailed = false;
    unsigned long long restartMask = 0;
    std::string upgradeTmp{};
    std::string target{};
    std::string progressPath{};
    CORV::PkgUtils::WorkerResp resp{};
    ScriptContext scripts{};
    int outcome = 0;
};

// Copies the payload's entries into the target when moving them failed: a target on
// another file system may refuse some entries for a while (busy files).
bool copyPayload(UpgradeRoad& r, const std::string& work, const std::string& dest) {
    for (int attempt = 0; attempt < kCopyTries; ++attempt) {
        sleep(static_cast<unsigned>(CORVFaultSeconds("copy-pause", 1)));
        CORVUtils::ProcessRunner cp("/bin/sh",
                                    {"-c", "/bin/cp -arf " + work + "/package/* " + dest});
        if (PMSRunAndWriteScriptLog(r.newInfo, kUpgrade, cp, -1) == 0) {
            return true;
        }
        CORV_LOG_ERR("Failed to move package files, %s, %d", r.target.c_str(), attempt);
    }
    return false;
}

// `text` escaped as one shell word; false (logged) when it does not fit.
bool shellWord(const std::string& text, std::string& word) {
    char buffer[kShellWordSize];
    if (VLIBCEncShParam(text.c_str(), buffer, sizeof(buffer)) < 0) {
        CORV_LOG_ERR("Failed to escape string: %s", text.c_str());
        return false;
    }
    word = buffer;
    return true;
}

bool readInstalledInfo(UpgradeRoad& r) {
    if (!r.pm.getPackageInfo(r.name, r.oldInfo, nullptr, PKG_INFO_MASK_ALL)) {
        CORV_LOG_ERR("Previous %s not installed, upgrade not possible", r.name.c_str());
        return false;
    }
    return true;
}

// Whether the init system holds the package's job up: running, or paused by a stop that
// meant to bring it back (an upgrade or a shutdown that did not get to its end).
bool jobHeldUp(const std::string& name) {
    const std::string job = "pkgctl-" + name;
    int state = VLIB_SERVICE_STATE_UNKNOWN;
    return (VLIBServiceStatusGet(job.c_str(), &state) == 0 &&
            state == VLIB_SERVICE_STATE_RUNNING) ||
           VLIBServiceIsPaused(job.c_str()) == 1;
}

// A package being repaired is brought up afterwards whatever its state. Otherwise the
// package runs again after the upgrade when it ran, or was meant to: an earlier upgrade,
// start or stop cut short by a crash leaves the `enabled` flag or the held job as the only
// word of it, and the package must not end stopped for the crash.
bool noteRunningState(UpgradeRoad& r) {
    if (r.repair) {
        r.running = true;
        r.wasEnabled = false;
    } else if (!r.pm.getServiceStatus(r.oldInfo.package, r.running, true)) {
        r.running = false;
        r.wasEnabled = false;
    } else {
        r.wasEnabled = access(PMSEnabledFlagPath(r.oldInfo.package).c_str(), F_OK) == 0;
    }
    // Also when the status cannot be had: an upgrade cut short after its resources went
    // leaves the package without a job definition, but with its paused job's state.
    r.running = r.running || r.wasEnabled || jobHeldUp(r.oldInfo.package);
    return true;
}

// The same version is a reinstall; an older one is refused before anything changes.
bool refuseDowngrade(UpgradeRoad& r) {
    if (PackageBasicInfo(r.newInfo.package, r.newInfo.version)
            .compare(PackageBasicInfo(r.oldInfo.package, r.oldInfo.version), PKG_COMPOP_LT)) {
        r.pm.insertMapParam("oldver", r.newInfo.version);
        r.pm.insertMapParam("curver", r.oldInfo.version);
        r.pm.setResult(PKG_ERR_DOWNGRADE);
        CORV_LOG_ERR("Can't downgrade %s", r.name.c_str());
        return false;
    }
    return true;
}

bool unpackPayload(UpgradeRoad& r) {
    return PMSUnpackPayload(r.pm, r.newInfo, kUpgrade, r.cmd, r.cpkPath, r.workDir);
}

// The message file, a fresh progress file, and what every script of the upgrade is given.
bool prepareMessages(UpgradeRoad& r) {
    r.progressPath = PMSGetProgressPath(r.name);
    unlink(r.progressPath.c_str());
    r.scripts = ScriptContext{r.language,
                              r.pm.getFixedLogFilePath(r.name),
                              r.extra,
                              r.volume.c_str(),
                              r.cpkPath.c_str(),
                              r.userName,
                              &r.resp,
                              {{"CORVPKG_PKGINST_TEMP_DIR", r.workDir + "/package"},
                               {"CORVPKG_OLD_PKGVER", r.oldInfo.version}}};
    return true;
}

// The packages that stop with this one, unless the upgrade would leave one of them
// unable to work. The first boot after an OS upgrade handles the named package alone.
bool checkDependents(UpgradeRoad& r) {
    if (VLIBCFileExist(kUpgradeBootupFlag)) {
        r.order = {r.name};
        std::string message;
        if (!r.pm.areDependentPackageStop(r.name, r.language, message)) {
            CORV_LOG_ERR("Warring: %s is dependent on %s", message.c_str(), r.name.c_str());
        }
        r.withDependents = false;
        return true;
    }
    Json::Value stopList;
    if (!r.pm.getDependencyOrder(r.name.c_str(), r.order, false)) {
        r.order.clear();
    }
    if (!r.pm.getDepPkgListStop(r.order, r.name, r.language, stopList)) {
        if (!r.ignoreDependents && !stopList.empty()) {
            std::string names;
            for (const Json::Value& entry : stopList) {
                names += (names.empty() ? "" : ", ") + entry["name"].asString();
            }
            r.pm.insertMapParam("deppkg", names);
            r.pm.setResult(PKG_ERR_UPGRADE_BREAKS_DEPENDENT);
            return false;
        }
    } else if (r.order.size() == 1) {
        r.order.clear();
    }
    r.withDependents = true;
    return true;
}

// The old package and its dependents stop as for an upgrade: jobs paused, lock kept. A
// package whose prestop refuses stays as it is.
bool stopOld(UpgradeRoad& r) {
    if (!r.running && r.order.empty() && !r.wasEnabled) {
        return true;
    }
    r.restartMask = r.pm.findRestartServices(r.order);
    r.pm.serviceControl(kUpgrade, r.oldInfo.package, false, r.language, r.userName, &r.order,
                        r.withDependents, false);
    return r.pm.getResult() != PKG_ERR_PRESTOP_FAILED;
}

bool relock(UpgradeRoad& r) {
    if (!PackageManager::ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", r.name.c_str());
        r.pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    return true;
}

// The folder outlives the old version, for the scripts to carry data across.
bool createUpgradeFolder(UpgradeRoad& r) {
    r.upgradeTmp = Privilege::GetTmpFolderPath(r.oldInfo.package, r.volume.c_str());
    return !r.upgradeTmp.empty() && Privilege::CreateTmpFolder(r.oldInfo.package, r.upgradeTmp);
}

// The new package's preupgrade, run as the old package. Up to here the old version is
// intact, and a refusal brings it back up.
bool runPreupgrade(UpgradeRoad& r) {
    const std::string script = r.workDir + "/scripts/preupgrade";
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    const int ret =
        PMSRunInstallScript(r.oldInfo, script, "preupgrade", kUpgrade, r.scripts, false, "");
    if (ret == kScriptIdentityFailed) {
        r.pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    if (ret != 0) {
        if (r.running || !r.newInfo.startable || !r.order.empty()) {
            r.pm.serviceControl(kUpgrade, r.name, true, r.language, r.userName, &r.order, true,
                                false);
        }
        CORV_LOG_ERR("Failed to run preupgrade script for %s, %d", r.name.c_str(), ret);
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

// No way back to the old version from here: its payload goes, its registry is emptied and
// its resource record is kept aside for the new version's workers.
bool uninstallOld(UpgradeRoad& r) {
    r.restartMask |= r.oldInfo.instuninst_restart_services;
    if (!r.pm.uninstall(r.oldInfo, r.extra, r.language, kUpgrade, nullptr)) {
        CORV_LOG_ERR("Failed to remove package %s", r.name.c_str());
        return false;
    }
    return true;
}

// Owners and modes, the required resource request, and the old version's resource record
// brought back into the new package. A failure sets no result of its own.
bool reviseFileAttributes(UpgradeRoad& r) {
    return Privilege::ReviseFileAttr(r.name, r.workDir) &&
           Resource::InitRequiredFields(r.name, r.workDir) &&
           Resource::RestoreResourceFile(r.name, r.workDir);
}

bool acquirePreinstResources(UpgradeRoad& r) {
    if (!Resource::Acquire(Resource::TIMING_PREINST, r.newInfo, kUpgrade, r.resp, r.extra,
                           r.workDir)) {
        CORV_LOG_ERR("Failed to acquire resource before install %s [0x%04X %s:%d]", r.name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        r.pm.insertJsonParam("worker_msg", r.resp.GetErrJsonArray());
        r.pm.setResult(PKG_ERR_UPGRADE_FAILED);
        return false;
    }
    return true;
}

bool runPreinst(UpgradeRoad& r) {
    const std::string script = r.workDir + "/scripts/preinst";
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    const int ret =
        PMSRunInstallScript(r.newInfo, script, "preinst", kUpgrade, r.scripts, true, r.workDir);
    if (ret != 0) {
        if (ret != kScriptIdentityFailed) {
            CORV_LOG_ERR("Failed to run preinstall script for %s, %d", r.name.c_str(), ret);
        }
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

bool clearTarget(UpgradeRoad& r) {
    r.target = r.storeRoot + "/" + r.name;
    return PMSClearTarget(r.newInfo, kUpgrade, r.target);
}

// The payload's entries move into a fresh target with a shell glob; when that fails they
// are copied.
bool movePayload(UpgradeRoad& r) {
    if (CORVFSMkdirP(r.target.c_str(), nullptr, 1, -1, -1, 0755) != 0) {
        CORV_LOG_ERR("Failed to mkdir, %s", r.target.c_str());
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    std::string work;
    std::string dest;
    if (!shellWord(r.workDir, work) || !shellWord(r.target, dest)) {
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    CORVUtils::ProcessRunner mv("/bin/sh", {"-c", "/bin/mv -f " + work + "/package/* " + dest});
    if (PMSRunAndWriteScriptLog(r.newInfo, kUpgrade, mv, 0x90) == 0) {
        return true;
    }
    CORV_LOG_ERR("Failed to move package files, %s", r.target.c_str());
    if (!copyPayload(r, work, dest)) {
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

// A preinst may have damaged the INFO it was unpacked with: take it from the package file.
bool checkInfo(UpgradeRoad& r) {
    if (PMSInfoFileUsable(r.workDir)) {
        return true;
    }
    CORV_LOG_ERR("Failed to validate package INFO in %s", r.workDir.c_str());
    PMSRunLogged(r.newInfo, kUpgrade, r.cmd.repairExtract);
    if (!PMSLoadPKGInfoFile(r.workDir, r.newInfo, nullptr, kInstallInfoMask)) {
        CORV_LOG_ERR("Failed to validate package INFO");
        r.pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
}

bool foldIcons(UpgradeRoad& r) {
    const PKG_ERRCODE icons = PMSFoldIcons(r.workDir, r.name);
    if (icons != PKG_OK) {
        r.pm.setResult(icons);
        return false;
    }
    return true;
}

bool registerPackage(UpgradeRoad& r) {
    if (!r.pm.registerPackage(kUpgrade, r.newInfo, r.workDir, r.target)) {
        CORV_LOG_ERR("Failed to register package %s", r.name.c_str());
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

// A failure is only noted: postinst and postupgrade still run.
bool acquirePostinstResources(UpgradeRoad& r) {
    if (!Resource::Acquire(Resource::TIMING_POSTINST, r.newInfo, kUpgrade, r.resp, r.extra, "")) {
        r.postinstAcquireFailed = true;
        CORV_LOG_ERR("Failed to acquire resource after install %s [0x%04X %s:%d]", r.name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        r.pm.insertJsonParam("worker_msg", r.resp.GetErrJsonArray());
    }
    r.restartMask |= r.newInfo.instuninst_restart_services;
    return true;
}

// One of the scripts that run from the new registry after the registration.
bool runRegisteredScript(UpgradeRoad& r, const char* action, bool dumpEnv, const char* failure) {
    const std::string script = r.registry + "/scripts/" + action;
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    const int ret =
        PMSRunInstallScript(r.newInfo, script, action, kUpgrade, r.scripts, dumpEnv, "");
    if (ret != 0) {
        if (ret != kScriptIdentityFailed) {
            CORV_LOG_ERR("Failed to run %s script for %s, %d", failure, r.name.c_str(), ret);
        }
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

bool runPostinst(UpgradeRoad& r) {
    return runRegisteredScript(r, "postinst", true, "postinst");
}

bool runPostupgrade(UpgradeRoad& r) {
    return runRegisteredScript(r, "postupgrade", false, "postupgrade");
}

// `installing` stays: the package shows as broken until it is repaired.
bool checkPostinstResources(UpgradeRoad& r) {
    if (r.postinstAcquireFailed) {
        r.pm.setResult(PKG_ERR_UPGRADE_FAILED);
        return false;
    }
    return true;
}

bool finishUpgrade(UpgradeRoad& r) {
    r.managerInfo = r.newInfo;
    r.pm.post_install(r.newInfo);
    unlink(r.progressPath.c_str());
    unlink(PMSInstallingFlagPath(r.name).c_str());
    r.outcome = 1;
    return true;
}

// The new version comes up with the packages that were stopped for it. The outcome stays
// a success whatever the start gives.
bool startNew(UpgradeRoad& r) {
    if (r.running || !r.newInfo.startable || !r.order.empty()) {
        r.restartMask |= r.pm.findRestartServices(r.order);
        r.pm.serviceControl(kUpgrade, r.name, true, r.language, r.userName, &r.order, true, false);
    }
    return true;
}

constexpr RoadStep<UpgradeRoad> kUpgradeSteps[] = {
    {"read-installed-info", readInstalledInfo},
    {"note-running-state", noteRunningState},
    {"refuse-downgrade", refuseDowngrade},
    {"unpack-payload", unpackPayload},
    {"prepare-messages", prepareMessages},
    {"check-dependents", checkDependents},
    {"stop-old", stopOld},
    {"relock-after-stop", relock},
    {"create-upgrade-folder", createUpgradeFolder},
    {"run-preupgrade", runPreupgrade},
    {"uninstall-old", uninstallOld},
    {"relock-after-uninstall", relock},
    {"revise-file-attributes", reviseFileAttributes},
    {"acquire-preinst-resources", acquirePreinstResources},
    {"run-preinst", runPreinst},
    {"clear-target", clearTarget},
    {"move-payload", movePayload},
    {"relock-after-move", relock},
    {"check-info", checkInfo},
    {"fold-icons", foldIcons},
    {"register", registerPackage},
    {"acquire-postinst-resources", acquirePostinstResources},
    {"run-postinst", runPostinst},
    {"run-postupgrade", runPostupgrade},
    {"check-postinst-resources", checkPostinstResources},
    {"finish-upgrade", finishUpgrade},
    {"start-new", startNew},
};

bool restartServices(UpgradeRoad& r) {
    if (r.restartMask != 0) {
        r.pm.RestartServicesAction(r.restartMask);
    }
    return true;
}

bool removeUpgradeFolder(UpgradeRoad& r) {
    if (!r.upgradeTmp.empty()) {
        VLIBCExec("/bin/rm", "-rf", r.upgradeTmp.c_str(), nullptr);
    }
    return true;
}

bool logOutcome(UpgradeRoad& r) {
    PMSWriteSysLogf("%s %s from %s to %s %s", "upgrade", r.oldInfo.package.c_str(),
                    r.oldInfo.version.c_str(), r.newInfo.version.c_str(),
                    r.outcome ? "successfully" : "failed");
    return true;
}

// A road that never got the lock must not touch a work directory that may be another's.
bool removeWorkDir(UpgradeRoad& r) {
    if (r.pm.getResult() != PKG_ERR_LOCKED && VLIBCFileCheckDir(r.workDir.c_str())) {
        PMSRunLogged(r.newInfo, kUpgrade, r.cmd.removeWorkDir);
    }
    return true;
}

bool runHooks(UpgradeRoad& r) {
    PMSCheckServiesStatus(r.newInfo, &r.oldInfo, kUpgrade, -1);
    return true;
}

constexpr RoadStep<UpgradeRoad> kUpgradeClosingSteps[] = {
    {"restart-services", restartServices},
    {"remove-upgrade-folder", removeUpgradeFolder},
    {"log-outcome", logOutcome},
    {"remove-work-dir", removeWorkDir},
    {"run-hooks", runHooks},
};

}  // namespace

int PackageManager::upgrade_package(const std::string& cpkPath, const std::string& volume,
                                    const std::string& storeRoot, const std::string& tmpRoot,
                                    bool repair, const Json::Value* extra, const char* language,
                                    const char* userName, bool ignoreDependents) {
    const std::string workDir = tmpRoot + "/pkginstall";
    UpgradeRoad r{*this,     d->packageInfo, cpkPath,          volume,
                  storeRoot, workDir,        repair,           extra,
                  language,  userName,       ignoreDependents, InstallCommands(cpkPath, workDir)};
    if (PMSUnpackAndCheck("upgrade", *this, kUpgrade, r.cmd, cpkPath, workDir, r.newInfo, false)) {
        r.name = r.newInfo.package;
        r.registry = PMSRegistryDir(r.name);
        PMSRunRoad("upgrade", r, kUpgradeSteps);
    }
    PMSRunClosingSteps("upgrade", r, kUpgradeClosingSteps);
    return r.outcome;
}

}  // namespace CORVPackageTool
