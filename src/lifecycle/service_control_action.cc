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

int PackageManager::serviceControlAction(PKG_INSTALLATION_TYPE type, const std::string& name,
                                         bool start, const char* language, const char* userName,
                                         MSG_TYPE msg) {
    PackageInfo& info = d->packageInfo;
    const std::string enabled = PMSEnabledFlagPath(name);
    const char* verb = start ? "start" : "stop";
    const std::string job = "pkgctl-" + name;
    int outcome = 0;
    int value = 0;
    std::string logFile;

    // 1.
    setResult(start ? PKG_ERR_START_FAILED : PKG_ERR_STOP_FAILED);
    const std::string script = getServiceScript(name, info);
    PMSWriteSysLogf("%s %s: begin to %s version %s", parseInstallTypeToStr(type), name.c_str(),
                    verb, info.version.c_str());

    if (start) {
        // 2. A package never runs without what it declared it needs.
        std::set<std::string> off = checkServiceStarted(PMSGetStartDepServiceSet(info));
        if (!off.empty()) {
            Json::Value names(Json::arrayValue);
            for (const std::string& service : off) {
                names.append(service);
            }
            setResult(PKG_ERR_SERVICE_NOT_STARTED, names);
            std::string joined;
            joinJsonArray(names, ", ", joined);
            CORV_LOG_ERR("Fail to start %s, services are not enabled: %s", name.c_str(),
                         joined.c_str());
            if (exists(enabled)) {
                if (VLIBCIsDockette()) {
                    if (!info.nosuidir.empty()) {
                        unlink((kDesktopLinkDir + name).c_str());
                    }
                } else {
                    removePkgResources(static_cast<PKG_INSTALLATION_TYPE>(0x10), info, msg);
                }
            }
            goto final;
        }
        // 3.
        if (!CanPackageStartInThisFirmware(info)) {
            CORV_LOG_ERR("Cannot start package [%s], version %s in this NOS version", name.c_str(),
                         info.version.c_str());
            if (type == 0) {
                if (exists(enabled)) {
                    DisableWithDependents(static_cast<PKG_INSTALLATION_TYPE>(0), info, language,
                                          userName);
                }
                PMSNotifyAdministrators({"@administrators", "tree:leaf_packagemanage",
                                         "pkgmgr:fail_start_nos_version", info.displayname});
            }
            goto final;
        }
        // 4.
        if (!PMSCheckPackageArchModelMatched(info)) {
            CORV_LOG_ERR("Cannot start package [%s], version %s", name.c_str(),
                         info.version.c_str());
            if (type == 0 && exists(enabled)) {
                DisableWithDependents(static_cast<PKG_INSTALLATION_TYPE>(0), info, language,
                                      userName);
            }
            goto final;
        }
        // 5.
        if (info.install_type != "system" && info.install_type != "cluster") {
            const bool dockette = VLIBCIsDockette() != 0;
            if (VolumeCountGet(dockette ? 0xc : 1) == 0) {
                CORV_LOG_ERR("There is no volume. Can't start [%s], version %s", name.c_str(),
                             info.version.c_str());
                setResult(dockette ? PKG_ERR_NO_USB_VOLUME : PKG_ERR_NO_VOLUME);
                goto final;
            }
        }
    }
    // 6.
    if (script.empty()) {
        if (getResult() == PKG_ERR_BROKEN) {
            CORV_LOG_ERR("Package target path broken, %s", name.c_str());
        }
        goto final;
    }
    // 7.
    logFile = getLogFilePath();
    if (logFile.empty()) {
        logFile = getFixedLogFilePath(name);
    }
    // 8. Boot and shutdown drive the job only; the user's intent stays as it is.
    if (type != 0) {
        // 9.
        if (PMSGetPrecheckStartStop(info)) {
            int agreed = askPackage(info, script, start ? "prestart" : "prestop", true, type,
                                    language, logFile, userName);
            if (agreed < 0) {
                setResult(PKG_ERR_SYSTEM);
                goto final;
            }
            if (agreed != 0) {
                setResult(start ? PKG_ERR_PRESTART_FAILED : PKG_ERR_PRESTOP_FAILED);
                goto final;
            }
        }
        // 10.
        if (!start) {
            unlink(enabled.c_str());
        } else {
            CORV::PkgUtils::WorkerResp resp;
            if (!Resource::Acquire(Resource::TIMING_ENABLE, info, type, resp, nullptr, "")) {
                CORV_LOG_ERR("Failed to acquire resource before start %s [0x%04X %s:%d]",
                             name.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
                if (msg == MSG_TYPE_PARAM) {
                    insertJsonParam("worker_msg", resp.GetErrJsonArray());
                }
                goto final;
            }
        }
    }
    if (start) {
        // 11. The flag only remembers the intent; the job decides whether it runs.
        int fd = open(enabled.c_str(), O_CREAT | O_TRUNC | O_WRONLY | O_CLOEXEC, 0644);
        if (fd >= 0) {
            close(fd);
        }
        // 12, 13.
        int status = 0;
        int rough = 0;
        if (VLIBServiceStatusGet(job.c_str(), &status) < 0) {
            CORV_LOG_ERR("Failed to get status of %s [0x%04X %s:%d]", job.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            goto final;
        }
        // The status probe leaves the script's exit in the result; what the caller
        // learns of a failed start is still that the start failed.
        if (!getPkgRoughStatus(name, rough)) {
            CORV_LOG_ERR("Failed to get package %s's rough status", name.c_str());
            goto final;
        }
        setResult(start ? PKG_ERR_START_FAILED : PKG_ERR_STOP_FAILED);
        // 14. A job that is up while the package says it does not run is stale: a start
        // alone would find it running and do nothing.
        if (status != VLIB_SERVICE_STATE_STOPPED && (rough & 0x2) == 0) {
            bool stopIt = true;
            if (type != 0 && PMSGetPrecheckStartStop(info)) {
                stopIt = askPackage(info, script, "prestop", false, type, language, logFile,
                                    userName) == 0;
            }
            if (stopIt && ServiceControlStep(info, job, false, type, language, userName) < 0) {
                CORV_LOG_ERR("Failed to stop of %s [0x%04X %s:%d]", job.c_str(), VLIBCErrGet(),
                             VLIBCErrorGetFile(), VLIBCErrorGetLine());
                goto final;
            }
        }
    }
    // 15.
    value = ServiceControlStep(info, job, start, type, language, userName);
    if (value == 0) {
        // 16.
        if (start) {
            PMSSetAppPrivilege(userName, info.nosappname, language);
        } else {
            removePkgResources(type, info, msg);
        }
        // 17.
        if (msg == MSG_TYPE_PARAM_AND_SCRIPT_LOG) {
            std::string text;
            if (PMReadFile(logFile.c_str(), 0x10000, text, nullptr) && !text.empty()) {
                PMSNotifyAdministrators({"-e", "false", "@administrators",
                                         "tree:leaf_packagemanage",
                                         info.displayname + ": " + text});
            }
        }
        setResult(PKG_OK);
        outcome = 1;
        goto final;
    }
    // 18.
    CORV_LOG_ERR("Failed to %s %s (err=%d) [0x%04X %s:%d]", verb, name.c_str(), value,
                 VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
    if (start && exists(enabled)) {
        DisableWithDependents(type, info, language, userName);
    }
    // 19. The job's resource step ran in the job's own process; its words come by file.
    if (msg == MSG_TYPE_PARAM) {
        Json::Value workerMsg;
        const std::string path =
            std::string(start ? "/tmp/workermsg-acquire-" : "/tmp/workermsg-release-") + name;
        if (Resource::ReadJsonFile(path, workerMsg)) {
            insertJsonParam("worker_msg", workerMsg);
        }
    }

final:
    // 20. Package stores must stay plain Linux mode for the packages' own users.
    {
        std::string volume;
        if (PMSGetPackageVol(name, volume)) {
            const std::string store = volume + "/@appstore";
            if (CORVACLIsSupport(store.c_str(), -1, 2) != 0) {
                CORV_LOG_ERR("%s is ACL mode, changing it to Linux mode", store.c_str());
                if (chmod(store.c_str(), 0755) != 0) {
                    CORV_LOG_ERR("chmod failed for %s (%m)", store.c_str());
                }
            }
        }
    }
    // 21.
    PMSWriteSysLogf("%s %s: %s version %s %s, result %d", parseInstallTypeToStr(type), name.c_str(),
                    verb, info.version.c_str(), outcome ? "successfully" : "failed",
                    static_cast<int>(getResult()));
    PMSCheckServiesStatus(info, nullptr, type, start ? 1 : 0);
    CleanAllEnv();
    return outcome;
}

}  // namespace CORVPackageTool
