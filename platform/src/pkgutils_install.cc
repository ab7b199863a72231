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

using corvplat::UniqueFd;

bool CopyAll(int from, int to) {
    char buffer[65536];
    for (;;) {
        ssize_t got = VLIBCRead(from, buffer, sizeof(buffer));
        if (got < 0) {
            return false;
        }
        if (got == 0) {
            return true;
        }
        for (ssize_t done = 0; done < got;) {
            ssize_t put = write(to, buffer + done, got - done);
            if (put < 0) {
                if (errno == EINTR) {
                    continue;
                }
                return false;
            }
            done += put;
        }
    }
}

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
    UniqueFd in(open(source.c_str(), O_RDONLY | O_CLOEXEC));
    if (in.get() < 0) {
        CORV_LOG_ERR("Failed to open %s (%m)", source.c_str());
        VLIBCErrSet(ERR_OPEN_FAILED);
        return false;
    }
    std::string tmp = destination + ".XXXXXX";
    UniqueFd out(mkstemp(&tmp[0]));
    if (out.get() < 0) {
        CORV_LOG_ERR("Failed to create tmp file for %s (%m)", destination.c_str());
        VLIBCErrSet(ERR_CREATE_FAILED);
        return false;
    }
    bool ok = CopyAll(in.get(), out.get()) && fchmod(out.get(), mode) == 0 && fsync(out.get()) == 0;
    if (close(out.release()) != 0) {
        ok = false;
    }
    if (!ok) {
        CORV_LOG_ERR("Failed to write %s (%m)", tmp.c_str());
        VLIBCErrSet(ERR_WRITE_FAILED);
        unlink(tmp.c_str());
        return false;
    }
    if (rename(tmp.c_str(), destination.c_str()) != 0) {
        CORV_LOG_ERR("Failed to rename %s to %s (%m)", tmp.c_str(), destination.c_str());
        VLIBCErrSet(ERR_RENAME_FAILED);
        unlink(tmp.c_str());
        return false;
    }
    return true;
}

bool InstallExecutable(const std::string& source, const std::string& destination, bool replace) {
    return InstallConfigFile(source, destination, 0755, replace);
}

}  // namespace PkgUtils
}  // namespace CORV
