// Start and stop of one package: the checks before its job may start, the `enabled` flag,
// the prestart/prestop questions to the package, the resources tied to the running state,
// and the job itself.
#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/packagemanager_private.h"
#include "corv/acl.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgapppriv.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "corvpkg/service.h"
#include "lifecycle/lifecycle_private.h"
#include "lifecycle/road.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kNotifier = "/usr/corv/bin/corvnosnotify";
constexpr const char* kDesktopLinkDir = "/usr/corv/corvman/webui/3rdparty/";

bool exists(const std::string& path) {
    return access(path.c_str(), F_OK) == 0;
}

// `<script> prestart|prestop`: 0 when the package agrees. With `identity`, the action's
// own identity from conf/privilege; -1 when that cannot be set.
int askPackage(const PackageInfo& info, const std::string& script, const char* action,
               bool identity, PKG_INSTALLATION_TYPE type, const char* language,
               const std::string& logFile, const char* userName) {
    CORVUtils::ProcessRunner runner(script, {action});
    runner.setArgZero("start-stop-status");
    if (identity && !Privilege::SetIdentity(runner, info.package, action, "")) {
        CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", info.package.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    PMSPrepareScriptEnv(info, runner, language, &logFile, type, nullptr, nullptr, nullptr,
                        userName);
    return runner.run(true, false) == 0 ? 0 : 1;
}

}  // namespace

void PMSNotifyAdministrators(const std::vector<std::string>& args) {
    std::vector<const char*> argv = {kNotifier, "-c", "CORV.NDS.PkgManApp.Instance", "-t", "false"};
    for (const std::string& arg : args) {
        argv.push_back(arg.c_str());
    }
    argv.push_back(nullptr);
    if (VLIBCExecv(kNotifier, argv.data(), 1) != 0) {
        CORV_LOG_ERR("Failed to run %s", kNotifier);
    }
}

int ServiceControlStep(const PackageInfo& info, const std::string& job, bool start,
                       PKG_INSTALLATION_TYPE type, const char* language, const char* userName) {
    if (!Service::DumpExtraEnv(info.package, type, language, userName)) {
        return -1;
    }
    if (type == 0) {
        return start ? VLIBServiceResume(job.c_str()) : VLIBServicePause(job.c_str());
    }
    if (type == 2 && !start) {
        return VLIBServicePause(job.c_str());
    }
    return start ? VLIBServiceStart(job.c_str(), 0) : VLIBServiceStop(job.c_str(), 0);
}

