// Background installs from a store: one task per package, found again by the next caller,
// cleaned up when its process died.
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <stdexcept>
#include <string>

#include "corv/log.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

std::unique_ptr<NOS::Task> existingTask(const std::string& id) {
    try {
        NOS::TaskMgr mgr(PKG_TASK_OWNER);
        return std::unique_ptr<NOS::Task>(mgr.getTask(id));
    } catch (const std::runtime_error& e) {
        CORV_LOG_ERR("Failed to get task %s: %s", id.c_str(), e.what());
        return nullptr;
    }
}

std::unique_ptr<NOS::Task> newTask(const std::string& id) {
    try {
        return std::make_unique<NOS::Task>(PKG_TASK_OWNER, id);
    } catch (const std::runtime_error& e) {
        CORV_LOG_ERR("GetNewTask failed with task id '%s'", id.c_str());
        return nullptr;
    }
}

// A download that finished and waits for the user to install it.
bool downloadWaits(const Json::Value& data, const std::string& path) {
    if (!data.isMember("blqinst") || data["blqinst"].asBool() || !data.isMember("size")) {
        return false;
    }
    struct stat st {};
    const unsigned long long size = std::stoull("0" + data["size"].asString());
    return stat(path.c_str(), &st) == 0 && static_cast<unsigned long long>(st.st_size) >= size;
}

// The answers of a wizard package: the caller's, else the wizard's defaults.
std::string chooseAnswers(const PackageInfo& info, const char* answersJson) {
    const bool wizard = (info.wizard.isArray() && !info.wizard.empty()) ||
                        (info.wizard.isObject() && !info.wizard.empty());
    if (!wizard || answersJson != nullptr) {
        return answersJson != nullptr ? answersJson : "";
    }
    Json::Value values(Json::objectValue);
    getUIDefaultValues(info.wizard, values);
    return toString(values);
}

}  // namespace

bool CORVPackageServer::IsInstalling(const char* packageName) {
    if (packageName == nullptr) {
        return false;
    }
    std::unique_ptr<NOS::Task> task =
        existingTask(PKG_DOWNLOAD_TASK_PREFIX + std::string(packageName));
    if (!task) {
        return false;
    }
    const Json::Value data = task->getProperty("data");
    if (data.isNull()) {
        return false;
    }
    const std::string folder = data.get("tmp_folder", "").asString();
    const std::string path = folder + "/" + task->getTaskId();
    if (data["pid"].isInt() && data["pid"].asInt() != getpid() &&
        VLIBCProcAlive(data["pid"].asInt()) == 1) {
        return true;
    }
    if (downloadWaits(data, path)) {
        return true;
    }
    task->remove();
    if (!folder.empty()) {
        VLIBCExec("/bin/rm", "-rf", folder.c_str(), nullptr);
    }
    return false;
}

bool CORVPackageServer::BackgroundInstall(const char* user, const char* volume,
                                          const char* packageName, const char* displayName,
                                          const char* answersJson, const char* language,
                                          unsigned long long size, const char* url, const char* md5,
                                          bool startAfterInstall) {
    PMSSetServerResult(PKG_ERR_SYSTEM);
    if (packageName == nullptr || url == nullptr) {
        return false;
    }
    if (IsInstalling(packageName)) {
        return true;
    }
    std::string tmpFolder;
    if (!PMSCreateDownloadTmpDir(volume, packageName, size, tmpFolder)) {
        return false;
    }
    std::unique_ptr<NOS::Task> task = newTask(PKG_DOWNLOAD_TASK_PREFIX + std::string(packageName));
    if (!task) {
        return false;
    }
    bool ok = false;
    std::string path;
    if (InitDownload(task.get(), packageName, size, url, tmpFolder.c_str(), true, getpid()) &&
        DownloadPackage(task.get(), user, displayName != nullptr ? displayName : packageName, url,
                        md5, true, tmpFolder.c_str(), language != nullptr ? language : "enu",
                        path) &&
        !isCanceled()) {
        PackageManager pm;
        PackageInfo info;
        if (pm.queryPackageFileInfoWithWizard(path, info, static_cast<PKG_INSTALLATION_TYPE>(0),
                                              language)) {
            const std::string answers = chooseAnswers(info, answersJson);
            ok = Install(task.get(), user, volume, packageName, tmpFolder.c_str(),
                         startAfterInstall, answers.empty() ? nullptr : answers.c_str(),
                         language != nullptr ? language : "enu");
        }
    }
    task->remove();
    return ok;
}

bool CORVPackageServer::DownloadInstatll(const char* user, const char* language, const char* volume,
                                         const char* answersJson, const PackageInfo& info) {
    return BackgroundInstall(user, volume, info.package.c_str(), info.displayname.c_str(),
                             answersJson, language, info.size, info.link.c_str(),
                             info.md5.empty() ? nullptr : info.md5.c_str(), true);
}

bool CORVPackageServer::StartOrDownloadInstall(const char* user, const char* language,
                                               const char* volume, const char* answersJson,
                                               const PackageInfo& info) {
    PackageManager pm;
    const int status = pm.getPkgStatus(info.package);
    if (status == 0) {
        return true;
    }
    if (status >= 1 && status <= 4) {
        if (pm.serviceControl(info.package, true, nullptr) == 1) {
            return true;
        }
        PMSSetServerResult(pm.getResult());
        CORV_LOG_ERR("Failed to start package %s, err=%d\n", info.package.c_str(), pm.getResult());
        return false;
    }
    if (status >= 256 && status <= 258) {
        CORV_LOG_ERR("Warning install a non-compatible package %s, err=%d\n", info.package.c_str(),
                     status);
        return true;
    }
    return DownloadInstatll(user, language, volume, answersJson, info);
}

}  // namespace CORVPackageTool
