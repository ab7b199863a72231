// The payload checksum as the system's openssl tool computes it.
#include "catalogue/pkgchecksum.h"

#include <string.h>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace CORVPackageTool {

PendingChecksum::~PendingChecksum() {
    if (out_ != nullptr) {
        VLIBCPclose(out_);
    }
}

bool PendingChecksum::start(const char* path) {
    if (out_ != nullptr || path == nullptr || !VLIBCFileExist(path)) {
        return false;
    }
    path_ = path;
    out_ = VLIBCPopen("/usr/bin/openssl", "r", "md5", path, nullptr);
    return out_ != nullptr;
}

bool PendingChecksum::matches(const char* expected) {
    if (out_ == nullptr || expected == nullptr) {
        return false;
    }
    char line[1024] = "";
    bool read = fgets(line, sizeof(line), out_) != nullptr;
    VLIBCPclose(out_);
    out_ = nullptr;
    if (!read) {
        CORV_LOG_ERR("%s failed, path=%s", "/usr/bin/openssl md5", path_.c_str());
        return false;
    }
    line[strcspn(line, "\n")] = '\0';
    const char* sum = strstr(line, "= ");
    if (sum == nullptr) {
        CORV_LOG_ERR("Invalid output");
        return false;
    }
    return strcmp(sum + 2, expected) == 0;
}

}  // namespace CORVPackageTool
