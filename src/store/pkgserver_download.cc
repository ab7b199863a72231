// The transfer of a package file from a store into a temporary folder, under the task
// record that the desktop polls.
#include <signal.h>
#include <stdio.h>
#include <string.h>
#include <sys/types.h>
#include <time.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "corv/log.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "store/curl_api.h"
#include "store/digest_pipe.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

volatile sig_atomic_t g_canceled = 0;

constexpr double kProgressStart = 1e-05;
constexpr int kLockTries = 10802;
constexpr int kAttempts = 4;
// The task record is a file: asking it on every chunk would cost more than the transfer.
constexpr long kProgressIntervalMs = 100;

void onSignal(int signo) {
    if (signo == SIGTERM) {
        g_canceled = 1;
        return;
    }
    CORV_LOG_ERR("Unknown Signal: %d", signo);
}

long long nowMs() {
    struct timespec ts {};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

struct HashOwner {
    PVLIBSZHASH hash;
    ~HashOwner() { VLIBCSzHashFree(hash); }
};

struct CurlOwner {
    CURL* curl;
    ~CurlOwner() {
        if (curl != nullptr) {
            PMSCurl().easy_cleanup(curl);
        }
    }
};

// What the write and progress callbacks share: the open file, the running digest, and
// the task to report into.
struct Transfer {
    NOS::Task* task = nullptr;
    bool blqinst = false;
    FILE* file = nullptr;
    DigestPipe md5;
    bool aborted = false;  // the task record went away
    double lastFraction = -1;
    long long lastReportMs = 0;
    ~Transfer() {
        if (file != nullptr) {
            fclose(file);
        }
    }
    bool restart() { return md5.restart(); }
    std::string digest() { return md5.finish(); }
};

size_t writeChunk(char* bytes, size_t size, size_t count, void* context) {
    Transfer* t = static_cast<Transfer*>(context);
    const size_t total = size * count;
    if (fwrite(bytes, 1, total, t->file) != total) {
        CORV_LOG_ERR("Failed to write the package file, %m");
        return 0;
    }
    t->md5.feed(bytes, total);
    return total;
}

int reportProgress(void* context, curl_off_t total, curl_off_t now, curl_off_t, curl_off_t) {
    Transfer* t = static_cast<Transfer*>(context);
    double fraction = total > 0 ? static_cast<double>(now) / static_cast<double>(total) : 0;
    fraction = fraction <= 0 ? kProgressStart : fraction >= 1 ? 1 : fraction;
    const long long ms = nowMs();
    const bool crossedEnd = fraction >= 0.99 && t->lastFraction < 0.99;
    if (!crossedEnd && ms - t->lastReportMs < kProgressIntervalMs) {
        return 0;
    }
    t->lastReportMs = ms;
    t->task->reload();
    Json::Value data = t->task->getProperty("data");
    if (data.isNull()) {
        CORV_LOG_ERR("Failed to read data.");
        NOS::Task::remove(t->task);
        t->aborted = true;
        return -1;
    }
    if (fraction == t->lastFraction) {
        return 0;
    }
    t->lastFraction = fraction;
    t->task->beginUpdate();
    t->task->setProperty("progress", fraction);
    if (fraction >= 0.99) {
        data["installing"] = true;
    }
    t->task->setProperty("data", data);
    if (!t->task->endUpdate()) {
        CORV_LOG_ERR("Failed to write progress.");
    }
    return 0;
}

bool isRetried(CURLcode code) {
    return code == CURLE_COULDNT_RESOLVE_PROXY || code == CURLE_COULDNT_RESOLVE_HOST ||
           code == CURLE_OPERATION_TIMEDOUT;
}

// Waits for the package lock one second at a time, so that SIGTERM ends the wait.
bool waitForLock() {
    for (int i = 0; i < kLockTries; ++i) {
        if (PackageManager::ExLock(1)) {
            return true;
        }
        if (CORVPackageServer::isCanceled()) {
            return false;
        }
    }
    return false;
}

// The store's fields of a download: the device's identity and whether it is an upgrade.
bool downloadFields(PVLIBSZHASH* fields, const char* displayName) {
    if (!PMSAddCommonQueryFields(fields)) {
        return false;
    }
    VLIBCSzHashRemoveKey(*fields, "arch");
    VLIBCSzHashRemoveKey(*fields, "timezone");
    PackageManager pm;
    PackageInfo installed;
    const bool upgrade = pm.getPackageInfo(displayName, installed, nullptr, PKG_INFO_MASK_ALL);
    return VLIBCSzHashSetValue(fields, "mode", upgrade ? "upgrade" : "install") == 0 &&
           VLIBCSzHashSetValue(fields, "pkg_version", upgrade ? installed.version.c_str() : "") ==
               0;
}

bool setTransferOptions(CURL* curl, Transfer& t) {
    CURLcode rc;
    if ((rc = PMSCurl().easy_setopt(curl, CURLOPT_WRITEFUNCTION, writeChunk)) != CURLE_OK ||
        (rc = PMSCurl().easy_setopt(curl, CURLOPT_WRITEDATA, &t)) != CURLE_OK) {
        CORV_LOG_ERR("Failed to set write data, code=%d, err=%s", rc, PMSCurl().easy_strerror(rc));
        return false;
    }
    if ((rc = PMSCurl().easy_setopt(curl, CURLOPT_NOPROGRESS, 0L)) != CURLE_OK) {
        CORV_LOG_ERR("Failed to set progress option, code=%d, err=%s", rc,
                     PMSCurl().easy_strerror(rc));
        return false;
    }
    if ((rc = PMSCurl().easy_setopt(curl, CURLOPT_XFERINFOFUNCTION, reportProgress)) != CURLE_OK) {
        CORV_LOG_ERR("Failed to set progress function, code=%d, err=%s", rc,
                     PMSCurl().easy_strerror(rc));
        return false;
    }
    if ((rc = PMSCurl().easy_setopt(curl, CURLOPT_XFERINFODATA, &t)) != CURLE_OK) {
        CORV_LOG_ERR("Failed to set progress data, code=%d, err=%s", rc,
                     PMSCurl().easy_strerror(rc));
        return false;
    }
    // Bigger reads mean fewer write calls for a package of many megabytes.
    PMSCurl().easy_setopt(curl, CURLOPT_BUFFERSIZE, 256L * 1024);
    return true;
}

// One attempt, with the fallback name server after a name that can't be resolved.
CURLcode performOnce(CURL* curl) {
    return PMSRetryWithFallbackDns(curl, PMSCurl().easy_perform(curl));
}

// Up to 4 attempts; a retried attempt starts the file and the digest again from zero.
bool performAttempts(CURL* curl, Transfer& t, const std::string& url) {
    CURLcode rc = CURLE_OK;
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        rc = performOnce(curl);
        if (rc == CURLE_OK) {
            break;
        }
        if (!isRetried(rc)) {
            CORV_LOG_ERR("Failed to curl perform, code=%d, err=%s, url=%s", rc,
                         PMSCurl().easy_strerror(rc), url.c_str());
            PMSSetLastStoreFailure(std::string("the transfer failed (") +
                                   PMSCurl().easy_strerror(rc) + ")");
            return false;
        }
        if (fflush(t.file) != 0 || ftruncate(fileno(t.file), 0) != 0 ||
            fseeko(t.file, 0, SEEK_SET) != 0 || !t.restart()) {
            CORV_LOG_ERR("Failed to truncate the package file, %m");
            return false;
        }
        sleep(1);
    }
    long status = 0;
    CURLcode info = PMSCurl().easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
    if (info != CURLE_OK) {
        CORV_LOG_ERR("Failed to curl_easy_getinfo, code=%d, err=%s, url=%s", info,
                     PMSCurl().easy_strerror(info), url.c_str());
        return false;
    }
    if (status != 200) {
        CORV_LOG_ERR("Failed to download package, httpResponseCode=%ld, url=%s", status,
                     url.c_str());
        PMSSetLastStoreFailure(rc == CURLE_OK ? "the server answered HTTP " + std::to_string(status)
                                              : std::string("the server could not be reached (") +
                                                    PMSCurl().easy_strerror(rc) + ")");
        return false;
    }
    return true;
}

