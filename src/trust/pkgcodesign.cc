// Whether a package file may be installed, given who signed it and how far the
// administrator trusts package sources.
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/codesign.h"
#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kTrustKey = "pkg_source_trust_level";
constexpr size_t kPathSize = 4096;

}  // namespace

PKG_ERRCODE PackageManager::verifyPackageSignature(const char* path) {
    if (path == nullptr) {
        return PKG_ERR_SIGNATURE_SYSTEM;
    }
    char value[32] = "";
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, kTrustKey, value, sizeof(value), 0) < 0) {
        CORV_LOG_ERR("Failed to get: %s", kTrustKey);
        return PKG_ERR_SIGNATURE_SYSTEM;
    }
    const long level = strtol(value, nullptr, 10);
    if (level == 2) {
        return PKG_SIGNATURE_OK;
    }
    char absolute[kPathSize];
    if (path[0] == '/') {
        snprintf(absolute, sizeof(absolute), "%s", path);
    } else {
        char cwd[kPathSize];
        if (getcwd(cwd, sizeof(cwd)) == nullptr) {
            CORV_LOG_ERR("Failed to getcwd, errno=%m");
            return PKG_ERR_SIGNATURE_SYSTEM;
        }
        int n = snprintf(absolute, sizeof(absolute), "%s/%s", cwd, path);
        if (n < 0 || static_cast<size_t>(n) >= sizeof(absolute)) {
            CORV_LOG_ERR("Path too long: %s", path);
            return PKG_ERR_SIGNATURE_SYSTEM;
        }
    }
    // The tool's words are kept from the caller's output, which may be a protocol of
    // its own (JSON for scripts); only the exit status is the answer.
    const char* const* command = CORVCodesignCommand();
    CORVUtils::ProcessRunner tool(command[0]);
    for (const char* const* part = command + 1; *part != nullptr; ++part) {
        tool.addArguments(*part);
    }
    tool.addArguments("--verify", absolute);
    int status = tool.run(true, true);
    if (status > 5 || status < 0) {
        CORV_LOG_ERR("%s: %d %s", tool.toString().c_str(), status,
                     tool.getCapturedOutputErr().c_str());
    }
    switch (status) {
        case 0:
            return PKG_SIGNATURE_OK;
        case 1:
            return level == 0 ? PKG_ERR_NOT_MAKER_SIGNED : PKG_SIGNATURE_OK;
        case 2:
            return PKG_ERR_UNKNOWN_PUBLISHER;
        case 3:
            return PKG_ERR_NO_SIGNATURE;
        case 4:
            return PKG_ERR_CERT_EXPIRED;
        case 5:
            return PKG_ERR_SIGNATURE_BAD;
        default:
            return PKG_ERR_SIGNATURE_SYSTEM;
    }
}

}  // namespace CORVPackageTool
