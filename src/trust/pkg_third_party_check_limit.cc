// Version limits that the maker sets for third-party packages.
#include <stdlib.h>

#include <algorithm>

#include <string>

#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkglimit.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

constexpr int kLimitValueSize = 512;
constexpr int kPieceCapacity = 32;

// a < x < b, strictly.
bool strictlyBetween(const std::string& a, const char* x, const std::string& b) {
    return !PMSVersionNotLess(a.c_str(), x) && !PMSVersionNotLess(x, b.c_str());
}

}  // namespace

bool PMSVersionNotLess(const char* a, const char* b) {
    std::string normA;
    std::string normB;
    if (!NormalizeVersion(a, b, normA) || !NormalizeVersion(b, a, normB)) {
        CORV_LOG_ERR("Failed to NormalizeVersion().");
        return false;
    }
    SzList piecesA(kPieceCapacity);
    SzList piecesB(kPieceCapacity);
    if (!piecesA || !piecesB) {
        CORV_LOG_ERR("Failed to VLIBCSzListAlloc().[0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (VLIBCStrTok(normA.c_str(), ".-", piecesA.addr()) < 0 ||
        VLIBCStrTok(normB.c_str(), ".-", piecesB.addr()) < 0) {
        CORV_LOG_ERR("Failed to VLIBCStrTok().[0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return false;
    }
    const int n = std::max(VLIBCSzListCount(piecesA.get()), VLIBCSzListCount(piecesB.get()));
    for (int i = 0; i < n; ++i) {
        const char* pa = VLIBCSzListGet(piecesA.get(), i);
        const char* pb = VLIBCSzListGet(piecesB.get(), i);
        long x = pa ? strtol(pa, nullptr, 10) : 0;
        long y = pb ? strtol(pb, nullptr, 10) : 0;
        if (x != y) {
            return x > y;
        }
    }
    return true;
}

int PMSThirdPartyCheckLimit(const char* packageName, const char* version, std::string& limit) {
    if (packageName == nullptr || version == nullptr) {
        CORV_LOG_ERR("Invaild Argument (%s)=[%d]\n", "NULL == packageName || NULL == version", 1);
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    char value[kLimitValueSize] = "";
    int n = VLIBCFileGetKeyValue(PKG_LIMIT_CONF, packageName, value, sizeof(value), 0);
    if (n < 0) {
        CORV_LOG_ERR("VLIBCFileGetKeyValue() failed, corverr=0x%04X", VLIBCErrGet());
        return -1;
    }
    if (n == 0) {
        return 0;
    }
    const std::string text = value;
    if (text == "system") {
        return -3;
    }
    if (text == "non") {
        return -4;
    }
    Json::Value parsed;
    bool isArray = fromString(text, parsed) && parsed.isArray() && !parsed.empty();
    // One range.
    if (isArray && parsed[0].isString()) {
        const std::string a = parsed[0].asString();
        const std::string b = parsed.size() > 1 ? parsed[1].asString() : "";
        if (!strictlyBetween(a, version, b)) {
            return 0;
        }
        limit = b;
        return -2;
    }
    // A list of bounds and ranges; `limit` ends as the highest bound met.
    if (isArray && parsed[0].isArray()) {
        int result = -1;
        bool barred = false;
        const Json::Value& first = parsed[0];
        std::string candidate =
            first.size() == 2 ? first[1].asString() : (first.empty() ? "" : first[0].asString());
        for (const Json::Value& element : parsed) {
            if (!element.isArray()) {
                return barred ? -2 : result;
            }
            if (element.size() == 1) {
                const std::string m = element[0].asString();
                if (!PMSVersionNotLess(version, m.c_str())) {
                    barred = true;
                }
                candidate = m;
            } else if (element.size() == 2) {
                const std::string a = element[0].asString();
                const std::string b = element[1].asString();
                if (strictlyBetween(a, version, b)) {
                    barred = true;
                }
                candidate = b;
            }
            if (limit.empty() || PMSVersionNotLess(candidate.c_str(), limit.c_str())) {
                limit = candidate;
            }
        }
        if (!barred) {
            limit = version;
            return 0;
        }
        return -2;
    }
    // A plain version.
    limit = text;
    return PMSVersionNotLess(version, text.c_str()) ? 0 : -2;
}

int PMSThirdPartyCheckLimit(const char* packageName, const char* version) {
    std::string limit;
    return PMSThirdPartyCheckLimit(packageName, version, limit);
}

}  // namespace CORVPackageTool
