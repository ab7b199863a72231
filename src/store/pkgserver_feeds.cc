// The feeds file as the command line edits it, and the maker's and the feeds' lists
// merged for people.
#include <errno.h>
#include <sys/stat.h>

#include <algorithm>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgserver.h"
#include "store/json_value.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

bool readFeeds(Json::Value& feeds) {
    feeds = Json::Value(Json::arrayValue);
    struct stat st {};
    if (stat(PKG_FEEDS_FILE, &st) != 0) {
        return errno == ENOENT;
    }
    if (st.st_size == 0) {
        return true;
    }
    return fromFile(PKG_FEEDS_FILE, feeds) && feeds.isArray();
}

bool writeFeeds(const Json::Value& feeds) {
    const std::string path = PKG_FEEDS_FILE;
    const std::string dir = path.substr(0, path.rfind('/'));
    return CORVFSMkdirP(dir.c_str(), nullptr, 1, -1, -1, 0755) == 0 && toFile(feeds, path);
}

bool isFeedUrl(const std::string& url) {
    const bool scheme = url.rfind("http://", 0) == 0 || url.rfind("https://", 0) == 0;
    return scheme && url.find_first_of(" \t\r\n") == std::string::npos &&
           url.size() > url.find("://") + 3;
}

}  // namespace

bool CORVPackageServer::ListFeeds(std::vector<std::string>& out) {
    out.clear();
    Json::Value feeds;
    if (!readFeeds(feeds)) {
        return false;
    }
    for (const Json::Value& item : feeds) {
        if (hasText(item, "feed")) {
            out.push_back(item["feed"].asString());
        }
    }
    return true;
}

bool CORVPackageServer::AddFeed(const std::string& url, std::string& error) {
    if (!isFeedUrl(url)) {
        error = "not a feed address (http://... or https://...): " + url;
        return false;
    }
    Json::Value feeds;
    if (!readFeeds(feeds)) {
        error = std::string("the feeds file ") + PKG_FEEDS_FILE + " is not a JSON array";
        return false;
    }
    for (const Json::Value& item : feeds) {
        if (hasText(item, "feed") && item["feed"].asString() == url) {
            error = "the feed is there already: " + url;
            return false;
        }
    }
    Json::Value item(Json::objectValue);
    item["feed"] = url;
    feeds.append(item);
    if (!writeFeeds(feeds)) {
        error = std::string("cannot write ") + PKG_FEEDS_FILE;
        return false;
    }
    return true;
}

bool CORVPackageServer::RemoveFeed(const std::string& url, std::string& error) {
    Json::Value feeds, kept(Json::arrayValue);
    if (!readFeeds(feeds)) {
        error = std::string("the feeds file ") + PKG_FEEDS_FILE + " is not a JSON array";
        return false;
    }
    for (const Json::Value& item : feeds) {
        if (!(hasText(item, "feed") && item["feed"].asString() == url)) {
            kept.append(item);
        }
    }
    if (kept.size() == feeds.size()) {
        error = "no such feed: " + url;
        return false;
    }
    if (!writeFeeds(kept)) {
        error = std::string("cannot write ") + PKG_FEEDS_FILE;
        return false;
    }
    // Its packages are no longer offered, so its keys no longer vouch for anything.
    PMSUpdatePkgServerKey(url, Json::Value());
    return true;
}

namespace {

void noteError(Json::Value& errors, const char* source, const Json::Value& message) {
    Json::Value error(Json::objectValue);
    error["source"] = source;
    error["sec"] = jsonText(message, "sec", "");
    error["key"] = jsonText(message, "key", "");
    errors.append(error);
}

}  // namespace

bool CORVPackageServer::PMSGetAllPkgList(bool force, const char* language, Json::Value& out,
                                         Json::Value& errors) {
    out = Json::Value(Json::arrayValue);
    errors = Json::Value(Json::arrayValue);
    if (language == nullptr) {
        return false;
    }
    Json::Value maker, feeds;
    const bool makerOk = PMSQueryCorvPkgServer(force, language, maker);
    if (makerOk) {
        // Entries move, never copy: the lists are megabytes of JSON.
        for (Json::Value& entry : maker["packages"]) {
            if (entry.isObject()) {
                entry["source"] = "maker";
                out.append(std::move(entry));
            }
        }
    } else {
        noteError(errors, "maker", maker);
    }
    // Without the maker's list the feeds can't be merged: it decides what they may offer.
    const bool feedsOk = makerOk && PMSQueryOtherPkgServer(force, language, feeds);
    if (feedsOk) {
        for (Json::Value& entry : feeds) {
            entry["source"] = jsonText(entry, "feed", "");
            out.append(std::move(entry));
        }
    } else if (makerOk) {
        noteError(errors, "feeds", Json::Value());
    }
    if (!PMSSortPackageArray(out)) {
        CORV_LOG_ERR("Failed to sort packages");
    }
    return makerOk || feedsOk;
}

}  // namespace CORVPackageTool
