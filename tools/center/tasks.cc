#include "tasks.h"

#include <dirent.h>
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <sstream>
#include <thread>
#include <vector>

#include "auth.h"
#include "corvpkg/json_util.h"

extern char** environ;

namespace center {

namespace {

bool isTerminal(const std::string& state) {
    return state == "done" || state == "failed" || state == "cancelled";
}

// Removes the files of a task directory but its JSON records.
void removePackageFiles(const std::string& dir) {
    DIR* handle = opendir(dir.c_str());
    if (handle == nullptr) {
        return;
    }
    std::vector<std::string> doomed;
    while (struct dirent* entry = readdir(handle)) {
        const std::string name = entry->d_name;
        if (name != "." && name != ".." && name.find(".json") == std::string::npos) {
            doomed.push_back(dir + "/" + name);
        }
    }
    closedir(handle);
    for (const std::string& path : doomed) {
        unlink(path.c_str());
    }
}

}  // namespace

bool readJsonFile(const std::string& path, Json::Value& out) {
    std::ifstream in(path);
    if (!in) {
        return false;
    }
    std::stringstream text;
    text << in.rdbuf();
    return CORVPackageTool::fromString(text.str(), out);
}

bool writeJsonFile(const std::string& path, const Json::Value& value) {
    const std::string temporary = path + ".new";
    {
        std::ofstream out(temporary, std::ios::trunc);
        out << CORVPackageTool::toString(value) << "\n";
        if (!out.flush()) {
            unlink(temporary.c_str());
            return false;
        }
    }
    return rename(temporary.c_str(), path.c_str()) == 0;
}

TaskTable::TaskTable(std::string root, std::string program)
    : root_(std::move(root)), program_(std::move(program)) {
    mkdir(root_.c_str(), 0700);
    struct stat st {};
    ok_ = stat(root_.c_str(), &st) == 0 && S_ISDIR(st.st_mode) && chmod(root_.c_str(), 0700) == 0;
}

std::string TaskTable::create(const std::string& owner) {
    std::string id = randomToken().substr(0, 16);
    if (id.empty() || mkdir(dir(id).c_str(), 0700) != 0) {
        return "";
    }
    Json::Value meta(Json::objectValue);
    meta["owner"] = owner;
    meta["created"] = static_cast<Json::Int64>(time(nullptr));
    if (!writeJsonFile(dir(id) + "/owner.json", meta)) {
        return "";
    }
    return id;
}

bool TaskTable::exists(const std::string& id) const {
    if (id.empty() || id.size() > 64 ||
        !std::all_of(id.begin(), id.end(), [](char c) { return isxdigit(c) != 0; })) {
        return false;
    }
    struct stat st {};
    return stat(dir(id).c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

bool TaskTable::start(const std::string& id, const Json::Value& request) {
    std::lock_guard<std::mutex> hold(mutex_);
    if (workers_.count(id) != 0 || !writeJsonFile(dir(id) + "/request.json", request)) {
        return false;
    }
    Json::Value queued(Json::objectValue);
    queued["state"] = "queued";
    queued["action"] = request["action"];
    queued["package"] = request["package"];
    writeJsonFile(dir(id) + "/state.json", queued);
    const std::string taskDir = dir(id);
    const char* argv[] = {program_.c_str(), "--worker", taskDir.c_str(), nullptr};
    pid_t pid = -1;
    if (posix_spawn(&pid, program_.c_str(), nullptr, nullptr, const_cast<char**>(argv), environ) !=
        0) {
        return false;
    }
    workers_[id] = pid;
    std::thread([this, id, pid] { reap(id, pid); }).detach();
    return true;
}

void TaskTable::reap(const std::string& id, pid_t pid) {
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    std::lock_guard<std::mutex> hold(mutex_);
    workers_.erase(id);
    // A worker that died without its last word leaves a task that would poll forever.
    Json::Value current = state(id);
    if (!isTerminal(current["state"].asString()) && current["state"].asString() != "ready") {
        current["state"] = "failed";
        current["result"]["meaning"] = "the worker process ended unexpectedly";
        writeJsonFile(dir(id) + "/state.json", current);
    }
}

pid_t TaskTable::workerOf(const std::string& id) {
    std::lock_guard<std::mutex> hold(mutex_);
    auto worker = workers_.find(id);
    return worker == workers_.end() ? -1 : worker->second;
}

bool TaskTable::busy(const std::string& id) {
    std::lock_guard<std::mutex> hold(mutex_);
    return workers_.count(id) != 0;
}

bool TaskTable::cancel(const std::string& id, std::string& why) {
    std::lock_guard<std::mutex> hold(mutex_);
    Json::Value current = state(id);
    const std::string now = current["state"].asString();
    if (now != "downloading" && now != "ready" && now != "queued") {
        why = "the task is " + now + " and can no longer be cancelled";
        return false;
    }
    if (now == "queued" && current["action"].asString() != "download") {
        why = "the operation has begun and can no longer be cancelled";
        return false;
    }
    auto worker = workers_.find(id);
    if (worker != workers_.end()) {
        kill(worker->second, SIGTERM);
    }
    current["state"] = "cancelled";
    writeJsonFile(dir(id) + "/state.json", current);
    removePackageFiles(dir(id));
    return true;
}

Json::Value TaskTable::state(const std::string& id) {
    Json::Value current;
    if (!readJsonFile(dir(id) + "/state.json", current) || !current.isObject()) {
        current = Json::Value(Json::objectValue);
        current["state"] = "new";
    }
    return current;
}

Json::Value TaskTable::list(const std::string& owner) {
    std::vector<std::pair<long long, std::string>> found;
    if (DIR* handle = opendir(root_.c_str())) {
        while (struct dirent* entry = readdir(handle)) {
            const std::string id = entry->d_name;
            Json::Value meta;
            if (id[0] != '.' && readJsonFile(dir(id) + "/owner.json", meta) &&
                meta["owner"].asString() == owner) {
                found.emplace_back(meta["created"].asInt64(), id);
            }
        }
        closedir(handle);
    }
    std::sort(found.rbegin(), found.rend());
    Json::Value out(Json::arrayValue);
    for (const auto& task : found) {
        Json::Value one = state(task.second);
        one["id"] = task.second;
        out.append(one);
    }
    return out;
}

}  // namespace center
