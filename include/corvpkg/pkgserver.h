// The package store client: queries to the maker's store and to the user's feed servers,
// their lists with an hour's disk cache, the merge of the feeds, named packages, the
// auto-update list and the feeds file. Built on the HTTP layer of pkgcurltool.h.
//
// Stores. The maker's store lives at the platform's address (corv/nsinfo.h:
// CORVMYNSServerConfigGet) and answers "<base>/api/getPackageList.php" (everything),
// "<base>/api/getPackages.php" (named packages, field pkg_list) and "<base>/api/<name>"
// (recommended lists). A feed is any URL in the feeds file; it is asked with GET first and
// POST second.
//
// Every query carries these fields (PMSQueryPkgServer): language, package_update_channel
// (from /etc/corvinfo.conf; without it no query is made), the caller's extra fields, then
// timezone, unique, arch, major "6", minor "1", build "15101", and on a device with a store
// account (corvpkg_server set in /etc.defaults/corvinfo.conf) ns_time and ns_token.
//
// Replies. A list is {"success": true | absent, "packages": [entry...], ...}; a refusal is
// {"success": false, "sec": S, "key": K}, which the list calls copy into their `out` for
// the desktop to show; a feed may also answer the bare array of entries, or
// {"packages": [...], "keyrings": [armored key, ...]}, whose keys go to the signature tool.
// An entry is an object with at least "package" and "version" (PMSMapJsonToPackageInfo
// maps it); members this client does not know pass through untouched.
//
// Caches. In the list directory (PMSGetListTmpDir): "corvserver.<language>" holds the maker
// store's whole reply, "otherserver.<language>" the merged array of the feeds. A cache is
// fresh for an hour (3599 s either way of its modification time); the feeds' cache also
// only while it is newer than the feeds file and not empty. A failed or refused query never
// writes a cache.
//
// Nothing here throws, whatever a server sends. All calls are synchronous; see
// pkgcurltool.h for threads.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "corvpkg/pkginfo.h"
#include "corvpkg/visibility.h"

struct VLIBSZHASH;

namespace NOS {
class Task;
}

namespace CORVPackageTool {

#define PKG_FEEDS_FILE "/usr/corv/etc/packages/feeds"
#define PKG_AUTO_UPDATE_FILE "/usr/corv/etc/packages/<auto_update_pkgs>"
#define PKG_MAKER_CACHE_PREFIX "corvserver."
#define PKG_FEEDS_CACHE_PREFIX "otherserver."
// Download and install tasks: id prefix + package name, owned by the administrators.
#define PKG_DOWNLOAD_TASK_PREFIX "@CORVPKG_DOWNLOAD_"
#define PKG_TASK_OWNER "@administrators"

// The OS version this library serves, sent with every query.
constexpr unsigned PKG_QUERY_MAJOR = 6;
constexpr unsigned PKG_QUERY_MINOR = 1;
constexpr unsigned PKG_QUERY_BUILD = 15101;

// Adds timezone, unique, arch, major, minor, build and, with a store account, ns_time and
// ns_token to `*fields`. False only when timezone, unique or arch is missing or a field
// can't be written; a token that can't be made is left out (logged).
CORVPKG_API bool PMSAddCommonQueryFields(VLIBSZHASH** fields);
// `key` of the key-value file `file` into `value`. False (logged) when missing or empty.
CORVPKG_API bool PMSReadConfValue(const char* file, const std::string& key, std::string& value);
// Lower-case hexadecimal MD5 of `text` into `out` (NUL at position 32). False for a null
// `text` or `outSize` below 33.
CORVPKG_API bool PMSMd5Hex(const char* text, char* out, int outSize);
// The request token for the text of ns_time: h = md5(time); then 1 + (first hex digit of
// h) rounds of w = md5(w + md5(w)) from w = time. False (logged) when a digest fails.
CORVPKG_API bool PMSGenerateNsToken(const std::string& nsTime, std::string& token);

class CORVPKG_API CORVPackageServer {
  public:
    // --- Queries -----------------------------------------------------------------------
    // Builds the fields and sends them to `url`, or, with `url` null, to the maker store's
    // getPackageList.php by GET whatever `post` says. Members of `extra` become fields
    // (their JSON text); the common fields are written after them and win, except language
    // and package_update_channel, which an extra member overrides. False on any failure;
    // `reply` is then empty or the "commfail" refusal of an unreachable server.
    static bool PMSQueryPkgServer(std::string language, std::string& reply, const char* url,
                                  bool post, const Json::Value& extra);
    // The first entry named `packageName` of the maker's list (`makerStore`) or of the
    // feeds' merged list. False when the list can't be had or has no such entry.
    static bool GetPackageInfoFromServer(const std::string& packageName, Json::Value& entry,
                                         bool makerStore, const std::string& language);
    // Hands a feed's keys to the signature tool (--addserver with a temporary key file),
    // or, for null, empty or non-array `keyrings`, has it forget them (--delserver). What
    // the tool answers is not examined: a key it refuses is simply not trusted. False only
    // when the key file can't be written.
    static bool PMSUpdatePkgServerKey(const std::string& feed, Json::Value keyrings);

