// The model question: a small box whose only volume is /volume1.
#include <strings.h>

#include <string>

#include "corv/vlibc.h"

int VLIBCIsDockette() {
    // A yes/no answer is no failure: whatever the reading leaves in the error slot would
    // hide the error that the caller is about to report.
    const int code = VLIBCErrGet();
    const std::string file = VLIBCErrorGetFile();
    const int line = VLIBCErrorGetLine();
    char value[16] = "";
    int n = -1;
    if (VLIBCFileExist(VLIBC_INFO_DEFAULTS_PATH)) {
        n = VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "dockette", value, sizeof(value), 0);
    }
    if (n < 0) {
        VLIBCErrSetEx(code, file.c_str(), line);
        return 0;  // without the defaults, the ordinary model
    }
    return strcasecmp(value, "yes") == 0 ? 1 : 0;
}
