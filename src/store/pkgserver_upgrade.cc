// The look for newer versions: which installed packages the stores offer anew, the
// automatic upgrades the administrator allowed, the badge, and the word to the
// administrators about the rest.
#include <strings.h>

#include <set>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/mail.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglimit.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "store/json_value.h"

namespace CORVPackageTool {

namespace {

const char kApp[] = "CORV.NDS.PkgManApp.Instance";

bool settingIsYes(const char* key) {
    char value[64] = {0};
    return VLIBCFileGetKeyValue(VLIBC_INFO_PATH, key, value, sizeof value, 0) > 0 &&
           strcasecmp(value, "yes") == 0;
}

std::string defaultLanguage(const char* language) {
    if (language != nullptr && language[0] != '\0') {
        return language;
    }
    char value[256] = {0};
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "maillang", value, sizeof value, 0) > 0 &&
        value[0] != '\0') {
        return value;
    }
    return "enu";
}

int runNotifier(const std::vector<std::string>& args) {
    std::vector<const char*> argv = {"/usr/corv/bin/corvnosnotify"};
    for (const std::string& arg : args) {
        argv.push_back(arg.c_str());
    }
    argv.push_back(nullptr);
    return VLIBCExecv(argv[0], argv.data(), 1);
}

// The settings of one run of the check.
struct CheckPlan {
    bool scheduled = false;
    bool nosNotify = false;
    bool mailNotify = false;
    bool autoUpdate = false;
    bool all = false;
    bool onlyOverLimit = false;
    std::set<std::string> chosen;
    const char* user = nullptr;
    std::string language;
};

bool makePlan(bool scheduled, bool forceAll, CheckPlan& plan) {
    plan.scheduled = scheduled;
    plan.nosNotify = settingIsYes("upgrade_pkg_nos_notification");
    plan.mailNotify = settingIsYes("upgrade_pkg_email_notification");
    plan.autoUpdate = (settingIsYes("enable_pkg_autoupdate_all") || forceAll) && scheduled;
    plan.all = settingIsYes("pkg_autoupdate_all") || forceAll;
    if (!plan.all && scheduled) {
        Json::Value names;
        if (!CORVPackageServer::List(names)) {
            return false;
        }
        for (const Json::Value& name : names) {
            if (name.isString()) {
                plan.chosen.insert(name.asString());
            }
        }
    }
    return true;
}

std::string entryText(const Json::Value& entry, const char* key) {
    const Json::Value& value = entry[key];
    return value.isString() || value.isNumeric() ? value.asString() : "";
}

// Whether the entry is to be left alone altogether: a beta over a stable installation, or
// a version that can't be reached from the installed one.
bool outOfReach(const Json::Value& entry, const PackageBasicInfo& installed) {
    if (entry["beta"].isBool() && entry["beta"].asBool() && !installed.beta) {
        return true;
    }
    const std::string from = entryText(entry, "auto_upgrade_from");
    return !from.empty() &&
           installed.compare(PackageBasicInfo(installed.package, from), PKG_COMPOP_LT);
}

void notifyNoAutoUpdate(const std::string& displayName) {
    runNotifier({"-c", kApp, "-t", "false", PKG_TASK_OWNER, "tree:leaf_packagemanage",
                 "pkgmgr:auto_update_non_support", displayName});
}

// Tries the silent upgrade of one entry; false when it is to be reported instead.
bool upgradeSilently(const CheckPlan& plan, const Json::Value& entry,
                     const PackageBasicInfo& installed) {
    if (!entry["silent_upgrade"].isBool() || !entry["silent_upgrade"].asBool()) {
        return false;
    }
    if (plan.onlyOverLimit &&
        PMSThirdPartyCheckLimit(installed.package.c_str(), installed.version.c_str()) != -2) {
        return false;
    }
    const std::string md5 = entryText(entry, "md5");
    const Json::Value size = entry["size"];
    return CORVPackageServer::BackgroundInstall(
        plan.user, nullptr, entryText(entry, "package").c_str(), entryText(entry, "dname").c_str(),
        nullptr, plan.language.c_str(),
        size.isNumeric() ? size.asUInt64() : std::stoull("0" + entryText(entry, "size")),
        entryText(entry, "link").c_str(), md5.empty() ? nullptr : md5.c_str(), false);
}

