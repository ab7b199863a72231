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
#include "lifecycle/road.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kUpgradeBootupFlag = "/var/.UpgradeBootup";
constexpr PKG_INSTALLATION_TYPE kUpgrade = static_cast<PKG_INSTALLATION_TYPE>(2);
constexpr PKG_INSTALLATION_TYPE kUninstall = static_cast<PKG_INSTALLATION_TYPE>(4);

// What the steps of an uninstallation share. With type 2 it is the first half of an
// upgrade, which keeps the registry directory and runs the closing hooks itself.
struct UninstallRoad {
    PackageManager& pm;
    const PackageInfo& info;
    const Json::Value* extra;
    const char* language;
    const PKG_INSTALLATION_TYPE type;
    const char* userName;
    const std::string name;
    const std::string registry;
    std::string logFile{};
    bool wasRunning = false;
    NOS::Task* task = nullptr;
    CORV::PkgUtils::WorkerResp resp{};
    int outcome = 0;
};

bool lock(UninstallRoad& r) {
    if (!PackageManager::ExLock(180)) {
        r.pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    return true;
}

// A record that others (the desktop) can follow; an upgrade has its own.
bool openTask(UninstallRoad& r) {
    if (r.type == kUninstall) {
        r.task = PMSCreateOperationTask("@CORVPKG_UNINSTALL_", r.name, "uninstalling");
    }
    return true;
}

bool prepareMessages(UninstallRoad& r) {
    r.logFile = r.pm.getLogFilePath();
    if (r.logFile.empty()) {
        r.logFile = r.pm.getFixedLogFilePath(r.name);
    }
    return true;
}

// The package stops with its dependents. A prestop that refuses keeps a plain uninstall
// from going on.
bool stopPackage(UninstallRoad& r) {
    if (access(PMSEnabledFlagPath(r.name).c_str(), F_OK) != 0) {
        return true;
    }
    r.pm.serviceControl(r.type, r.name, false, r.language, nullptr, nullptr, true, true);
    if (r.type == kUninstall && r.pm.getResult() == PKG_ERR_PRESTOP_FAILED) {
        return false;
    }
    r.wasRunning = true;
    return true;
}

// preuninst may refuse: a package that was running comes back up, and nothing is removed.
// Binaries of another architecture cannot run, so their refusal means nothing.
bool runPreuninst(UninstallRoad& r) {
    const std::string script = r.registry + "/scripts/preuninst";
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    CORVUtils::ProcessRunner runner(script, {});
    runner.setArgZero("preuninst");
    PMSPrepareScriptEnv(r.info, runner, r.language, &r.logFile, r.type, r.extra, nullptr, nullptr,
                        r.userName);
    bool refused = false;
    if (!Privilege::SetIdentity(runner, r.name, "preuninst", "")) {
        CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", r.name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        refused = true;
    } else if (int ret = PMSRunAndWriteScriptLog(r.info, r.type, runner, 0x90); ret != 0) {
        CORV_LOG_ERR("Failed to run preuninst for %s, [%d]", r.name.c_str(), ret);
        if (PMSCheckPackageArchModelMatched(r.info)) {
            refused = true;
        } else {
            CORV_LOG_ERR("Ignoring preuninst failure for %s due to wrong arch", r.name.c_str());
        }
    }
    if (refused && r.type == kUninstall && r.wasRunning) {
        r.pm.serviceControl(kUninstall, r.name, true, r.language, nullptr, nullptr, true, true);
    }
    return !refused;
}

// From here on the road only goes forward; a failed release is recorded and the removal
// goes on.
bool releaseResources(UninstallRoad& r, Resource::TIMING timing, const char* when) {
    if (!Resource::Release(timing, r.info, r.type, r.resp, r.extra, "")) {
        CORV_LOG_ERR("Failed to release resource %s uninstall %s [0x%04X %s:%d]", when,
                     r.name.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        r.pm.insertJsonParam("worker_msg", r.resp.GetErrJsonArray());
        r.pm.setResult(PKG_ERR_RESOURCE_RELEASE);
    }
    return true;
}

bool releasePreuninstResources(UninstallRoad& r) {
    return releaseResources(r, Resource::TIMING_PREUNINST, "before");
}

// The payload's directory goes; when it cannot be removed it is moved aside on its volume.
bool removePayload(UninstallRoad& r) {
    const std::string target = PMSReadLink(r.registry + "/" + kRegistryTarget);
    if (target.empty()) {
        CORV_LOG_ERR("Failed to resovle package target for %s", r.name.c_str());
        return true;
    }
    if (!VLIBCFileCheckDir(target.c_str())) {
        return true;
    }
    return PMSClearTarget(r.info, r.type, target);
}

bool releasePostuninstResources(UninstallRoad& r) {
    return releaseResources(r, Resource::TIMING_POSTUNINST, "after");
}

// The new version's workers start from what the old one acquired.
bool keepResourceRecord(UninstallRoad& r) {
    if (r.type == kUpgrade) {
        Resource::BackupResourceFile(r.name);
    }
    return true;
}

// A failing postuninst changes nothing: the package is gone already.
bool runPostuninst(UninstallRoad& r) {
    const std::string script = r.registry + "/scripts/postuninst";
    if (!PMSCheckIsExec(script)) {
        return true;
    }
    CORVUtils::ProcessRunner runner(script, {});
    runner.setArgZero("postuninst");
    PMSPrepareScriptEnv(r.info, runner, r.language, &r.logFile, r.type, r.extra, nullptr, nullptr,
                        nullptr);
    r.resp.DumpEnv(runner);
    if (!Privilege::SetIdentity(runner, r.name, "postuninst", "")) {
        CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", r.name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
    }
    if (int ret = PMSRunAndWriteScriptLog(r.info, r.type, runner, 0x90); ret != 0) {
        CORV_LOG_ERR("Failed to run postuninst for %s, [%d]", r.name.c_str(), ret);
    }
    return true;
}

bool removeImageCache(UninstallRoad& r) {
    std::string images;
    if (VLIBCFileCheckDir(r.registry.c_str()) &&
        PMSGetImageTmpPath("INST", r.name.c_str(), nullptr, images)) {
        CORVUtils::ProcessRunner rm("/bin/rm", {"-rf", images});
        rm.run(true, true);
    }
    return true;
}

// An upgrade keeps the registry directory, emptied, for the new version.
bool removeRegistry(UninstallRoad& r) {
    CORVUtils::ProcessRunner rm =
        r.type == kUpgrade
            ? CORVUtils::ProcessRunner("/usr/bin/find", {r.registry, "-mindepth", "1", "-maxdepth",
                                                         "1", "-exec", "rm", "-rf", "{}", ";"})
            : CORVUtils::ProcessRunner("/bin/rm", {"-rf", r.registry});
    if (rm.run(true, true) != 0) {
        CORV_LOG_ERR("Failed to remove files %s", r.registry.c_str());
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    r.outcome = 1;
    return true;
}

constexpr RoadStep<UninstallRoad> kUninstallSteps[] = {
    {"lock", lock},
    {"open-task", openTask},
    {"prepare-messages", prepareMessages},
    {"stop", stopPackage},
    {"run-preuninst", runPreuninst},
    {"release-preuninst-resources", releasePreuninstResources},
    {"remove-payload", removePayload},
    {"release-postuninst-resources", releasePostuninstResources},
    {"keep-resource-record", keepResourceRecord},
    {"run-postuninst", runPostuninst},
    {"remove-image-cache", removeImageCache},
    {"remove-registry", removeRegistry},
};

bool recordEvent(UninstallRoad& r) {
    if (!r.info.displayname.empty() && (r.type & kUninstall) != 0) {
        if (r.outcome) {
            CORVLogSet1(2, 1, 0x13700007, r.info.displayname.c_str(), "", "", "");
        } else {
            CORVLogSet1(2, 3, 0x13700008, r.info.displayname.c_str(), "", "", "");
        }
    }
    return true;
}

bool logOutcome(UninstallRoad& r) {
    PMSWriteSysLogf("%s %s: Uninstall %s %s", parseInstallTypeToStr(r.type), r.name.c_str(),
                    r.info.version.c_str(), r.outcome ? "successfully" : "failed");
    return true;
}

// An upgrade goes on under the same lock and runs the hooks itself.
bool runHooks(UninstallRoad& r) {
    if (r.type == kUninstall) {
        PMSCheckServiesStatus(r.info, nullptr, r.type, -1);
        r.pm.RestartServices(r.type, 0);
        PackageManager::UnLock();
    }
    return true;
}

bool cleanUp(UninstallRoad& r) {
    CleanAllEnv();
    PMSRemoveTask(r.task);
    return true;
}

constexpr RoadStep<UninstallRoad> kUninstallClosingSteps[] = {
    {"record-event", recordEvent},
    {"log-outcome", logOutcome},
    {"run-hooks", runHooks},
    {"clean-up", cleanUp},
};

}  // namespace

int PackageManager::uninstall(const std::string& name, const Json::Value* extra,
                              const char* language, PKG_INSTALLATION_TYPE type, bool force,
                              const char* userName) {
    PackageInfo local;
    PackageInfo& info = type == 4 ? d->packageInfo : local;
    if (type == 4 && !force && !VLIBCFileExist(kUpgradeBootupFlag)) {
        std::string dependents;
        if (!arePackagesDepended(name, language, dependents)) {
            insertMapParam("deppkg", dependents);
            setResult(PKG_ERR_DEPENDENCY);
            return 0;
        }
    }
    const std::string registry = PMSRegistryDir(name);
    if (!PMSLoadPKGInfoFile(registry, info, nullptr, PKG_INFO_MASK_ALL)) {
        CORV_LOG_ERR("Failed to load package info in %s", registry.c_str());
        setResult(PKG_ERR_NOT_INSTALLED);
        return 0;
    }
    // The routine may reload the manager's own record; it works on a copy.
    const PackageInfo snapshot = info;
    return uninstall(snapshot, extra, language, type, userName);
}

int PackageManager::uninstall(const PackageInfo& info, const Json::Value* extra,
                              const char* language, PKG_INSTALLATION_TYPE type,
                              const char* userName) {
    UninstallRoad r{*this, info,     extra,        language,
                    type,  userName, info.package, PMSRegistryDir(info.package)};
    PMSRunRoad("uninstall", r, kUninstallSteps);
    PMSRunClosingSteps("uninstall", r, kUninstallClosingSteps);
    return r.outcome;
}

int PackageManager::uninstallPKGs(const std::vector<std::string>& names, bool toStdout) {
    if (!init()) {
        return 0;
    }
    if (names.empty()) {
        return 1;
    }
    // Dependents go before what they depend on; without an order, in any order.
    std::vector<std::string> list;
    if (!getDependencyOrder(list)) {
        list = enumPackages(std::set<std::string>(), PKG_INFO_MASK_ALL);
    }
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
