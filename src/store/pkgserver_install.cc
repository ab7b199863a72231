// The install half of a store task: a downloaded file installed under the package lock,
// with the desktop told how it went.
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgverify.h"
#include "corvpkg/pkgvolume.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

constexpr int kInstallLockSeconds = 10800;
constexpr size_t kMaxErrorElements = 5;
constexpr size_t kMaxElementLength = 1023;

// The desktop's message key of a failed install, and its arguments.
Json::Value errorArray(PKG_ERRCODE code, const Json::Value& extra) {
    Json::Value errors(Json::arrayValue);
    switch (code) {
        case PKG_ERR_BAD_ARCHIVE:
            errors.append("pkgmgr:pkgmgr_file_not_package");
            break;
        case PKG_ERR_ALREADY_INSTALLED:
            errors.append("pkgmgr:pkgmgr_pkg_install_already");
            break;
        case PKG_ERR_NOT_INSTALLED:
            errors.append("pkgmgr:pkgmgr_pkg_not_available");
            break;
        case PKG_ERR_DOWNGRADE:
        case PKG_ERR_BELOW_VERSION_LIMIT:
            errors.append(code == PKG_ERR_DOWNGRADE ? "pkgmgr:downgrade_version"
                                                    : "pkgmgr:install_version_less_than_limit");
            errors.append(extra.get("curVersion", "").asString());
            errors.append(extra.get("insVersion", "").asString());
            break;
        case PKG_ERR_DEPENDENCY:
        case PKG_ERR_UPGRADE_BREAKS_DEPENDENT:
            errors.append("pkgmgr:error_upgrade_dep_packages");
            errors.append(toString(extra.get("deppkg", "")));
            break;
        case PKG_ERR_NO_SPACE:
            errors.append("pkgError:error_space_not_enough");
            break;
        case PKG_ERR_NO_VOLUME:
            errors.append("pkgError:volume_no_volumes");
            break;
        case PKG_ERR_VOLUME_NOT_READY:
            errors.append("pkgError:volume_creating");
            break;
        case PKG_ERR_DEPENDENCY_CYCLE:
            errors.append("pkgmgr:depend_cycle");
            break;
        case PKG_ERR_LOCKED:
            errors.append("pkgmgr:error_occupied");
            break;
        case PKG_ERR_INSTALL_FAILED:
            errors.append("pkgmgr:pkgmgr_file_install_failed");
            break;
        case PKG_ERR_UPGRADE_FAILED:
            errors.append("pkgmgr:upgrade_fail");
            break;
        default:
            errors.append("error:error_error_system");
            break;
    }
    return errors;
}

// The manager's result as the desktop knows it; the extra members its message needs.
PKG_ERRCODE mapInstallError(PackageManager& pm, PKG_ERRCODE code, Json::Value& extra) {
    switch (code) {
        case PKG_ERR_NOT_INSTALLED:
        case PKG_ERR_BAD_ARCHIVE:
        case PKG_ERR_LIMIT_BLOCKED:
        case PKG_ERR_LIMIT_PROHIBITED:
        case PKG_ERR_ALREADY_INSTALLED:
            return code;
        case PKG_ERR_VOLUME_CHECK:
            switch (VLIBCErrGet()) {
                case PKG_VOLERR_NO_VOLUME:
                    return PKG_ERR_NO_VOLUME;
                case PKG_VOLERR_NONE_READY:
                    return PKG_ERR_VOLUME_NOT_READY;
                case PKG_VOLERR_NO_SPACE:
                    return PKG_ERR_NO_SPACE;
                default:
                    return code;
            }
        case PKG_ERR_BELOW_VERSION_LIMIT:
        case PKG_ERR_DOWNGRADE:
            extra["curVersion"] = pm.getMapParam("curver");
            extra["insVersion"] = pm.getMapParam("oldver");
            return code;
        case PKG_ERR_DEPENDENCY:
        case PKG_ERR_UPGRADE_BREAKS_DEPENDENT:
            extra["deppkg"] = pm.getMapParam("deppkg");
            return code;
        default:
            return code >= PKG_ERR_DEPENDENCY_CYCLE && code <= PKG_ERR_NO_SPACE ? code
                                                                                : PKG_ERR_SYSTEM;
    }
}

