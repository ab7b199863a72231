// Fresh installation of a package file: unpack, check, run preinst, move the payload to its
// volume, register, run postinst and start. The road has no rollback of its own; what each
// failure leaves behind is what the next install call (a repair) expects to find.
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/packagemanager_private.h"
#include "corv/app_priv.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/user.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgschedule.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "lifecycle/install_private.h"
#include "lifecycle/lifecycle_private.h"
#include "lifecycle/road.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kGuestGroup = "CorvelGuests";

// Closes the package's desktop applications to guests. Failures are logged: they never
// fail an installation.
void denyGuestAccess(const PackageInfo& info) {
    PCORVGROUP group = nullptr;
    bool ok = true;
    if (CORVGroupGet(kGuestGroup, &group) < 0) {
        if (VLIBCErrGet() == ERR_NO_SUCH_GROUP) {
            return;
        }
        CORV_LOG_ERR("Failed to check existence of group '%s' [0x%04X %s:%d]", kGuestGroup,
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        ok = false;
    } else if (CORVGroupIsReserved(group->name, group->gid)) {
        for (const std::string& app : PMSExplodeString(info.nosappname, " ")) {
            if (VLIBAppPrivGroupDenyOne(kGuestGroup, app.c_str()) < 0) {
                CORV_LOG_ERR("VLIBAppPrivGroupDenyOne failed for %s[0x%04X %s:%d]", app.c_str(),
                             VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            }
        }
    }
    CORVGroupFree(group);
    if (!ok) {
        CORV_LOG_ERR("DenyGroupAccess failed for '%s'", info.package.c_str());
    }
}

constexpr PKG_INSTALLATION_TYPE kInstall = static_cast<PKG_INSTALLATION_TYPE>(1);

// What the steps of a fresh installation share. The package's record is the manager's own,
// so that afterwards the manager describes the new package.
struct InstallRoad {
    PackageManager& pm;
    PackageInfo& info;
    const std::string& cpkPath;
    const std::string& volume;
    const std::string& storeRoot;
    const std::string workDir;
    const bool startAfterInstall;
    const Json::Value* extra;
    const char* language;
    const char* userName;
    InstallCommands cmd;
    CORV::PkgUtils::WorkerResp resp{};
    ScriptContext scripts{};
    std::string target{};
    std::string registry{};
    std::string progressPath{};
    bool postinstAcquireFailed = false;
    unsigned long long restartMask = 0;
    int outcome = 0;
};

// The status query leaves PKG_ERR_NOT_INSTALLED for a name that is free.
bool checkNotInstalled(InstallRoad& r) {
    bool running = false;
    r.pm.getServiceStatus(r.info.package, running, true);
    if (r.pm.getResult() != PKG_ERR_NOT_INSTALLED) {
        CORV_LOG_ERR("Package %s already installed", r.info.package.c_str());
        r.pm.setResult(PKG_ERR_ALREADY_INSTALLED);
        return false;
    }
    return true;
}

bool unpackPayload(InstallRoad& r) {
    return PMSUnpackPayload(r.pm, r.info, kInstall, r.cmd, r.cpkPath, r.workDir);
}

// The message file the scripts write to, a fresh progress file, and what every install
// script of this road is given.
bool prepareMessages(InstallRoad& r) {
    r.progressPath = PMSGetProgressPath(r.info.package);
    unlink(r.progressPath.c_str());
    r.scripts =
        ScriptContext{r.language,        r.pm.getFixedLogFilePath(r.info.package),
                      r.extra,           r.volume.c_str(),
                      r.cpkPath.c_str(), r.userName,
                      &r.resp,           {{"CORVPKG_PKGINST_TEMP_DIR", r.workDir + "/package"}}};
    return true;
}

// Owners and modes of the unpacked files, and the resource request every package has.
// A failure leaves the result of the status query.
bool reviseFileAttributes(InstallRoad& r) {
    return Privilege::ReviseFileAttr(r.info.package, r.workDir) &&
           Resource::InitRequiredFields(r.info.package, r.workDir);
}

bool acquirePreinstResources(InstallRoad& r) {
    if (!Resource::Acquire(Resource::TIMING_PREINST, r.info, kInstall, r.resp, r.extra,
                           r.workDir)) {
        CORV_LOG_ERR("Failed to acquire resource before install %s [0x%04X %s:%d]",
                     r.info.package.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        r.pm.insertJsonParam("worker_msg", r.resp.GetErrJsonArray());
        r.pm.setResult(PKG_ERR_INSTALL_FAILED);
        return false;
    }
    return true;
}

// The script runs from the work directory, before anything is registered, with the
// identity that the package's own conf/privilege there gives it.
bool runPreinst(InstallRoad& r) {
    const std::string script = r.workDir + "/scripts/preinst";
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    const int ret =
        PMSRunInstallScript(r.info, script, "preinst", kInstall, r.scripts, true, r.workDir);
    if (ret != 0) {
        if (ret != kScriptIdentityFailed) {
            CORV_LOG_ERR("Failed to run preinst script for %s, [%d]", r.info.package.c_str(), ret);
        }
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

bool clearTarget(InstallRoad& r) {
    r.target = r.storeRoot + "/" + r.info.package;
    return PMSClearTarget(r.info, kInstall, r.target);
}

bool movePayload(InstallRoad& r) {
    CORVUtils::ProcessRunner mv("/bin/mv", {"-f", r.workDir + "/package", r.target});
    if (!PMSRunLogged(r.info, kInstall, mv)) {
        CORV_LOG_ERR("Failed to move package files, %s", r.target.c_str());
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

// A registry left over from an earlier, failed road would mix with the new one.
bool dropOldRegistry(InstallRoad& r) {
    r.registry = PMSRegistryDir(r.info.package);
    if (!r.info.package.empty()) {
        CORVUtils::ProcessRunner rm("/bin/rm", {"-rf", r.registry});
        PMSRunLogged(r.info, kInstall, rm);
    }
    if (!PackageManager::ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", r.info.package.c_str());
        r.pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    return true;
}

// A preinst may have damaged the INFO it was unpacked with: read it again, from the
// package file if need be.
bool checkInfo(InstallRoad& r) {
    if (PMSInfoFileUsable(r.workDir) ||
        PMSLoadPKGInfoFile(r.workDir, r.info, nullptr, kInstallInfoMask)) {
        return true;
    }
    CORV_LOG_ERR("Failed to validate package INFO in %s", r.workDir.c_str());
    PMSRunLogged(r.info, kInstall, r.cmd.repairExtract);
    if (!PMSLoadPKGInfoFile(r.workDir, r.info, nullptr, kInstallInfoMask)) {
        CORV_LOG_ERR("Failed to validate package INFO");
        r.pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
}

bool foldIcons(InstallRoad& r) {
    const PKG_ERRCODE icons = PMSFoldIcons(r.workDir, r.info.package);
    if (icons != PKG_OK) {
        r.pm.setResult(icons);
        return false;
    }
    return true;
}

// From here on the package is there: whatever follows, the daemons it names are reloaded.
bool registerPackage(InstallRoad& r) {
    if (!r.pm.registerPackage(kInstall, r.info, r.workDir, r.target)) {
        CORV_LOG_ERR("Failed to register package for %s", r.info.package.c_str());
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    r.restartMask = r.info.instuninst_restart_services;
    return true;
}

// A failure is only noted: postinst still runs, the package may need its own cleanup.
bool acquirePostinstResources(InstallRoad& r) {
    if (!Resource::Acquire(Resource::TIMING_POSTINST, r.info, kInstall, r.resp, r.extra, "")) {
        r.postinstAcquireFailed = true;
        CORV_LOG_ERR("Failed to acquire resource after install %s [0x%04X %s:%d]",
                     r.info.package.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        r.pm.insertJsonParam("worker_msg", r.resp.GetErrJsonArray());
    }
    return true;
}

bool closeToGuests(InstallRoad& r) {
    denyGuestAccess(r.info);
    return true;
}

// postinst runs from the registry now, with the registered conf/privilege.
bool runPostinst(InstallRoad& r) {
    const std::string script = r.registry + "/scripts/postinst";
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    const int ret = PMSRunInstallScript(r.info, script, "postinst", kInstall, r.scripts, true, "");
    if (ret != 0) {
        if (ret != kScriptIdentityFailed) {
            CORV_LOG_ERR("Failed to run postinst script for %s, %d", r.info.package.c_str(), ret);
        }
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

// The registry keeps `installing`: the package shows as broken until it is repaired.
bool checkPostinstResources(InstallRoad& r) {
    if (r.postinstAcquireFailed) {
        r.pm.setResult(PKG_ERR_INSTALL_FAILED);
        return false;
    }
    return true;
}

bool finishInstallation(InstallRoad& r) {
    r.pm.post_install(r.info);
    unlink(r.progressPath.c_str());
    unlink(PMSInstallingFlagPath(r.info.package).c_str());
    r.outcome = 1;
    return true;
}

// A package without a stop control runs whatever the caller asked. The outcome stays a
// success whatever the start gives.
bool startPackage(InstallRoad& r) {
    if (!r.startAfterInstall && r.info.startable) {
        return true;
    }
    std::vector<std::string> order;
    if (!r.pm.getDependencyOrder(r.info.package.c_str(), order, false)) {
        order = {r.info.package};
    }
    r.restartMask |= r.pm.findRestartServices(order);
    const std::string name = r.info.package;
    r.pm.serviceControl(kInstall, name, true, r.language, r.userName, nullptr, true, false);
    return true;
}

constexpr RoadStep<InstallRoad> kInstallSteps[] = {
    {"check-not-installed", checkNotInstalled},
    {"unpack-payload", unpackPayload},
    {"prepare-messages", prepareMessages},
    {"revise-file-attributes", reviseFileAttributes},
    {"acquire-preinst-resources", acquirePreinstResources},
    {"run-preinst", runPreinst},
    {"clear-target", clearTarget},
    {"move-payload", movePayload},
    {"drop-old-registry", dropOldRegistry},
    {"check-info", checkInfo},
    {"fold-icons", foldIcons},
    {"register", registerPackage},
    {"acquire-postinst-resources", acquirePostinstResources},
    {"close-to-guests", closeToGuests},
    {"run-postinst", runPostinst},
    {"check-postinst-resources", checkPostinstResources},
    {"finish-installation", finishInstallation},
    {"start", startPackage},
};

bool restartServices(InstallRoad& r) {
    if (r.restartMask != 0) {
        r.pm.RestartServicesAction(r.restartMask);
    }
    return true;
}

// A road that never got the lock must not touch a work directory that may be another's.
bool removeWorkDir(InstallRoad& r) {
    if (r.pm.getResult() != PKG_ERR_LOCKED && VLIBCFileCheckDir(r.workDir.c_str())) {
        PMSRunLogged(r.info, kInstall, r.cmd.removeWorkDir);
    }
    return true;
}

bool logOutcome(InstallRoad& r) {
    PMSWriteSysLogf("%s %s %s %s", "install", r.info.package.c_str(), r.info.version.c_str(),
                    r.outcome ? "successfully" : "failed");
    return true;
}

bool runHooks(InstallRoad& r) {
    PMSCheckServiesStatus(r.info, nullptr, kInstall, -1);
    return true;
}

constexpr RoadStep<InstallRoad> kInstallClosingSteps[] = {
    {"restart-services", restartServices},
    {"remove-work-dir", removeWorkDir},
    {"log-outcome", logOutcome},
    {"run-hooks", runHooks},
};

}  // namespace

int PackageManager::install_package(const std::string& cpkPath, const std::string& volume,
                                    const std::string& storeRoot, const std::string& tmpRoot,
                                    bool startAfterInstall, const Json::Value* extra,
                                    const char* language, const char* userName) {
    const std::string workDir = tmpRoot + "/pkginstall";
    InstallRoad r{*this,
                  d->packageInfo,
                  cpkPath,
                  volume,
                  storeRoot,
                  workDir,
                  startAfterInstall,
                  extra,
                  language,
                  userName,
                  InstallCommands(cpkPath, workDir)};
    if (PMSUnpackAndCheck("install", *this, kInstall, r.cmd, cpkPath, workDir, r.info, true)) {
        PMSRunRoad("install", r, kInstallSteps);
    }
    PMSRunClosingSteps("install", r, kInstallClosingSteps);
    return r.outcome;
}

bool PackageManager::post_install(const PackageInfo& info) {
    (void)info;
    PMSSavaDefNotify();
    return true;
}

}  // namespace CORVPackageTool
