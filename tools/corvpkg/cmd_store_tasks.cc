// corvpkg tasks, cancel, updates, chkupgradepkg and icon: the running downloads and
// installs, the update check, and package icons.
#include <signal.h>
#include <stdio.h>
#include <unistd.h>

#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "cli.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgimagetool.h"
#include "corvpkg/pkglimit.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"
#include "store_download.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

std::string text(const Json::Value& value, const char* key) {
    const Json::Value& member = value.isObject() ? value[key] : Json::Value::nullSingleton();
    return member.isString() || member.isNumeric() || member.isBool() ? member.asString() : "";
}

std::unique_ptr<NOS::Task> findTask(const std::string& id) {
    try {
        NOS::TaskMgr mgr(PKG_TASK_OWNER);
        return std::unique_ptr<NOS::Task>(mgr.getTask(id));
    } catch (const std::exception&) {
        return nullptr;
    }
}

// What a task is doing, in a word.
std::string stateOf(const Json::Value& record) {
    const double progress = record["progress"].asDouble();
    const Json::Value& data = record["data"];
    if (progress < 0) {
        return "failed";
    }
    if (record["finished"].asBool()) {
        return "done";
    }
    if (data.isObject() && data.isMember("status")) {
        return data["status"].asString();
    }
    return "downloading";
}

}  // namespace

int cmdTasks(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, findCommand("tasks"), opts)) {
        return EXIT_USAGE;
    }
    std::vector<std::string> ids;
    try {
        ids = NOS::TaskMgr(PKG_TASK_OWNER).list();
    } catch (const std::exception& e) {
        return printFailure(opts.json, PKG_ERR_SYSTEM, e.what());
    }
    Json::Value out(Json::arrayValue);
    for (const std::string& id : ids) {
        std::unique_ptr<NOS::Task> task = findTask(id);
        if (!task) {
            continue;
        }
        Json::Value record(Json::objectValue);
        record["id"] = id;
        record["progress"] = task->getProperty("progress");
        record["finished"] = task->getProperty("finished");
        record["data"] = task->getProperty("data");
        record["state"] = stateOf(record);
        out.append(record);
    }
    if (opts.json) {
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    printf("%-36s %-12s %8s %8s\n", "TASK", "STATE", "PROGRESS", "PID");
    for (const Json::Value& record : out) {
        printf("%-36s %-12s %7.0f%% %8s\n", record["id"].asCString(), record["state"].asCString(),
               record["progress"].asDouble() * 100, text(record["data"], "pid").c_str());
    }
    if (out.empty()) {
        printf("(no tasks)\n");
    }
    return EXIT_OK;
}

int cmdCancel(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "cancel", "package name", opts); status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    std::unique_ptr<NOS::Task> task = findTask(PKG_DOWNLOAD_TASK_PREFIX + name);
    if (!task) {
        return printFailure(opts.json, PKG_ERR_NOT_INSTALLED,
                            "no download or install of " + name + " is under way");
    }
    const Json::Value data = task->getProperty("data");
    const int pid = data["pid"].isInt() ? data["pid"].asInt() : -1;
    const bool alive = pid > 0 && pid != getpid() && VLIBCProcAlive(pid) == 1;
    if (alive && data.isMember("status") && !task->getProperty("finished").asBool()) {
        return printFailure(opts.json, PKG_ERR_LOCKED,
                            name + " is being installed now and can no longer be canceled");
    }
    // The signal ends a wait for the lock; the record's removal cuts a running transfer.
    if (alive) {
        kill(pid, SIGTERM);
    }
    task->remove();
    if (!alive && !text(data, "tmp_folder").empty()) {
        VLIBCExec("/bin/rm", "-rf", text(data, "tmp_folder").c_str(), nullptr);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["package"] = name;
        out["pid"] = pid;
        printf("%s\n", toString(out).c_str());
    } else {
        printf("canceled the download of %s%s\n", name.c_str(),
               alive ? "" : " (its process was gone; its files are removed)");
    }
    return EXIT_OK;
}

