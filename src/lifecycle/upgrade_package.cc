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

namespace CORVPackageTool {

namespace {

constexpr const char* kUpgradeBootupFlag = "/var/.UpgradeBootup";
constexpr unsigned long long kInstallInfoMask = 0xFFFFFFFFF7FFFFFFULL;
constexpr int kCopyTries = 30;
constexpr int kShellWordSize = 4096;

// Moves the payload's entries into the (fresh) target with a shell glob, and copies them
// when the move fails (a target on another file system that refuses some entries).
bool movePayload(const PackageInfo& info, const std::string& workDir, const std::string& target,
                 PKG_ERRCODE& result) {
    const PKG_INSTALLATION_TYPE type = static_cast<PKG_INSTALLATION_TYPE>(2);
    if (CORVFSMkdirP(target.c_str(), nullptr, 1, -1, -1, 0755) != 0) {
        CORV_LOG_ERR("Failed to mkdir, %s", target.c_str());
        result = PKG_ERR_SYSTEM;
        return false;
    }
    char work[kShellWordSize];
    char dest[kShellWordSize];
    if (VLIBCEncShParam(workDir.c_str(), work, sizeof(work)) < 0) {
        CORV_LOG_ERR("Failed to escape string: %s", workDir.c_str());
        result = PKG_ERR_SYSTEM;
        return false;
    }
    if (VLIBCEncShParam(target.c_str(), dest, sizeof(dest)) < 0) {
        CORV_LOG_ERR("Failed to escape string: %s", target.c_str());
        result = PKG_ERR_SYSTEM;
        return false;
    }
    CORVUtils::ProcessRunner mv("/bin/sh",
                                {"-c", std::string("/bin/mv -f ") + work + "/package/* " + dest});
    if (PMSRunAndWriteScriptLog(info, type, mv, 0x90) == 0) {
        return true;
    }
    CORV_LOG_ERR("Failed to move package files, %s", target.c_str());
    for (int attempt = 0; attempt < kCopyTries; ++attempt) {
        sleep(1);
        CORVUtils::ProcessRunner cp(
            "/bin/sh", {"-c", std::string("/bin/cp -arf ") + work + "/package/* " + dest});
        if (PMSRunAndWriteScriptLog(info, type, cp, -1) == 0) {
            return true;
        }
        CORV_LOG_ERR("Failed to move package files, %s, %d", target.c_str(), attempt);
    }
    result = PKG_ERR_SYSTEM;
    return false;
}

}  // namespace

int PackageManager::upgrade_package(const std::string& cpkPath, const std::string& volume,
                                    const std::string& storeRoot, const std::string& tmpRoot,
                                    bool repair, const Json::Value* extra, const char* language,
                                    const char* userName, bool ignoreDependents) {
    const PKG_INSTALLATION_TYPE type = static_cast<PKG_INSTALLATION_TYPE>(2);
    const std::string workDir = tmpRoot + "/pkginstall";
    PackageInfo newInfo;
    PackageInfo oldInfo;
    std::vector<std::string> order;
    bool running = false;
    bool wasEnabled = false;
    bool withDependents = true;
    bool postinstAcquireFailed = false;
    unsigned long long restartMask = 0;
    int outcome = 0;
    std::string upgradeTmp;
    std::string name;
    std::string target;
    std::string registry;
    std::string progressPath;
    CORV::PkgUtils::WorkerResp resp;
    ScriptContext ctx;
    InstallCommands cmd(cpkPath, workDir);

    // 1. As an installation: lock, unpack, check the new record.
    if (!PMSUnpackAndCheck(*this, type, cmd, cpkPath, workDir, newInfo, false)) {
        goto final;
    }
    name = newInfo.package;
    registry = PMSRegistryDir(name);
    // 2.
    if (!getPackageInfo(name, oldInfo, nullptr, PKG_INFO_MASK_ALL)) {
        CORV_LOG_ERR("Previous %s not installed, upgrade not possible", name.c_str());
        goto final;
    }
    // 3. A package being repaired is brought up afterwards whatever its state.
    if (repair) {
        running = true;
        wasEnabled = false;
    } else if (!getServiceStatus(oldInfo.package, running, true)) {
        running = false;
        wasEnabled = false;
    } else {
        wasEnabled = access(PMSEnabledFlagPath(oldInfo.package).c_str(), F_OK) == 0;
    }
    // 4. The same version is a reinstall.
    if (PackageBasicInfo(newInfo.package, newInfo.version)
            .compare(PackageBasicInfo(oldInfo.package, oldInfo.version), PKG_COMPOP_LT)) {
        insertMapParam("oldver", newInfo.version);
        insertMapParam("curver", oldInfo.version);
        setResult(PKG_ERR_DOWNGRADE);
        CORV_LOG_ERR("Can't downgrade %s", name.c_str());
        goto final;
    }
    // 5.
    if (!PMSRunLogged(newInfo, type, cmd.extractPayload) ||
        !PMSDropSpecialFiles(workDir + "/package")) {
        CORV_LOG_ERR("Failed to unpack package.tgz, %s", cpkPath.c_str());
        PMSExplainFailedUnpack(*this, workDir + "/package", PMSPayloadSize(newInfo, workDir));
        setResult(PKG_ERR_BAD_ARCHIVE);
        goto final;
    }
    // 6.
    ctx.logFile = getFixedLogFilePath(name);
    progressPath = PMSGetProgressPath(name);
    unlink(progressPath.c_str());
    ctx.language = language;
    ctx.extra = extra;
    ctx.volume = volume.c_str();
    ctx.cpkPath = cpkPath.c_str();
    ctx.userName = userName;
    ctx.resp = &resp;
    ctx.variables = {{"CORVPKG_PKGINST_TEMP_DIR", workDir + "/package"},
                     {"CORVPKG_OLD_PKGVER", oldInfo.version}};
    if (!VLIBCFileExist(kUpgradeBootupFlag)) {
        // 7.
        Json::Value stopList;
        if (!getDependencyOrder(name.c_str(), order, false)) {
            order.clear();
        }
        if (!getDepPkgListStop(order, name, language, stopList)) {
            if (!ignoreDependents && !stopList.empty()) {
                std::string names;
                for (const Json::Value& entry : stopList) {
                    names += (names.empty() ? "" : ", ") + entry["name"].asString();
                }
                insertMapParam("deppkg", names);
                setResult(PKG_ERR_UPGRADE_BREAKS_DEPENDENT);
                goto final;
            }
        } else if (order.size() == 1) {
            order.clear();
        }
        withDependents = true;
    } else {
        // 8. The first boot after an OS upgrade handles the named package alone.
        order = {name};
        std::string message;
        if (!areDependentPackageStop(name, language, message)) {
            CORV_LOG_ERR("Warring: %s is dependent on %s", message.c_str(), name.c_str());
        }
        withDependents = false;
    }
    // 9.
    if (running || !order.empty() || wasEnabled) {
        restartMask = findRestartServices(order);
        serviceControl(type, oldInfo.package, false, language, userName, &order, withDependents,
                       false);
        if (getResult() == PKG_ERR_PRESTOP_FAILED) {
            goto restart;
        }
    } else {
        restartMask = 0;
    }
    // 10.
    if (!ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", name.c_str());
        setResult(PKG_ERR_LOCKED);
        goto restart;
    }
    // 11. The folder outlives the old version, for the scripts to carry data across.
    upgradeTmp = Privilege::GetTmpFolderPath(oldInfo.package, volume.c_str());
    if (upgradeTmp.empty() || !Privilege::CreateTmpFolder(oldInfo.package, upgradeTmp)) {
        goto restart;
    }
    // 12. Up to here the old version is intact; a refusal brings it back.
    if (PMSCheckIsExec(workDir + "/scripts/preupgrade")) {
        int ret = PMSRunInstallScript(oldInfo, workDir + "/scripts/preupgrade", "preupgrade", type,
                                      ctx, false, "");
        if (ret == kScriptIdentityFailed) {
            setResult(PKG_ERR_BAD_ARCHIVE);
            goto restart;
        }
        if (ret != 0) {
            if (running || !newInfo.startable || !order.empty()) {
                serviceControl(type, name, true, language, userName, &order, true, false);
            }
            CORV_LOG_ERR("Failed to run preupgrade script for %s, %d", name.c_str(), ret);
            setResult(PKG_ERR_SYSTEM);
            goto restart;
        }
    }
    // 13. No way back to the old version from here.
    restartMask |= oldInfo.instuninst_restart_services;
    if (!uninstall(oldInfo, extra, language, type, nullptr)) {
        CORV_LOG_ERR("Failed to remove package %s", name.c_str());
        goto restart;
    }
    // 14.
    if (!ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", name.c_str());
        setResult(PKG_ERR_LOCKED);
        goto restart;
    }
    // 15.
    if (!Privilege::ReviseFileAttr(name, workDir) || !Resource::InitRequiredFields(name, workDir) ||
        !Resource::RestoreResourceFile(name, workDir)) {
        goto restart;
    }
    // 16.
    if (!Resource::Acquire(Resource::TIMING_PREINST, newInfo, type, resp, extra, workDir)) {
        CORV_LOG_ERR("Failed to acquire resource before install %s [0x%04X %s:%d]", name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        insertJsonParam("worker_msg", resp.GetErrJsonArray());
        setResult(PKG_ERR_UPGRADE_FAILED);
        goto restart;
    }
    // 17.
    if (PMSCheckIsExec(workDir + "/scripts/preinst")) {
        int ret = PMSRunInstallScript(newInfo, workDir + "/scripts/preinst", "preinst", type, ctx,
                                      true, workDir);
        if (ret != 0) {
            if (ret != kScriptIdentityFailed) {
                CORV_LOG_ERR("Failed to run preinstall script for %s, %d", name.c_str(), ret);
            }
            setResult(PKG_ERR_SYSTEM);
            goto restart;
        }
    }
    // 18, 19, 20.
    target = storeRoot + "/" + name;
    if (!PMSClearTarget(newInfo, type, target)) {
        goto restart;
    }
    {
        PKG_ERRCODE moveResult = PKG_OK;
        if (!movePayload(newInfo, workDir, target, moveResult)) {
            setResult(moveResult);
            goto restart;
        }
    }
    // 21.
    if (!ExLock(180)) {
        setResult(PKG_ERR_LOCKED);
        goto restart;
    }
    // 22.
    if (!PMSInfoFileUsable(workDir)) {
        CORV_LOG_ERR("Failed to validate package INFO in %s", workDir.c_str());
        PMSRunLogged(newInfo, type, cmd.repairExtract);
        if (!PMSLoadPKGInfoFile(workDir, newInfo, nullptr, kInstallInfoMask)) {
            CORV_LOG_ERR("Failed to validate package INFO");
            setResult(PKG_ERR_BAD_ARCHIVE);
            goto restart;
        }
    }
    // 23.
    if (PKG_ERRCODE icons = PMSFoldIcons(workDir, name); icons != PKG_OK) {
        setResult(icons);
        goto restart;
    }
    // 24.
    if (!registerPackage(type, newInfo, workDir, target)) {
        CORV_LOG_ERR("Failed to register package %s", name.c_str());
        setResult(PKG_ERR_SYSTEM);
        goto restart;
    }
    // 25.
    if (!Resource::Acquire(Resource::TIMING_POSTINST, newInfo, type, resp, extra, "")) {
        postinstAcquireFailed = true;
        CORV_LOG_ERR("Failed to acquire resource after install %s [0x%04X %s:%d]", name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        insertJsonParam("worker_msg", resp.GetErrJsonArray());
    }
    // 26.
    restartMask |= newInfo.instuninst_restart_services;
    // 27.
    if (PMSCheckIsExec(registry + "/scripts/postinst")) {
        int ret = PMSRunInstallScript(newInfo, registry + "/scripts/postinst", "postinst", type,
                                      ctx, true, "");
        if (ret != 0) {
            if (ret != kScriptIdentityFailed) {
                CORV_LOG_ERR("Failed to run postinst script for %s, %d", name.c_str(), ret);
            }
            setResult(PKG_ERR_SYSTEM);
            goto restart;
        }
    }
    if (PMSCheckIsExec(registry + "/scripts/postupgrade")) {
        int ret = PMSRunInstallScript(newInfo, registry + "/scripts/postupgrade", "postupgrade",
                                      type, ctx, false, "");
        if (ret != 0) {
            if (ret != kScriptIdentityFailed) {
                CORV_LOG_ERR("Failed to run postupgrade script for %s, %d", name.c_str(), ret);
            }
            setResult(PKG_ERR_SYSTEM);
            goto restart;
        }
    }
    // 28. `installing` stays: the package shows as broken until repaired.
    if (postinstAcquireFailed) {
        setResult(PKG_ERR_UPGRADE_FAILED);
        goto restart;
    }
    // 29.
    d->packageInfo = newInfo;
    post_install(newInfo);
    unlink(progressPath.c_str());
    unlink((registry + "/installing").c_str());
    outcome = 1;
    if (running || !newInfo.startable || !order.empty()) {
        restartMask |= findRestartServices(order);
        serviceControl(type, name, true, language, userName, &order, true, false);
    }
restart:
    // 30.
    if (restartMask != 0) {
        RestartServicesAction(restartMask);
    }
final:
    // 31.
    if (!upgradeTmp.empty()) {
        VLIBCExec("/bin/rm", "-rf", upgradeTmp.c_str(), nullptr);
    }
    PMSWriteSysLogf("%s %s from %s to %s %s", "upgrade", oldInfo.package.c_str(),
                    oldInfo.version.c_str(), newInfo.version.c_str(),
                    outcome ? "successfully" : "failed");
    if (getResult() != PKG_ERR_LOCKED && VLIBCFileCheckDir(workDir.c_str())) {
        PMSRunLogged(newInfo, type, cmd.removeWorkDir);
    }
    PMSCheckServiesStatus(newInfo, &oldInfo, type, -1);
    return outcome;
}

}  // namespace CORVPackageTool
