// The worker process of a task (tasks.h): one download, install, start, stop or uninstall
// through libcorvpkg, its progress and outcome written to state.json as it goes.
#include <openssl/evp.h>
#include <stdio.h>
#include <unistd.h>

#include <fstream>
#include <string>

#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgcurltool.h"
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

// Lower-case hexadecimal MD5 of a file's bytes, "" when it cannot be read.
std::string fileMd5(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    if (!in || context == nullptr || EVP_DigestInit_ex(context, EVP_md5(), nullptr) != 1) {
        EVP_MD_CTX_free(context);
        return "";
    }
    char buffer[65536];
    while (in.read(buffer, sizeof buffer) || in.gcount() > 0) {
        EVP_DigestUpdate(context, buffer, static_cast<size_t>(in.gcount()));
    }
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    EVP_DigestFinal_ex(context, digest, &length);
    EVP_MD_CTX_free(context);
    static const char kHex[] = "0123456789abcdef";
    std::string out;
    for (unsigned int i = 0; i < length; ++i) {
        out += kHex[digest[i] >> 4];
        out += kHex[digest[i] & 15];
    }
    return out;
}

Json::Value failure(const std::string& meaning, int code = PKG_ERR_SERVER) {
    Json::Value result = describeResult(code);
    result["meaning"] = meaning;
    result["text"] = meaning;
    return result;
}

// Fetches every file of the plan; the page sees the bytes grow under their final names'
// ".part" and computes the progress from the sizes the plan gives.
int download(const std::string& dir, const Json::Value& request, StateWriter& state) {
    state.value()["plan"] = request["plan"];
    state.set("downloading");
    Json::Value files(Json::arrayValue);
    for (const Json::Value& entry : request["plan"]) {
        const std::string name = entry["package"].asString();
        const std::string part = dir + "/" + name + ".cpk.part";
        const std::string file = dir + "/" + name + ".cpk";
        if (!PMSDownloadFile(entry["link"].asCString(), part.c_str(), nullptr, nullptr, nullptr)) {
            const std::string why = PMSGetLastStoreFailure();
            state.value()["result"] =
                failure("the download of " + name + " failed" + (why.empty() ? "" : ": " + why));
            state.set("failed");
            return 1;
        }
        const std::string md5 = entry["md5"].asString();
        if (!md5.empty() && fileMd5(part) != md5) {
            unlink(part.c_str());
            state.value()["result"] =
                failure("the file of " + name + " does not have the checksum the store gives");
            state.set("failed");
            return 1;
        }
        rename(part.c_str(), file.c_str());
        Json::Value one(Json::objectValue);
        one["package"] = name;
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