namespace {

// The entries of both stores by name, the maker's first.
bool storeEntries(bool force, const std::string& language, std::map<std::string, Json::Value>& out,
                  std::string& error) {
    Json::Value maker, feeds;
    if (!CORVPackageServer::PMSQueryCorvPkgServer(force, language.c_str(), maker)) {
        error = "cannot get the maker store's list: " + PMSGetLastStoreFailure();
        return false;
    }
    CORVPackageServer::PMSQueryOtherPkgServer(force, language.c_str(), feeds);
    for (const Json::Value* list : {&maker["packages"], &feeds}) {
        if (!list->isArray()) {
            continue;
        }
        for (const Json::Value& entry : *list) {
            const std::string name = text(entry, "package");
            if (!name.empty() && out.count(name) == 0) {
                out[name] = entry;
            }
        }
    }
    return true;
}

// Why an installed package is not offered as an update.
std::string whyNot(const PackageBasicInfo& installed, const Json::Value* entry) {
    if (entry == nullptr) {
        return "no store offers it";
    }
    const std::string version = text(*entry, "version");
    std::string limit;
    if (PMSThirdPartyCheckLimit(installed.package.c_str(), version.c_str(), limit) != 0) {
        return "the version limits bar " + version;
    }
    return "up to date (the store has " + version + ")";
}

}  // namespace

int cmdUpdates(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, findCommand("updates"), opts, {{"--refresh", false}})) {
        return EXIT_USAGE;
    }
    const std::string language = languageOf(opts);
    PackageManager pm;
    PackageBasicInfoMap installed = pm.enumPackageMap(PKG_INFO_MASK_ALL);
    const bool force = opts.has("--refresh");
    Json::Value maker, feeds;
    std::map<std::string, Json::Value> offered;
    std::string error;
    if (!getUpdatableRepairablePackageList(force, true, language, true, false, installed, maker,
                                           true) ||
        !getUpdatableRepairablePackageList(force, false, language, true, false, installed, feeds,
                                           false) ||
        !storeEntries(false, language, offered, error)) {
        return printFailure(
            opts.json, PKG_ERR_SERVER,
            error.empty() ? "cannot get the stores' lists: " + PMSGetLastStoreFailure() : error);
    }
    Json::Value updates(Json::arrayValue), others(Json::arrayValue);
    std::map<std::string, bool> updatable;
    for (const Json::Value* list : {&maker, &feeds}) {
        for (const Json::Value& entry : *list) {
            Json::Value item(Json::objectValue);
            const std::string name = text(entry, "package");
            item["package"] = name;
            item["installed"] = installed[name].version;
            item["available"] = text(entry, "version");
            item["source"] = entry.isMember("feed") ? text(entry, "feed") : "maker";
            if (entry["beta"].asBool() && !installed[name].beta) {
                item["note"] = "beta; automatic update leaves it";
            }
            updates.append(item);
            updatable[name] = true;
        }
    }
    for (const auto& pkg : installed) {
        if (updatable.count(pkg.first) != 0) {
            continue;
        }
        auto found = offered.find(pkg.first);
        Json::Value item(Json::objectValue);
        item["package"] = pkg.first;
        item["installed"] = pkg.second.version;
        item["reason"] = whyNot(pkg.second, found == offered.end() ? nullptr : &found->second);
        others.append(item);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["updates"] = updates;
        out["others"] = others;
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    printf("%-24s %-14s %-14s %s\n", "NAME", "INSTALLED", "AVAILABLE", "SOURCE");
    for (const Json::Value& item : updates) {
        printf("%-24s %-14s %-14s %s%s\n", text(item, "package").c_str(),
               text(item, "installed").c_str(), text(item, "available").c_str(),
               text(item, "source").c_str(),
               item.isMember("note") ? ("  (" + text(item, "note") + ")").c_str() : "");
    }
    printf("%u update(s)\n", updates.size());
    for (const Json::Value& item : others) {
        printf("  %s %s: %s\n", text(item, "package").c_str(), text(item, "installed").c_str(),
               text(item, "reason").c_str());
    }
    return EXIT_OK;
}

