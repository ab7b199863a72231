// Start and stop of a package together with the packages that depend on it, under the
// package lock and a task record that others can follow.
#include <algorithm>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "lifecycle/lifecycle_private.h"
#include "lifecycle/road.h"

namespace CORVPackageTool {

namespace {

// What the steps of a start or stop of a package with its dependents share.
struct ServiceRoad {
    PackageManager& pm;
    const PKG_INSTALLATION_TYPE type;
    const std::string& name;
    const bool start;
    const char* language;
    const char* userName;
    std::vector<std::string>* order;
    const bool withDependents;
    const bool restartRelated;
    NOS::Task* task = nullptr;
    std::vector<std::string> list{};
    int outcome = 0;
};

// A record that others (the desktop) can follow while the packages are driven.
bool openTask(ServiceRoad& r) {
    r.task = createStartStopTask(r.name, r.start);
    r.pm.setResult(r.start ? PKG_ERR_START_FAILED : PKG_ERR_STOP_FAILED);
    return true;
}

bool lock(ServiceRoad& r) {
    if (!PackageManager::ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", r.name.c_str());
        r.pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    return true;
}

// The packages to drive, in stop order (dependents first), turned round for a start: the
// named package is then first on a start and last on a stop.
bool listPackages(ServiceRoad& r) {
    if (!r.withDependents) {
        r.list = {r.name};
    } else if (r.order == nullptr || r.order->empty()) {
        if (!r.pm.getDependencyOrder(r.name.c_str(), r.list, false)) {
            r.list = {r.name};
        }
    } else {
        r.list = *r.order;
    }
    if (r.start) {
        std::reverse(r.list.begin(), r.list.end());
    }
    if (r.list.size() >= 2) {
        std::string names;
        for (const std::string& entry : r.list) {
            names += (names.empty() ? "" : ",") + entry;
        }
        PMSWriteSysLogf("%s %s: begin to %s packages %s", parseInstallTypeToStr(r.type),
                        r.name.c_str(), r.start ? "start" : "stop", names.c_str());
    }
    return true;
}

// Only the named package's outcome counts. Dependents run on a manager of their own, so
// that what the caller reads afterwards (result, parameters, package) is the named one's;
// at boot, shutdown and upgrade they keep their intent (type 0).
bool drivePackages(ServiceRoad& r) {
    r.outcome = r.list.empty() ? 1 : 0;
    const size_t expected = r.start ? 0 : r.list.size() - 1;
    for (size_t i = 0; i < r.list.size(); ++i) {
        if (i == expected && r.list[i] == r.name) {
            r.outcome = r.pm.serviceControlAction(
                r.type, r.name, r.start, r.language, r.userName,
                r.order != nullptr ? MSG_TYPE_PARAM_AND_SCRIPT_LOG : MSG_TYPE_PARAM);
            continue;
        }
        const int dependentType = (r.type == 0 || r.type == 2) ? 0 : (r.start ? 8 : 0x10);
        PackageManager dependent;
        dependent.serviceControlAction(static_cast<PKG_INSTALLATION_TYPE>(dependentType), r.list[i],
                                       r.start, r.language, r.userName,
                                       MSG_TYPE_PARAM_AND_SCRIPT_LOG);
    }
    return true;
}

bool restartRelatedServices(ServiceRoad& r) {
    if (r.restartRelated) {
        r.pm.RestartServices(static_cast<PKG_INSTALLATION_TYPE>(r.start ? 8 : 0x10),
                             r.pm.findRestartServices(r.list));
    }
    if (r.outcome != 0) {
        r.pm.setResult(PKG_OK);
    }
    return true;
}

constexpr RoadStep<ServiceRoad> kServiceSteps[] = {
    {"open-task", openTask},
    {"lock", lock},
    {"list-packages", listPackages},
    {"drive-packages", drivePackages},
    {"restart-related-services", restartRelatedServices},
};

// An upgrade keeps the lock between the stop of the old and the start of the new version.
bool closeTask(ServiceRoad& r) {
    PMSRemoveTask(r.task);
    if (r.type != 2) {
        PackageManager::UnLock();
    }
    return true;
}

constexpr RoadStep<ServiceRoad> kServiceClosingSteps[] = {
    {"close-task", closeTask},
};

}  // namespace

int PackageManager::serviceControl(PKG_INSTALLATION_TYPE type, const std::string& name, bool start,
                                   const char* language, const char* userName,
                                   std::vector<std::string>* order, bool withDependents,
                                   bool restartRelated) {
    ServiceRoad r{*this,    type,  name,           start,         language,
                  userName, order, withDependents, restartRelated};
    const char* road = start ? "start" : "stop";
    PMSRunRoad(road, r, kServiceSteps);
    PMSRunClosingSteps(road, r, kServiceClosingSteps);
    return r.outcome;
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
