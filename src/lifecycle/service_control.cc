// Start and stop of a package together with the packages that depend on it, under the
// package lock and a task record that others can follow.
#include <algorithm>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

int PackageManager::serviceControl(PKG_INSTALLATION_TYPE type, const std::string& name, bool start,
                                   const char* language, const char* userName,
                                   std::vector<std::string>* order, bool withDependents,
                                   bool restartRelated) {
    int outcome = 0;
    std::vector<std::string> list;
    // 1.
    NOS::Task* task = createStartStopTask(name, start);
    setResult(start ? PKG_ERR_START_FAILED : PKG_ERR_STOP_FAILED);
    // 2.
    if (!ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", name.c_str());
        setResult(PKG_ERR_LOCKED);
        goto final;
    }
    // 3.
    if (!withDependents) {
        list = {name};
    } else if (order == nullptr || order->empty()) {
        if (!getDependencyOrder(name.c_str(), list, false)) {
            list = {name};
        }
    } else {
        list = *order;
    }
    // 4. The list stands in stop order, dependents first.
    if (start) {
        std::reverse(list.begin(), list.end());
    }
    // 5.
    if (list.size() >= 2) {
        std::string names;
        for (const std::string& entry : list) {
            names += (names.empty() ? "" : ",") + entry;
        }
        PMSWriteSysLogf("%s %s: begin to %s packages %s", parseInstallTypeToStr(type), name.c_str(),
                        start ? "start" : "stop", names.c_str());
    }
    // 6. Dependents run on a manager of their own, so that what the caller reads
    // afterwards (result, parameters, package) is the named package's.
    outcome = list.empty() ? 1 : 0;
    for (size_t i = 0; i < list.size(); ++i) {
        const size_t expected = start ? 0 : list.size() - 1;
        if (i == expected && list[i] == name) {
            outcome = serviceControlAction(
                type, name, start, language, userName,
                order != nullptr ? MSG_TYPE_PARAM_AND_SCRIPT_LOG : MSG_TYPE_PARAM);
            continue;
        }
        int dependentType = (type == 0 || type == 2) ? 0 : (start ? 8 : 0x10);
        PackageManager dependent;
        dependent.serviceControlAction(static_cast<PKG_INSTALLATION_TYPE>(dependentType), list[i],
                                       start, language, userName, MSG_TYPE_PARAM_AND_SCRIPT_LOG);
    }
    // 7.
    if (restartRelated) {
        RestartServices(static_cast<PKG_INSTALLATION_TYPE>(start ? 8 : 0x10),
                        findRestartServices(list));
    }
    if (outcome != 0) {
        setResult(PKG_OK);
    }
final:
    // 8. An upgrade keeps the lock between the stop of the old and the start of the new.
    PMSRemoveTask(task);
    if (type != 2) {
        UnLock();
    }
    return outcome;
}

int PackageManager::serviceControl(const std::string& name, bool start, const char* ignored) {
    (void)ignored;
    return serviceControl(static_cast<PKG_INSTALLATION_TYPE>(start ? 8 : 0x10), name, start,
                          nullptr, nullptr, nullptr, true, true);
}

int PackageManager::serviceControlRestart(const std::string& name) {
    const PKG_INSTALLATION_TYPE restart = static_cast<PKG_INSTALLATION_TYPE>(0x20);
    int outcome = serviceControl(restart, name, false, nullptr, nullptr, nullptr, true, true);
    if (outcome != 0) {
        outcome = serviceControl(restart, name, true, nullptr, nullptr, nullptr, true, true);
    }
    return outcome;
}

}  // namespace CORVPackageTool
