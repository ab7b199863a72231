// The reference platform's signature tool.
#include "corv/codesign.h"

const char* const* CORVCodesignCommand() {
    static const char* const kCommand[] = {"/usr/corv/bin/corv-codesign", nullptr};
    return kCommand;
}
