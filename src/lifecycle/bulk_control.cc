// Many packages at once: every package at boot and shutdown (optionally only those that
// registered an interest in one of a filter's items), and the packages that need a system
// service when it goes up or down. Both walk with type 0, so the users' `enabled` flags
// stay as they are, and both print progress for a console that waits.
#include <stdio.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {

// The package lock taken exclusively with a wait, and the name to release it by.
constexpr int kBulkLock = VLIBC_LOCK_PKG | VLIBC_LOCK_EXCLUSIVE | VLIBC_LOCK_WAIT;
constexpr int kBulkLockSeconds = 180;
constexpr char kDesktopLinkDir[] = "/usr/corv/corvman/webui/3rdparty/";

// Holds the package lock for a walk if it can be had; a walk goes on without it, since
// at boot and shutdown nothing may be left undone for a busy lock.
class BulkLock {
  public:
    BulkLock() {
        if (VLIBCFileLock(kBulkLock, kBulkLockSeconds) != 0) {
            CORV_LOG_ERR("A package is busy");
        }
    }
    ~BulkLock() { VLIBCFileUnlock(VLIBC_LOCK_PKG); }
    BulkLock(const BulkLock&) = delete;
    BulkLock& operator=(const BulkLock&) = delete;
};

void printProgress(const char* status, bool start, const std::string& name, size_t number,
                   size_t total) {
    Json::Value line(Json::objectValue);
    line["status"] = status;
    line["action"] = start ? "start" : "stop";
    line["id"] = name;
    line["number"] = static_cast<Json::UInt64>(number);
    line["total"] = static_cast<Json::UInt64>(total);
    printf("%s\n", toString(line).c_str());
    fflush(stdout);
}

// The things a package registered under `key`: true with them when its registration file
// is an array of strings; false when it has none or the file is not such an array.
bool readRegistration(const std::string& name, const char* key, std::set<std::string>& things) {
    const std::string path = PMSRegistryDir(name) + "/etc/corvpkg_conf/reg_" + key;
    if (access(path.c_str(), F_OK) != 0) {
        return false;
    }
    Json::Value list;
    if (!fromFile(path, list) || !list.isArray()) {
        CORV_LOG_ERR("Fail to read jsonfile [%s]", path.c_str());
        return false;
    }
    for (const Json::Value& item : list) {
        if (!item.isString()) {
            return false;
        }
        things.insert(item.asString());
    }
    return true;
}

// A package is left out of a filtered walk only when it said what it needs and none of
// it is among the filter's items; anything unclear keeps it in.
bool ShouldSkipPackage(const std::string& name, const char* filter, const char* key) {
    if (name.empty() || filter == nullptr || key == nullptr || key[0] == '\0') {
        return false;
    }
    std::unique_ptr<VLIBSZLIST, void (*)(PVLIBSZLIST)> items(VLIBCSzListAlloc(16), VLIBCSzListFree);
    PVLIBSZLIST raw = items.get();
    if (raw == nullptr || VLIBCStrSep(filter, ",", &raw) < 1) {
        return false;
    }
    std::set<std::string> things;
    if (!readRegistration(name, key, things)) {
        return false;
    }
    for (const std::string& thing : things) {
        if (VLIBCSzListFind(raw, thing.c_str()) >= 0) {
            return false;
        }
    }
    return true;
}

}  // namespace

int PackageManager::serviceControlOnOffALL(bool start, bool verbose, const char* filter,
                                           const char* key) {
    std::vector<std::string> list;
    if (!getDependencyOrder(list)) {
        list = enumPackages(static_cast<const char*>(nullptr), PKG_INFO_MASK_ALL);
    }
    if (list.empty()) {
        return 1;
    }
    BulkLock lock;
    // The order lists dependents first: a start walks it backwards.
    if (start) {
        std::reverse(list.begin(), list.end());
    }
    if (verbose) {
        printf("Total:\t%zd packages\n", list.size());
        fflush(stdout);
    }
    std::vector<PackageInfo> infos;
    getPackageInfo(list, infos, nullptr, PKG_INFO_MASK_ALL);
    int outcome = 1;
    unsigned long long mask = 0;
    for (size_t i = 0; i < list.size(); ++i) {
        const std::string& name = list[i];
        if (ShouldSkipPackage(name, filter, key)) {
            if (verbose) {
                printProgress("skip", start, name, i + 1, list.size());
            }
            continue;
        }
        if (verbose) {
            printProgress("begin", start, name, i + 1, list.size());
        }
        const auto info = std::find_if(infos.begin(), infos.end(),
                                       [&name](const PackageInfo& p) { return p.package == name; });
        const bool startable = info == infos.end() || info->startable;
        if (access(PMSEnabledFlagPath(name).c_str(), F_OK) != 0 && startable) {
            continue;
        }
        if (serviceControlAction(static_cast<PKG_INSTALLATION_TYPE>(0), name, start, nullptr,
                                 nullptr, MSG_TYPE_LOG) == 0) {
            outcome = 0;
            continue;
        }
        mask |= getPackageInfoData().startstop_restart_services;
        if (verbose) {
            printProgress("end", start, name, i + 1, list.size());
        }
    }
    if (!start) {
        return outcome;
    }
    if (verbose) {
        printf("Begin:\tReload relative services\n");
        fflush(stdout);
    }
    if (RestartServices(static_cast<PKG_INSTALLATION_TYPE>(8), mask) == 0) {
        outcome = 0;
    } else if (verbose) {
        printf("End:\tReload relative services\n");
        fflush(stdout);
    }
    return outcome;
}

int PackageManager::serviceControlByService(const std::set<std::string>& services, bool start,
                                            bool verbose) {
    std::vector<PackageInfo> infos;
    getDepServicePkgs(services, infos);
    BulkLock lock;
    int outcome = 1;
    unsigned long long mask = 0;
    for (size_t i = 0; i < infos.size(); ++i) {
        const PackageInfo& info = infos[i];
        if (serviceControlAction(static_cast<PKG_INSTALLATION_TYPE>(0), info.package, start,
                                 nullptr, nullptr, MSG_TYPE_LOG) == 0) {
            CORV_LOG_ERR("Failed to %s %s\n", start ? "start" : "stop", info.package.c_str());
            outcome = 0;
            continue;
        }
        if (!start && !info.nosuidir.empty()) {
            unlink((kDesktopLinkDir + info.package).c_str());
        }
        if (verbose) {
            printf("%s %s successfully (%zd/%zd)\n", start ? "Start" : "Stop", info.package.c_str(),
                   i + 1, infos.size());
            fflush(stdout);
        }
        mask |= getPackageInfoData().startstop_restart_services;
    }
    if (RestartServices(static_cast<PKG_INSTALLATION_TYPE>(start ? 8 : 0x10), mask) == 0) {
        outcome = 0;
    }
    return outcome;
}

int PackageManager::serviceControlByService(const std::vector<unsigned int>&, bool, bool) {
    return 0;
}

}  // namespace CORVPackageTool
