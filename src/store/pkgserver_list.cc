// The maker store's list and the feeds' merged list, each with its disk cache, and the
// dependency sort of a list.
#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <queue>
#include <unordered_map>
#include <unordered_set>

#include "catalogue/pkginfo_private.h"
#include "corv/log.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "store/json_value.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

constexpr time_t kCacheSeconds = 3599;
constexpr size_t kLoggedReplyLength = 512;

bool isList(const Json::Value& value) {
    return value.isObject() && value.isMember("packages") && value["packages"].isArray();
}

// A refusal: an object whose success is false.
bool isRefusal(const Json::Value& value) {
    return value.isObject() && value.isMember("success") && value["success"].isBool() &&
           !value["success"].asBool();
}

bool newerThan(const struct timespec& a, const struct timespec& b) {
    return a.tv_sec > b.tv_sec || (a.tv_sec == b.tv_sec && a.tv_nsec > b.tv_nsec);
}

}  // namespace

bool PMSIsCacheFresh(const std::string& path, struct stat* out) {
    struct stat st {};
    if (stat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
        return false;
    }
    if (out != nullptr) {
        *out = st;
    }
    // Both signs count: a clock set back keeps a cache fresh for as long.
    const time_t age = st.st_mtime - time(nullptr);
    return age >= -kCacheSeconds && age <= kCacheSeconds;
}

bool PMSParseReply(const std::string& reply, Json::Value& value) {
    Json::CharReaderBuilder builder;
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    std::string errors;
    value = Json::Value();
    if (reader->parse(reply.data(), reply.data() + reply.size(), &value, &errors)) {
        return true;
    }
    CORV_LOG_ERR("%s", errors.c_str());
    CORV_LOG_ERR("%s", reply.substr(0, kLoggedReplyLength).c_str());
    PMSSetLastStoreFailure("the reply is not JSON");
    value = Json::Value();
    return false;
}

void PMSSetMessage(Json::Value& out, const std::string& sec, const std::string& key) {
    if (!out.isObject()) {
        out = Json::Value(Json::objectValue);
    }
    out["sec"] = sec;
    out["key"] = key;
}

std::string PMSListCachePath(const char* prefix, const char* language) {
    std::string dir;
    if (!PMSGetListTmpDir(dir)) {
        return "";
    }
    return dir + prefix + language;
}

namespace {

// What the sort reads of an entry: its name and the names of what it depends on. A full
// PackageInfo per entry costs more than all the rest of a list of thousands.
struct SortKey {
    std::string package;
    std::vector<std::string> needs;
};

// The order of the dependency graph's topological sort (dependents first; among the
// packages whose dependencies are all placed, the one listed first goes to the latest free
// place; of two records of one name the later takes the name's edges), computed with a
// heap instead of the graph's dense matrix, whose cost grows with the cube of the count:
// a store lists thousands of packages. False on a cycle.
bool dependentsFirst(const std::vector<SortKey>& keys, std::vector<std::string>& order) {
    const size_t count = keys.size();
    std::unordered_map<std::string, size_t> vertex;
    vertex.reserve(count);
    for (size_t i = 0; i < count; ++i) {
        vertex[keys[i].package] = i;
    }
    std::vector<std::vector<size_t>> dependents(count);
    std::vector<size_t> open(count, 0);  // dependencies not placed yet
    for (size_t i = 0; i < count; ++i) {
        std::unordered_set<size_t> seen;
        for (const std::string& dep : keys[i].needs) {
            auto it = vertex.find(dep);
            if (it != vertex.end() && seen.insert(it->second).second) {
                dependents[it->second].push_back(i);
                ++open[i];
            }
        }
    }
    std::priority_queue<size_t, std::vector<size_t>, std::greater<size_t>> ready;
    for (size_t i = 0; i < count; ++i) {
        if (open[i] == 0) {
            ready.push(i);
        }
    }
    order.assign(count, std::string());
    size_t free = count;
    while (!ready.empty()) {
        const size_t v = ready.top();
        ready.pop();
        order[--free] = keys[v].package;
        for (size_t dependent : dependents[v]) {
            if (--open[dependent] == 0) {
                ready.push(dependent);
            }
        }
    }
    return free == 0;
}

// The sort keys of the array's entries; false at the first entry that is not an object.
bool sortKeys(const Json::Value& array, std::vector<SortKey>& keys) {
    keys.reserve(array.size());
    for (const Json::Value& entry : array) {
        if (!entry.isObject()) {
            CORV_LOG_ERR("Format Error: jsData is not json object");
            return false;
        }
        DepPkgVector deps;
        PMSMapJsonDependencies(entry, deps);
        SortKey key{jsonText(entry, "package", ""), {}};
        key.needs.reserve(deps.size());
        for (PackageBasicInfo& dep : deps) {
            key.needs.push_back(std::move(dep.package));
        }
        keys.push_back(std::move(key));
    }
    return true;
}

}  // namespace

