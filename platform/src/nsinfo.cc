#include "corv/nsinfo.h"

#include <stdio.h>
#include <string.h>

#include "corv/vlibc.h"

namespace {

// The OS release that the reference platform stands for.
const char kOsRelease[] = "6.1-15101";

}  // namespace

int VLIBNsinfoUserAgentGet(const char* type, char* buffer, int size) {
    if (type == nullptr || buffer == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    char unique[256] = {0};
    if (VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "unique", unique, sizeof unique, 0) <= 0) {
        VLIBCErrSet(ERR_KEY_NOT_FOUND);
        return -1;
    }
    int length = snprintf(buffer, size, "CorvNOS/%s (%s) %s", kOsRelease, unique, type);
    if (length < 0 || length >= size) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    return length;
}

int CORVMYNSServerConfigGet(char* buffer) {
    if (buffer == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    int length = VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "package_server", buffer,
                                      CORV_NSINFO_STORE_BUFFER, 0);
    if (length < 0) {
        VLIBCErrSet(ERR_READ_FAILED);
        return -1;
    }
    while (length > 0 && buffer[length - 1] == '/') {
        buffer[--length] = '\0';
    }
    if (length == 0) {
        VLIBCErrSet(ERR_KEY_NOT_FOUND);
        return -1;
    }
    return length;
}