// Decides one entry of the maker store's list: true when it goes on the report.
bool handleMakerEntry(CheckPlan& plan, const Json::Value& entry,
                      const PackageBasicInfoMap& installed) {
    if (!plan.autoUpdate || entryText(entry, "link").empty()) {
        return true;
    }
    const std::string name = entryText(entry, "package");
    auto found = installed.find(name);
    if (found == installed.end()) {
        return true;
    }
    if (outOfReach(entry, found->second)) {
        return false;
    }
    const bool silent = entry["silent_upgrade"].isBool() && entry["silent_upgrade"].asBool();
    if (!plan.all) {
        if (plan.chosen.count(name) == 0) {
            return true;
        }
        if (!silent) {
            plan.chosen.erase(name);
            notifyNoAutoUpdate(entryText(entry, "dname"));
            return true;
        }
    }
    return !upgradeSilently(plan, entry, found->second);
}

void addToReport(const Json::Value& entry, std::vector<std::string>& report,
                 std::vector<PackageInfo>* found) {
    const std::string dname = entryText(entry, "dname");
    report.push_back(dname.empty() ? entryText(entry, "package") : dname);
    if (found != nullptr) {
        PackageInfo info;
        PMSMapJsonToPackageInfo(entry, info);
        found->push_back(info);
    }
}

void announce(const CheckPlan& plan, const std::vector<std::string>& report,
              const std::string& joined) {
    if (plan.mailNotify) {
        PVLIBSZHASH fields = VLIBCSzHashAlloc(512);
        if (fields != nullptr) {
            VLIBCSzHashSetValue(&fields, "%PKG_SET%", joined.c_str());
            CORVMailSendMessageWithoutBlock("PKGUpgrade", fields, 0, 0);
            VLIBCSzHashFree(fields);
        }
    }
    if (plan.nosNotify) {
        std::vector<std::string> args = {"-c",    kApp,           "-e",
                                         "false", PKG_TASK_OWNER, "tree:leaf_packagemanage"};
        if (report.size() == 1) {
            args.insert(args.end(), {"pkgmgr:upgrade_one_package", joined});
        } else {
            args.insert(args.end(), {"pkgmgr:upgrade_packages", std::to_string(report.size())});
        }
        args.insert(args.end(), {"<a data-corv-app='CORV.NDS.PkgManApp.Instance'>",
                                 "pkgmgr:pkgmgr_upgrade_noti_link", "</a>"});
        if (runNotifier(args) != 0) {
            CORV_LOG_ERR("Failed to run %s.", "/usr/corv/bin/corvnosnotify");
        }
    }
}

}  // namespace

bool getUpdatableRepairablePackageList(bool force, bool makerStore, std::string language,
                                       bool upgradable, bool repairable,
                                       PackageBasicInfoMap& installed, Json::Value& out,
                                       bool sort) {
    out = Json::Value(Json::arrayValue);
    Json::Value list;
    const bool ok =
        makerStore ? CORVPackageServer::PMSQueryCorvPkgServer(force, language.c_str(), list, sort)
                   : CORVPackageServer::PMSQueryOtherPkgServer(force, language.c_str(), list, sort);
    if (!ok) {
        CORV_LOG_ERR("failed to get package list from server");
        return false;
    }
    const Json::Value& entries =
        list.isObject() && list.isMember("packages") ? list["packages"] : list;
    if (!entries.isArray()) {
        return true;
    }
    PackageManager pm;
    for (const Json::Value& entry : entries) {
        const std::string name = entryText(entry, "package");
        auto found = installed.find(name);
        if (name.empty() || found == installed.end()) {
            continue;
        }
        const std::string version = entryText(entry, "version");
        if (entry.isMember("version") && PMSThirdPartyCheckLimit(name.c_str(), version.c_str())) {
            continue;
        }
        if (upgradable && found->second.compare(PackageBasicInfo(name, version), PKG_COMPOP_LT)) {
            out.append(entry);
            continue;
        }
        int rough = 0;
        if (repairable && pm.getPkgRoughStatus(name, rough) && (rough & 0x4) != 0) {
            out.append(entry);
        }
    }
    return true;
}