void runNotifier(const std::vector<std::string>& args) {
    std::vector<const char*> argv = {"/usr/corv/bin/corvnosnotify"};
    for (const std::string& arg : args) {
        argv.push_back(arg.c_str());
    }
    argv.push_back(nullptr);
    VLIBCExecv(argv[0], argv.data(), 1);
}

std::vector<std::string> notifierHead(const char* user, bool success) {
    return {"-c",
            "CORV.NDS.PkgManApp.Instance",
            "-t",
            success ? "true" : "false",
            "-e",
            "false",
            user != nullptr ? user : PKG_TASK_OWNER,
            "tree:leaf_packagemanage"};
}

// What the resource workers had to say during the install, one notification each.
void notifyWorkerMessages(const char* user, const Json::Value& messages) {
    if (!messages.isArray()) {
        return;
    }
    for (const Json::Value& message : messages) {
        if (!message.isObject()) {
            continue;
        }
        std::string text;
        Json::Value args;
        if (message["message_i18n"].isString()) {
            text = message["message_i18n"].asString();
            if (message["args"].isArray()) {
                args = message["args"];
            }
        } else if (message["message"].isString()) {
            text = message["message"].asString();
        }
        if (text.empty()) {
            continue;
        }
        std::vector<std::string> argv = notifierHead(user, false);
        argv.push_back(text);
        for (const Json::Value& arg : args) {
            if (arg.isString()) {
                argv.push_back(arg.asString());
            }
        }
        runNotifier(argv);
    }
}

struct InstallOutcome {
    bool success = false;
    bool fresh = true;
    std::string displayName;
    Json::Value errors{Json::arrayValue};
    std::string log;
};

const char* completionKey(bool fresh, bool running) {
    if (fresh) {
        return running ? "pkgmgr:install_start_pkg_completed" : "pkgmgr:install_pkg_completed";
    }
    return running ? "pkgmgr:upgrade_start_pkg_completed" : "pkgmgr:upgrade_pkg_completed";
}

// The last word to the desktop and into the task; the folder goes after a failure.
bool finalReport(NOS::Task* task, const char* user, const char* packageName, const char* tmpFolder,
                 InstallOutcome& out) {
    if (out.displayName.empty() && packageName != nullptr) {
        out.displayName = packageName;
    }
    Json::Value notes(Json::objectValue);
    std::vector<std::string> argv = notifierHead(user, out.success);
    std::string detail;
    if (out.success) {
        PackageManager pm;
        bool running = false;
        pm.getServiceStatus(packageName, running, true);
        argv.push_back(completionKey(out.fresh, running));
        argv.push_back(out.displayName);
    } else if (out.errors.size() >= 2) {
        for (Json::ArrayIndex i = 0; i < out.errors.size() && i < kMaxErrorElements; ++i) {
            argv.push_back(out.errors[i].asString().substr(0, kMaxElementLength));
        }
        notes["error"] = toString(out.errors);
    } else {
        argv.push_back(out.fresh ? "pkgmgr:install_pkg_fail" : "pkgmgr:upgrade_pkg_fail");
        argv.push_back(out.displayName);
        if (out.errors.size() == 1) {
            notes["error"] = toString(out.errors);
            detail = out.errors[0].asString();
        }
    }
    if (!out.log.empty()) {
        detail = out.log;
        notes["message"] = out.log;
    }
    argv.push_back(detail);
    runNotifier(argv);
    if (!out.success && tmpFolder != nullptr && tmpFolder[0] != '\0') {
        VLIBCExec("/bin/rm", "-rf", tmpFolder, nullptr);
    }
    if (task == nullptr) {
        return out.success;
    }
    notes["success"] = out.success;
    task->setProperty("progress", out.success ? 1.0 : -1.0);
    PMSUpdateTaskData(task, notes);
    if (!task->finish(false)) {
        CORV_LOG_ERR("Failed to write progress.");
    }
    return out.success;
}

bool fileExists(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0;
}

