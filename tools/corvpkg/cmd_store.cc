// corvpkg store, feed and autoupdate: the package stores from the command line.
#include <stdio.h>
#include <string.h>

#include <string>
#include <utility>

#include "cli.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

std::string text(const Json::Value& entry, const char* key) {
    const Json::Value* value = entry.isObject() ? entry.find(key, key + strlen(key)) : nullptr;
    return value != nullptr && (value->isString() || value->isNumeric()) ? value->asString() : "";
}

// Why a store query failed, in words: what the transfer met, and the desktop's message key.
std::string storeFailure(const char* what, const Json::Value& message) {
    std::string words = std::string(what) + ": ";
    const std::string met = PMSGetLastStoreFailure();
    words += met.empty() ? "no answer from the store" : met;
    if (!text(message, "sec").empty()) {
        words += " [" + text(message, "sec") + ":" + text(message, "key") + "]";
    }
    return words;
}

// A store's list is megabytes of JSON: it goes out in one write.
void printLarge(const Json::Value& value) {
    std::string text = toString(value);
    text += '\n';
    fflush(stdout);
    fwrite(text.data(), 1, text.size(), stdout);
    fflush(stdout);
}

int storeList(const Command& self, const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--refresh", false}})) {
        return EXIT_USAGE;
    }
    if (!opts.positional.empty()) {
        return usageError(self, "unexpected argument " + opts.positional[0]);
    }
    const std::string language = languageOf(opts);
    Json::Value list;
    Json::Value errors;
    LogCapture log;
    if (!CORVPackageServer::PMSGetAllPkgList(opts.has("--refresh"), language.c_str(), list,
                                             errors)) {
        return printFailure(opts.json, PKG_ERR_SERVER,
                            storeFailure("cannot get the maker store's list", errors[0]), errors);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["packages"].swap(list);
        out["errors"] = errors;
        printLarge(out);
        return EXIT_OK;
    }
    printf("%-24s %-16s %-28s %s\n", "NAME", "VERSION", "DISPLAY NAME", "SOURCE");
    for (const Json::Value& entry : list) {
        printf("%-24s %-16s %-28s %s\n", text(entry, "package").c_str(),
               text(entry, "version").c_str(), text(entry, "dname").c_str(),
               text(entry, "source").c_str());
    }
    printf("%u package(s)\n", list.size());
    if (!errors.empty()) {
        fprintf(stderr, "warning: the feeds' list is missing: %s\n", log.reasons().c_str());
    } else if (!log.reasons().empty()) {
        fprintf(stderr, "warning: %s\n", log.reasons().c_str());
    }
    return EXIT_OK;
}

// The entry of `name`: the maker store's first, else the feeds'.
bool findEntry(const std::string& name, const std::string& language, Json::Value& entry) {
    if (CORVPackageServer::GetPackageInfoFromServer(name, entry, true, language)) {
        entry["source"] = "maker";
        return true;
    }
    if (CORVPackageServer::GetPackageInfoFromServer(name, entry, false, language)) {
        entry["source"] = text(entry, "feed");
        return true;
    }
    return false;
}

int storeInfo(const Command& self, const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    if (opts.positional.size() != 1) {
        return usageError(self, "give exactly one package name");
    }
    const std::string& name = opts.positional[0];
    Json::Value entry;
    LogCapture log;
    if (!findEntry(name, languageOf(opts), entry)) {
        const std::string met = PMSGetLastStoreFailure();
        return printFailure(opts.json, met.empty() ? PKG_ERR_NOT_INSTALLED : PKG_ERR_SERVER,
                            met.empty()
                                ? "no store offers " + name
                                : storeFailure("cannot get the stores' lists", Json::Value()));
    }
    if (opts.json) {
        printf("%s\n", toString(entry).c_str());
        return EXIT_OK;
    }
    PackageInfo info;
    PMSMapJsonToPackageInfo(entry, info);
    std::string deps;
    for (const PackageBasicInfo& dep : info.dep_packages) {
        deps += (deps.empty() ? "" : ", ") + dep.package;
    }
    const std::pair<const char*, std::string> rows[] = {
        {"package", info.package},
        {"version", info.version},
        {"display name", info.displayname},
        {"description", info.description},
        {"maintainer", info.maintainer},
        {"source", text(entry, "source")},
        {"depends on", deps.empty() ? "(nothing)" : deps},
        {"size", std::to_string(info.size)},
        {"md5", info.md5},
        {"link", info.link}};
    for (const auto& row : rows) {
        printf("%-14s %s\n", (std::string(row.first) + ":").c_str(), row.second.c_str());
    }
    return EXIT_OK;
}