bool PMSSortPackageArray(Json::Value& array) {
    if (!array.isArray()) {
        return false;
    }
    std::vector<SortKey> keys;
    std::vector<std::string> order;
    if (!sortKeys(array, keys)) {
        return false;
    }
    if (!dependentsFirst(keys, order)) {
        CORV_LOG_ERR("Cycle among the %zu packages of the list", keys.size());
        return false;
    }
    // The order lists dependents first; reversed, each package comes after what it needs.
    std::unordered_map<std::string, size_t> rank;
    rank.reserve(order.size());
    for (size_t i = 0; i < order.size(); ++i) {
        rank[order[order.size() - 1 - i]] = i;
    }
    std::vector<std::pair<size_t, Json::Value*>> keyed;  // rank, entry
    keyed.reserve(keys.size());
    size_t position = 0;
    for (Json::Value& entry : array) {
        auto it = rank.find(keys[position++].package);
        keyed.emplace_back(it == rank.end() ? 0 : it->second, &entry);
    }
    std::sort(keyed.begin(), keyed.end(),
              [](const auto& a, const auto& b) { return a.first < b.first; });
    // The entries move into their new places: a store's list is megabytes of JSON.
    Json::Value sorted(Json::arrayValue);
    for (const auto& item : keyed) {
        sorted.append(std::move(*item.second));
    }
    array.swap(sorted);
    return true;
}

bool CORVPackageServer::PMSQueryCorvPkgServer(bool force, const char* language, Json::Value& out,
                                              bool sort) {
    if (language == nullptr) {
        return false;
    }
    const std::string cache = PMSListCachePath(PKG_MAKER_CACHE_PREFIX, language);
    Json::Value result;
    bool cached = !force && !cache.empty() && PMSIsCacheFresh(cache, nullptr) &&
                  fromFile(cache, result) && isList(result);
    if (!cached) {
        std::string reply;
        bool queried = PMSQueryPkgServer(language, reply, nullptr, false, Json::Value());
        if (!queried && reply.empty()) {
            PMSSetMessage(out, "pkgmgr", "fail_connect_server");
            return false;
        }
        if (!PMSParseReply(reply, result)) {
            return false;
        }
        if (isRefusal(result)) {
            PMSSetMessage(out, jsonText(result, "sec", ""), jsonText(result, "key", ""));
            return false;
        }
        // A reply of another shape would stand in the cache for an hour in place of the
        // list; it is refused like a reply that is not JSON.
        if (!isList(result)) {
            CORV_LOG_ERR("Format error: jsData has no packages member");
            PMSSetLastStoreFailure("the reply is not a package list");
            return false;
        }
        if (!cache.empty() && !toFile(result, cache)) {
            CORV_LOG_ERR("Fail to save %s, %m", cache.c_str());
        }
    }
    if (sort && !PMSSortPackageArray(result["packages"])) {
        CORV_LOG_ERR("Failed to sort packages");
    }
    out = std::move(result);
    return true;
}

void PMSMergeFeedEntries(const std::unordered_set<std::string>& makerNames, const std::string& feed,
                         Json::Value entries, Json::Value& out,
                         std::unordered_map<std::string, Json::ArrayIndex>& index) {
    for (Json::Value& entry : entries) {
        if (!hasText(entry, "package") || !hasText(entry, "version")) {
            continue;
        }
        const std::string name = entry["package"].asString();
        // The maker's store always shadows a feed.
        if (makerNames.count(name) != 0) {
            continue;
        }
        const std::string version = entry["version"].asString();
        Json::Value taken = std::move(entry);
        taken["feed"] = feed;
        auto it = index.find(name);
        if (it == index.end()) {
            index[name] = out.size();
            out.append(std::move(taken));
            continue;
        }
        PackageBasicInfo candidate(name, version);
        PackageBasicInfo present(name, out[it->second]["version"].asString());
        if (candidate.compare(present, PKG_COMPOP_GT)) {
            out[it->second] = std::move(taken);
        }
    }
}

