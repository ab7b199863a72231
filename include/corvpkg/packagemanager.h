// PackageManager: the class through which callers drive the engine. One instance is one
// conversation: it keeps the result of the last operation and a small bag of named
// parameters. Reading operations take no lock; anything that changes the system runs
// under the system-wide lock of ExLock.
#pragma once

#include <json/json.h>

#include <map>
#include <set>
#include <string>
#include <vector>

#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

class PackageManagerPrivate;

// A short word for a status of PackageManager::getPkgStatus ("running", "stopped",
// "broken", ...), for people and scripts.
CORVPKG_API const char* PMSPkgStatusWord(int status);

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

    // Off by default. When on, install and upgrade compare the payload archive with the
    // INFO key "checksum" while they unpack it and refuse a mismatch (PKG_ERR_BAD_ARCHIVE)
    // before anything lasting is done: for a caller whose check of the file left the
    // payload out, so that the archive is hashed beside the unpacking, not before it.
    void setChecksumWhileUnpacking(bool on);
    bool checksumWhileUnpacking() const;

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

    // Related-service restarts. The OR of the start/stop restart masks of this manager's
    // package and of every package of `names` but the last (the last is the package
    // itself, whose mask is already the start).
    unsigned long long findRestartServices(const std::vector<std::string>& names);
    // Reloads the daemons of `mask`, or, with mask 0, of this manager's package for `type`
    // (start/stop masks for start and stop, else install/uninstall). Type 0 does nothing.
    // The result of RestartServicesAction; 0 for type 0.
    int RestartServices(PKG_INSTALLATION_TYPE type, unsigned long long mask);
    // Gives up the package lock and reloads every daemon of `mask`, the firewall last and
    // only when all else reloaded. 1 on success; else 0 with PKG_ERR_RESTART_SERVICES and
    // the names that failed in the parameter "services".
    int RestartServicesAction(unsigned long mask);

    // The volume for a package's files: "/volume1" on a small-box model, the system
    // install path for a package of install_type "system", else the volume of `volume`;
    // it must have `size` plus the margin free. False with the reason in the platform error.
    bool GetAppStoreVolume(const PackageInfo& info, const char* volume, unsigned long long size,
                           std::string& out);
    // A precheck before a package file is looked at: the file exists, there is room for it
    // where it must go, and a volume exists when the package needs one.
    bool CheckVolume(const char* cpkFile, const PackageInfo& info);

    // Registration: moves INFO, scripts/, WIZARD_UIFILES/ and conf/ from the unpack
    // directory `workDir` into /var/packages/<name>, flags it `installing`, links `target`
    // to the payload directory and `etc` to the package's settings directory. True when all
    // is in place; on false the registry stays flagged and the package shows as broken.
    bool registerPackage(PKG_INSTALLATION_TYPE type, PackageInfo& info, const std::string& workDir,
                         const std::string& target);
    // The path of the package's control script with `info` read from the registry, or ""
    // with the reason in the result: PKG_ERR_NOT_INSTALLED, PKG_ERR_BROKEN (no usable
    // target, unreadable INFO, script not runnable) or PKG_ERR_NO_STATUS_SCRIPT.
    std::string getServiceScript(const std::string& name, PackageInfo& info);
    // Whether this OS lets the package run, by the maker's version limits. False with
    // PKG_ERR_LIMIT_PROHIBITED, PKG_ERR_LIMIT_BLOCKED, PKG_ERR_BELOW_VERSION_LIMIT (with
    // the parameters "oldver" and "curver") or PKG_ERR_LIMIT_OTHER.
    bool CanPackageStartInThisFirmware(const PackageInfo& info);

    // Listings of /var/packages, in directory order. Entries that are not directories, or
    // whose INFO does not read, are passed over.
    // Names of the packages on one of `volumes` (all when the set is empty; a package
    // without target link is always listed).
    std::vector<std::string> enumPackages(const std::set<std::string>& volumes,
                                          unsigned long long mask);
    std::vector<std::string> enumPackages(const char* volume, unsigned long long mask);
    PackageBasicInfoMap enumPackageMap(unsigned long long mask);
    void enumPackageInfoMap(std::map<std::string, PackageInfo>& out, const char* language,
                            unsigned long long mask);
    // Every package directory under `path` with an INFO: read ones into `out`, damaged ones
    // by name into `failed`. False with PKG_ERR_ENUMERATION when any failed or the
    // directory cannot be read.
    bool enumPackageInfoByPath(const char* path, std::vector<PackageInfo>& out,
                               std::vector<std::string>& failed, const char* language,
                               unsigned long long mask);
    bool enumPackageInfo(std::vector<PackageInfo>& out, const char* language,
                         unsigned long long mask);

    // Single packages.
    bool getPackageInfoByPathAndInfoType(const char* dir, PackageInfo& info, const char* language,
                                         unsigned long long mask);
    bool getPackageInfoByPath(const char* dir, PackageInfo& info, const char* language);
    bool getPackageInfoByPathAndName(const char* base, const std::string& name, PackageInfo& info,
                                     const char* language, unsigned long long mask);
    bool getInstallPackageInfo(const std::string& name, PackageInfo& info, const char* language,
                               unsigned long long mask);
    // Sets PKG_ERR_NOT_INSTALLED or PKG_OK.
    bool getPackageInfo(const std::string& name, PackageInfo& info, const char* language,
                        unsigned long long mask);
    // One record per name, in order; true only if all were read.
    bool getPackageInfo(std::vector<std::string>& names, std::vector<PackageInfo>& out,
                        const char* language, unsigned long long mask);

    // State. getServiceStatus answers whether the query worked; `running` is the answer,
    // and a status script's exit value stays in the result.
    bool getServiceStatus(const std::string& name, bool& running, bool askScript);
    // 0 running, 1-3 stopped, 4 no status script, 150 broken, 255 not installed, 256-258
    // stopped by the version limits, 259 a system error hid the status.
    int getPkgStatus(const std::string& name);
    // Bits: 1 installed, 2 running, 4 broken.
    bool getPkgRoughStatus(const std::string& name, int& rough);
    bool isStarted(const std::string& name);
    // The package's own log, through its control script.
    std::string getPackageLog(const std::string& name, bool quiet);
    std::string getPackageLog(const std::string& name);

    // Whether the package is meant to run: its `enabled` flag. False with PKG_ERR_SYSTEM
    // (no name), PKG_ERR_NOT_INSTALLED or PKG_ERR_NOT_ENABLED.
    bool isServiceEnabled(const char* name);
    bool hasEnableConf(const std::string& registryDir, bool& unused);

    // Dependency queries. Every order lists a package before what it depends on: a caller
    // that starts packages walks it backwards, one that stops them forwards.
    // True when `pkg` conflicts with an installed package, in either direction; `names`
    // holds their display names.
    bool arePackagesConflict(PackageBasicInfo pkg, const DepPkgVector& conflicts,
                             std::string& names, const char* language);
    // True when every dependency is installed in a fitting version and started; else
    // `missing` has the absent ones in the JSON form and `notStarted` the display names.
    bool arePackagesInstallAndStart(const DepPkgVector& deps, Json::Value& missing,
                                    std::string& notStarted, const char* language);
    // True when no installed package depends on `name`.
    bool arePackagesDepended(std::string name, const char* language, std::string& names);
    bool arePackagesDepended(std::string name, const char* language,
                             std::vector<std::string>& names);
    // True when every dependent of `name` is stopped.
    bool areDependentPackageStop(std::string name, const char* language, std::string& names);
    // The startable packages of `order` other than `name`, as {"name","id"} objects; true
    // when there is none.
    bool getDepPkgListStop(const std::vector<std::string>& order, std::string name,
                           const char* language, Json::Value& list);
    bool getDepPkgListStop(std::string name, const char* language, Json::Value& list);
    // `pkgs` (all installed when null) ordered dependents first; false on a cycle.
    bool topologicalSortPkgs(std::vector<PackageInfo>* pkgs, std::vector<std::string>& order);
    bool getDependencyOrder(std::vector<std::string>& order);
    // `name` and its active dependents (enabled, or started), dependents first.
    bool getDependencyOrder(const char* name, std::vector<std::string>& order, bool useEnabledFlag);
    // Whether installing `candidate` would close a dependency cycle.
    bool hasCycle(const PackageInfo& candidate);
    // `name` and its ancestors within `pkgs`, in install order reversed (dependents first).
    bool getAncestryDependencyOrder(const char* name, std::vector<PackageInfo>& pkgs,
                                    std::vector<std::string>& order);
    // `name` and its ancestors among the maker store's packages (pkgserver.h), dependents
    // first, as PackageInfo records mapped from the store's entries. False with the result
    // PKG_ERR_SYSTEM (bad argument, a dependency cycle), PKG_ERR_SERVER (no list from the
    // store) or PKG_ERR_NOT_INSTALLED (the store has no such package).
    bool getAncestryDepOrderByServer(const char* name, const char* language,
                                     std::vector<PackageInfo>& pkgs);
    // The enabled packages that require one of `services` to start.
    void getDepServicePkgs(const std::set<std::string>& services, std::vector<PackageInfo>& pkgs);
    void getDepServicePkgs(const std::vector<unsigned int>& services,
                           std::vector<PackageInfo>& pkgs);

    // Package files. The record of a .cpk's INFO, conf and scripts, read from single
    // members in a temporary folder that is removed again. `type` plays no part.
    bool queryPackageFileInfo(const std::string& cpkFile, PackageInfo& info,
                              PKG_INSTALLATION_TYPE type, const char* language);
    // Whether the payload package.tgz has the MD5 `checksum`; a null checksum is not
    // checked.
    bool verifyPackageTgzFile(const std::string& cpkFile, const char* checksum);
    // The signature check by the administrator's trust level: PKG_SIGNATURE_OK when the
    // package may go on, else the reason.
    static PKG_ERRCODE verifyPackageSignature(const char* path);

    // Installability. Each stops at the first failure with the result set.
    bool checkPkgInfoCanInstallEx(PackageInfo& info, const char* language);
    // The same, with the OS range reported as PKG_ERR_OS_VERSION.
    bool checkPkgInfoCanInstall(PackageInfo& info, const char* language);
    // -1 not comparable (not installed), 0 same version, 1 `info` is newer, 2 older.
    int compareWithInstallPkgInfo(const PackageInfo& info);
    bool canPackageRunAfterInstall(const PackageInfo& info);
    // The services of a mask (0x08 ssh, 0x10 pgsql) that are not up; 0 when all are.
    unsigned int checkServiceStarted(unsigned int mask);
    // The services of `services` that are not enabled, by display name.
    std::set<std::string> checkServiceStarted(std::set<std::string> services);

    // Start and stop. One package, no lock, no dependency logic: 1 when the job did
    // what was asked, else 0 with the reason in the result. `msg` says where a failure's
    // text goes (the parameter "worker_msg", a desktop notification, or nowhere).
    int serviceControlAction(PKG_INSTALLATION_TYPE type, const std::string& name, bool start,
                             const char* language, const char* userName, MSG_TYPE msg);
    // A package with its active dependents, under the package lock and a task record:
    // dependents are stopped before the package and started after it. `order`, when given
    // and not empty, is the stop order to use. The outcome is the named package's only.
    // The lock is released on the way out unless `type` is 2 (an upgrade keeps it).
    int serviceControl(PKG_INSTALLATION_TYPE type, const std::string& name, bool start,
                       const char* language, const char* userName, std::vector<std::string>* order,
                       bool withDependents, bool restartRelated);
    // The user's start (type 8) or stop (type 0x10), with dependents and related daemons.
    int serviceControl(const std::string& name, bool start, const char* ignored);
    // Stop, and start again only if the stop succeeded.
    int serviceControlRestart(const std::string& name);
    // Every package in dependency order with type 0 (enabled flags stay), at boot and
    // shutdown; `filter` (comma-separated) with `key` leaves out the packages whose
    // etc/corvpkg_conf/reg_<key> names none of its items. 1 when all went well.
    int serviceControlOnOffALL(bool start, bool verbose, const char* filter, const char* key);
    // The enabled packages that need one of `services`, with type 0. 1 when all went well.
    int serviceControlByService(const std::set<std::string>& services, bool start, bool verbose);
    int serviceControlByService(const std::vector<unsigned int>& services, bool start,
                                bool verbose);  // an older form: does nothing, 0
    // What a package holds while enabled: the desktop link, `enabled`, the resources of
    // TIMING_DISABLE. Type 0 keeps all. Failures are logged and never change the result.
    void removePkgResources(PKG_INSTALLATION_TYPE type, const PackageInfo& info, MSG_TYPE msg);
    // Takes back the user's intent to run a package that cannot: removes `enabled` and
    // stops the package with its dependents; with type 0 the administrators are told.
    void DisableWithDependents(PKG_INSTALLATION_TYPE type, const PackageInfo& info,
                               const char* language, const char* userName);

    // Installation, upgrade, removal. Each returns 1 on success and 0 on failure with the
    // reason in the result; "worker_msg" carries a failed resource step's messages. What a
    // failure leaves behind is stated at each definition. All run under the package lock;
    // callers of install_package and upgrade_package hold it and release it afterwards.
    int install_package(const std::string& cpkPath, const std::string& volume,
                        const std::string& storeRoot, const std::string& tmpRoot,
                        bool startAfterInstall, const Json::Value* extra, const char* language,
                        const char* userName);
    int upgrade_package(const std::string& cpkPath, const std::string& volume,
                        const std::string& storeRoot, const std::string& tmpRoot, bool repair,
                        const Json::Value* extra, const char* language, const char* userName,
                        bool ignoreDependents);
    int uninstall(const PackageInfo& info, const Json::Value* extra, const char* language,
                  PKG_INSTALLATION_TYPE type, const char* userName);
    // By name: refuses (PKG_ERR_DEPENDENCY, parameter "deppkg") while installed packages
    // depend on it, unless `force`.
    int uninstall(const std::string& name, const Json::Value* extra, const char* language,
                  PKG_INSTALLATION_TYPE type, bool force, const char* userName);
    // Several packages, dependents first; 1 only if every one went.
    int uninstallPKGs(const std::vector<std::string>& names, bool toStdout);

    // The one entrance for a .cpk: decides between install, upgrade and repair, picks the
    // volume and a temporary directory. `volume` may be empty; a saved default volume wins
    // over it. 1 on success, else 0 with the reason in the result.
    int install(const char* userName, const std::string& cpkPath, const std::string& volume,
                bool startAfterInstall, const Json::Value* extra, const char* language,
                bool ignoreDependents, bool checkSignature);
    int install(const char* userName, const std::string& cpkPath, const std::string& volume,
                bool startAfterInstall, const Json::Value* extra, const char* language,
                bool ignoreDependents);
    int installCPK(const char* userName, std::string cpkPath, const std::string& volume);
    bool post_install(const PackageInfo& info);

    // Wizards. The steps of the wizard for `type` (1 install, 2 upgrade, 4 uninstall) go
    // to info.wizard; a package without one, or with a broken one, gets an empty wizard.
    bool parseUIFile(const std::string& cpkFile, const std::string& dir, PKG_INSTALLATION_TYPE type,
                     PackageInfo& info, const char* language);
    // queryPackageFileInfo with the LICENSE and the wizard; type 0 means install or
    // upgrade, whichever fits what is installed.
    bool queryPackageFileInfoWithWizard(const std::string& cpkFile, PackageInfo& info,
                                        PKG_INSTALLATION_TYPE type, const char* language);
    // The wizard of an installed package. True when one was found (always for type 0).
    bool readUIFile(PKG_INSTALLATION_TYPE type, const std::string& name, PackageInfo& info,
                    const char* language) const;
    bool readUIFile(const std::string& name, const std::string& type, PackageInfo& info,
                    const char* language) const;

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
