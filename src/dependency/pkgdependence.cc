// Questions the lifecycle asks of the dependency declarations: conflicts, missing or
// stopped dependencies, dependents, and the orders of starting and stopping.
#include <unistd.h>

#include <map>
#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/graph.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkginfo_json.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

constexpr unsigned long long kConflictMask = 0xFFFFFFFF90000000ULL;
constexpr unsigned long long kDepMask = 0x1000000ULL;
constexpr unsigned long long kDepNameMask = 0x11000000ULL;
constexpr unsigned long long kDepNameStartMask = 0x11000400ULL;
constexpr unsigned long long kNameMask = 0x10000000ULL;

void appendName(std::string& list, const std::string& name) {
    if (!list.empty()) {
        list += ", ";
    }
    list += name;
}

bool dependsOn(const PackageInfo& info, const std::string& name) {
    for (const PackageBasicInfo& dep : info.dep_packages) {
        if (dep.package == name) {
            return true;
        }
    }
    return false;
}

}  // namespace

bool joinJsonArray(const Json::Value& array, const std::string& separator, std::string& out) {
    if (!array.isArray()) {
        return false;
    }
    std::string joined;
    for (Json::ArrayIndex i = 0; i < array.size(); ++i) {
        if (i != 0) {
            joined += separator;
        }
        joined += array[i].isString() ? array[i].asString() : toString(array[i]);
    }
    out = joined;
    return true;
}

bool PackageManager::arePackagesConflict(PackageBasicInfo pkg, const DepPkgVector& conflicts,
                                         std::string& names, const char* language) {
    names.clear();
    std::map<std::string, PackageInfo> installed;
    enumPackageInfoMap(installed, language, kConflictMask);
    Json::Value found(Json::arrayValue);
    std::set<std::string> seen;
    bool conflict = false;
    // What the candidate refuses.
    for (const PackageBasicInfo& entry : conflicts) {
        auto it = installed.find(entry.package);
        if (it == installed.end() || seen.count(it->first)) {
            continue;
        }
        PackageBasicInfo record(it->second.package, it->second.version);
        if (record.compare(entry, entry.compop)) {
            found.append(it->second.displayname);
            seen.insert(it->first);
            conflict = true;
        }
    }
    // What refuses the candidate; an older version of the candidate itself never does.
    for (const auto& [name, info] : installed) {
        if (name == pkg.package) {
            continue;
        }
        for (const PackageBasicInfo& entry : info.conflict_packages) {
            if (entry.package == pkg.package && pkg.compare(entry, entry.compop) &&
                !seen.count(name)) {
                found.append(info.displayname);
                seen.insert(name);
                conflict = true;
            }
        }
    }
    joinJsonArray(found, ", ", names);
    return conflict;
}

bool PackageManager::arePackagesInstallAndStart(const DepPkgVector& deps, Json::Value& missing,
                                                std::string& notStarted, const char* language) {
    if (deps.empty()) {
        return true;
    }
    PackageBasicInfoMap installed = enumPackageMap(PKG_INFO_MASK_ALL);
    notStarted.clear();
    missing = Json::Value(Json::objectValue);
    bool ok = true;
    for (const PackageBasicInfo& entry : deps) {
        auto it = installed.find(entry.package);
        if (it != installed.end() && it->second.compare(entry, entry.compop)) {
            if (!isStarted(entry.package)) {
                ok = false;
                if (getResult() != PKG_ERR_BELOW_VERSION_LIMIT && getResult() != PKG_ERR_SYSTEM) {
                    CORV_LOG_ERR("Faild to get %s status, err = %d", entry.package.c_str(),
                                 getResult());
                }
                PackageInfo info;
                appendName(notStarted,
                           getInstallPackageInfo(entry.package, info, language, kNameMask)
                               ? info.displayname
                               : entry.package);
            }
            continue;
        }
        ok = false;
        const char* op = PMSCompOpToStr(entry.compop);
        if (op[0] != '\0') {
            if (!missing[entry.package].isObject()) {
                missing[entry.package] = Json::Value(Json::objectValue);
            }
            missing[entry.package][op] = entry.version;
        } else {
            missing[entry.package] = "";
        }
    }
    return ok;
}

bool PackageManager::arePackagesDepended(std::string name, const char* language,
                                         std::string& names) {
    names.clear();
    PackageManager other;
    std::vector<PackageInfo> all;
    other.enumPackageInfo(all, language, kDepNameMask);
    for (const PackageInfo& info : all) {
        if (dependsOn(info, name)) {
            appendName(names, info.displayname);
        }
    }
    return names.empty();
}

