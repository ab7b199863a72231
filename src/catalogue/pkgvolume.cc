// What machine this is: its platform code and architecture mask.
#include <string.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {
constexpr size_t kPlatformCodeSize = 128;
}

std::string PMSGetSystemArchString() {
    char unique[kPlatformCodeSize] = "";
    if (VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "unique", unique, sizeof(unique), 0) <= 0) {
        CORV_LOG_ERR("system unique not found");
        return "";
    }
    // "<vendor>_<platform>_<model>": the platform is between the first two underscores.
    const char* first = strchr(unique, '_');
    if (first == nullptr) {
        return "";
    }
    const char* second = strchr(first + 1, '_');
    if (second == nullptr) {
        return "";
    }
    return std::string(first + 1, second);
}

int PMSGetSystemArch() {
    std::string code = PMSGetSystemArchString();
    if (code.empty()) {
        return 0;
    }
    int mask = PMSMapSystemArch(code.c_str());
    // 1 is no table value, so it can stand for "a platform the table does not know".
    return mask == 0 ? 1 : mask;
}

}  // namespace CORVPackageTool
