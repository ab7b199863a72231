// A summary of what this machine offers packages.
#include <stdio.h>

#include <string>

#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

Json::Value PMSGetSystemInfo(unsigned long long installSize) {
    Json::Value out(Json::objectValue);
    char version[64];
    snprintf(version, sizeof(version), "%d.%d-%d", PKG_OS_MAJOR, PKG_OS_MINOR, PKG_OS_BUILD);
    out["os_version"] = version;
    out["platform"] = PMSGetSystemArchString();
    char arch[16];
    snprintf(arch, sizeof(arch), "0x%08X", static_cast<unsigned int>(PMSGetSystemArch()));
    out["arch"] = arch;
    char unique[256] = "";
    VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "unique", unique, sizeof(unique), 0);
    out["model"] = unique;
    out["small_box"] = VLIBCIsDockette() != 0;

    Json::Value volumes(Json::arrayValue);
    CORVMOUNTVOLINFO* list = CORVMountVolAllEnum(nullptr, 0xFF, nullptr);
    for (CORVMOUNTVOLINFO* v = list; v != nullptr; v = v->next) {
        Json::Value vol(Json::objectValue);
        vol["path"] = v->szMountPath;
        vol["free_bytes"] = static_cast<Json::UInt64>(v->freeBytes);
        vol["ready"] = v->ready != 0;
        vol["read_only"] = v->readOnly != 0;
        vol["kind"] = v->kind;
        volumes.append(vol);
    }
    CORVMountVolInfoFree(list);
    out["volumes"] = volumes;

    std::string defVol;
    bool defUsable = PMSGetPackageDefVol(defVol);
    out["default_volume"] = defVol;
    out["default_volume_usable"] = defUsable;

    Json::Value tmp(Json::objectValue);
    tmp["install_size"] = static_cast<Json::UInt64>(installSize);
    std::string dir;
    if (PMSGetTmpDir(installSize, dir) || PMSGetSystemTmpDir(installSize, dir)) {
        tmp["dir"] = dir;
    } else {
        char err[16];
        snprintf(err, sizeof(err), "0x%04X", VLIBCErrGet());
        tmp["dir"] = "";
        tmp["error"] = err;
    }
    out["temporary"] = tmp;
    return out;
}

}  // namespace CORVPackageTool
