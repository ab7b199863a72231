// Queries for named packages and recommended lists of the maker's store, and the install
// order of a package that is only on the store.
#include <stdio.h>

#include "corv/log.h"
#include "corv/nsinfo.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "store/json_value.h"
#include "store/pkgserver_private.h"

namespace CORVPackageTool {

namespace {

int g_serverResult = 0;

// The maker store's address; false (logged) without one.
bool makerBase(std::string& base) {
    char buffer[CORV_NSINFO_STORE_BUFFER] = {0};
    if (CORVMYNSServerConfigGet(buffer) < 0) {
        CORV_LOG_ERR("Failed to get package_server in %s.", "/etc.defaults/corvinfo.conf");
        return false;
    }
    base = buffer;
    return true;
}

}  // namespace

int CORVPackageServer::getResult() {
    return g_serverResult;
}

void PMSSetServerResult(int code) {
    g_serverResult = code;
}

bool CORVPackageServer::PMSGetPkgListFromServer(const char* language,
                                                const std::vector<PackageInfo>& wanted,
                                                std::vector<PackageInfo>& found) {
    if (language == nullptr) {
        CORV_LOG_ERR("szLang can not be NULL");
        return false;
    }
    std::string base;
    if (!makerBase(base)) {
        return false;
    }
    Json::Value list(Json::arrayValue);
    for (const PackageInfo& info : wanted) {
        Json::Value item(Json::objectValue);
        item["id"] = info.package;
        item["version"] = info.version;
        list.append(item);
    }
    Json::Value extra(Json::objectValue);
    extra["pkg_list"] = list;
    const std::string url = base + "/api/getPackages.php";
    std::string reply;
    if (!PMSQueryPkgServer(language, reply, url.c_str(), false, extra)) {
        CORV_LOG_ERR("Failed to query pacakge server [%s]", url.c_str());
        return false;
    }
    Json::Value data;
    if (!PMSParseReply(reply, data)) {
        return false;
    }
    if (!data.isObject() || !data.isMember("packages")) {
        CORV_LOG_ERR("Format error: jsData has no packages member");
        return false;
    }
    if (!data["packages"].isArray()) {
        CORV_LOG_ERR("Format Error: jsData is not json array");
        return false;
    }
    found.clear();
    for (const Json::Value& entry : data["packages"]) {
        PackageInfo info;
        PMSMapJsonToPackageInfo(entry, info);
        found.push_back(info);
    }
    return true;
}

bool CORVPackageServer::PMSGetPkgFromServer(const char* language, PackageInfo& info) {
    if (language == nullptr) {
        g_serverResult = PKG_ERR_SYSTEM;
        CORV_LOG_ERR("szLang can not be NULL");
        return false;
    }
    if (info.package.empty()) {
        g_serverResult = PKG_ERR_SYSTEM;
        CORV_LOG_ERR("Package name is empty");
        return false;
    }
    std::vector<PackageInfo> found;
    if (!PMSGetPkgListFromServer(language, {info}, found)) {
        g_serverResult = PKG_ERR_SERVER;
        return false;
    }
    if (found.size() != 1) {
        g_serverResult = PKG_ERR_NOT_INSTALLED;
        return false;
    }
    info = found[0];
    return true;
}

bool CORVPackageServer::PMSGetRecommendPkgList(const char* language, const char* phpName,
                                               Json::Value& out) {
    if (language == nullptr || phpName == nullptr) {
        CORV_LOG_ERR("Bad Parameter, szLang and szPhpName can not be null");
        return false;
    }
    std::string base;
    if (!makerBase(base)) {
        return false;
    }
    const std::string url = base + "/api/" + phpName;
    std::string reply;
    if (!PMSQueryPkgServer(language, reply, url.c_str(), false, Json::Value())) {
        CORV_LOG_ERR("Failed to query pacakge server [%s]", url.c_str());
        return false;
    }
    return PMSParseReply(reply, out);
}

bool PackageManager::getAncestryDepOrderByServer(const char* name, const char* language,
                                                 std::vector<PackageInfo>& pkgs) {
    if (name == nullptr || language == nullptr) {
        setResult(PKG_ERR_SYSTEM);
        CORV_LOG_ERR("Bad Parameter");
        return false;
    }
    Json::Value json;
    if (!CORVPackageServer::PMSQueryCorvPkgServer(false, language, json)) {
        setResult(PKG_ERR_SERVER);
        CORV_LOG_ERR("Failed to query pacakge server");
        return false;
    }
    if (!json.isObject() || !json.isMember("packages")) {
        setResult(PKG_ERR_SERVER);
        CORV_LOG_ERR("Format error: jsData has no packages member");
        return false;
    }
    if (!json["packages"].isArray()) {
        setResult(PKG_ERR_SERVER);
        CORV_LOG_ERR("Format error: jsData is not json array");
        return false;
    }
    std::vector<PackageInfo> list;
    bool seen = false;
    for (const Json::Value& entry : json["packages"]) {
        if (jsonText(entry, "package", "").empty()) {
            continue;
        }
        PackageInfo info;
        if (!PMSMapJsonToPackageInfo(entry, info)) {
            setResult(PKG_ERR_SYSTEM);
            CORV_LOG_ERR("Failed map json data to PackageInfo");
            return false;
        }
        seen = seen || info.package == name;
        list.push_back(info);
    }
    if (!seen) {
        setResult(PKG_ERR_NOT_INSTALLED);
        return false;
    }
    std::vector<std::string> order;
    if (!getAncestryDependencyOrder(name, list, order)) {
        setResult(PKG_ERR_SYSTEM);
        CORV_LOG_ERR("Failed to get dependecy of package [%s]", name);
        return false;
    }
    pkgs = list;
    return true;
}

}  // namespace CORVPackageTool