    // --- Lists -------------------------------------------------------------------------
    // The maker store's whole reply (an object with "packages"), from the cache when fresh
    // and `force` is false. `sort` orders "packages" so that each entry comes after those
    // it depends on (a list with a cycle keeps the order received). False with
    // out.sec/out.key: "pkgmgr"/"fail_connect_server" when nothing came back,
    // "common"/"commfail" when the server could not be reached, or the store's own
    // refusal; false without them for a reply that is not JSON.
    static bool PMSQueryCorvPkgServer(bool force, const char* language, Json::Value& out,
                                      bool sort = false);
    // The feeds' merged array: each feed's entries with "package" and "version", less the
    // names that the maker's list has; of one name in several feeds the highest version
    // stays, in the place of the first. A feed that fails or answers nonsense is skipped.
    // Each entry gets the member "feed" with the URL it came from. An array even on
    // failure; false when the feeds file is unreadable or the maker's list can't be had.
    static bool PMSQueryOtherPkgServer(bool force, const char* language, Json::Value& out,
                                       bool sort = false);
    // The entries of the maker store's getPackages.php for `wanted` (name and version each).
    static bool PMSGetPkgListFromServer(const char* language,
                                        const std::vector<PackageInfo>& wanted,
                                        std::vector<PackageInfo>& found);
    // Replaces `info` by the maker store's entry of info.package. False with getResult():
    // PKG_ERR_SYSTEM (bad argument), PKG_ERR_SERVER (query failed), PKG_ERR_NOT_INSTALLED
    // (the store answered with no such package, or with more than one).
    static bool PMSGetPkgFromServer(const char* language, PackageInfo& info);
    // The parsed reply of "<base>/api/<phpName>".
    static bool PMSGetRecommendPkgList(const char* language, const char* phpName, Json::Value& out);

    // The maker's list and the feeds' merged list in one array for people: every entry with
    // "source" ("maker" or the feed's URL), in dependency order (each entry after what it
    // depends on; names tie by name). `errors` receives a {"source","sec","key"} object per
    // list that could not be had; the call fails only when neither could.
    static bool PMSGetAllPkgList(bool force, const char* language, Json::Value& out,
                                 Json::Value& errors);

    // --- Feeds file (/usr/corv/etc/packages/feeds, [{"feed": URL}, ...]) ----------------
    // The feed URLs in file order. False when the file exists but can't be read as an array.
    static bool ListFeeds(std::vector<std::string>& feeds);
    // Appends `url` (http:// or https://, no blanks). False with `error` for a bad URL, a
    // feed that is there already, or a file that can't be written.
    static bool AddFeed(const std::string& url, std::string& error);
    // Removes `url` and has the signature tool forget its keys. False with `error` when it
    // is not in the file or the file can't be written.
    static bool RemoveFeed(const std::string& url, std::string& error);

    // --- Auto-update list ----------------------------------------------------------------
    // The names chosen for automatic update; an empty array when there is no list.
    static bool List(Json::Value& names);
    // Stores the choice: pkg_autoupdate_all ("yes"/"no", removed when `enabled` is false),
    // the update-check job, and with `enabled` and not `all` the list `names`.
    static bool Save(bool enabled, bool all, const Json::Value& names);

    // --- Downloads ------------------------------------------------------------------------
    // A download runs under the task PKG_DOWNLOAD_TASK_PREFIX + name; the task's "progress"
    // (1e-05 at the start, the fraction done, 1 finished, -1 failed) and "data" ({"id",
    // "name", "size", "tmp_folder", "remote_link", "pid", "taskid", "success", "installing"
    // (true from 99 %), "blqinst", and after the transfer "version", "nos_apps" or on
    // failure "sec"/"key"}) are what the desktop follows. The file is
    // <tmp_folder>/<task id>.
    //
    // Writes that record with progress 1e-05 and installs the SIGTERM handler. False for a
    // null task, name or folder, or when the record can't be written.
    static bool InitDownload(NOS::Task* task, const char* packageName, unsigned long long size,
                             const char* url, const char* tmpFolder, bool blqinst, int pid);
    // The whole transfer: waits for the package lock (about 3 hours, ending early on
    // SIGTERM) and keeps it, downloads `url` with the store's fields (mode "install" or
    // "upgrade" by whether `displayName` is installed), streaming to disk and hashing on
    // the way, up to 4 attempts after a time-out or an unresolvable host (the file starts
    // again from zero), requires status 200, compares the MD5 with `md5` (null or empty
    // skips; a mismatch alone is only logged) and reads the file as a package. Removing the
    // task record stops the transfer at once; SIGTERM stops it at the next step. A failure
    // notifies `user` (null: the administrators), removes `tmpFolder` and marks the task;
    // a cancel removes the task and says nothing. With `blqinst` false the task is finished
    // (progress 1 or -1), otherwise left open for the install. getResult() is
    // PKG_ERR_SERVER after a failed transfer.
    static bool DownloadPackage(NOS::Task* task, const char* user, const char* displayName,
                                const char* url, const char* md5, bool blqinst,
                                const char* tmpFolder, const char* language, std::string& filePath);
    // SIGTERM sets the process-wide cancel flag that isCanceled reads.
    static void RegisterCancel();
    static bool isCanceled();

