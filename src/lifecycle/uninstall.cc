// Removal of an installed package. Until its preuninst has agreed the package can come
// back as it was; after that the road only goes forward, and what a failure leaves shows as
// a broken package that the next install repairs.
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/packagemanager_private.h"
#include "corv/eventlog.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
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

// The payload's directory goes; when it cannot be removed it is moved aside on its volume.
bool removePayload(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                   const std::string& registry) {
    const std::string target = PMSReadLink(registry + "/target");
    if (target.empty()) {
        CORV_LOG_ERR("Failed to resovle package target for %s", info.package.c_str());
        return true;
    }
    if (!VLIBCFileCheckDir(target.c_str())) {
        return true;
    }
    return PMSClearTarget(info, type, target);
}

}  // namespace

int PackageManager::uninstall(const std::string& name, const Json::Value* extra,
                              const char* language, PKG_INSTALLATION_TYPE type, bool force,
                              const char* userName) {
    // 1.
    PackageInfo local;
    PackageInfo& info = type == 4 ? d->packageInfo : local;
    // 2.
    if (type == 4 && !force && !VLIBCFileExist(kUpgradeBootupFlag)) {
        std::string dependents;
        if (!arePackagesDepended(name, language, dependents)) {
            insertMapParam("deppkg", dependents);
            setResult(PKG_ERR_DEPENDENCY);
            return 0;
        }
    }
    // 3.
    const std::string registry = PMSRegistryDir(name);
    if (!PMSLoadPKGInfoFile(registry, info, nullptr, PKG_INFO_MASK_ALL)) {
        CORV_LOG_ERR("Failed to load package info in %s", registry.c_str());
        setResult(PKG_ERR_NOT_INSTALLED);
        return 0;
    }
    // 4. The routine may reload the manager's own record; it works on a copy.
    const PackageInfo snapshot = info;
    return uninstall(snapshot, extra, language, type, userName);
}

