// Dependency lists in their JSON form, as the package server sends them.
#include <string>

#include "catalogue/pkginfo_private.h"
#include "corv/log.h"
#include "corvpkg/pkginfo_json.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

// Pushes member `key` of `bounds` with `op` when it is a non-empty string.
bool pushBound(DepPkgVector& out, const std::string& name, const Json::Value& bounds,
               const char* key, PKG_VERSION_COMPOP op) {
    if (!bounds.isMember(key) || !bounds[key].isString() || bounds[key].asString().empty()) {
        return false;
    }
    out.pushDepPkg(name, bounds[key].asString(), op);
    return true;
}

bool osVersionMember(const Json::Value& bounds, const char* key, int version[3]) {
    if (!bounds.isMember(key)) {
        return false;
    }
    const Json::Value& v = bounds[key];
    PMSParseOSVersion(v.isString() ? v.asCString() : "", version);
    return true;
}

}  // namespace

int PMSParseDepJSON(const Json::Value& json, DepPkgVector& out) {
    if (json.empty() || !json.isObject()) {
        return 0;
    }
    int applied = 0;
    for (const std::string& name : json.getMemberNames()) {
        const Json::Value& bounds = json[name];
        if (!bounds.isObject() || bounds.empty()) {
            out.pushDepPkg(name, "0", PKG_COMPOP_NONE);
            ++applied;
            continue;
        }
        int os[3];
        if (osVersionMember(bounds, "nos_min_ver", os) && PMSCompareOSVersion(os) < 0) {
            continue;
        }
        if (osVersionMember(bounds, "nos_max_ver", os) && PMSCompareOSVersion(os) > 0) {
            continue;
        }
        // The long names win over the operators.
        ++applied;
        bool bounded = false;
        bounded |= pushBound(out, name, bounds, "pkg_min_ver", PKG_COMPOP_GE) ||
                   pushBound(out, name, bounds, ">=", PKG_COMPOP_GE);
        bounded |= pushBound(out, name, bounds, "pkg_max_ver", PKG_COMPOP_LE) ||
                   pushBound(out, name, bounds, "<=", PKG_COMPOP_LE);
        bounded |= pushBound(out, name, bounds, "<", PKG_COMPOP_LT);
        bounded |= pushBound(out, name, bounds, ">", PKG_COMPOP_GT);
        if (!pushBound(out, name, bounds, "=", PKG_COMPOP_EQ) && !bounded) {
            out.pushDepPkg(name, "0", PKG_COMPOP_NONE);
        }
    }
    return applied;
}

int PMSParseDepJSONString(const std::string& text, DepPkgVector& out) {
    if (text.empty()) {
        return 0;
    }
    Json::Reader reader;
    Json::Value value;
    if (!reader.parse(text, value, true)) {
        CORV_LOG_ERR("%s", reader.getFormattedErrorMessages().c_str());
        return -1;
    }
    return PMSParseDepJSON(value, out);
}

void DepPkgVector::toJSON(Json::Value& out) const {
    if (empty()) {
        out = Json::Value();
        return;
    }
    out = Json::Value(Json::objectValue);
    for (const PackageBasicInfo& entry : *this) {
        const char* op = PMSCompOpToStr(entry.compop);
        if (op[0] != '\0') {
            // A range merges into one object.
            if (!out[entry.package].isObject()) {
                out[entry.package] = Json::Value(Json::objectValue);
            }
            out[entry.package][op] = entry.version;
        } else {
            out[entry.package] = "";
        }
    }
}

void PackageBasicInfoMap::insertPackagae(std::string name, std::string version, bool beta,
                                         PKG_VERSION_COMPOP op) {
    PackageBasicInfo entry(name, std::move(version));
    entry.beta = beta;
    entry.compop = op;
    emplace(std::move(name), std::move(entry));
}

}  // namespace CORVPackageTool