bool PackageManager::arePackagesDepended(std::string name, const char* language,
                                         std::vector<std::string>& names) {
    names.clear();
    PackageManager other;
    std::vector<PackageInfo> all;
    other.enumPackageInfo(all, language, kDepMask);
    for (const PackageInfo& info : all) {
        if (dependsOn(info, name)) {
            names.push_back(info.package);
        }
    }
    return names.empty();
}

bool PackageManager::areDependentPackageStop(std::string name, const char* language,
                                             std::string& names) {
    names.clear();
    PackageManager other;
    std::vector<PackageInfo> all;
    other.enumPackageInfo(all, language, kDepNameStartMask);
    for (const PackageInfo& info : all) {
        if (!dependsOn(info, name)) {
            continue;
        }
        // A package that cannot be stopped counts as running.
        bool running = false;
        if (!info.startable || (getServiceStatus(info.package, running, true) && running)) {
            appendName(names, info.displayname);
        }
    }
    return names.empty();
}

bool PackageManager::getDepPkgListStop(const std::vector<std::string>& order, std::string name,
                                       const char* language, Json::Value& list) {
    list = Json::Value(Json::arrayValue);
    for (const std::string& pkg : order) {
        if (pkg == name) {
            continue;
        }
        PackageInfo info;
        if (!getInstallPackageInfo(pkg, info, language, PKG_INFO_MASK_ALL)) {
            continue;
        }
        if (info.startable) {
            Json::Value entry(Json::objectValue);
            entry["name"] = info.displayname;
            entry["id"] = info.package;
            list.append(entry);
        }
    }
    return list.empty();
}

bool PackageManager::getDepPkgListStop(std::string name, const char* language, Json::Value& list) {
    std::vector<std::string> order;
    if (!getDependencyOrder(name.c_str(), order, false)) {
        return false;
    }
    return getDepPkgListStop(order, name, language, list);
}

bool PackageManager::topologicalSortPkgs(std::vector<PackageInfo>* pkgs,
                                         std::vector<std::string>& order) {
    std::vector<PackageInfo> installed;
    if (pkgs == nullptr) {
        enumPackageInfo(installed, nullptr, kDepMask);
        pkgs = &installed;
    }
    // A later record of the same name takes the name's edges.
    Graph graph(pkgs->size());
    std::map<std::string, unsigned long long> vertex;
    for (const PackageInfo& info : *pkgs) {
        vertex[info.package] = graph.addVertex(info.package);
    }
    for (size_t i = 0; i < pkgs->size(); ++i) {
        for (const PackageBasicInfo& dep : (*pkgs)[i].dep_packages) {
            auto it = vertex.find(dep.package);
            if (it != vertex.end()) {
                graph.addEdge(i, it->second);
            }
        }
    }
    if (!graph.topologicalSort()) {
        std::string all;
        for (const PackageInfo& info : *pkgs) {
            appendName(all, info.package);
        }
        CORV_LOG_ERR("Cycle in %s", all.c_str());
        return false;
    }
    order = graph.getResult();
    return true;
}

bool PackageManager::getDependencyOrder(std::vector<std::string>& order) {
    return topologicalSortPkgs(nullptr, order);
}

bool PackageManager::hasCycle(const PackageInfo& candidate) {
    std::vector<PackageInfo> pkgs;
    enumPackageInfo(pkgs, nullptr, kDepMask);
    pkgs.push_back(candidate);
    std::vector<std::string> order;
    return !topologicalSortPkgs(&pkgs, order);
}

