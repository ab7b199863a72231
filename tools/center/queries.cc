#include "queries.h"

#include <algorithm>
#include <functional>
#include <map>
#include <set>

#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"
#include "results.h"

namespace center {

using namespace CORVPackageTool;

namespace {

const char kLanguage[] = "enu";

std::string iconUrl(const std::string& base64) {
    return base64.empty() ? "" : "data:image/png;base64," + base64;
}

Json::Value summary(PackageManager& pm, const std::string& name, const PackageInfo& info) {
    Json::Value row(Json::objectValue);
    const int status = pm.getPkgStatus(name);
    row["package"] = name;
    row["version"] = info.version;
    row["displayname"] = info.displayname.empty() ? name : info.displayname;
    row["description"] = info.description;
    row["status"] = status;
    row["status_word"] = PMSPkgStatusWord(status);
    row["icon"] = iconUrl(info.package_icon);
    row["startable"] = info.startable;
    return row;
}

// The installed version of each package.
std::map<std::string, std::string> installedVersions() {
    PackageManager pm;
    std::map<std::string, std::string> out;
    for (const auto& entry : pm.enumPackageMap(0)) {
        out[entry.first] = entry.second.version;
    }
    return out;
}

bool isNewer(const std::string& name, const std::string& candidate, const std::string& current) {
    return PackageBasicInfo(name, candidate)
        .compare(PackageBasicInfo(name, current), PKG_COMPOP_GT);
}

}  // namespace

std::mutex& queryLock() {
    static std::mutex lock;
    return lock;
}

Json::Value installedPackages() {
    PackageManager pm;
    std::vector<std::string> names =
        pm.enumPackages(static_cast<const char*>(nullptr), PKG_INFO_MASK_ALL);
    std::sort(names.begin(), names.end());
    Json::Value rows(Json::arrayValue);
    for (const std::string& name : names) {
        PackageInfo info;
        if (pm.getInstallPackageInfo(name, info, kLanguage, PKG_INFO_MASK_ALL)) {
            rows.append(summary(pm, name, info));
        }
    }
    return rows;
}

Json::Value packageDetails(const std::string& name) {
    PackageManager pm;
    PackageInfo info;
    if (!PMSCheckPackage(name) ||
        !pm.getInstallPackageInfo(name, info, kLanguage, PKG_INFO_MASK_ALL)) {
        return Json::Value();
    }
    Json::Value out = summary(pm, name, info);
    out["maintainer"] = info.maintainer;
    out["maintainer_url"] = info.maintainer_url;
    out["adminport"] = info.adminport;
    out["adminurl"] = info.adminurl;
    out["volume"] = PMSGetPackageTargetVolByPath(("/var/packages/" + name).c_str());
    Json::Value deps;
    info.dep_packages.toJSON(deps);
    out["dependencies"] = deps.isNull() ? Json::Value(Json::objectValue) : deps;
    std::vector<std::string> dependents;
    pm.arePackagesDepended(name, kLanguage, dependents);
    out["dependents"] = Json::Value(Json::arrayValue);
    for (const std::string& dependent : dependents) {
        out["dependents"].append(dependent);
    }
    PackageInfo wizard;
    out["uninstall_wizard"] = Json::Value(Json::arrayValue);
    if (pm.readUIFile(static_cast<PKG_INSTALLATION_TYPE>(4), name, wizard, kLanguage) &&
        wizard.wizard.isArray()) {
        out["uninstall_wizard"] = wizard.wizard;
    }
    out["log"] = pm.getPackageLog(name, true);
    return out;
}

Json::Value storePackages(bool refresh) {
    Json::Value entries(Json::arrayValue), errors(Json::arrayValue);
    CORVPackageServer::PMSGetAllPkgList(refresh, kLanguage, entries, errors);
    const auto installed = installedVersions();
    Json::Value out(Json::objectValue);
    out["packages"] = Json::Value(Json::arrayValue);
    for (Json::Value entry : entries) {
        const std::string name = entry["package"].asString();
        auto have = installed.find(name);
        entry["installed_version"] = have == installed.end() ? "" : have->second;
        if (have == installed.end()) {
            entry["action"] = "install";
        } else if (isNewer(name, entry["version"].asString(), have->second)) {
            entry["action"] = "upgrade";
        } else {
            entry["action"] = "installed";
        }
        out["packages"].append(entry);
    }
    out["errors"] = errors;
    return out;
}

Json::Value availableUpdates(bool refresh) {
    // The engine's own list, as the update check sees it: newer entries of the maker's
    // store and of the feeds, less those the version limits bar.
    PackageManager pm;
    PackageBasicInfoMap installed = pm.enumPackageMap(PKG_INFO_MASK_ALL);
    Json::Value out(Json::arrayValue);
    for (bool maker : {true, false}) {
        Json::Value entries;
        if (!getUpdatableRepairablePackageList(refresh, maker, kLanguage, true, false, installed,
                                               entries, maker) ||
            !entries.isArray()) {
            continue;
        }
        for (Json::Value entry : entries) {
            entry["installed_version"] = installed[entry["package"].asString()].version;
            entry["action"] = "upgrade";
            out.append(entry);
        }
    }
    return out;
}

bool storePlan(const Json::Value& names, Json::Value& plan, std::string& why) {
    Json::Value store = storePackages(false);
    std::map<std::string, Json::Value> byName;
    for (const Json::Value& entry : store["packages"]) {
        byName[entry["package"].asString()] = entry;
    }
    std::set<std::string> placed, visiting;
    plan = Json::Value(Json::arrayValue);
    std::function<bool(const std::string&, bool)> place = [&](const std::string& name, bool asked) {
        if (placed.count(name) != 0 || (!asked && PMSCheckPackage(name))) {
            return true;
        }
        auto found = byName.find(name);
        if (found == byName.end()) {
            why = "the stores offer no package " + name;
            return false;
        }
        if (!visiting.insert(name).second) {
            why = "the store's dependencies of " + name + " form a cycle";
            return false;
        }
        const Json::Value& deps = found->second["conf_deppkgs"];
        if (deps.isObject()) {
            for (const std::string& dep : deps.getMemberNames()) {
                if (!place(dep, false)) {
                    return false;
                }
            }
        }
        placed.insert(name);
        Json::Value step(Json::objectValue);
        for (const char* key : {"package", "version", "link", "md5", "size", "dname"}) {
            step[key] = found->second[key];
        }
        plan.append(step);
        return true;
    };
    for (const Json::Value& name : names) {
        if (!name.isString() || !place(name.asString(), true)) {
            if (why.empty()) {
                why = "a package name is no text";
            }
            return false;
        }
    }
    return !plan.empty() || (why = "nothing to download", false);
}

Json::Value stagedQuestions(const Json::Value& files) {
    Json::Value out(Json::arrayValue);
    for (const Json::Value& entry : files) {
        const std::string file = entry["file"].asString();
        PackageManager pm;
        PackageInfo info;
        Json::Value one(Json::objectValue);
        one["package"] = entry["package"];
        if (!pm.queryPackageFileInfoWithWizard(file, info, static_cast<PKG_INSTALLATION_TYPE>(0),
                                               kLanguage)) {
            one["error"] = describeOutcome(pm, entry["package"].asString(), "check");
            out.append(one);
            continue;
        }
        one["displayname"] = info.displayname.empty() ? info.package : info.displayname;
        one["version"] = info.version;
        one["upgrade"] = PMSCheckPackage(info.package);
        one["wizard"] = info.wizard.isArray() ? info.wizard : Json::Value(Json::arrayValue);
        const PKG_ERRCODE verdict = PackageManager::verifyPackageSignature(file.c_str());
        one["signature"] = verdict == PKG_SIGNATURE_OK ? Json::Value() : describeResult(verdict);
        out.append(one);
    }
    return out;
}

bool readPackageFile(const std::string& path, std::string& name, std::string& version) {
    PackageManager pm;
    PackageInfo info;
    if (!pm.queryPackageFileInfo(path, info, static_cast<PKG_INSTALLATION_TYPE>(0), kLanguage) ||
        info.package.empty()) {
        return false;
    }
    name = info.package;
    version = info.version;
    return true;
}

}  // namespace center
