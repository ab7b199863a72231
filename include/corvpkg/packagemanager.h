// PackageManager: the class through which callers drive the engine. One instance is one
// conversation: it keeps the result of the last operation and a small bag of named
// parameters. Reading operations take no lock; anything that changes the system runs
// under the system-wide lock of ExLock.
#pragma once

#include <json/json.h>

#include <set>
#include <string>

#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

class PackageManagerPrivate;

class CORVPKG_API PackageManager {
  public:
    PackageManager();
    ~PackageManager();
    PackageManager(const PackageManager&) = delete;
    PackageManager& operator=(const PackageManager&) = delete;

    // Prepares the process: records the machine's architecture and makes sure the
    // registry and scripts directories exist. False with result PKG_ERR_SYSTEM when the
    // architecture cannot be read or a directory cannot be made; sets no result on success.
    bool init();

    // Takes the system-wide package lock, waiting up to `seconds`. False when the lock is
    // busy (unless this is the first boot after an OS upgrade), when the OS upgrade has
    // stopped services, or when the system shuts down; in the last two cases the lock
    // stays held until UnLock or the end of the process. Callers set PKG_ERR_LOCKED on
    // false and go no further.
    static bool ExLock(int seconds);
    static void UnLock();
    // Process-wide: skip the OS-upgrade flag in ExLock (the flag of a shutdown still holds).
    static void setSkipUpgradeCheck(bool skip);

    // The result channel. setResult(code) clears the data.
    void setResult(PKG_ERRCODE code);
    void setResult(PKG_ERRCODE code, Json::Value data);
    PKG_ERRCODE getResult();
    PKG_ERRCODE getResult(Json::Value& data);

    void setIntParam(unsigned int value);
    unsigned int getIntParam();

    const PackageInfo& getPackageInfoData() const;

    // Named parameters. The first value of a key stays: a later insert of the same key is
    // ignored. Missing keys read as "" (map) or as a JSON string "" (JSON).
    void insertMapParam(std::string key, std::string value);
    std::string getMapParam(std::string key);
    void insertJsonParam(std::string key, const Json::Value& value);
    Json::Value getJsonParam(std::string key);

    // The volume for a package's files: "/volume1" on a small-box model, the system
    // install path for a package of install_type "system", else the volume of `volume`;
    // it must have `size` plus the margin free. False with the reason in the platform error.
    bool GetAppStoreVolume(const PackageInfo& info, const char* volume, unsigned long long size,
                           std::string& out);
    // A precheck before a package file is looked at: the file exists, there is room for it
    // where it must go, and a volume exists when the package needs one.
    bool CheckVolume(const char* cpkFile, const PackageInfo& info);

    std::string getFixedLogFilePath(const std::string& name);
    std::string getLogFilePath();

    // Services a package can require: "ssh" (0x08) and "pgsql" (0x10).
    // The OR of the bits of the blank-separated names; unknown names add nothing.
    static unsigned int PMSExplodeServiceString(const char* names);
    // The names of the set bits, in table order, as a JSON array in `out`.
    static void parseService(unsigned int mask, Json::Value& out);
    // The blank-separated names that the system's service manager knows ("ssh" is
    // "ssh-shell" there); unknown names are dropped.
    static std::set<std::string> getServiceSetFromString(const char* names);

    std::string logFilePath;

  private:
    PackageManagerPrivate* d;
};

}  // namespace CORVPackageTool
