// The detached look for package updates after an install.
#include "corv/nsinfo.h"
#include "corvpkg/pkgserver.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

void PMSRunUpgradeCheck(const char* userName, const char* language) {
    // A machine without a maker store has nothing to ask, and no list cache should appear
    // for it.
    char store[CORV_NSINFO_STORE_BUFFER] = {0};
    if (CORVMYNSServerConfigGet(store) < 0) {
        return;
    }
    // Unscheduled: it refreshes nothing, installs nothing and tells nobody; it keeps the
    // desktop's badge in step with what the install changed.
    PMSCheckUpgrade(false, userName, language, nullptr);
}

}  // namespace CORVPackageTool
