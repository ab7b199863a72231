#include "corvpkg/corvpkg.h"

namespace CORVPackageTool {
const char* CORVPKGLibraryVersion() {
    return CORVPKG_VERSION;
}
}  // namespace CORVPackageTool