bool updateBadgeCount(bool force) {
    PackageManager pm;
    PackageBasicInfoMap installed = pm.enumPackageMap(PKG_INFO_MASK_ALL);
    Json::Value maker, feeds;
    if (!getUpdatableRepairablePackageList(force, true, "enu", true, true, installed, maker,
                                           false) ||
        !getUpdatableRepairablePackageList(force, false, "enu", true, true, installed, feeds,
                                           false)) {
        return false;
    }
    const std::string count = std::to_string(maker.size() + feeds.size());
    return VLIBCExec("/usr/corv/bin/corvappnotify", "-c", kApp, "-u", count.c_str(), PKG_TASK_OWNER,
                     nullptr) == 0;
}

bool PMSCheckUpgrade(bool scheduled, const char* user, const char* language,
                     std::vector<PackageInfo>* found, bool forceAll, bool onlyOverLimit) {
    CheckPlan plan;
    plan.user = user;
    plan.onlyOverLimit = onlyOverLimit;
    if (!makePlan(scheduled, forceAll, plan)) {
        return false;
    }
    plan.language = defaultLanguage(language);
    PackageManager pm;
    PackageBasicInfoMap installed = pm.enumPackageMap(PKG_INFO_MASK_ALL);
    Json::Value maker, feeds;
    if (!getUpdatableRepairablePackageList(scheduled, true, plan.language, true, false, installed,
                                           maker, true)) {
        return false;
    }
    std::vector<std::string> report;
    for (const Json::Value& entry : maker) {
        if (handleMakerEntry(plan, entry, installed)) {
            addToReport(entry, report, found);
        }
    }
    if (plan.autoUpdate && !plan.all) {
        Json::Value names(Json::arrayValue);
        for (const std::string& name : plan.chosen) {
            names.append(name);
        }
        CORVPackageServer::Save(true, false, names);
    }
    if (!getUpdatableRepairablePackageList(scheduled, false, plan.language, true, false, installed,
                                           feeds, false)) {
        return false;
    }
    for (const Json::Value& entry : feeds) {
        addToReport(entry, report, found);
    }
    std::string joined;
    for (const std::string& name : report) {
        joined += (joined.empty() ? "" : ", ") + name;
    }
    updateBadgeCount(scheduled);
    if (!report.empty() && scheduled) {
        announce(plan, report, joined);
    }
    return true;
}

bool PMSCheckUpgrade(bool scheduled, const char* user, const char* language,
                     std::vector<PackageInfo>* found) {
    return PMSCheckUpgrade(scheduled, user, language, found, false, false);
}

bool CORVPackageServer::PMSCheckUpgrade(bool force, const char* packageName, const char* language) {
    if (packageName == nullptr || packageName[0] == '\0') {
        return false;
    }
    const std::string lang = defaultLanguage(language);
    PackageManager pm;
    PackageInfo info;
    if (!pm.getInstallPackageInfo(packageName, info, lang.c_str(), PKG_INFO_MASK_ALL)) {
        return false;
    }
    PackageBasicInfoMap one;
    one.insertPackagae(info.package, info.version, info.beta, PKG_COMPOP_NONE);
    Json::Value maker, feeds;
    if (!getUpdatableRepairablePackageList(force, true, lang, true, false, one, maker, false)) {
        return false;
    }
    if (!maker.empty()) {
        return true;
    }
    return getUpdatableRepairablePackageList(force, false, lang, true, false, one, feeds, false) &&
           !feeds.empty();
}

}  // namespace CORVPackageTool
