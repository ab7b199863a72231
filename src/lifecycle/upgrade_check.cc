// The detached look for package updates after an install.
#include <syslog.h>

#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

void PMSRunUpgradeCheck(const char* userName, const char* language) {
    // This build does not talk to package stores yet, so there is never an update to find;
    // say so, so that someone reading the log after an install knows the check ran.
    syslog(LOG_INFO,
           "upgrade check after install (user %s, language %s): no package store "
           "is configured in this build, nothing to check",
           userName ? userName : "-", language ? language : "-");
}

}  // namespace CORVPackageTool