// The steps before the install itself; false stops with what `out` holds.
bool prepareInstall(NOS::Task* task, const char* language, const char* packageName,
                    const std::string& path, InstallOutcome& out) {
    if (!CheckPackageFileInfo(language, path.c_str(), out.displayName, out.errors) ||
        !out.errors.empty()) {
        return false;
    }
    // An upgrade of a healthy package reads as a repair here too, as the desktop expects.
    PackageManager pm;
    int rough = 0;
    const bool known = pm.getPkgRoughStatus(packageName, rough);
    Json::Value notes(Json::objectValue);
    notes["id"] = packageName;
    notes["installing"] = true;
    notes["pid"] = static_cast<int>(getpid());
    notes["status"] = known && (rough & 0x5) != 0 ? "repairing" : "installing";
    if (!PMSUpdateTaskData(task, notes)) {
        CORV_LOG_ERR("Failed to write data.");
        return false;
    }
    if (!PackageManager::ExLock(kInstallLockSeconds)) {
        CORV_LOG_ERR("Failed to lock, %s", path.c_str());
        return false;
    }
    return fileExists(path);
}

}  // namespace

bool CORVPackageServer::InstallCpkImpl(const char* user, const char* cpkPath, const char* volume,
                                       bool startAfterInstall, const char* answersJson,
                                       const char* language, std::string& log, PKG_ERRCODE& error,
                                       Json::Value& extra, bool upgradeFlag, bool verifySignature) {
    (void)upgradeFlag;
    PackageManager pm;
    if (cpkPath == nullptr || !pm.init()) {
        error = PKG_ERR_SYSTEM;
        return false;
    }
    if (access(cpkPath, R_OK) != 0) {
        error = PKG_ERR_FILE_ACCESS;
        return false;
    }
    Json::Value answers;
    if (answersJson != nullptr && answersJson[0] != '\0' && !fromString(answersJson, answers)) {
        CORV_LOG_ERR("Error: parsing error, reason = %s\n", "the answers are not JSON");
        error = PKG_ERR_BAD_ANSWERS;
        return false;
    }
    PackageInfo info;
    pm.queryPackageFileInfo(cpkPath, info, static_cast<PKG_INSTALLATION_TYPE>(0), language);
    const std::string logFile = info.package.empty() ? "" : pm.getFixedLogFilePath(info.package);
    const int outcome =
        pm.install(user, cpkPath, volume != nullptr ? volume : "", startAfterInstall,
                   answers.isNull() ? nullptr : &answers, language, false, verifySignature);
    extra["workerMessage"] = pm.getJsonParam("worker_msg");
    if (!logFile.empty()) {
        log = PMSReadPackageLog(logFile);
    }
    if (outcome != 1) {
        PMSSetServerResult(pm.getResult());
        error = mapInstallError(pm, pm.getResult(), extra);
    }
    extra["installReboot"] = info.install_reboot;
    if (outcome == 1) {
        VLIBCExec("/bin/rm", "-rf", cpkPath, nullptr);
    }
    if (!logFile.empty()) {
        unlink(logFile.c_str());
    }
    return outcome == 1;
}

bool CORVPackageServer::Install(NOS::Task* task, const char* user, const char* volume,
                                const char* packageName, const char* tmpFolder,
                                bool startAfterInstall, const char* answersJson,
                                const char* language) {
    InstallOutcome out;
    if (task == nullptr || packageName == nullptr || tmpFolder == nullptr || language == nullptr) {
        return finalReport(task, user, packageName, tmpFolder, out);
    }
    out.fresh = !PMSCheckPackage(packageName);
    if (out.fresh && volume == nullptr) {
        CORV_LOG_ERR("no selected volume");
        return finalReport(task, user, packageName, tmpFolder, out);
    }
    task->reload();
    const Json::Value data = task->getProperty("data");
    if (data.isNull()) {
        return finalReport(task, user, packageName, tmpFolder, out);
    }
    const std::string path = data.get("tmp_folder", "").asString() + "/" + task->getTaskId();
    if (!prepareInstall(task, language, packageName, path, out)) {
        return finalReport(task, user, packageName, tmpFolder, out);
    }
    PKG_ERRCODE error = PKG_OK;
    Json::Value extra(Json::objectValue);
    out.success = InstallCpkImpl(user, path.c_str(), volume, startAfterInstall, answersJson,
                                 language, out.log, error, extra, true, true);
    notifyWorkerMessages(user, extra["workerMessage"]);
    if (!out.success) {
        out.errors = errorArray(error, extra);
    }
    return finalReport(task, user, packageName, tmpFolder, out);
}

}  // namespace CORVPackageTool
