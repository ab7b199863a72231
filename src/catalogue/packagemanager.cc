// The PackageManager frame: construction, the result channel, parameters, init and the
// small table of services a package can require.
#include "corvpkg/packagemanager.h"

#include <sys/stat.h>

#include <map>
#include <utility>

#include "catalogue/packagemanager_private.h"
#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kPackagesRegistryDir = "/var/packages";
constexpr const char* kPackagesScriptsDir = "/usr/local/etc/rc.d";
constexpr const char* kFixedLogPrefix = "/tmp/corvpkgmgr.log-";
constexpr int kServiceListCapacity = 0x400;

struct DepService {
    const char* name;
    unsigned int bit;
};
const DepService kDepServices[] = {{"ssh", 0x08}, {"pgsql", 0x10}};

// mkdir -p and the mode, even when the directory existed with another one.
bool ensureDir(const char* path, const char* failure) {
    if (CORVFSMkdirP(path, nullptr, 1, -1, -1, 0755) < 0) {
        CORV_LOG_ERR("%s %s", failure, path);
        return false;
    }
    if (chmod(path, 0755) != 0) {
        CORV_LOG_ERR("chmod failed for %s (%m)", path);
    }
    return true;
}

}  // namespace

PackageManager::PackageManager() : d(new PackageManagerPrivate()) {}
PackageManager::~PackageManager() {
    delete d;
}

bool PackageManager::init() {
    // The machine must know what it is before anything can be installed on it.
    int arch = PMSGetSystemArch();
    if (arch == 0) {
        CORV_LOG_ERR("Failed to get system arch");
        setResult(PKG_ERR_SYSTEM);
        return false;
    }
    d->packageInfo.arch = static_cast<unsigned int>(arch);
    // The registry and the scripts directory.
    if (!ensureDir(kPackagesRegistryDir, "Failed to init packages registry dir") ||
        !ensureDir(kPackagesScriptsDir, "Failed to init packages scripts dir")) {
        setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

void PackageManager::setChecksumWhileUnpacking(bool on) {
    d->checksumWhileUnpacking = on;
}

bool PackageManager::checksumWhileUnpacking() const {
    return d->checksumWhileUnpacking;
}

void PackageManager::setResult(PKG_ERRCODE code) {
    d->result = code;
    d->resultData = Json::Value();
}

void PackageManager::setResult(PKG_ERRCODE code, Json::Value data) {
    d->result = code;
    d->resultData = std::move(data);
}

PKG_ERRCODE PackageManager::getResult() {
    return d->result;
}

PKG_ERRCODE PackageManager::getResult(Json::Value& data) {
    data = d->resultData;
    return d->result;
}

void PackageManager::setIntParam(unsigned int value) {
    d->intParam = value;
}
unsigned int PackageManager::getIntParam() {
    return d->intParam;
}

const PackageInfo& PackageManager::getPackageInfoData() const {
    return d->packageInfo;
}

void PackageManager::insertMapParam(std::string key, std::string value) {
    d->params.emplace(std::move(key), std::move(value));
}

std::string PackageManager::getMapParam(std::string key) {
    auto it = d->params.find(key);
    return it == d->params.end() ? std::string() : it->second;
}

void PackageManager::insertJsonParam(std::string key, const Json::Value& value) {
    insertMapParam(std::move(key), toString(value));
}

Json::Value PackageManager::getJsonParam(std::string key) {
    auto it = d->params.find(key);
    if (it == d->params.end()) {
        return Json::Value("");
    }
    Json::Value value;
    fromString(it->second, value);
    return value;
}

std::string PackageManager::getFixedLogFilePath(const std::string& name) {
    logFilePath = kFixedLogPrefix + name;
    return logFilePath;
}

std::string PackageManager::getLogFilePath() {
    return logFilePath;
}

unsigned int PackageManager::PMSExplodeServiceString(const char* names) {
    if (names == nullptr) {
        return 0;
    }
    unsigned int mask = 0;
    for (const std::string& word : PMSExplodeString(names, " \t")) {
        for (const DepService& service : kDepServices) {
            if (word == service.name) {
                mask |= service.bit;
            }
        }
    }
    return mask;
}

void PackageManager::parseService(unsigned int mask, Json::Value& out) {
    out = Json::Value(Json::arrayValue);
    for (const DepService& service : kDepServices) {
        if (mask & service.bit) {
            out.append(service.name);
        }
    }
}

std::set<std::string> PackageManager::getServiceSetFromString(const char* names) {
    std::set<std::string> services;
    if (names == nullptr) {
        return services;
    }
    SzList known(kServiceListCapacity);
    if (!known) {
        CORV_LOG_ERR("VLIBCSzListAlloc failed [0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return services;
    }
    if (VLIBServiceEnum(known.addr()) < 0) {
        CORV_LOG_ERR("VLIBServiceEnum failed [0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return services;
    }
    for (std::string word : PMSExplodeString(names, " \t")) {
        // The service manager knows the ssh daemon by its own name.
        if (word == "ssh") {
            word = "ssh-shell";
        }
        if (VLIBCSzListFind(known.get(), word.c_str()) >= 0) {
            services.insert(word);
        }
    }
    return services;
}

}  // namespace CORVPackageTool
