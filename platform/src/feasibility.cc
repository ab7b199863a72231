// The feasibility check types and their directories.
#include "corv/feasibility.h"

#include <stdio.h>
#include <string.h>

#include "corv/vlibc.h"

namespace {

const char* const kTypes[] = {"poweroff", "reboot", "upgrade", "volume-remove"};

}  // namespace

int CORVFeasibilityCheckTypeValidate(const char* type, int flags, char* buffer, int size) {
    bool known = false;
    for (const char* candidate : kTypes) {
        known = known || (type != nullptr && strcmp(type, candidate) == 0);
    }
    if (!known || (flags == 2 && (buffer == nullptr || size <= 0))) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (flags == 2 &&
        snprintf(buffer, size, "/usr/local/share/feasibilitycheck/%s.d", type) >= size) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    return 0;
}
