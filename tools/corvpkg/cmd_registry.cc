// corvpkg list, status and log: what is installed and in which state.
#include <stdio.h>

#include <algorithm>
#include <string>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgvolume.h"

namespace cli {

using namespace CORVPackageTool;

namespace {
// Enough for a listing: names, versions, display names, dependencies; no icons.
constexpr unsigned long long kListMask = 0x11000000ULL;
}  // namespace

int cmdList(const std::vector<std::string>& args) {
    const Command& self = findCommand("list");
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--volume", true}})) {
        return EXIT_USAGE;
    }
    if (!opts.positional.empty()) {
        return usageError(self, "unexpected argument " + opts.positional[0]);
    }
    PackageManager pm;
    const char* volume = opts.has("--volume") ? opts.options["--volume"].c_str() : nullptr;
    Json::Value rows(Json::arrayValue);
    // The registry lists in directory order; people look a name up alphabetically.
    std::vector<std::string> names = pm.enumPackages(volume, kListMask);
    std::sort(names.begin(), names.end());
    for (const std::string& name : names) {
        PackageInfo info;
        pm.getInstallPackageInfo(name, info, opts.lang.empty() ? nullptr : opts.lang.c_str(),
                                 kListMask);
        int status = pm.getPkgStatus(name);
        Json::Value row(Json::objectValue);
        row["package"] = name;
        row["version"] = info.version;
        row["displayname"] = info.displayname;
        row["status"] = status;
        row["status_word"] = PMSPkgStatusWord(status);
        std::string vol = PMSGetPackageTargetVolByPath(("/var/packages/" + name).c_str());
        row["volume"] = vol;
        rows.append(row);
    }
    if (opts.json) {
        printf("%s\n", toString(rows).c_str());
        return EXIT_OK;
    }
    if (rows.empty()) {
        printf("no packages installed\n");
        return EXIT_OK;
    }
    printf("%-24s %-16s %-20s %s\n", "PACKAGE", "VERSION", "STATUS", "VOLUME");
    for (const Json::Value& row : rows) {
        printf("%-24s %-16s %-20s %s\n", row["package"].asCString(), row["version"].asCString(),
               row["status_word"].asCString(), row["volume"].asCString());
    }
    return EXIT_OK;
}

int cmdStatus(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "status", "package name", opts); status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    PackageManager pm;
    int status = pm.getPkgStatus(name);
    int rough = 0;
    bool roughOk = pm.getPkgRoughStatus(name, rough);
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["package"] = name;
        out["status"] = status;
        out["status_word"] = PMSPkgStatusWord(status);
        out["rough"] = roughOk ? Json::Value(rough) : Json::Value();
        out["installed"] = roughOk && (rough & 1) != 0;
        out["running"] = roughOk && (rough & 2) != 0;
        out["broken"] = roughOk && (rough & 4) != 0;
        printf("%s\n", toString(out).c_str());
    } else {
        printf("%s: %s (status %d", name.c_str(), PMSPkgStatusWord(status), status);
        if (roughOk) {
            printf(", rough %d", rough);
        }
        printf(")\n");
    }
    // Scripts test the exit status: 0 running, 1 installed but not running, 2 broken,
    // 3 not installed, 4 unknown.
    if (status == 0) {
        return 0;
    }
    if (!roughOk) {
        return 4;
    }
    if (rough == 0) {
        return 3;
    }
    return (rough & 4) ? 2 : 1;
}

int cmdLog(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "log", "package name", opts); status >= 0) {
        return status;
    }
    PackageManager pm;
    LogCapture log;
    std::string text = pm.getPackageLog(opts.positional[0]);
    if (pm.getResult() != PKG_OK) {
        return printFailure(opts.json, pm.getResult(), log.reasons());
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["package"] = opts.positional[0];
        out["log"] = text;
        printf("%s\n", toString(out).c_str());
    } else if (!text.empty()) {
        printf("%s\n", text.c_str());
    }
    return EXIT_OK;
}

}  // namespace cli