namespace {

// The feed's reply, parsed: GET first, POST when that fails or is not JSON.
bool queryFeed(const char* language, const std::string& feed, Json::Value& data) {
    std::string reply;
    if (CORVPackageServer::PMSQueryPkgServer(language, reply, feed.c_str(), false, Json::Value()) &&
        PMSParseReply(reply, data)) {
        return true;
    }
    reply.clear();
    return CORVPackageServer::PMSQueryPkgServer(language, reply, feed.c_str(), true,
                                                Json::Value()) &&
           PMSParseReply(reply, data);
}

// The entries and keys of a feed's reply; false for a reply of another shape.
bool feedEntries(Json::Value& data, Json::Value& entries, Json::Value& keys) {
    if (data.isArray()) {
        entries = std::move(data);
        return true;
    }
    if (!isList(data)) {
        return false;
    }
    entries = std::move(data["packages"]);
    if (data.isMember("keyrings") && data["keyrings"].isArray() && !data["keyrings"].empty()) {
        keys = data["keyrings"];
    }
    return true;
}

// The feed URLs of the feeds file; `absent` when there is none or it is empty.
bool readFeedsFile(Json::Value& feeds, struct stat& st) {
    feeds = Json::Value(Json::arrayValue);
    if (stat(PKG_FEEDS_FILE, &st) != 0) {
        return errno == ENOENT;
    }
    if (st.st_size == 0) {
        return true;
    }
    if (!fromFile(PKG_FEEDS_FILE, feeds) || !feeds.isArray()) {
        CORV_LOG_ERR("Fail to load %s, %m", PKG_FEEDS_FILE);
        feeds = Json::Value(Json::arrayValue);
        return false;
    }
    return true;
}

}  // namespace

bool CORVPackageServer::PMSQueryOtherPkgServer(bool force, const char* language, Json::Value& out,
                                               bool sort) {
    (void)sort;  // the merged list keeps its order of arrival
    out = Json::Value(Json::arrayValue);
    if (language == nullptr) {
        return false;
    }
    Json::Value feeds;
    struct stat feedsStat {};
    if (!readFeedsFile(feeds, feedsStat)) {
        return false;
    }
    if (feeds.empty()) {
        return true;
    }
    const std::string cache = PMSListCachePath(PKG_FEEDS_CACHE_PREFIX, language);
    struct stat cacheStat {};
    Json::Value cached;
    if (!force && !cache.empty() && PMSIsCacheFresh(cache, &cacheStat) &&
        newerThan(cacheStat.st_mtim, feedsStat.st_mtim) && fromFile(cache, cached) &&
        cached.isArray() && !cached.empty()) {
        out = std::move(cached);
        return true;
    }
    Json::Value maker;
    if (!PMSQueryCorvPkgServer(false, language, maker)) {
        return false;
    }
    std::unordered_set<std::string> makerNames;
    for (const Json::Value& entry : maker["packages"]) {
        if (hasText(entry, "package")) {
            makerNames.insert(entry["package"].asString());
        }
    }
    std::unordered_map<std::string, Json::ArrayIndex> index;
    for (const Json::Value& item : feeds) {
        if (!hasText(item, "feed")) {
            continue;
        }
        const std::string feed = item["feed"].asString();
        Json::Value data, entries, keys;
        const bool queried = queryFeed(language, feed, data);
        if (!queried || !feedEntries(data, entries, keys)) {
            if (!queried) {
                CORV_LOG_ERR("Skip the feed %s: %s", feed.c_str(),
                             PMSGetLastStoreFailure().c_str());
            } else {
                CORV_LOG_ERR("Skip the feed %s: the reply is not a package list", feed.c_str());
            }
            continue;
        }
        PMSUpdatePkgServerKey(feed, keys);
        PMSMergeFeedEntries(makerNames, feed, std::move(entries), out, index);
    }
    if (!cache.empty() && !toFile(out, cache)) {
        CORV_LOG_ERR("Fail to save %s, %m", cache.c_str());
    }
    return true;
}

}  // namespace CORVPackageTool
