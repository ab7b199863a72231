// Task records: one JSON file per task, changed under the record's own flock.
#include "corv/task.h"

#include <errno.h>
#include <signal.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <stdexcept>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "json_store.h"
#include "sz_holder.h"

namespace NOS {

namespace {

using corvplat::FileLock;
using corvplat::JsonRead;

constexpr size_t kMaxWord = 200;
constexpr int kLockSeconds = 10;
constexpr mode_t kDirMode = 0755;
constexpr mode_t kFileMode = 0644;

bool isValidWord(const std::string& word) {
    if (word.empty() || word.size() > kMaxWord || word[0] == '.') {
        return false;
    }
    for (char c : word) {
        const bool ok = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                        (c >= '0' && c <= '9') || c == '@' || c == '_' || c == '.' || c == '-';
        if (!ok) {
            return false;
        }
    }
    return true;
}

void requireWord(const char* what, const std::string& word) {
    if (!isValidWord(word)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        throw std::runtime_error(std::string("invalid task ") + what + " '" + word + "'");
    }
}

std::string ownerDir(const std::string& owner) {
    return std::string(NOS_TASK_DIR) + "/" + owner;
}

std::string lockPath(const std::string& owner, const std::string& id) {
    return ownerDir(owner) + "/." + id + ".lock";
}

bool ensureOwnerDir(const std::string& owner) {
    return CORVFSMkdirP(ownerDir(owner).c_str(), nullptr, 1, -1, -1, kDirMode) == 0;
}

bool processAlive(pid_t pid) {
    return kill(pid, 0) == 0 || errno == EPERM;
}

// Another living process still works on this record.
bool heldByOther(const Json::Value& record) {
    if (!record.isObject() || record["finished"] == Json::Value(true)) {
        return false;
    }
    const Json::Value& pid = record["pid"];
    if (!pid.isIntegral() || pid.asLargestInt() <= 0 || pid.asLargestInt() == getpid()) {
        return false;
    }
    return processAlive(static_cast<pid_t>(pid.asLargestInt()));
}

Json::Value freshRecord() {
    Json::Value record(Json::objectValue);
    record["progress"] = 0;
    record["data"] = Json::Value();
    record["pid"] = static_cast<Json::Int64>(getpid());
    record["finished"] = false;
    return record;
}

}  // namespace

Task::Task(const std::string& owner, const std::string& id)
    : owner_(owner), id_(id), record_(Json::objectValue), pending_(Json::objectValue) {
    requireWord("owner", owner);
    requireWord("id", id);
    if (!ensureOwnerDir(owner_)) {
        throw std::runtime_error("cannot create " + ownerDir(owner_));
    }
    // The check for a living holder and the new record are one step under the lock, so
    // two processes cannot both take over the same stale record.
    FileLock lock(lockPath(owner_, id_), kLockSeconds);
    if (!lock.ok()) {
        throw std::runtime_error("cannot lock task " + owner_ + "/" + id_);
    }
    Json::Value current;
    if (corvplat::readJsonFile(path(), current) == JsonRead::kOk && heldByOther(current)) {
        throw std::runtime_error("task " + owner_ + "/" + id_ + " is held by process " +
                                 current["pid"].asString());
    }
    Json::Value record = freshRecord();
    if (!corvplat::writeJsonFile(path(), record, kFileMode)) {
        throw std::runtime_error("cannot write task " + path());
    }
    record_ = record;
}

Task::Task(const std::string& owner, const std::string& id, bool)
    : owner_(owner), id_(id), record_(Json::objectValue), pending_(Json::objectValue) {
    requireWord("owner", owner);
    requireWord("id", id);
}

Task::~Task() = default;

const std::string& Task::getOwner() const {
    return owner_;
}

const std::string& Task::getTaskId() const {
    return id_;
}

std::string Task::path() const {
    return ownerDir(owner_) + "/" + id_ + ".json";
}

bool Task::reload() {
    Json::Value current;
    if (corvplat::readJsonFile(path(), current) != JsonRead::kOk || !current.isObject()) {
        record_ = Json::Value(Json::objectValue);
        return false;
    }
    for (const std::string& key : pending_.getMemberNames()) {
        current[key] = pending_[key];
    }
    record_ = current;
    return true;
}

Json::Value Task::getProperty(const std::string& key) const {
    return record_.isMember(key) ? record_[key] : Json::Value();
}

bool Task::setProperty(const std::string& key, const Json::Value& value) {
    record_[key] = value;
    pending_[key] = value;
    return updateDepth_ > 0 ? true : write();
}

void Task::beginUpdate() {
    ++updateDepth_;
}

bool Task::endUpdate() {
    if (updateDepth_ > 0) {
        --updateDepth_;
    }
    return updateDepth_ > 0 ? true : write();
}

bool Task::finish(bool removeAfter) {
    updateDepth_ = 0;
    if (removeAfter) {
        return remove();
    }
    record_["finished"] = true;
    pending_["finished"] = true;
    return write();
}

bool Task::remove() {
    FileLock lock(lockPath(owner_, id_), kLockSeconds);
    if (!lock.ok()) {
        return false;
    }
    if (unlink(path().c_str()) != 0 && errno != ENOENT) {
        CORV_LOG_ERR("Failed to unlink %s, %m", path().c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
        return false;
    }
    // What this object knows is all that a later write can bring back.
    pending_ = Json::Value(Json::objectValue);
    return true;
}

bool Task::remove(Task* task) {
    return task != nullptr && task->remove();
}

bool Task::write() {
    if (!ensureOwnerDir(owner_)) {
        return false;
    }
    FileLock lock(lockPath(owner_, id_), kLockSeconds);
    if (!lock.ok()) {
        return false;
    }
    // Others may have set properties of their own since we read the record; a record
    // that is gone or damaged is written anew from what this object holds.
    Json::Value base;
    if (corvplat::readJsonFile(path(), base) != JsonRead::kOk || !base.isObject()) {
        base = record_;
    }
    for (const std::string& key : pending_.getMemberNames()) {
        base[key] = pending_[key];
    }
    if (!corvplat::writeJsonFile(path(), base, kFileMode)) {
        return false;
    }
    record_ = base;
    pending_ = Json::Value(Json::objectValue);
    return true;
}

TaskMgr::TaskMgr(const std::string& owner) : owner_(owner) {
    requireWord("owner", owner);
}

Task* TaskMgr::getTask(const std::string& id) {
    requireWord("id", id);
    const std::string file = ownerDir(owner_) + "/" + id + ".json";
    Json::Value record;
    switch (corvplat::readJsonFile(file, record)) {
        case JsonRead::kMissing:
            return nullptr;
        case JsonRead::kBad:
            throw std::runtime_error("cannot read task " + file);
        case JsonRead::kOk:
            break;
    }
    if (!record.isObject()) {
        VLIBCErrSet(ERR_MALFORMED);
        throw std::runtime_error("task " + file + " is no JSON object");
    }
    Task* task = new Task(owner_, id, true);
    task->record_ = record;
    return task;
}

std::vector<std::string> TaskMgr::list() const {
    std::vector<std::string> ids;
    const std::string dir = ownerDir(owner_);
    if (VLIBCFileCheckDir(dir.c_str()) != 1) {
        return ids;
    }
    corvplat::SzListHolder names(16);
    if (!names || VLIBCFileEnumDir(dir.c_str(), ".json", names.addr(), 0) < 0) {
        return ids;
    }
    const size_t suffix = strlen(".json");
    for (int i = 0; i < VLIBCSzListCount(names.get()); ++i) {
        const std::string name = VLIBCSzListGet(names.get(), i);
        const std::string id = name.substr(0, name.size() - suffix);
        if (isValidWord(id)) {
            ids.push_back(id);
        }
    }
    return ids;
}

}  // namespace NOS
