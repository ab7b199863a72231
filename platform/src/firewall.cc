// Firewall reloads of the reference platform: recorded, never applied to the host.
#include "corv/firewall.h"
#include "corv/handles.h"

#include <stdio.h>
#include <time.h>

#include "corv/log.h"
#include "corv/vlibc.h"

int CORVFwRuleHup() {
    if (CORVFSMkdirP("/run/corvfw", nullptr, 1, -1, -1, 0755) != 0) {
        return -1;
    }
    CORVUniqueFile out{fopen("/run/corvfw/reloads", "a")};
    if (!out) {
        CORV_LOG_ERR("Failed to open /run/corvfw/reloads (%m)");
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    const bool ok = fprintf(out.get(), "%lld reload\n", static_cast<long long>(time(nullptr))) > 0;
    if (fclose(out.release()) != 0 || !ok) {
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    return 0;
}