bool PackageManager::getDependencyOrder(const char* name, std::vector<std::string>& order,
                                        bool useEnabledFlag) {
    if (name == nullptr) {
        return false;
    }
    if (!PMSCheckPackage(name)) {
        return true;
    }
    std::vector<PackageInfo> all;
    enumPackageInfo(all, nullptr, kDepMask);
    if (all.empty()) {
        return true;
    }
    // Only active dependents matter: a stopped one need not be stopped again.
    Graph graph(all.size());
    std::map<std::string, unsigned long long> vertex;
    bool met = false;
    for (const PackageInfo& info : all) {
        bool isNamed = !met && info.package == name;
        bool active = false;
        if (!isNamed) {
            if (useEnabledFlag) {
                active = access(("/var/packages/" + info.package + "/enabled").c_str(), F_OK) == 0;
            } else {
                PackageManager other;
                active = other.isStarted(info.package);
            }
        }
        if (isNamed || active) {
            vertex[info.package] = graph.addVertex(info.package);
            met = met || isNamed;
        }
    }
    if (!met) {
        return true;
    }
    // From the dependency to the dependent.
    for (const PackageInfo& info : all) {
        auto self = vertex.find(info.package);
        if (self == vertex.end()) {
            continue;
        }
        for (const PackageBasicInfo& dep : info.dep_packages) {
            auto it = vertex.find(dep.package);
            if (it != vertex.end()) {
                graph.addEdge(it->second, self->second);
            }
        }
    }
    graph.visit(vertex[name]);
    std::vector<PackageInfo> reached;
    for (const std::string& pkg : graph.getResult()) {
        PackageInfo info;
        if (PMSLoadPKGInfoFile("/var/packages/" + pkg, info, nullptr, kDepMask)) {
            reached.push_back(info);
        }
    }
    bool ok = topologicalSortPkgs(&reached, order);
    if (order.empty()) {
        order.push_back(name);
    }
    return ok;
}

bool PackageManager::getAncestryDependencyOrder(const char* name, std::vector<PackageInfo>& pkgs,
                                                std::vector<std::string>& order) {
    if (name == nullptr) {
        return false;
    }
    if (pkgs.empty()) {
        return true;
    }
    Graph graph(pkgs.size());
    std::map<std::string, unsigned long long> vertex;
    std::map<std::string, PackageInfo> records;
    for (const PackageInfo& info : pkgs) {
        vertex[info.package] = graph.addVertex(info.package);
        records[info.package] = info;
    }
    if (vertex.find(name) == vertex.end()) {
        return true;
    }
    order.clear();
    for (size_t i = 0; i < pkgs.size(); ++i) {
        for (const PackageBasicInfo& dep : pkgs[i].dep_packages) {
            auto it = vertex.find(dep.package);
            if (it == vertex.end()) {
                order.push_back(dep.package);
                CORV_LOG_ERR("Failed to find the dependecence between %s and %s",
                             pkgs[i].package.c_str(), dep.package.c_str());
            } else {
                graph.addEdge(i, it->second);
            }
        }
    }
    graph.visit(vertex[name]);
    std::vector<PackageInfo> ancestry;
    for (const std::string& pkg : graph.getResult()) {
        ancestry.push_back(records[pkg]);
    }
    pkgs = ancestry;
    bool ok = topologicalSortPkgs(&pkgs, order);
    if (order.empty()) {
        order.push_back(name);
    }
    std::vector<PackageInfo> sorted;
    for (const std::string& pkg : order) {
        auto it = records.find(pkg);
        if (it != records.end()) {
            sorted.push_back(it->second);
        }
    }
    pkgs = sorted;
    return ok;
}

void PackageManager::getDepServicePkgs(const std::set<std::string>& services,
                                       std::vector<PackageInfo>& pkgs) {
    for (const std::string& name :
         enumPackages(static_cast<const char*>(nullptr), PKG_INFO_MASK_ALL)) {
        PackageInfo info;
        if (!getPackageInfo(name, info, nullptr, PKG_INFO_MASK_ALL)) {
            continue;
        }
        for (const std::string& service : services) {
            if (isServiceEnabled(info.package.c_str()) &&
                PMSGetStartDepServiceSet(info).count(service)) {
                pkgs.push_back(info);
                break;
            }
        }
    }
}

void PackageManager::getDepServicePkgs(const std::vector<unsigned int>&,
                                       std::vector<PackageInfo>&) {}

bool PackageManager::isServiceEnabled(const char* name) {
    if (name == nullptr || name[0] == '\0') {
        setResult(PKG_ERR_SYSTEM);
        return false;
    }
    const std::string registry = std::string("/var/packages/") + name;
    if (!VLIBCFileCheckDir(registry.c_str())) {
        setResult(PKG_ERR_NOT_INSTALLED);
        return false;
    }
    if (access((registry + "/enabled").c_str(), F_OK) != 0) {
        setResult(PKG_ERR_NOT_ENABLED);
        return false;
    }
    setResult(PKG_OK);
    return true;
}

bool PackageManager::hasEnableConf(const std::string& registryDir, bool&) {
    return access((registryDir + "/enabled").c_str(), F_OK) == 0;
}

}  // namespace CORVPackageTool
