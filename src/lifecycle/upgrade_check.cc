// The detached look for package updates after an install.
#include "corvpkg/pkgserver.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

void PMSRunUpgradeCheck(const char* userName, const char* language) {
    // Unscheduled: it refreshes nothing, installs nothing and tells nobody; it keeps the
    // desktop's badge in step with what the install changed.
    PMSCheckUpgrade(false, userName, language, nullptr);
}

}  // namespace CORVPackageTool