// The transfer itself into `filePath`; `digest` receives the MD5 of what was written.
// `removed` tells a transfer that stopped because the task record went away.
bool transfer(NOS::Task* task, bool blqinst, const char* displayName, const char* url,
              const std::string& filePath, std::string& digest, bool& removed) {
    HashOwner fields{VLIBCSzHashAlloc(0x400)};
    if (fields.hash == nullptr) {
        CORV_LOG_ERR("Out of memory!!");
        return false;
    }
    Transfer t;
    t.task = task;
    t.blqinst = blqinst;
    t.file = fopen(filePath.c_str(), "w");
    if (t.file == nullptr) {
        CORV_LOG_ERR("Failed to open temp file [%s] [%m]", filePath.c_str());
        return false;
    }
    CurlOwner handle{PMSCurl().easy_init()};
    if (handle.curl == nullptr || !t.restart()) {
        CORV_LOG_ERR("Failed to init curl.");
        return false;
    }
    if (!downloadFields(&fields.hash, displayName)) {
        return false;
    }
    std::string fullUrl;
    if (!PMSCurlGetQueryURL(handle.curl, url, fields.hash, fullUrl)) {
        CORV_LOG_ERR("Failed to get query url, %s", url);
        return false;
    }
    if (!PMSCurlSetupConfig(handle.curl, fullUrl.c_str()) || !setTransferOptions(handle.curl, t)) {
        return false;
    }
    if (!performAttempts(handle.curl, t, fullUrl)) {
        removed = t.aborted;
        return false;
    }
    if (fclose(t.file) != 0) {
        t.file = nullptr;
        CORV_LOG_ERR("Failed to write the package file %s, %m", filePath.c_str());
        return false;
    }
    t.file = nullptr;
    digest = t.digest();
    return true;
}

