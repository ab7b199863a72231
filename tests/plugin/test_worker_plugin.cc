// A scripted resource worker, loaded by the engine through dlopen like any plug-in.
//
// Every call is appended as one line to the file named by CORV_TEST_PLUGIN_LOG (when set):
//   "init <n>", "destroy <n>", "free <n>" for the n-th worker made in this process, and
//   "<op> <tag>" for acquire, rollback, release and update,
// where the tag is the section's "tag" (or the one recorded in own), "?" without one.
//
// The request section scripts the worker:
//   "tag": text          names this worker in the log and in own
//   "fail": [ops]        these operations fail ("acquire", "rollback", "release", "update")
//   "message": key       on failure, recorded with SetI18NErrMsg(key, tag, null)
//   "env": {NAME: text}  handed back with WorkerResp::SetEnv by acquire
// and own records what happened: "tag", "acquired" (a count), "rolled_back", "released",
// "updated" (the "@helper-args"), and "seen" (what ActionInfo said at the last acquire).
//
// The environment scripts what has no arguments: CORV_TEST_PLUGIN_INIT_NULL (set: Init
// gives null) and CORV_TEST_PLUGIN_UPDATABLE ("1": IsUpdatable answers true).
//
// Built with CORV_TEST_PLUGIN_WITHOUT_FREE it lacks the Free symbol.
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <new>
#include <string>

#include "corv/pkgutils.h"

namespace {

using CORV::PkgUtils::ActionInfo;
using CORV::PkgUtils::WorkerResp;

int g_made = 0;

// Closes the call log whichever way a write ends.
class Fd {
  public:
    explicit Fd(int fd) : fd_(fd) {}
    ~Fd() {
        if (fd_ >= 0) {
            close(fd_);
        }
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    int get() const { return fd_; }

  private:
    int fd_;
};

void record(const std::string& line) {
    const char* path = getenv("CORV_TEST_PLUGIN_LOG");
    if (path == nullptr || *path == '\0') {
        return;
    }
    Fd fd(open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
    if (fd.get() < 0) {
        return;
    }
    // One write per line, so that lines of several workers never interleave; a lost line
    // shows up as a failed expectation in the test.
    const std::string text = line + "\n";
    ssize_t written = write(fd.get(), text.data(), text.size());
    (void)written;
}

class ScriptedWorker : public CORV::PkgUtils::IWorker {
  public:
    explicit ScriptedWorker(int serial) : serial_(serial) {}
    ~ScriptedWorker() override { record("destroy " + std::to_string(serial_)); }

    int Acquire(const ActionInfo& action, const Json::Value& request, Json::Value& own,
                WorkerResp& resp) override {
        ownObject(own);
        const std::string tag = tagOf(request, own);
        record("acquire " + tag);
        Json::Value seen(Json::objectValue);
        seen["pkg"] = action.GetPkgName();
        seen["user"] = action.GetPkgUserName();
        seen["type"] = action.GetActionType();
        seen["root"] = action.GetRootDir();
        seen["request"] = request;
        own["seen"] = seen;
        if (request.isObject() && request["env"].isObject()) {
            for (const std::string& name : request["env"].getMemberNames()) {
                resp.SetEnv(name, request["env"][name].asString());
            }
        }
        if (fails(request, "acquire", tag, resp)) {
            return 1;
        }
        own["tag"] = tag;
        own["acquired"] = own["acquired"].asInt() + 1;
        return 0;
    }

    int Rollback(const ActionInfo&, const Json::Value& request, Json::Value& own,
                 WorkerResp& resp) override {
        ownObject(own);
        const std::string tag = tagOf(request, own);
        record("rollback " + tag);
        own["rolled_back"] = true;
        return fails(request, "rollback", tag, resp) ? 1 : 0;
    }

    int Release(const ActionInfo&, const Json::Value& request, Json::Value& own,
                WorkerResp& resp) override {
        ownObject(own);
        const std::string tag = tagOf(request, own);
        record("release " + tag + (request.isNull() ? " (no request)" : ""));
        if (fails(request, "release", tag, resp)) {
            return 1;
        }
        own["released"] = true;
        return 0;
    }

    bool IsUpdatable() override {
        const char* updatable = getenv("CORV_TEST_PLUGIN_UPDATABLE");
        return updatable != nullptr && strcmp(updatable, "1") == 0;
    }

    bool Update(const ActionInfo&, const Json::Value& request, Json::Value& own,
                WorkerResp& resp) override {
        ownObject(own);
        const std::string tag = tagOf(request, own);
        record("update " + tag);
        if (fails(request, "update", tag, resp)) {
            return false;
        }
        own["updated"] = request["@helper-args"];
        return true;
    }

    int serial() const { return serial_; }

  private:
    // The engine hands over whatever the own-file holds; this worker keeps an object.
    static void ownObject(Json::Value& own) {
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
    }

    static std::string tagOf(const Json::Value& request, const Json::Value& own) {
        if (request.isObject() && request["tag"].isString()) {
            return request["tag"].asString();
        }
        if (own["tag"].isString()) {
            return own["tag"].asString();
        }
        return "?";
    }

    static bool fails(const Json::Value& request, const char* op, const std::string& tag,
                      WorkerResp& resp) {
        if (!request.isObject() || !request["fail"].isArray()) {
            return false;
        }
        for (const Json::Value& item : request["fail"]) {
            if (item.isString() && item.asString() == op) {
                if (request["message"].isString()) {
                    resp.SetI18NErrMsg(request["message"].asString(), tag.c_str(), nullptr);
                }
                return true;
            }
        }
        return false;
    }

    int serial_;
};

}  // namespace

extern "C" __attribute__((visibility("default"))) CORV::PkgUtils::IWorker*
CORVPkgUtilsPluginWorkerInit() {
    if (getenv("CORV_TEST_PLUGIN_INIT_NULL") != nullptr) {
        record("init null");
        return nullptr;
    }
    int serial = ++g_made;
    record("init " + std::to_string(serial));
    return new (std::nothrow) ScriptedWorker(serial);
}

#ifndef CORV_TEST_PLUGIN_WITHOUT_FREE
extern "C" __attribute__((visibility("default"))) void* CORVPkgUtilsPluginWorkerFree(
    CORV::PkgUtils::IWorker* worker) {
    ScriptedWorker* scripted = static_cast<ScriptedWorker*>(worker);
    record("free " + std::to_string(scripted->serial()));
    delete scripted;
    return nullptr;
}
#endif
