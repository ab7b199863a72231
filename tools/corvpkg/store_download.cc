#include "store_download.h"

#include <stdio.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <stdexcept>
#include <thread>

#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

// Draws the task's progress on standard error while the download runs, when that is a
// terminal; otherwise one line at the start.
class ProgressBar {
  public:
    ProgressBar(std::string taskId, std::string name)
        : taskId_(std::move(taskId)), name_(std::move(name)), tty_(isatty(2) == 1) {
        if (!tty_) {
            fprintf(stderr, "downloading %s\n", name_.c_str());
            return;
        }
        thread_ = std::thread([this] { loop(); });
    }
    ~ProgressBar() {
        stop_ = true;
        if (thread_.joinable()) {
            thread_.join();
            fprintf(stderr, "\n");
        }
    }
    ProgressBar(const ProgressBar&) = delete;
    ProgressBar& operator=(const ProgressBar&) = delete;

  private:
    void loop() {
        while (!stop_) {
            draw();
            std::this_thread::sleep_for(std::chrono::milliseconds(150));
        }
        draw();
    }
    void draw() {
        double fraction = 0;
        try {
            NOS::TaskMgr mgr(PKG_TASK_OWNER);
            std::unique_ptr<NOS::Task> task(mgr.getTask(taskId_));
            if (task) {
                fraction = task->getProperty("progress").asDouble();
            }
        } catch (const std::exception&) {
            return;
        }
        fraction = fraction < 0 ? 0 : fraction > 1 ? 1 : fraction;
        const int width = 30, filled = static_cast<int>(fraction * width);
        fprintf(stderr, "\rdownloading %-20s [%.*s%*s] %3d%%", name_.c_str(), filled,
                "##############################", width - filled, "",
                static_cast<int>(fraction * 100));
    }

    std::string taskId_;
    std::string name_;
    bool tty_;
    std::atomic<bool> stop_{false};
    std::thread thread_;
};

}  // namespace

StoreDownload::~StoreDownload() {
    if (task_) {
        task_->remove();
    }
    if (!folder_.empty()) {
        VLIBCExec("/bin/rm", "-rf", folder_.c_str(), nullptr);
    }
}

bool StoreDownload::fetch(const PackageInfo& entry, const std::string& language,
                          std::string& error) {
    if (entry.link.empty()) {
        error = "the store gives no link for " + entry.package;
        return false;
    }
    if (CORVPackageServer::IsInstalling(entry.package.c_str())) {
        error = "a download or install of " + entry.package + " is under way";
        return false;
    }
    if (!PMSCreateDownloadTmpDir(nullptr, entry.package.c_str(), entry.size, folder_)) {
        error = "no temporary folder with room for " + std::to_string(entry.size) + " bytes";
        return false;
    }
    const std::string id = PKG_DOWNLOAD_TASK_PREFIX + entry.package;
    try {
        task_ = std::make_unique<NOS::Task>(PKG_TASK_OWNER, id);
    } catch (const std::exception&) {
        error = "a download or install of " + entry.package + " is under way";
        return false;
    }
    if (!CORVPackageServer::InitDownload(task_.get(), entry.package.c_str(), entry.size,
                                         entry.link.c_str(), folder_.c_str(), false, getpid())) {
        error = "cannot write the task record " + task_->path();
        return false;
    }
    bool ok = false;
    {
        ProgressBar bar(id, entry.package);
        ok = CORVPackageServer::DownloadPackage(task_.get(), nullptr, entry.package.c_str(),
                                                entry.link.c_str(),
                                                entry.md5.empty() ? nullptr : entry.md5.c_str(),
                                                false, folder_.c_str(), language.c_str(), path_);
    }
    if (ok) {
        task_->reload();
        const Json::Value data = task_->getProperty("data");
        if (data.get("key", "").asString() == "pkgmgr_pkg_broken") {
            // The checksum did not match, though the file reads as a package: not ours to
            // install.
            error = "the downloaded file's MD5 is not " + entry.md5 + " as the store says";
            return false;
        }
        return true;
    }
    task_->reload();
    const Json::Value data = task_->getProperty("data");
    canceled_ = CORVPackageServer::isCanceled() || data.isNull();
    if (canceled_) {
        error = "the download of " + entry.package + " was canceled";
    } else if (data.get("key", "").asString() == "pkgmgr_pkg_broken") {
        error = "the downloaded file of " + entry.package + " is not a package";
    } else {
        const std::string met = PMSGetLastStoreFailure();
        error = "the download of " + entry.link + " failed" + (met.empty() ? "" : ": " + met);
    }
    return false;
}

bool findStoreEntry(const std::string& name, const std::string& language, PackageInfo& entry,
                    std::string& source, std::string& error) {
    Json::Value json;
    if (CORVPackageServer::GetPackageInfoFromServer(name, json, true, language)) {
        source = "maker";
    } else if (CORVPackageServer::GetPackageInfoFromServer(name, json, false, language)) {
        source = json.get("feed", "").asString();
    } else {
        const std::string met = PMSGetLastStoreFailure();
        error = met.empty() ? "no store offers " + name : "cannot get the stores' lists: " + met;
        return false;
    }
    PMSMapJsonToPackageInfo(json, entry);
    return true;
}

}  // namespace cli