void notifyDownloadFailure(const char* user, const std::string& name) {
    const char* argv[] = {"/usr/corv/bin/corvnosnotify",
                          "-c",
                          "CORV.NDS.PkgManApp.Instance",
                          "-t",
                          "false",
                          user != nullptr ? user : PKG_TASK_OWNER,
                          "tree:leaf_packagemanage",
                          "pkgmgr:download_pkg_fail",
                          name.c_str(),
                          nullptr};
    VLIBCExecv(argv[0], argv, 1);
}

void finishTask(NOS::Task* task, bool success) {
    task->setProperty("progress", success ? 1.0 : -1.0);
    if (!task->finish(false)) {
        CORV_LOG_ERR("Failed to write progress.");
    }
}

// The failure path: the notification, the folder, and the task's verdict.
void failDownload(NOS::Task* task, const char* user, const std::string& name, const char* tmpFolder,
                  Json::Value notes) {
    notifyDownloadFailure(user, name);
    if (tmpFolder != nullptr && tmpFolder[0] != '\0') {
        VLIBCExec("/bin/rm", "-rf", tmpFolder, nullptr);
    }
    if (task == nullptr) {
        return;
    }
    notes["success"] = false;
    task->setProperty("progress", -1.0);
    PMSUpdateTaskData(task, notes);
}

void brokenPackage(Json::Value& notes) {
    notes["sec"] = "pkgmgr";
    notes["key"] = "pkgmgr_pkg_broken";
}

// After a cancel: no record and no partial file stay for anyone to trip over.
void dropCanceled(NOS::Task* task, const char* tmpFolder) {
    NOS::Task::remove(task);
    if (tmpFolder != nullptr && tmpFolder[0] != '\0') {
        VLIBCExec("/bin/rm", "-rf", tmpFolder, nullptr);
    }
}

}  // namespace

void CORVPackageServer::RegisterCancel() {
    signal(SIGTERM, onSignal);
}

bool CORVPackageServer::isCanceled() {
    return g_canceled != 0;
}

