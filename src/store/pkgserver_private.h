// Internals of the store client's lists, reachable by the unit tests.
#pragma once

#include <curl/curl.h>
#include <json/json.h>
#include <sys/stat.h>

#include <string>
#include <unordered_map>
#include <unordered_set>

namespace CORVPackageTool {

// After a perform that ended with `first`: an unresolvable host is tried once more with
// the fallback name server (kept on the handle); any other result is returned as it is.
CURLcode PMSRetryWithFallbackDns(CURL* curl, CURLcode first);

// Records the words that PMSGetLastStoreFailure gives, for a reply that arrived but is
// no good.
void PMSSetLastStoreFailure(const std::string& words);

// Sets the class result code that CORVPackageServer::getResult gives.
void PMSSetServerResult(int code);

// Whether a cache file is there and no more than an hour off the clock either way.
// `st` receives its stat when not null.
bool PMSIsCacheFresh(const std::string& path, struct stat* st);

// Orders `array` in place so that each entry comes after the entries it depends on. False
// (and `array` untouched) when an entry is not an object or the dependencies form a cycle.
bool PMSSortPackageArray(Json::Value& array);

// Merges one feed's entries into the feeds' array `out`: entries without text "package"
// and "version" and names in `makerNames` are left out; a name already in `out` (found
// through `index`, name to position) is replaced only by a greater version. Each entry
// taken gets "feed": `feed`.
void PMSMergeFeedEntries(const std::unordered_set<std::string>& makerNames, const std::string& feed,
                         Json::Value entries, Json::Value& out,
                         std::unordered_map<std::string, Json::ArrayIndex>& index);

// Parses a store reply; a reply that is not JSON is logged with the parser's messages and
// (the start of) the reply itself.
bool PMSParseReply(const std::string& reply, Json::Value& value);

// Copies a refusal's sec and key into `out` (made an object first).
void PMSSetMessage(Json::Value& out, const std::string& sec, const std::string& key);

// The list directory's cache file "<prefix><language>", empty without a list directory.
std::string PMSListCachePath(const char* prefix, const char* language);

}  // namespace CORVPackageTool
