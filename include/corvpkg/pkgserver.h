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

namespace CORVPackageTool {

#define PKG_FEEDS_FILE "/usr/corv/etc/packages/feeds"
#define PKG_AUTO_UPDATE_FILE "/usr/corv/etc/packages/<auto_update_pkgs>"
#define PKG_MAKER_CACHE_PREFIX "corvserver."
#define PKG_FEEDS_CACHE_PREFIX "otherserver."

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

    // The class's result code, set by PMSGetPkgFromServer (and the install tasks).
    static int getResult();
};

}  // namespace CORVPackageTool