bool PMSUpdateTaskData(NOS::Task* task, const Json::Value& members) {
    if (task == nullptr) {
        return false;
    }
    task->reload();
    Json::Value data = task->getProperty("data");
    if (data.isNull()) {
        data = Json::Value(Json::objectValue);
    }
    for (const std::string& key : members.getMemberNames()) {
        data[key] = members[key];
    }
    return task->setProperty("data", data);
}

bool CORVPackageServer::InitDownload(NOS::Task* task, const char* packageName,
                                     unsigned long long size, const char* url,
                                     const char* tmpFolder, bool blqinst, int pid) {
    if (task == nullptr || packageName == nullptr || tmpFolder == nullptr) {
        return false;
    }
    char sizeText[32];
    snprintf(sizeText, sizeof sizeText, "%llu", size);
    Json::Value data(Json::objectValue);
    data["id"] = packageName;
    data["name"] = packageName;
    data["size"] = sizeText;
    data["tmp_folder"] = tmpFolder;
    data["remote_link"] = url != nullptr ? url : "";
    data["pid"] = pid;
    data["taskid"] = task->getTaskId();
    data["success"] = true;
    data["installing"] = false;
    data["blqinst"] = blqinst;
    task->beginUpdate();
    task->setProperty("data", data);
    task->setProperty("progress", kProgressStart);
    if (!task->endUpdate()) {
        CORV_LOG_ERR("Failed to write progress.");
        return false;
    }
    RegisterCancel();
    return true;
}

bool CORVPackageServer::DownloadPackage(NOS::Task* task, const char* user, const char* displayName,
                                        const char* url, const char* md5, bool blqinst,
                                        const char* tmpFolder, const char* language,
                                        std::string& filePath) {
    if (task == nullptr || displayName == nullptr || url == nullptr || tmpFolder == nullptr ||
        language == nullptr) {
        failDownload(task, user, displayName ? displayName : "", tmpFolder, Json::Value());
        return false;
    }
    RegisterCancel();
    task->setProperty("progress", kProgressStart);
    if (!waitForLock()) {
        NOS::Task::remove(task);
        if (isCanceled()) {
            dropCanceled(task, tmpFolder);
            return false;
        }
        failDownload(nullptr, user, displayName, tmpFolder, Json::Value());
        return false;
    }
    filePath = std::string(tmpFolder) + "/" + task->getTaskId();
    std::string digest;
    bool removed = false;
    const bool transferred = transfer(task, blqinst, displayName, url, filePath, digest, removed);
    // A record removed from outside is a cancel as much as SIGTERM is.
    if (isCanceled() || removed) {
        dropCanceled(task, tmpFolder);
        return false;
    }
    Json::Value notes(Json::objectValue);
    if (!transferred) {
        PMSSetServerResult(PKG_ERR_SERVER);
        failDownload(task, user, displayName, tmpFolder, notes);
        if (!blqinst) {
            finishTask(task, false);
        }
        return false;
    }
    if (md5 != nullptr && md5[0] != '\0' && digest != md5) {
        CORV_LOG_ERR("Warning: Failed to verify the package %s by MD5 %s", filePath.c_str(), md5);
        CORV_LOG_ERR("Warning: Failed to download %s from %s", displayName, url);
        brokenPackage(notes);
    }
    PackageManager pm;
    PackageInfo info;
    if (!pm.queryPackageFileInfo(filePath, info, static_cast<PKG_INSTALLATION_TYPE>(0), language)) {
        CORV_LOG_ERR("Faild to download %s", url);
        brokenPackage(notes);
        failDownload(task, user, displayName, tmpFolder, notes);
        if (!blqinst) {
            finishTask(task, false);
        }
        return false;
    }
    notes["id"] = info.package;
    notes["version"] = info.version;
    if (!info.nosappname.empty()) {
        notes["nos_apps"] = info.nosappname;
    }
    PMSUpdateTaskData(task, notes);
    if (!blqinst) {
        finishTask(task, true);
    }
    return true;
}

}  // namespace CORVPackageTool
