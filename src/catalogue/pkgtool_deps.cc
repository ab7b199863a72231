// Dependency and conflict lists in their two INFO-side forms: the one-line string and
// the section file.
#include <errno.h>
#include <stdio.h>

#include <string>

#include "catalogue/pkginfo_private.h"
#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

struct DepOperator {
    const char* text;
    PKG_VERSION_COMPOP op;
};

// The two-character operators first, so that "<=" is not read as "<" followed by "=".
const DepOperator kDepOperators[] = {
    {"<=", PKG_COMPOP_LE}, {">=", PKG_COMPOP_GE}, {"<", PKG_COMPOP_LT},
    {">", PKG_COMPOP_GT},  {"=", PKG_COMPOP_EQ},
};

constexpr int kSectionCapacity = 1024;

}  // namespace

void PMSExplodeDepPKGString(const char* text, DepPkgVector& out) {
    if (text == nullptr) {
        return;
    }
    for (const std::string& item : PMSExplodeString(text, ":")) {
        bool found = false;
        for (const DepOperator& candidate : kDepOperators) {
            size_t pos = item.rfind(candidate.text);
            if (pos == std::string::npos) {
                continue;
            }
            found = true;
            size_t after = pos + std::char_traits<char>::length(candidate.text);
            // A bound that is missing adds nothing, not an unbounded entry.
            if (after < item.size()) {
                out.pushDepPkg(item.substr(0, pos), item.substr(after), candidate.op);
            }
            break;
        }
        if (!found) {
            out.pushDepPkg(item, "0", PKG_COMPOP_NONE);
        }
    }
}

int PMSLoadDepConfFile(const char* path, DepPkgVector& out) {
    if (path == nullptr) {
        CORV_LOG_ERR("Bad parameters");
        return -1;
    }
    SzList sections(kSectionCapacity);
    if (!sections) {
        CORV_LOG_ERR("Failed to VLIBCSzListAlloc, errno=0X%X", errno);
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    int count = VLIBCFileEnumSection(path, sections.addr());
    if (count < 0) {
        CORV_LOG_ERR("Failed to VLIBCFileEnumSection %s, errno=0X%X", path, errno);
        return -1;
    }
    if (count == 0) {
        return 0;
    }
    SzHash fields(kSectionCapacity);
    if (!fields) {
        CORV_LOG_ERR("failed to VLIBCSzHashAlloc, corv_error=[%X]", VLIBCErrGet());
        return -1;
    }

    int applied = 0;
    for (int i = 0; i < count; ++i) {
        const char* name = VLIBCSzListGet(sections.get(), i);
        if (name == nullptr) {
            continue;
        }
        VLIBCHashRemoveAll(fields.get());
        int nFields = VLIBCFileGetSection(path, name, fields.addr());
        if (nFields < 0) {
            CORV_LOG_ERR(
                "failed to VLIBCFileGetSection, path: %s, section name: %s, nFields: %d, "
                "corv_error=[%X]",
                path, name, nFields, VLIBCErrGet());
            continue;
        }
        // A section may apply only to a range of OS versions.
        int bound[3];
        if (const char* v = VLIBCSzHashGetValue(fields.get(), "nos_min_ver")) {
            PMSParseOSVersion(v, bound);
            if (PMSCompareOSVersion(bound) < 0) {
                continue;
            }
        }
        if (const char* v = VLIBCSzHashGetValue(fields.get(), "nos_max_ver")) {
            PMSParseOSVersion(v, bound);
            if (PMSCompareOSVersion(bound) > 0) {
                continue;
            }
        }
        ++applied;
        const char* minVer = VLIBCSzHashGetValue(fields.get(), "pkg_min_ver");
        const char* maxVer = VLIBCSzHashGetValue(fields.get(), "pkg_max_ver");
        if (minVer != nullptr) {
            out.pushDepPkg(name, minVer, PKG_COMPOP_GE);
        }
        if (maxVer != nullptr) {
            out.pushDepPkg(name, maxVer, PKG_COMPOP_LE);
        }
        if (minVer == nullptr && maxVer == nullptr) {
            out.pushDepPkg(name, "0", PKG_COMPOP_NONE);
        }
    }
    return count + applied;
}

}  // namespace CORVPackageTool
