// The worker process of a task (tasks.h): one download, install, start, stop or uninstall
// through libcorvpkg, its progress and outcome written to state.json as it goes.
#include <stdio.h>
#include <unistd.h>

#include <filesystem>
#include <memory>
#include <string>

#include "corv/task.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"
#include "results.h"
#include "tasks.h"

namespace center {

using namespace CORVPackageTool;

namespace {

const char kLanguage[] = "enu";

class StateWriter {
  public:
    StateWriter(std::string dir, const Json::Value& request) : path_(dir + "/state.json") {
        state_["action"] = request["action"];
        state_["package"] = request["package"];
    }
    void set(const std::string& state) {
        state_["state"] = state;
        writeJsonFile(path_, state_);
    }
    Json::Value& value() { return state_; }

  private:
    std::string path_;
    Json::Value state_{Json::objectValue};
};

Json::Value failure(const std::string& meaning, int code = PKG_ERR_SERVER) {
    Json::Value result = describeResult(code);
    result["meaning"] = meaning;
    result["text"] = meaning;
    return result;
}

// Fetches one store entry as the engine's own download task ("@CORVPKG_DOWNLOAD_<name>",
// whose progress the page is shown) into the engine's download folder, and moves the file
// into the task directory. The engine's record goes when the file is here, so that it
// does not read as an install under way. False with the result in `state`; on a cancel
// (SIGTERM from the server) `canceled` is set and nothing is written.
bool fetch(const std::string& dir, const Json::Value& entry, const std::string& user,
           StateWriter& state, std::string& file, bool& canceled) {
    const std::string name = entry["package"].asString();
    const std::string link = entry["link"].asString();
    const std::string md5 = entry["md5"].asString();
    std::string folder;
    if (!PMSCreateDownloadTmpDir(nullptr, name.c_str(), entry["size"].asUInt64(), folder)) {
        state.value()["result"] = failure("there is no room to download " + name, PKG_ERR_NO_SPACE);
        return false;
    }
    std::unique_ptr<NOS::Task> task;
    try {
        task = std::make_unique<NOS::Task>(PKG_TASK_OWNER, PKG_DOWNLOAD_TASK_PREFIX + name);
    } catch (const std::exception&) {
        state.value()["result"] = failure(name + " is being downloaded or installed already");
        std::filesystem::remove_all(folder);
        return false;
    }
    std::string path;
    bool ok = CORVPackageServer::InitDownload(task.get(), name.c_str(), entry["size"].asUInt64(),
                                              link.c_str(), folder.c_str(), false, getpid()) &&
              CORVPackageServer::DownloadPackage(task.get(), user.c_str(), name.c_str(),
                                                 link.c_str(), md5.empty() ? nullptr : md5.c_str(),
                                                 false, folder.c_str(), kLanguage, path);
    task->reload();
    const std::string key = task->getProperty("data").get("key", "").asString();
    canceled = CORVPackageServer::isCanceled();
    std::error_code error;
    if (ok && key.empty()) {
        file = dir + "/" + name + ".cpk";
        std::filesystem::copy_file(path, file, std::filesystem::copy_options::overwrite_existing,
                                   error);
        ok = !error;
    }
    task->remove();
    std::filesystem::remove_all(folder, error);
    if (!ok && !canceled) {
        const std::string why = key == "pkgmgr_pkg_broken"
                                    ? "the file is not the package the store describes"
                                    : PMSGetLastStoreFailure();
        state.value()["result"] =
            failure("the download of " + name + " failed" + (why.empty() ? "" : ": " + why));
    }
    return ok;
}

int download(const std::string& dir, const Json::Value& request, StateWriter& state) {
    state.value()["plan"] = request["plan"];
    state.set("downloading");
    Json::Value files(Json::arrayValue);
    for (const Json::Value& entry : request["plan"]) {
        std::string file;
        bool canceled = false;
        if (!fetch(dir, entry, request["user"].asString(), state, file, canceled)) {
            if (!canceled) {
                state.set("failed");
            }
            return 1;
        }
        Json::Value one(Json::objectValue);
        one["package"] = entry["package"];
        one["version"] = entry["version"];
        one["file"] = file;
        files.append(one);
    }
    state.value()["files"] = files;
    state.set("ready");
    return 0;
}

// The answers for one package file: its wizard's defaults, overridden by what the page
// sent for the keys that wizard asks. Keys of other packages' wizards stay out of its
// scripts' environment.
Json::Value answersFor(const std::string& file, const Json::Value& given) {
    PackageManager pm;
    PackageInfo info;
    pm.queryPackageFileInfoWithWizard(file, info, static_cast<PKG_INSTALLATION_TYPE>(0), kLanguage);
    Json::Value answers(Json::objectValue);
    getUIDefaultValues(info.wizard, answers);
    for (const std::string& key : answers.getMemberNames()) {
        if (given.isMember(key) && given[key].isString()) {
            answers[key] = given[key];
        }
    }
    return answers;
}

int install(const Json::Value& request, StateWriter& state) {
    const std::string user = request["user"].asString();
    const bool verify = !request["accept_unsigned"].asBool();
    Json::Value done(Json::arrayValue);
    state.value()["files"] = request["files"];
    for (const Json::Value& entry : request["files"]) {
        const std::string file = entry["file"].asString();
        state.value()["current"] = entry["package"];
        state.value()["done"] = done;
        state.set("installing");
        Json::Value answers = answersFor(file, request["answers"]);
        PackageManager pm;
        int outcome = pm.install(user.c_str(), file, "", true, answers.empty() ? nullptr : &answers,
                                 kLanguage, false, verify);
        if (outcome != 1) {
            state.value()["result"] = describeOutcome(
                pm, entry["package"].asString(),
                PMSCheckPackage(entry["package"].asString()) ? "upgrade" : "install");
            state.set("failed");
            return 1;
        }
        done.append(entry["package"]);
        unlink(file.c_str());
    }
    state.value()["done"] = done;
    state.value()["result"] = describeResult(PKG_OK);
    state.set("done");
    return 0;
}

int control(const Json::Value& request, StateWriter& state) {
    const std::string action = request["action"].asString();
    const std::string name = request["package"].asString();
    const std::string user = request["user"].asString();
    state.set("running");
    PackageManager pm;
    int outcome = 0;
    if (action == "uninstall") {
        const Json::Value& answers = request["answers"];
        outcome =
            pm.uninstall(name, answers.isObject() && !answers.empty() ? &answers : nullptr,
                         kLanguage, static_cast<PKG_INSTALLATION_TYPE>(4), false, user.c_str());
    } else {
        const bool start = action == "start";
        outcome = pm.serviceControl(static_cast<PKG_INSTALLATION_TYPE>(start ? 8 : 0x10), name,
                                    start, kLanguage, user.c_str(), nullptr, true, true);
    }
    state.value()["result"] = describeOutcome(pm, name, action);
    state.set(outcome == 1 ? "done" : "failed");
    return outcome == 1 ? 0 : 1;
}

}  // namespace

int runWorker(const std::string& dir) {
    Json::Value request;
    if (!readJsonFile(dir + "/request.json", request) || !request.isObject()) {
        fprintf(stderr, "corv-center: no task request in %s\n", dir.c_str());
        return 2;
    }
    StateWriter state(dir, request);
    const std::string action = request["action"].asString();
    if (action == "download") {
        return download(dir, request, state);
    }
    if (action == "install") {
        return install(request, state);
    }
    if (action == "start" || action == "stop" || action == "uninstall") {
        return control(request, state);
    }
    state.value()["result"] = failure("unknown action " + action, PKG_ERR_SYSTEM);
    state.set("failed");
    return 2;
}

}  // namespace center
