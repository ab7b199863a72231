// The system's service names, from the service configuration directory.
#include <errno.h>
#include <string.h>

#include <string>

#include "corv/vlibc.h"

int VLIBServiceEnum(PVLIBSZLIST* list) {
    if (list == nullptr || *list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    // A machine without any service configuration simply has no services.
    if (!VLIBCFileCheckDir(VLIB_SERVICE_CFG_DIR)) {
        return 0;
    }
    static const char kSuffix[] = ".cfg";
    const size_t suffixLen = sizeof(kSuffix) - 1;
    PVLIBSZLIST files = VLIBCSzListAlloc(64);
    if (files == nullptr) {
        return -1;
    }
    int count = VLIBCFileEnumDir(VLIB_SERVICE_CFG_DIR, kSuffix, &files, 0);
    int added = 0;
    for (int i = 0; i < count; ++i) {
        std::string name(VLIBCSzListGet(files, i));
        name.resize(name.size() - suffixLen);
        if (name.empty()) {
            continue;  // ".cfg" alone names nothing
        }
        if (VLIBCSzListPush(list, name.c_str()) != 0) {
            added = -1;
            break;
        }
        ++added;
    }
    VLIBCSzListFree(files);
    return count < 0 ? -1 : added;
}
