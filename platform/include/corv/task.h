// Task records of the reference platform: small named JSON documents that a long
// operation keeps up to date and that other processes (the web UI, the command line)
// read. A task is identified by its owner ("@administrators" for the package manager's
// tasks) and its id; both are words of 1 to 200 letters, digits and "@_.-" that do not
// begin with a dot. A record lives in NOS_TASK_DIR/<owner>/<id>.json until it is removed:
// it outlives the process that made it, not a reboot. Every change of the file is a write
// to a temporary name and a rename, under an flock of the record's lock file
// NOS_TASK_DIR/<owner>/.<id>.lock (which stays), so that readers never see half a record.
// A write merges the properties that this object changed into the record as it is on
// disk: two processes that set different properties of one task lose neither.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#define NOS_TASK_DIR "/run/corv/task"

namespace NOS {

class Task {
  public:
    // Creates the record (or takes over a stale one of the same id) with the properties
    // "progress" 0 and "data" null, "pid" the caller's process and "finished" false.
    // A record is stale when it is finished or its "pid" is no living process; a record
    // of the calling process itself is taken over too.
    // Throws std::runtime_error when the owner or id is not a valid word, when another
    // living process holds an unfinished record of that id, or when the record cannot be
    // written.
    Task(const std::string& owner, const std::string& id);
    virtual ~Task();
    Task(const Task&) = delete;
    Task& operator=(const Task&) = delete;

    const std::string& getOwner() const;
    // The id given at construction.
    const std::string& getTaskId() const;

    // Reads the record again from its file (changes of an open update are kept on top).
    // False when it is gone (removed by someone else) or unreadable; the properties then
    // read as null.
    bool reload();
    // A property as last loaded or set; null when absent.
    Json::Value getProperty(const std::string& key) const;
    // Sets a property and writes the record at once, unless an update is open (see
    // beginUpdate). False when the write fails.
    bool setProperty(const std::string& key, const Json::Value& value);
    // Groups several setProperty calls into one write: endUpdate writes them all (updates
    // nest: the outermost endUpdate writes). False when the write fails; the changes are
    // then kept and go out with the next write.
    void beginUpdate();
    bool endUpdate();
    // Marks the record finished ("finished" true) and writes it, closing any open update;
    // with `removeAfter` the record is removed instead. False when the write fails.
    bool finish(bool removeAfter);
    // Removes the record's file. False when it could not be removed (a missing file is
    // success). The object stays usable; later writes recreate the record.
    bool remove();
    // The same for `task`; false for null.
    static bool remove(Task* task);

    // The record's file path.
    std::string path() const;

  private:
    friend class TaskMgr;
    Task(const std::string& owner, const std::string& id, bool attach);
    bool write();
    std::string owner_;
    std::string id_;
    Json::Value record_;   // the record as last read or written, with our changes
    Json::Value pending_;  // properties changed since the last successful write
    int updateDepth_ = 0;
};

class TaskMgr {
  public:
    // The tasks of one owner. Throws std::runtime_error for an invalid owner.
    explicit TaskMgr(const std::string& owner);
    // The existing task `id`, loaded, or null when there is none. The caller owns it.
    // Throws std::runtime_error when `id` is not a valid word or the record exists but
    // cannot be read.
    Task* getTask(const std::string& id);
    // The ids of the owner's tasks, sorted; empty when the owner has none.
    std::vector<std::string> list() const;

  private:
    std::string owner_;
};

}  // namespace NOS
