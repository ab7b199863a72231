// A package server's entry mapped into the PackageInfo that an INFO file would give, so
// that packages that are only on a store go through the same dependency logic.
#include <stdlib.h>

#include <json/json.h>

#include "corv/log.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "pkginfo_private.h"
#include "store/json_value.h"

namespace CORVPackageTool {

bool PMSMapJsonToPackageInfo(const Json::Value& entry, PackageInfo& info) {
    if (!entry.isObject()) {
        CORV_LOG_ERR("Format Error: jsData is not json object");
        return false;
    }
    info.package = jsonText(entry, "package", "");
    info.version = jsonText(entry, "version", "");
    info.displayname = jsonText(entry, "dname", "");
    info.description = jsonText(entry, "desc", "");
    info.maintainer = jsonText(entry, "maintainer", "");
    info.maintainer_url = jsonText(entry, "maintainer_url", "");
    info.distributor = jsonText(entry, "distributor", "");
    info.distributor_url = jsonText(entry, "distributor_url", "");
    info.silent_install = jsonBool(entry, "silent_install", false);
    info.silent_upgrade = jsonBool(entry, "silent_upgrade", false);
    info.silent_uninstall = jsonBool(entry, "silent_uninstall", false);
    info.link = jsonText(entry, "link", "");
    info.size = jsonUInt64(entry, "size");
    info.type = static_cast<unsigned int>(jsonUInt64(entry, "type"));
    info.md5 = jsonText(entry, "md5", "");

    if (entry.isMember("depsers") && entry["depsers"].isString()) {
        const std::string services = entry["depsers"].asString();
        info.install_dep_services = PackageManager::PMSExplodeServiceString(services.c_str());
        info.extra.priv()->install_dep_service_set =
            PackageManager::getServiceSetFromString(services.c_str());
    }
    if (entry.isMember("conf_conxpkgs")) {
        PMSParseDepJSON(entry["conf_conxpkgs"], info.conflict_packages);
    } else if (entry.isMember("conflictpkgs") && entry["conflictpkgs"].isString()) {
        PMSExplodeDepPKGString(entry["conflictpkgs"].asCString(), info.conflict_packages);
    }
    PMSMapJsonDependencies(entry, info.dep_packages);
    return true;
}

void PMSMapJsonDependencies(const Json::Value& entry, DepPkgVector& deps) {
    if (!entry.isObject()) {
        return;
    }
    if (entry.isMember("conf_deppkgs")) {
        PMSParseDepJSON(entry["conf_deppkgs"], deps);
    } else if (entry.isMember("deppkgs") && hasText(entry, "deppgs")) {
        // The test names "deppgs", as it always has: stores send dependencies as
        // "conf_deppkgs", and an entry with only "deppkgs" has never added any.
        PMSExplodeDepPKGString(jsonText(entry, "deppkgs", "").c_str(), deps);
    }
}

}  // namespace CORVPackageTool