void PackageManager::removePkgResources(PKG_INSTALLATION_TYPE type, const PackageInfo& info,
                                        MSG_TYPE msg) {
    // Shutdown keeps everything: the package comes back as it was at boot.
    if (type == 0) {
        return;
    }
    if (!info.nosuidir.empty()) {
        unlink((kDesktopLinkDir + info.package).c_str());
    }
    unlink(PMSEnabledFlagPath(info.package).c_str());
    CORV::PkgUtils::WorkerResp resp;
    if (!Resource::Release(Resource::TIMING_DISABLE, info, type, resp, nullptr, "")) {
        CORV_LOG_ERR("Failed to release resource after stop %s [0x%04X %s:%d]",
                     info.package.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        if (msg == MSG_TYPE_PARAM) {
            insertJsonParam("worker_msg", resp.GetErrJsonArray());
        }
    }
}

void PackageManager::DisableWithDependents(PKG_INSTALLATION_TYPE type, const PackageInfo& info,
                                           const char* language, const char* userName) {
    const std::string enabled = PMSEnabledFlagPath(info.package);
    if (!exists(enabled)) {
        return;
    }
    PackageManager other;
    std::vector<std::string> order;
    if (!other.getDependencyOrder(info.package.c_str(), order, true)) {
        order = {info.package};
    }
    unlink(enabled.c_str());
    other.serviceControl(static_cast<PKG_INSTALLATION_TYPE>(0x10), info.package, false, language,
                         userName, &order, true, true);
    if (type != 0 || order.size() <= 1) {
        return;
    }
    std::string names;
    for (const std::string& entry : order) {
        if (entry == info.package) {
            continue;
        }
        PackageInfo dependent;
        if (!other.getPackageInfo(entry, dependent, language, PKG_INFO_MASK_ALL)) {
            continue;
        }
        names += (names.empty() ? "" : ", ") + dependent.displayname;
    }
    if (!names.empty()) {
        PMSNotifyAdministrators({"@administrators", "tree:leaf_packagemanage",
                                 "pkgmgr:dep_start_failed", info.displayname, names});
    }
}

namespace {

// What the steps of one package's start or stop share.
struct ControlRoad {
    PackageManager& pm;
    PackageInfo& info;
    const PKG_INSTALLATION_TYPE type;
    const std::string& name;
    const bool start;
    const char* language;
    const char* userName;
    const MSG_TYPE msg;
    const std::string enabled;
    const std::string job;
    std::string script{};
    std::string logFile{};
    int outcome = 0;
};

const char* verbOf(const ControlRoad& r) {
    return r.start ? "start" : "stop";
}

// The result says what failed until a later step knows better.
bool begin(ControlRoad& r) {
    r.pm.setResult(r.start ? PKG_ERR_START_FAILED : PKG_ERR_STOP_FAILED);
    r.script = r.pm.getServiceScript(r.name, r.info);
    PMSWriteSysLogf("%s %s: begin to %s version %s", parseInstallTypeToStr(r.type), r.name.c_str(),
                    verbOf(r), r.info.version.c_str());
    return true;
}

// A package never runs without the system services it declared it needs; one that was
// meant to run gives up what its running state held.
bool checkRequiredServices(ControlRoad& r) {
    if (!r.start) {
        return true;
    }
    const std::set<std::string> off = r.pm.checkServiceStarted(PMSGetStartDepServiceSet(r.info));
    if (off.empty()) {
        return true;
    }
    Json::Value names(Json::arrayValue);
    for (const std::string& service : off) {
        names.append(service);
    }
    r.pm.setResult(PKG_ERR_SERVICE_NOT_STARTED, names);
    std::string joined;
    joinJsonArray(names, ", ", joined);
    CORV_LOG_ERR("Fail to start %s, services are not enabled: %s", r.name.c_str(), joined.c_str());
    if (exists(r.enabled)) {
        if (!VLIBCIsDockette()) {
            r.pm.removePkgResources(static_cast<PKG_INSTALLATION_TYPE>(0x10), r.info, r.msg);
        } else if (!r.info.nosuidir.empty()) {
            unlink((kDesktopLinkDir + r.name).c_str());
        }
    }
    return false;
}

// At boot a package this firmware does not allow is disabled with its dependents, and the
// administrators are told.
bool checkVersionLimits(ControlRoad& r) {
    if (!r.start || r.pm.CanPackageStartInThisFirmware(r.info)) {
        return true;
    }
    CORV_LOG_ERR("Cannot start package [%s], version %s in this NOS version", r.name.c_str(),
                 r.info.version.c_str());
    if (r.type == 0) {
        if (exists(r.enabled)) {
            r.pm.DisableWithDependents(static_cast<PKG_INSTALLATION_TYPE>(0), r.info, r.language,
                                       r.userName);
        }
        PMSNotifyAdministrators({"@administrators", "tree:leaf_packagemanage",
                                 "pkgmgr:fail_start_nos_version", r.info.displayname});
    }
    return false;
}

bool checkArch(ControlRoad& r) {
    if (!r.start || PMSCheckPackageArchModelMatched(r.info)) {
        return true;
    }
    CORV_LOG_ERR("Cannot start package [%s], version %s", r.name.c_str(), r.info.version.c_str());
    if (r.type == 0 && exists(r.enabled)) {
        r.pm.DisableWithDependents(static_cast<PKG_INSTALLATION_TYPE>(0), r.info, r.language,
                                   r.userName);
    }
    return false;
}

// A package on a data volume cannot run while there is none.
bool checkVolume(ControlRoad& r) {
    if (!r.start || r.info.install_type == "system" || r.info.install_type == "cluster") {
        return true;
    }
    const bool dockette = VLIBCIsDockette() != 0;
    if (VolumeCountGet(dockette ? 0xc : 1) != 0) {
        return true;
    }
    CORV_LOG_ERR("There is no volume. Can't start [%s], version %s", r.name.c_str(),
                 r.info.version.c_str());
    r.pm.setResult(dockette ? PKG_ERR_NO_USB_VOLUME : PKG_ERR_NO_VOLUME);
    return false;
}

// Without its control script the result is what the registry lookup said.
bool checkControlScript(ControlRoad& r) {
    if (!r.script.empty()) {
        return true;
    }
    if (r.pm.getResult() == PKG_ERR_BROKEN) {
        CORV_LOG_ERR("Package target path broken, %s", r.name.c_str());
    }
    return false;
}

bool prepareMessages(ControlRoad& r) {
    r.logFile = r.pm.getLogFilePath();
    if (r.logFile.empty()) {
        r.logFile = r.pm.getFixedLogFilePath(r.name);
    }
    return true;
}

// prestart/prestop: the package may say no. Boot and shutdown do not ask.
bool askPackageFirst(ControlRoad& r) {
    if (r.type == 0 || !PMSGetPrecheckStartStop(r.info)) {
        return true;
    }
    const int agreed = askPackage(r.info, r.script, r.start ? "prestart" : "prestop", true, r.type,
                                  r.language, r.logFile, r.userName);
    if (agreed < 0) {
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    if (agreed != 0) {
        r.pm.setResult(r.start ? PKG_ERR_PRESTART_FAILED : PKG_ERR_PRESTOP_FAILED);
        return false;
    }
    return true;
}

// The user's intent: a stop withdraws it, a start first takes the resources the running
// state needs. Boot and shutdown leave the intent as it is.
bool changeIntent(ControlRoad& r) {
    if (r.type == 0) {
        return true;
    }
    if (!r.start) {
        unlink(r.enabled.c_str());
        return true;
    }
    CORV::PkgUtils::WorkerResp resp;
    if (!Resource::Acquire(Resource::TIMING_ENABLE, r.info, r.type, resp, nullptr, "")) {
        CORV_LOG_ERR("Failed to acquire resource before start %s [0x%04X %s:%d]", r.name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        if (r.msg == MSG_TYPE_PARAM) {
            r.pm.insertJsonParam("worker_msg", resp.GetErrJsonArray());
        }
        return false;
    }
    return true;
}

// The flag only remembers the intent; the job decides whether the package runs. A failure
// to write it does not stop the start.
bool markEnabled(ControlRoad& r) {
    if (r.start) {
        int fd = open(r.enabled.c_str(), O_CREAT | O_TRUNC | O_WRONLY | O_CLOEXEC, 0644);
        if (fd >= 0) {
            close(fd);
        }
    }
    return true;
}

// A job that is up while the package says it does not run is stale: a start alone would
// find it running and do nothing. It is stopped first, unless the package refuses.
bool clearStaleJob(ControlRoad& r) {
    if (!r.start) {
        return true;
    }
    int status = 0;
    int rough = 0;
    if (VLIBServiceStatusGet(r.job.c_str(), &status) < 0) {
        CORV_LOG_ERR("Failed to get status of %s [0x%04X %s:%d]", r.job.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (!r.pm.getPkgRoughStatus(r.name, rough)) {
        CORV_LOG_ERR("Failed to get package %s's rough status", r.name.c_str());
        return false;
    }
    // The status probe leaves the script's exit in the result; what the caller learns of a
    // failed start is still that the start failed.
    r.pm.setResult(PKG_ERR_START_FAILED);
    if (status == VLIB_SERVICE_STATE_STOPPED || (rough & 0x2) != 0) {
        return true;
    }
    bool stopIt = true;
    if (r.type != 0 && PMSGetPrecheckStartStop(r.info)) {
        stopIt = askPackage(r.info, r.script, "prestop", false, r.type, r.language, r.logFile,
                            r.userName) == 0;
    }
    if (stopIt && ServiceControlStep(r.info, r.job, false, r.type, r.language, r.userName) < 0) {
        CORV_LOG_ERR("Failed to stop of %s [0x%04X %s:%d]", r.job.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    return true;
}

// What a started or stopped job leaves to do: the desktop applications of a started
// package, the running state's resources of a stopped one, and the package's own words.
void jobDone(ControlRoad& r) {
    if (r.start) {
        PMSSetAppPrivilege(r.userName, r.info.nosappname, r.language);
    } else {
        r.pm.removePkgResources(r.type, r.info, r.msg);
    }
    if (r.msg == MSG_TYPE_PARAM_AND_SCRIPT_LOG) {
        std::string text;
        if (PMReadFile(r.logFile.c_str(), 0x10000, text, nullptr) && !text.empty()) {
            PMSNotifyAdministrators({"-e", "false", "@administrators", "tree:leaf_packagemanage",
                                     r.info.displayname + ": " + text});
        }
    }
    r.pm.setResult(PKG_OK);
    r.outcome = 1;
}

// A package that fails to start is disabled with its dependents. The job's resource step
// ran in the job's own process: its words come by file.
void jobFailed(ControlRoad& r, int value) {
    CORV_LOG_ERR("Failed to %s %s (err=%d) [0x%04X %s:%d]", verbOf(r), r.name.c_str(), value,
                 VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
    if (r.start && exists(r.enabled)) {
        r.pm.DisableWithDependents(r.type, r.info, r.language, r.userName);
    }
    if (r.msg == MSG_TYPE_PARAM) {
        Json::Value workerMsg;
        const std::string path =
            std::string(r.start ? "/tmp/workermsg-acquire-" : "/tmp/workermsg-release-") + r.name;
        if (Resource::ReadJsonFile(path, workerMsg)) {
            r.pm.insertJsonParam("worker_msg", workerMsg);
        }
    }
}

bool driveJob(ControlRoad& r) {
    const int value = ServiceControlStep(r.info, r.job, r.start, r.type, r.language, r.userName);
    if (value == 0) {
        jobDone(r);
    } else {
        jobFailed(r, value);
    }
    return r.outcome == 1;
}

constexpr RoadStep<ControlRoad> kControlSteps[] = {
    {"begin", begin},
    {"check-required-services", checkRequiredServices},
    {"check-version-limits", checkVersionLimits},
    {"check-arch", checkArch},
    {"check-volume", checkVolume},
    {"check-control-script", checkControlScript},
    {"prepare-messages", prepareMessages},
    {"ask-package", askPackageFirst},
    {"change-intent", changeIntent},
    {"mark-enabled", markEnabled},
    {"clear-stale-job", clearStaleJob},
    {"drive-job", driveJob},
};

// Package stores must stay in plain Linux mode for the packages' own users.
bool keepStoreLinuxMode(ControlRoad& r) {
    std::string volume;
    if (!PMSGetPackageVol(r.name, volume)) {
        return true;
    }
    const std::string store = volume + "/@appstore";
    if (CORVACLIsSupport(store.c_str(), -1, 2) != 0) {
        CORV_LOG_ERR("%s is ACL mode, changing it to Linux mode", store.c_str());
        if (chmod(store.c_str(), 0755) != 0) {
            CORV_LOG_ERR("chmod failed for %s (%m)", store.c_str());
        }
    }
    return true;
}

bool logOutcome(ControlRoad& r) {
    PMSWriteSysLogf("%s %s: %s version %s %s, result %d", parseInstallTypeToStr(r.type),
                    r.name.c_str(), verbOf(r), r.info.version.c_str(),
                    r.outcome ? "successfully" : "failed", static_cast<int>(r.pm.getResult()));
    return true;
}

bool runHooks(ControlRoad& r) {
    PMSCheckServiesStatus(r.info, nullptr, r.type, r.start ? 1 : 0);
    CleanAllEnv();
    return true;
}

constexpr RoadStep<ControlRoad> kControlClosingSteps[] = {
    {"keep-store-linux-mode", keepStoreLinuxMode},
    {"log-outcome", logOutcome},
    {"run-hooks", runHooks},
};

}  // namespace

int PackageManager::serviceControlAction(PKG_INSTALLATION_TYPE type, const std::string& name,
                                         bool start, const char* language, const char* userName,
                                         MSG_TYPE msg) {
    ControlRoad r{*this,
                  d->packageInfo,
                  type,
                  name,
                  start,
                  language,
                  userName,
                  msg,
                  PMSEnabledFlagPath(name),
                  "pkgctl-" + name};
    const char* road = start ? "start" : "stop";
    PMSRunRoad(road, r, kControlSteps);
    PMSRunClosingSteps(road, r, kControlClosingSteps);
    return r.outcome;
}

}  // namespace CORVPackageTool
