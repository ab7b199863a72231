// Installing a package's configuration file into a system directory.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "io_util.h"

namespace CORV {
namespace PkgUtils {

namespace {

constexpr size_t kConfigFileLimit = 16 << 20;

}  // namespace

bool InstallConfigFile(const std::string& source, const std::string& destination, mode_t mode,
                       bool replace) {
    if (source.empty() || destination.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    struct stat st;
    if (!replace && lstat(destination.c_str(), &st) == 0) {
        VLIBCErrSet(0x0800);
        return false;
    }
    // Configuration files: small enough to be read whole and replaced in one step.
    std::string content;
    if (!corvplat::readWhole(source.c_str(), kConfigFileLimit, content)) {
        return false;
    }
    return corvplat::replaceWhole(destination, content, mode, nullptr);
}

bool InstallExecutable(const std::string& source, const std::string& destination, bool replace) {
    return InstallConfigFile(source, destination, 0755, replace);
}

}  // namespace PkgUtils
}  // namespace CORV
