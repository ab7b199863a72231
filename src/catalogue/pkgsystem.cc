// A summary of what this machine offers packages.
#include <stdio.h>

#include <string>
#include <vector>

#include "corv/share.h"
#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

Json::Value listOf(const std::string& text) {
    Json::Value out(Json::arrayValue);
    size_t start = 0;
    while (start < text.size()) {
        size_t comma = text.find(',', start);
        if (comma == std::string::npos) {
            comma = text.size();
        }
        if (comma > start) {
            out.append(text.substr(start, comma - start));
        }
        start = comma + 1;
    }
    return out;
}

// The shared folders with their directories and who may write and read them.
Json::Value sharesInfo() {
    Json::Value out(Json::arrayValue);
    std::vector<std::string> names;
    CORVShareEnum(&names);
    for (const std::string& name : names) {
        PCORVSHARE share = nullptr;
        if (CORVShareGet(name.c_str(), &share) != 0) {
            continue;
        }
        Json::Value entry(Json::objectValue);
        entry["name"] = name;
        entry["path"] = share->path;
        entry["rw"] = listOf(share->rwList);
        entry["ro"] = listOf(share->roList);
        out.append(entry);
        CORVShareFree(share);
    }
    return out;
}

}  // namespace

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
    out["shares"] = sharesInfo();
    return out;
}

}  // namespace CORVPackageTool