int cmdChkUpgradePkg(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (!parseCommon(args, findCommand("chkupgradepkg"), opts)) {
        return EXIT_USAGE;
    }
    std::vector<PackageInfo> found;
    LogCapture log;
    if (!PMSCheckUpgrade(true, nullptr, opts.lang.c_str(), &found)) {
        return printFailure(opts.json, PKG_ERR_SERVER,
                            "the update check failed: " + PMSGetLastStoreFailure());
    }
    if (opts.json) {
        Json::Value out(Json::objectValue), reported(Json::arrayValue);
        for (const PackageInfo& info : found) {
            reported.append(info.package);
        }
        out["success"] = true;
        out["reported"] = reported;
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    for (const PackageInfo& info : found) {
        printf("update available: %s %s\n", info.package.c_str(), info.version.c_str());
    }
    printf("update check done: %zu package(s) reported\n", found.size());
    return EXIT_OK;
}

namespace {

// The cached icon file of `name`: the installed package's, else the store's thumbnail.
bool iconFile(const std::string& name, bool big, const std::string& language, std::string& path,
              std::string& error) {
    char out[4096] = {0};
    const PKG_INFO_TYPE type = big ? PKG_INFO_PACKAGE_ICON_256 : PKG_INFO_PACKAGE_ICON;
    PackageManager pm;
    PackageInfo info;
    if (PMSCheckPackage(name) && pm.getInstallPackageInfo(name, info, nullptr, PKG_INFO_MASK_ALL)) {
        if (PMSGetInstallImage(type, "installed", name.c_str(), info.version.c_str(),
                               big ? "icon_256.png" : "icon.png", out, sizeof out)) {
            path = out;
            return true;
        }
        error = name + " has no valid icon in its INFO";
        return false;
    }
    Json::Value entry;
    if (!CORVPackageServer::GetPackageInfoFromServer(name, entry, true, language) &&
        !CORVPackageServer::GetPackageInfoFromServer(name, entry, false, language)) {
        error = name + " is neither installed nor offered by a store";
        return false;
    }
    const Json::Value& thumbs = entry["thumbnail"];
    const Json::ArrayIndex pick = big && thumbs.size() > 1 ? thumbs.size() - 1 : 0;
    const std::string source =
        thumbs.isArray() && !thumbs.empty() ? thumbs[pick].asString() : text(entry, "thumbnail");
    std::string fileName;
    PMSParseUrlToFileName(source.c_str(), fileName);
    if (source.empty() || fileName.empty()) {
        error = "the store gives no icon for " + name;
        return false;
    }
    if (!PMSGetServerImage("store", name.c_str(), text(entry, "version").c_str(), fileName.c_str(),
                           source.c_str(), out, sizeof out)) {
        error = "the store's icon of " + name + " is not a PNG or JPEG image under 2 MiB";
        return false;
    }
    path = out;
    return true;
}

}  // namespace

int cmdIcon(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status =
            parseSingle(args, "icon", "package name", opts, {{"-o", true}, {"--256", false}});
        status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    std::string path, error;
    LogCapture log;
    if (!iconFile(name, opts.has("--256"), languageOf(opts), path, error)) {
        return printFailure(opts.json, PKG_ERR_NOT_INSTALLED, error);
    }
    if (opts.has("-o")) {
        if (VLIBCExec("/bin/cp", "-f", path.c_str(), opts.options["-o"].c_str(), nullptr) != 0) {
            return printFailure(opts.json, PKG_ERR_SYSTEM, "cannot write " + opts.options["-o"]);
        }
        path = opts.options["-o"];
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["package"] = name;
        out["path"] = path;
        printf("%s\n", toString(out).c_str());
    } else {
        printf("%s\n", path.c_str());
    }
    return EXIT_OK;
}

}  // namespace cli