    // --- Install tasks ----------------------------------------------------------------------
    // Whether a download or install of `packageName` is under way: its task's pid lives, or
    // a finished download waits for the user. A stale task (dead pid, incomplete file) is
    // removed with its folder, and the answer is false.
    static bool IsInstalling(const char* packageName);
    // Downloads and installs in this process under the package's task, and removes the
    // task at the end; true at once when IsInstalling. Wizard packages without answers
    // take the wizard's defaults. `volume` may be null for an upgrade.
    static bool BackgroundInstall(const char* user, const char* volume, const char* packageName,
                                  const char* displayName, const char* answersJson,
                                  const char* language, unsigned long long size, const char* url,
                                  const char* md5, bool startAfterInstall);
    // Installs the downloaded file of `task`: checks it, waits up to 10800 s for the lock,
    // installs with the signature check, turns worker messages into notifications, and
    // ends with the final notification and the task's "success", "error", "message".
    static bool Install(NOS::Task* task, const char* user, const char* volume,
                        const char* packageName, const char* tmpFolder, bool startAfterInstall,
                        const char* answersJson, const char* language);
    // PackageManager::install of a file with the wizard's answers as JSON text. `error`
    // receives the result code mapped for the desktop (PKG_ERR_FILE_ACCESS,
    // PKG_ERR_BAD_ANSWERS of this call alone), `extra` "workerMessage", "installReboot" and
    // the versions or dependencies of the refusal; `log` the package's own log. The file
    // is removed after success.
    static bool InstallCpkImpl(const char* user, const char* cpkPath, const char* volume,
                               bool startAfterInstall, const char* answersJson,
                               const char* language, std::string& log, PKG_ERRCODE& error,
                               Json::Value& extra, bool upgradeFlag, bool verifySignature);
    // BackgroundInstall of a store entry, started after install.
    static bool DownloadInstatll(const char* user, const char* language, const char* volume,
                                 const char* answersJson, const PackageInfo& info);
    // Starts the installed package when it is stopped, leaves a running one or one stopped
    // by the version limit, and downloads and installs anything else.
    static bool StartOrDownloadInstall(const char* user, const char* language, const char* volume,
                                       const char* answersJson, const PackageInfo& info);

    // --- Updates ------------------------------------------------------------------------------
    // Whether the installed `packageName` has a newer version in the maker's store or the
    // feeds (a fresh list with `force`). False also when a list can't be had.
    static bool PMSCheckUpgrade(bool force, const char* packageName, const char* language);

    // The class's result code, set by PMSGetPkgFromServer (and the install tasks).
    static int getResult();
};

// Merges `members` into the "data" of `task` as it is on disk, key by key. False when
// the task can't be read or written.
CORVPKG_API bool PMSUpdateTaskData(NOS::Task* task, const Json::Value& members);

// The store entries (maker's with `makerStore`, else the feeds') of installed packages
// that are newer (`upgradable`) or whose installation is broken (`repairable`), less those
// that the version limits bar. False when the list can't be had.
CORVPKG_API bool getUpdatableRepairablePackageList(bool force, bool makerStore,
                                                   std::string language, bool upgradable,
                                                   bool repairable, PackageBasicInfoMap& installed,
                                                   Json::Value& out, bool sort);
// Sends the count of updatable and repairable packages to the desktop's badge
// (/usr/corv/bin/corvappnotify). False when a list can't be had.
CORVPKG_API bool updateBadgeCount(bool force);
// The update check. `scheduled`: a fresh list, automatic upgrades as the settings allow
// (all packages, or those of the auto-update list whose entry allows a silent upgrade;
// beta releases only over a beta, never below "auto_upgrade_from"), and the mail and
// desktop notification of the rest. Unscheduled it only reports. `found` receives the
// reported entries; `forceAll` upgrades all as if automatic update were on for all;
// `onlyOverLimit` upgrades only packages whose installed version the limits bar. Always
// updates the badge. False when a store list can't be had.
CORVPKG_API bool PMSCheckUpgrade(bool scheduled, const char* user, const char* language,
                                 std::vector<PackageInfo>* found, bool forceAll,
                                 bool onlyOverLimit);
CORVPKG_API bool PMSCheckUpgrade(bool scheduled, const char* user, const char* language,
                                 std::vector<PackageInfo>* found);

}  // namespace CORVPackageTool
