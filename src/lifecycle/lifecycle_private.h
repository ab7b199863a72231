// Internals shared by the lifecycle sources.
#pragma once

namespace CORVPackageTool {

// The CORVPKG_PKG_STATUS word of an operation type ("INSTALL", "START", ...), or null for
// the types that have none (0, restart, combinations).
const char* PMSStatusWord(int type);

}  // namespace CORVPackageTool

#include <string>
#include <vector>

#include "common/registry_paths.h"

namespace CORVPackageTool {

// PMSWriteSysLog of a printf-style line, cut at 4095 bytes.
void PMSWriteSysLogf(const char* format, ...) __attribute__((format(printf, 1, 2)));
// The package's settings directory /usr/corv/etc/packages/<name>.
std::string PMSPackageEtcDir(const std::string& name);
// The registry's `target` link leads to a directory on a volume that has not failed.
bool PMSCheckPayloadTarget(const std::string& registry);

}  // namespace CORVPackageTool

#include <json/json.h>

#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"

namespace NOS {
class Task;
class TaskMgr;
}  // namespace NOS

namespace CORVPackageTool {

// Task records of the package manager (owner "@administrators"). Null when the record
// cannot be made or read; that is logged and never fails the operation. The caller owns
// the task and ends it with PMSRemoveTask.
NOS::Task* GetNewTask(const std::string& owner, const std::string& id);
NOS::Task* GetTaskWithTaskMgr(NOS::TaskMgr& mgr, const std::string& id);
// A task "<prefix><name>" whose "data" says who works on it and how: {"id": name, "pid",
// "taskid", "status": status}.
NOS::Task* PMSCreateOperationTask(const std::string& prefix, const std::string& name,
                                  const char* status);
NOS::Task* createStartStopTask(const std::string& name, bool start);
// Removes the record and frees the task; null is fine.
void PMSRemoveTask(NOS::Task* task);

// The job step of a start or stop: the caller's context for the job, then resume/pause at
// boot and shutdown (type 0), pause on the stop of an upgrade, else start/stop. -1 when the
// context cannot be handed over, else the service call's value (0 is success).
int ServiceControlStep(const PackageInfo& info, const std::string& job, bool start,
                       PKG_INSTALLATION_TYPE type, const char* language, const char* userName);

// Runs the desktop notifier with `args` after its fixed leading arguments; failures are
// logged only.
void PMSNotifyAdministrators(const std::vector<std::string>& args);

}  // namespace CORVPackageTool

namespace CORVPackageTool {

// The look for newer versions that runs, detached, after every successful install.
void PMSRunUpgradeCheck(const char* userName, const char* language);

}  // namespace CORVPackageTool
