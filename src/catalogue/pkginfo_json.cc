// PackageInfo as JSON.
#include "corvpkg/pkginfo_json.h"

#include <string>

#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

Json::Value stringArray(const std::vector<std::string>& items) {
    Json::Value out(Json::arrayValue);
    for (const std::string& item : items) {
        out.append(item);
    }
    return out;
}

std::string osVersion(const int v[3]) {
    return std::to_string(v[0]) + "." + std::to_string(v[1]) + "-" + std::to_string(v[2]);
}

Json::Value depArray(const DepPkgVector& deps) {
    Json::Value out(Json::arrayValue);
    for (const PackageBasicInfo& dep : deps) {
        Json::Value entry(Json::objectValue);
        entry["package"] = dep.package;
        entry["version"] = dep.version;
        entry["compop"] = PMSCompOpToStr(dep.compop);
        out.append(entry);
    }
    return out;
}

Json::Value stringSet(const std::set<std::string>& items) {
    Json::Value out(Json::arrayValue);
    for (const std::string& item : items) {
        out.append(item);
    }
    return out;
}

}  // namespace

const char* PMSCompOpToStr(PKG_VERSION_COMPOP op) {
    switch (op) {
        case PKG_COMPOP_EQ:
            return "=";
        case PKG_COMPOP_GT:
            return ">";
        case PKG_COMPOP_LT:
            return "<";
        case PKG_COMPOP_GE:
            return ">=";
        case PKG_COMPOP_LE:
            return "<=";
        default:
            return "";
    }
}

Json::Value PackageInfoToJson(const PackageInfo& info, bool withIcons) {
    PackageInfo copy(info);  // the accessors of the extension take a mutable record
    Json::Value out(Json::objectValue);
    out["package"] = info.package;
    out["version"] = info.version;
    out["displayname"] = info.displayname;
    out["description"] = info.description;
    out["description_enu"] = info.description_enu;
    out["maintainer"] = info.maintainer;
    out["maintainer_url"] = info.maintainer_url;
    out["distributor"] = info.distributor;
    out["distributor_url"] = info.distributor_url;
    out["adminurl"] = info.adminurl;
    out["adminport"] = info.adminport;
    out["adminprotocol"] = stringArray(info.adminprotocol);
    out["license"] = info.license;
    out["nosuidir"] = info.nosuidir;
    out["nosappname"] = info.nosappname;
    out["helpurl"] = info.helpurl;
    out["checksum"] = info.checksum;
    out["report_url"] = info.report_url;
    out["beta"] = info.beta;
    out["support_center"] = info.support_center;
    out["support_url"] = info.support_url;
    out["instuninst_restart_services"] = info.instuninst_restart_services;
    out["startstop_restart_services"] = info.startstop_restart_services;
    out["install_dep_services"] = info.install_dep_services;
    out["start_dep_services"] = info.start_dep_services;
    out["install_dep_service_set"] = stringSet(PMSGetInstallDepServiceSet(info));
    out["start_dep_service_set"] = stringSet(PMSGetStartDepServiceSet(info));
    out["script_mask"] = info.script_mask;
    out["arch"] = info.arch;
    out["exclude_arch"] = info.exclude_arch;
    out["arch_list"] = stringArray(info.arch_list);
    out["exclude_arch_list"] = stringArray(info.exclude_arch_list);
    out["model_list"] = stringArray(info.model_list);
    out["checkport"] = info.checkport;
    out["startable"] = info.startable;
    out["install_reboot"] = info.install_reboot;
    out["has_uninstall_wizard"] = info.has_uninstall_wizard;
    out["firmware"] = osVersion(info.firmware);
    out["os_min_ver"] = osVersion(PMSGetOSMinVer(copy));
    out["os_max_ver"] = osVersion(PMSGetOSMaxVer(copy));
    out["ctl_uninstall"] = PMSGetCtlUninstall(info);
    out["precheckstartstop"] = PMSGetPrecheckStartStop(info);
    out["dep_packages"] = depArray(info.dep_packages);
    out["conflict_packages"] = depArray(info.conflict_packages);
    out["wizard"] = info.wizard;
    out["extractsize"] = static_cast<Json::Int64>(info.extractsize);
    out["silent_install"] = info.silent_install;
    out["silent_upgrade"] = info.silent_upgrade;
    out["silent_uninstall"] = info.silent_uninstall;
    out["install_type"] = info.install_type;
    out["link"] = info.link;
    out["size"] = static_cast<Json::UInt64>(info.size);
    out["type"] = info.type;
    out["md5"] = info.md5;
    if (withIcons) {
        out["package_icon"] = info.package_icon;
        out["package_icon_256"] = info.package_icon_256;
    }
    return out;
}

}  // namespace CORVPackageTool
