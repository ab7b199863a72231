// What a package's file tree holds: which control scripts it ships.
#include <sys/stat.h>

#include <string>

#include "corv/log.h"
#include "corvpkg/pkgfile.h"

namespace CORVPackageTool {

const PKG_SCRIPT_ENTRY g_PackageScripts[PKG_SCRIPT_COUNT] = {
    {"start-stop-status", 0x01}, {"preinst", 0x02},    {"postinst", 0x04},    {"preuninst", 0x08},
    {"postuninst", 0x10},        {"preupgrade", 0x20}, {"postupgrade", 0x40},
};

unsigned int PMGetScriptMask(const std::string& scriptsDir) {
    unsigned int mask = 0;
    for (const PKG_SCRIPT_ENTRY& script : g_PackageScripts) {
        const std::string path = scriptsDir + "/" + script.name;
        struct stat st {};
        if (stat(path.c_str(), &st) != 0) {
            continue;
        }
        mask |= script.bit;
        // Archives made by hand often lose the execute bit; a script that exists is meant
        // to run.
        if ((st.st_mode & S_IXUSR) == 0 && chmod(path.c_str(), 0700) != 0) {
            CORV_LOG(LOG_EMERG, "chmod error: %m");
        }
    }
    return mask;
}

}  // namespace CORVPackageTool
