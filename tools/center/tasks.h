// Background work of the Package Center. Everything that changes the system (download,
// install, upgrade, start, stop, uninstall) runs in a worker process, a second instance of
// this program started without a shell, so that a page's request never waits on a script
// and a crash of one operation cannot take the server down. A task is a directory under
// the state directory:
//   request.json  what to do, written by the server before it starts the worker
//   state.json    how far it got, replaced atomically by the worker (and by the server
//                 when it cancels or finds the worker gone)
//   <package>.cpk the package files to install, downloaded or uploaded
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <map>
#include <mutex>
#include <string>

namespace center {

// Reads and writes the JSON files of a task; writes go through a temporary file and
// rename, so a reader never sees half a file.
bool readJsonFile(const std::string& path, Json::Value& out);
bool writeJsonFile(const std::string& path, const Json::Value& value);

class TaskTable {
  public:
    // `root` is the state directory (made 0700 when missing); `program` the path of this
    // program, started as "program --worker DIR".
    TaskTable(std::string root, std::string program);
    bool ready() const { return ok_; }

    // A new empty task directory of `owner`; its id, or "" on failure.
    std::string create(const std::string& owner);
    std::string dir(const std::string& id) const { return root_ + "/" + id; }
    // Whether `id` names a task of this server (ids are hexadecimal tokens).
    bool exists(const std::string& id) const;
    // Writes `request` and starts the worker on it. False when it cannot be started.
    bool start(const std::string& id, const Json::Value& request);
    // Whether a worker of the task is still running.
    bool busy(const std::string& id);
    // Ends the worker of a task that has not begun to change the system (a download, or a
    // task that waits for its answers) and removes its files. False with `why` otherwise.
    bool cancel(const std::string& id, std::string& why);
    // The process id of the task's running worker, or -1.
    pid_t workerOf(const std::string& id);
    // The state as the worker left it ({"state": "queued"} before its first word).
    Json::Value state(const std::string& id);
    // Every task directory of `owner`, newest first, as their states with "id".
    Json::Value list(const std::string& owner);

  private:
    void reap(const std::string& id, pid_t pid);

    std::string root_;
    std::string program_;
    bool ok_ = false;
    std::mutex mutex_;
    std::map<std::string, pid_t> workers_;
};

// The worker's entry: runs request.json of `dir` to its end. The exit status is 0 when
// the task succeeded.
int runWorker(const std::string& dir);

}  // namespace center