int storeDeps(const Command& self, const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    if (opts.positional.size() != 1) {
        return usageError(self, "give exactly one package name");
    }
    const std::string& name = opts.positional[0];
    PackageManager pm;
    std::vector<PackageInfo> pkgs;
    LogCapture log;
    if (!pm.getAncestryDepOrderByServer(name.c_str(), languageOf(opts).c_str(), pkgs)) {
        const int code = pm.getResult();
        std::string reason = code == PKG_ERR_NOT_INSTALLED
                                 ? "the maker store does not offer " + name
                             : code == PKG_ERR_SERVER
                                 ? storeFailure("cannot get the maker store's list", Json::Value())
                                 : log.reasons();
        return printFailure(opts.json, code, reason);
    }
    // The records come dependents first; an install walks them the other way.
    Json::Value order(Json::arrayValue);
    for (auto it = pkgs.rbegin(); it != pkgs.rend(); ++it) {
        order.append(it->package + " " + it->version);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["package"] = name;
        out["install_order"] = Json::Value(Json::arrayValue);
        for (auto it = pkgs.rbegin(); it != pkgs.rend(); ++it) {
            Json::Value item(Json::objectValue);
            item["package"] = it->package;
            item["version"] = it->version;
            out["install_order"].append(item);
        }
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    printf("install order of %s:\n", name.c_str());
    for (Json::ArrayIndex i = 0; i < order.size(); ++i) {
        printf("  %u. %s\n", i + 1, order[i].asCString());
    }
    return EXIT_OK;
}

// "sub rest..." to the subcommand's function; usage error for an unknown one.
int dispatch(
    const char* command, const std::vector<std::string>& args,
    const std::vector<
        std::pair<std::string, int (*)(const Command&, const std::vector<std::string>&)>>& table) {
    const Command& self = findCommand(command);
    if (args.empty()) {
        return usageError(self, "give a subcommand");
    }
    for (const auto& entry : table) {
        if (args[0] == entry.first) {
            return entry.second(self, std::vector<std::string>(args.begin() + 1, args.end()));
        }
    }
    return usageError(self, "unknown subcommand " + args[0]);
}

int feedList(const Command& self, const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    std::vector<std::string> feeds;
    if (!CORVPackageServer::ListFeeds(feeds)) {
        return printFailure(opts.json, PKG_ERR_SYSTEM,
                            std::string(PKG_FEEDS_FILE) + " is not a JSON array of feeds");
    }
    if (opts.json) {
        Json::Value out(Json::arrayValue);
        for (const std::string& feed : feeds) {
            out.append(feed);
        }
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    for (const std::string& feed : feeds) {
        printf("%s\n", feed.c_str());
    }
    if (feeds.empty()) {
        printf("(no feeds)\n");
    }
    return EXIT_OK;
}

int feedChange(const Command& self, const std::vector<std::string>& args, bool add) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    if (opts.positional.size() != 1) {
        return usageError(self, "give exactly one feed URL");
    }
    std::string error;
    bool ok = add ? CORVPackageServer::AddFeed(opts.positional[0], error)
                  : CORVPackageServer::RemoveFeed(opts.positional[0], error);
    if (!ok) {
        return printFailure(opts.json, PKG_ERR_SYSTEM, error);
    }
    if (opts.json) {
        printf("{\"success\":true}\n");
    } else {
        printf("%s %s\n", add ? "added" : "removed", opts.positional[0].c_str());
    }
    return EXIT_OK;
}

int autoupdateList(const Command& self, const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    Json::Value names;
    if (!CORVPackageServer::List(names)) {
        return printFailure(opts.json, PKG_ERR_SYSTEM, "cannot read " PKG_AUTO_UPDATE_FILE);
    }
    char all[16] = {0};
    VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "pkg_autoupdate_all", all, sizeof all, 0);
    const std::string mode = all[0] == '\0' ? "off" : std::string(all) == "yes" ? "all" : "chosen";
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["mode"] = mode;
        out["packages"] = names;
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    printf("automatic update: %s\n", mode.c_str());
    for (const Json::Value& name : names) {
        printf("  %s\n", name.isString() ? name.asCString() : toString(name).c_str());
    }
    return EXIT_OK;
}

int autoupdateSet(const Command& self, const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--all", false}, {"--off", false}})) {
        return EXIT_USAGE;
    }
    const bool all = opts.has("--all"), off = opts.has("--off");
    if ((all || off) == !opts.positional.empty() || (all && off)) {
        return usageError(self, "give --all, --off, or the names of the packages");
    }
    Json::Value names(Json::arrayValue);
    for (const std::string& name : opts.positional) {
        names.append(name);
    }
    LogCapture log;
    if (!CORVPackageServer::Save(!off, all, names)) {
        return printFailure(opts.json, PKG_ERR_SYSTEM, log.reasons());
    }
    if (opts.json) {
        printf("{\"success\":true}\n");
    } else {
        printf("automatic update: %s\n", off ? "off" : all ? "all" : "chosen");
    }
    return EXIT_OK;
}

}  // namespace

int cmdStore(const std::vector<std::string>& args) {
    return dispatch("store", args, {{"list", storeList}, {"info", storeInfo}, {"deps", storeDeps}});
}

int cmdFeed(const std::vector<std::string>& args) {
    return dispatch(
        "feed", args,
        {{"list", feedList},
         {"add", [](const Command& self,
                    const std::vector<std::string>& rest) { return feedChange(self, rest, true); }},
         {"remove", [](const Command& self, const std::vector<std::string>& rest) {
              return feedChange(self, rest, false);
          }}});
}

int cmdAutoupdate(const std::vector<std::string>& args) {
    return dispatch("autoupdate", args, {{"list", autoupdateList}, {"set", autoupdateSet}});
}

}  // namespace cli