int PackageManager::uninstall(const PackageInfo& info, const Json::Value* extra,
                              const char* language, PKG_INSTALLATION_TYPE type,
                              const char* userName) {
    const std::string name = info.package;
    const std::string registry = PMSRegistryDir(name);
    int outcome = 0;
    bool wasRunning = false;
    NOS::Task* task = nullptr;
    std::string logFile;
    CORV::PkgUtils::WorkerResp resp;

    // 1.
    if (!ExLock(180)) {
        setResult(PKG_ERR_LOCKED);
        goto final;
    }
    // 2.
    if (type == 4) {
        task = PMSCreateOperationTask("@CORVPKG_UNINSTALL_", name, "uninstalling");
    }
    // 3.
    logFile = getLogFilePath();
    if (logFile.empty()) {
        logFile = getFixedLogFilePath(name);
    }
    // 4.
    if (access(PMSEnabledFlagPath(name).c_str(), F_OK) == 0) {
        serviceControl(type, name, false, language, nullptr, nullptr, true, true);
        if (type == 4 && getResult() == PKG_ERR_PRESTOP_FAILED) {
            goto final;
        }
        wasRunning = true;
    }
    // 5-7.
    if (PMSCheckIsExec(registry + "/scripts/preuninst")) {
        CORVUtils::ProcessRunner runner(registry + "/scripts/preuninst", {});
        PMSPrepareScriptEnv(info, runner, language, &logFile, type, extra, nullptr, nullptr,
                            userName);
        bool refused = false;
        if (!Privilege::SetIdentity(runner, name, "preuninst", "")) {
            CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", name.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            refused = true;
        } else if (int ret = PMSRunAndWriteScriptLog(info, type, runner, 0x90); ret != 0) {
            CORV_LOG_ERR("Failed to run preuninst for %s, [%d]", name.c_str(), ret);
            // Binaries of another architecture cannot run: their refusal means nothing.
            if (PMSCheckPackageArchModelMatched(info)) {
                refused = true;
            } else {
                CORV_LOG_ERR("Ignoring preuninst failure for %s due to wrong arch", name.c_str());
            }
        }
        if (refused) {
            if (type == 4 && wasRunning) {
                serviceControl(static_cast<PKG_INSTALLATION_TYPE>(4), name, true, language, nullptr,
                               nullptr, true, true);
            }
            goto final;
        }
    }
    // 8. From here on the road goes forward; release failures are recorded only.
    if (!Resource::Release(Resource::TIMING_PREUNINST, info, type, resp, extra, "")) {
        CORV_LOG_ERR("Failed to release resource before uninstall %s [0x%04X %s:%d]", name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        insertJsonParam("worker_msg", resp.GetErrJsonArray());
        setResult(PKG_ERR_RESOURCE_RELEASE);
    }
    // 9.
    if (!removePayload(info, type, registry)) {
        goto final;
    }
    // 10.
    if (!Resource::Release(Resource::TIMING_POSTUNINST, info, type, resp, extra, "")) {
        CORV_LOG_ERR("Failed to release resource after uninstall %s [0x%04X %s:%d]", name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        insertJsonParam("worker_msg", resp.GetErrJsonArray());
        setResult(PKG_ERR_RESOURCE_RELEASE);
    }
    // 11. The new version's workers start from what the old one acquired.
    if (type == 2) {
        Resource::BackupResourceFile(name);
    }
    // 12. A failing postuninst changes nothing: the package is gone already.
    if (PMSCheckIsExec(registry + "/scripts/postuninst")) {
        CORVUtils::ProcessRunner runner(registry + "/scripts/postuninst", {});
        PMSPrepareScriptEnv(info, runner, language, &logFile, type, extra, nullptr, nullptr,
                            nullptr);
        resp.DumpEnv(runner);
        if (!Privilege::SetIdentity(runner, name, "postuninst", "")) {
            CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", name.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        }
        if (int ret = PMSRunAndWriteScriptLog(info, type, runner, 0x90); ret != 0) {
            CORV_LOG_ERR("Failed to run postuninst for %s, [%d]", name.c_str(), ret);
        }
    }
    // 13.
    if (VLIBCFileCheckDir(registry.c_str())) {
        std::string images;
        if (PMSGetImageTmpPath("INST", name.c_str(), nullptr, images)) {
            CORVUtils::ProcessRunner rm("/bin/rm", {"-rf", images});
            rm.run(true, true);
        }
    }
    // 14. An upgrade keeps the registry directory for the new version.
    {
        CORVUtils::ProcessRunner rm =
            type == 2 ? CORVUtils::ProcessRunner(
                            "/usr/bin/find", {registry, "-mindepth", "1", "-maxdepth", "1", "-exec",
                                              "rm", "-rf", "{}", ";"})
                      : CORVUtils::ProcessRunner("/bin/rm", {"-rf", registry});
        if (rm.run(true, true) != 0) {
            CORV_LOG_ERR("Failed to remove files %s", registry.c_str());
            setResult(PKG_ERR_SYSTEM);
            goto final;
        }
    }
    outcome = 1;

final:
    // 15.
    if (!info.displayname.empty() && (type & 4) != 0) {
        if (outcome) {
            CORVLogSet1(2, 1, 0x13700007, info.displayname.c_str(), "", "", "");
        } else {
            CORVLogSet1(2, 3, 0x13700008, info.displayname.c_str(), "", "", "");
        }
    }
    // 16.
    PMSWriteSysLogf("%s %s: Uninstall %s %s", parseInstallTypeToStr(type), name.c_str(),
                    info.version.c_str(), outcome ? "successfully" : "failed");
    // 17. An upgrade goes on under the same lock and runs the hooks itself.
    if (type == 4) {
        PMSCheckServiesStatus(info, nullptr, type, -1);
        RestartServices(type, 0);
        UnLock();
    }
    // 18.
    CleanAllEnv();
    PMSRemoveTask(task);
    return outcome;
}

int PackageManager::uninstallPKGs(const std::vector<std::string>& names, bool toStdout) {
    // 1.
    if (!init()) {
        return 0;
    }
    if (names.empty()) {
        return 1;
    }
    // 2.
    std::vector<std::string> list;
    if (!getDependencyOrder(list)) {
        list = enumPackages(std::set<std::string>(), PKG_INFO_MASK_ALL);
    }
    // 3.
    int outcome = 1;
    for (const std::string& entry : list) {
        bool wanted = false;
        for (const std::string& name : names) {
            wanted = wanted || name == entry;
        }
        if (!wanted) {
            continue;
        }
        if (!uninstall(entry, nullptr, nullptr, static_cast<PKG_INSTALLATION_TYPE>(4), false,
                       nullptr)) {
            if (toStdout) {
                printf("Failed to uninstall package: %s, %d\n", entry.c_str(),
                       static_cast<int>(getResult()));
            } else {
                CORV_LOG_ERR("Failed to uninstall package: %s, %d", entry.c_str(),
                             static_cast<int>(getResult()));
            }
            outcome = 0;
        }
    }
    return outcome;
}

}  // namespace CORVPackageTool
