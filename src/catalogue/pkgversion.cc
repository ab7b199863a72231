// Version normalisation and comparison, and the OS limits of a package.
#include <stdlib.h>
#include <string.h>

#include <string>

#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

constexpr int kPieceCapacity = 32;
constexpr int kNormalBufferSize = 100;

// Reads a normal form token by token. A delimiter that is the last byte stays in the
// token ("1." reads as "1."), since the end test comes first; it does not change the
// token's number.
class TokenScan {
  public:
    explicit TokenScan(const std::string& s) : s_(s) {}
    std::string next() {
        const size_t n = s_.size();
        if (pos_ >= n) {
            return "";
        }
        for (size_t i = pos_;; ++i) {
            if (i + 1 >= n) {
                std::string token = s_.substr(pos_);
                pos_ = n;
                return token;
            }
            if (s_[i] == '-' || s_[i] == '.') {
                std::string token = s_.substr(pos_, i - pos_);
                pos_ = i + 1;
                return token;
            }
        }
    }

  private:
    const std::string& s_;
    size_t pos_ = 0;
};

long long number(const std::string& token) {
    return strtoll(token.c_str(), nullptr, 10);
}

size_t dots(const char* text) {
    size_t count = 0;
    for (; *text; ++text) {
        count += *text == '.';
    }
    return count;
}

// -1, 0 or 1: how `thisNorm` stands to `otherNorm`.
int compareNormal(const std::string& otherNorm, const std::string& thisNorm) {
    TokenScan other(otherNorm);
    TokenScan self(thisNorm);
    for (;;) {
        std::string a = other.next();
        std::string b = self.next();
        long long x = 0;
        long long y = 0;
        if (a.empty() && b.empty()) {
            return 0;
        }
        if (a.empty()) {
            y = number(b);
        } else if (b.empty()) {
            return number(a) != 0 ? -1 : 0;
        } else {
            x = number(a);
            y = number(b);
        }
        if (x != y) {
            return static_cast<unsigned long long>(x) < static_cast<unsigned long long>(y) ? 1 : -1;
        }
        if (a.empty() || b.empty()) {
            return 0;
        }
    }
}

}  // namespace

bool NormalizeVersion(const char* version, const char* reference, char** buffer, int* capacity) {
    SzList versionPieces(kPieceCapacity);
    SzList referencePieces(kPieceCapacity);
    if (!versionPieces || !referencePieces) {
        CORV_LOG_ERR("Failed to VLIBCSzListAlloc().[0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (VLIBCStrTok(version, "-", versionPieces.addr()) < 0 ||
        VLIBCStrTok(reference, "-", referencePieces.addr()) < 0) {
        CORV_LOG_ERR("Failed to VLIBCStrTok().[0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return false;
    }
    const char* firstVersion = VLIBCSzListGet(versionPieces.get(), 0);
    const char* firstReference = VLIBCSzListGet(referencePieces.get(), 0);
    if (firstVersion == nullptr || firstReference == nullptr) {
        CORV_LOG_ERR("Failed to VLIBCSzListGet().[0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    // The version only ever grows to the reference's shape.
    size_t have = dots(firstVersion);
    size_t want = dots(firstReference);
    if (VLIBCStrCat(buffer, capacity, firstVersion) < 0) {
        return false;
    }
    for (size_t i = have; i < want; ++i) {
        if (VLIBCStrCat(buffer, capacity, ".0") < 0) {
            return false;
        }
    }
    const char* build = VLIBCSzListGet(versionPieces.get(), 1);
    if (build != nullptr &&
        (VLIBCStrCat(buffer, capacity, "-") < 0 || VLIBCStrCat(buffer, capacity, build) < 0)) {
        return false;
    }
    return true;
}

bool NormalizeVersion(std::string version, std::string reference, std::string& normal) {
    int capacity = kNormalBufferSize;
    char* buffer = static_cast<char*>(calloc(1, static_cast<size_t>(capacity)));
    if (buffer == nullptr) {
        CORV_LOG_ERR("Fail to allocate");
        return false;
    }
    bool ok = NormalizeVersion(version.c_str(), reference.c_str(), &buffer, &capacity);
    if (ok) {
        normal = buffer;
    }
    free(buffer);
    return ok;
}

bool PackageBasicInfo::compare(const PackageBasicInfo& other, PKG_VERSION_COMPOP op) const {
    if (package != other.package) {
        return false;
    }
    std::string normOther;
    std::string normThis;
    if (!NormalizeVersion(other.version, version, normOther) ||
        !NormalizeVersion(version, other.version, normThis)) {
        CORV_LOG_ERR("Failed to NormalizeVersion");
        return false;
    }
    if (op == PKG_COMPOP_NONE) {
        return true;
    }
    int r = compareNormal(normOther, normThis);
    switch (op) {
        case PKG_COMPOP_EQ:
            return r == 0;
        case PKG_COMPOP_GT:
            return r == 1;
        case PKG_COMPOP_LT:
            return r == -1;
        case PKG_COMPOP_GE:
            return r >= 0;
        case PKG_COMPOP_LE:
            return r <= 0;
        default:
            return true;
    }
}

int PMSComparePackageAndOSVersion(PackageInfo& info) {
    if (PMSCompareOSVersion(PMSGetOSMinVer(info)) < 0) {
        return -1;
    }
    return PMSCompareOSVersion(PMSGetOSMaxVer(info)) > 0 ? 1 : 0;
}

bool PMSCheckPackageVersionVaild(PackageInfo& info) {
    return PMSCompareOSVersion(PMSGetOSMinVer(info)) >= 0 &&
           PMSCompareOSVersion(PMSGetOSMaxVer(info)) <= 0;
}

}  // namespace CORVPackageTool
