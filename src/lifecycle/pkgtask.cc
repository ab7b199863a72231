// Task records of running package operations, for the desktop and the command line to
// follow.
#include <unistd.h>

#include <stdexcept>
#include <string>

#include "corv/log.h"
#include "corv/task.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {
constexpr const char* kTaskOwner = "@administrators";
}

NOS::Task* GetNewTask(const std::string& owner, const std::string& id) {
    try {
        return new NOS::Task(owner, id);
    } catch (const std::runtime_error& e) {
        CORV_LOG_ERR("GetNewTask failed with exception: '%s'", e.what());
        return nullptr;
    }
}

NOS::Task* GetTaskWithTaskMgr(NOS::TaskMgr& mgr, const std::string& id) {
    try {
        return mgr.getTask(id);
    } catch (const std::runtime_error& e) {
        CORV_LOG_ERR("GetNewTask failed with exception: '%s'", e.what());
        return nullptr;
    }
}

NOS::Task* PMSCreateOperationTask(const std::string& prefix, const std::string& name,
                                  const char* status) {
    NOS::Task* task = GetNewTask(kTaskOwner, prefix + name);
    if (task == nullptr) {
        return nullptr;
    }
    Json::Value data(Json::objectValue);
    data["id"] = name;
    data["pid"] = static_cast<int>(getpid());
    data["taskid"] = task->getTaskId();
    data["status"] = status;
    task->setProperty("data", data);
    return task;
}

NOS::Task* createStartStopTask(const std::string& name, bool start) {
    return PMSCreateOperationTask("@CORVPKG_STARTSTOP_", name, start ? "starting" : "stopping");
}

void PMSRemoveTask(NOS::Task* task) {
    if (task == nullptr) {
        return;
    }
    task->remove();
    delete task;
}

}  // namespace CORVPackageTool
