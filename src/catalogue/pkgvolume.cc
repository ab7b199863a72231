// What machine this is, which volumes may take a package, and whether a package's
// architecture and model fit this machine.
#include "corvpkg/pkgvolume.h"

#include <string.h>
#include <sys/stat.h>
#include <sys/statfs.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

constexpr size_t kPlatformCodeSize = 128;
constexpr size_t kUniqueSize = 256;
constexpr size_t kDefVolSize = 256;

bool readUnique(char* buf, size_t size) {
    if (VLIBCFileGetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "unique", buf, static_cast<int>(size), 0) <=
        0) {
        CORV_LOG_ERR("system unique not found");
        return false;
    }
    return true;
}

bool contains(const std::vector<std::string>& list, const std::string& item) {
    for (const std::string& entry : list) {
        if (entry == item) {
            return true;
        }
    }
    return false;
}

}  // namespace

std::string PMSGetSystemArchString() {
    char unique[kPlatformCodeSize] = "";
    if (!readUnique(unique, sizeof(unique))) {
        return "";
    }
    // "<vendor>_<platform>_<model>": the platform is between the first two underscores.
    const char* first = strchr(unique, '_');
    if (first == nullptr) {
        return "";
    }
    const char* second = strchr(first + 1, '_');
    if (second == nullptr) {
        return "";
    }
    return std::string(first + 1, second);
}

int PMSGetSystemArch() {
    std::string code = PMSGetSystemArchString();
    if (code.empty()) {
        return 0;
    }
    int mask = PMSMapSystemArch(code.c_str());
    // 1 is no table value, so it can stand for "a platform the table does not know".
    return mask == 0 ? 1 : mask;
}

bool PMSCheckPackageArchMatched(const PackageInfo& info) {
    int sys = PMSGetSystemArch();
    if (sys == 0) {
        CORV_LOG_ERR("Failed to get system arch");
        return false;
    }
    // Taken literally, an INFO without "arch" (or with "noarch") does not match here; the
    // test must stay first.
    if (info.arch == 0xFFFFFFFF) {
        return false;
    }
    if (sys == 1) {
        // A platform the table does not know can only be matched by its name.
        std::string code = PMSGetSystemArchString();
        if (!info.exclude_arch_list.empty() && contains(info.exclude_arch_list, code)) {
            return false;
        }
        return contains(info.arch_list, code);
    }
    const unsigned int mask = static_cast<unsigned int>(sys);
    if (info.exclude_arch != 0 && (info.exclude_arch & mask) != 0) {
        return false;
    }
    return (info.arch & mask) != 0;
}

bool PMSCheckPackageModelMatched(const PackageInfo& info) {
    char unique[kUniqueSize] = "";
    if (!readUnique(unique, sizeof(unique))) {
        return false;
    }
    return info.model_list.empty() || contains(info.model_list, unique);
}

bool PMSCheckPackageArchModelMatched(const PackageInfo& info) {
    return PMSCheckPackageArchMatched(info) && PMSCheckPackageModelMatched(info);
}

bool PMSCheckVolStatus(const char* volume, unsigned long long size) {
    if (volume == nullptr) {
        return false;
    }
    CORVMOUNTVOLINFO info;
    if (CORVMountVolInfoGet(volume, &info) < 0) {
        if (VLIBCErrGet() != PKG_VOLERR_NO_SUCH_VOLUME) {
            CORV_LOG_ERR("Failed to get volume info %s, corverr=[0x%04X]", volume, VLIBCErrGet());
        }
        return false;
    }
    if (!info.ready) {
        VLIBCErrSet(PKG_VOLERR_NOT_READY);
        return false;
    }
    if (size > info.freeBytes) {
        VLIBCErrSet(PKG_VOLERR_NO_SPACE);
        return false;
    }
    return true;
}

bool PMSCheckFreeSpace(const char* path, unsigned long long size) {
    struct statfs64 st {};
    if (statfs64(path, &st) != 0) {
        CORV_LOG_ERR("Failed to get status of %s, %m", path);
        return false;
    }
    if (static_cast<unsigned long long>(st.f_bavail) * st.f_bsize < size) {
        VLIBCErrSet(PKG_VOLERR_NO_SPACE);
        CORV_LOG_ERR("%s space is not enough", path);
        return false;
    }
    return true;
}

int VolumeCountGet(int kinds) {
    CORVMOUNTVOLINFO* list = CORVMountVolAllEnum(nullptr, kinds, nullptr);
    int count = 0;
    for (CORVMOUNTVOLINFO* v = list; v != nullptr; v = v->next) {
        if (v->kind != CORV_VOL_KIND_ISCSI && v->ready) {
            ++count;
        }
    }
    CORVMountVolInfoFree(list);
    return count;
}

bool PMSGetPackageDefVol(std::string& volume) {
    char value[kDefVolSize] = "";
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, PKG_DEF_VOL_KEY, value, sizeof(value), 0) > 0) {
        volume = value;
    }
    if (PMSCheckVolStatus(value, PKG_ROOT_MARGIN)) {
        return true;
    }
    // A volume that exists but cannot serve stays named, so the caller can say which.
    if (VLIBCErrGet() == PKG_VOLERR_NO_SUCH_VOLUME) {
        volume.clear();
    }
    return false;
}

bool PMSSavePackageDefVolPath(const char* path) {
    if (path == nullptr) {
        return false;
    }
    // Anything that is not a volume clears the choice.
    std::string value = strncmp(path, "/volume", 7) == 0 ? path : "";
    if (!value.empty() && !PMSCheckVolStatus(value.c_str(), PKG_ROOT_MARGIN)) {
        return false;
    }
    if (VLIBCINFOSetKeyValue(PKG_DEF_VOL_KEY, value.c_str()) != 0) {
        CORV_LOG_ERR("Failed to set info key [%s] to [%s]", PKG_DEF_VOL_KEY, value.c_str());
        return false;
    }
    return true;
}

bool PackageManager::GetAppStoreVolume(const PackageInfo& info, const char* volume,
                                       unsigned long long size, std::string& out) {
    if (volume == nullptr || volume[0] == '\0') {
        return false;
    }
    // A small box has its one volume.
    if (VLIBCIsDockette()) {
        out = "/volume1";
        return PMSCheckFreeSpace("/volume1", size + PKG_VOLUME_MARGIN);
    }
    if (info.install_type == "system") {
        std::string path;
        if (!PMSGetSystemInstallPath(path)) {
            CORV_LOG_ERR("Failed to get system volumne");
            return false;
        }
        if (!PMSCheckFreeSpace(path.c_str(), size + PKG_VOLUME_MARGIN)) {
            return false;
        }
        out = path;
        return true;
    }
    char parsed[4096] = "";
    if (VolumePathParseEx(volume, parsed) < 0) {
        CORV_LOG_ERR("Failed to parse volume path: %s", volume);
        return false;
    }
    if (!PMSCheckVolStatus(parsed, size + PKG_VOLUME_MARGIN)) {
        return false;
    }
    out = parsed;
    return true;
}

bool PackageManager::CheckVolume(const char* cpkFile, const PackageInfo& info) {
    if (cpkFile == nullptr) {
        return false;
    }
    struct stat st {};
    if (stat(cpkFile, &st) != 0) {
        CORV_LOG_ERR("Failed to get status of %s, %m", cpkFile);
        return false;
    }
    const unsigned long long need = static_cast<unsigned long long>(st.st_size) + PKG_VOLUME_MARGIN;
    const bool dockette = VLIBCIsDockette();
    if (dockette) {
        if (!PMSCheckFreeSpace("/volume1", need)) {
            return false;
        }
    } else if (info.install_type == "system") {
        if (!PMSCheckFreeSpace(PKG_SYSTEM_INSTALL_PATH, need)) {
            return false;
        }
    }
    // Packages that live on a data volume need one.
    if (info.install_type != "system" && info.install_type != "cluster") {
        if (VolumeCountGet(dockette ? (CORV_VOL_KIND_USB | CORV_VOL_KIND_ESATA)
                                    : CORV_VOL_KIND_INTERNAL) == 0) {
            VLIBCErrSet(dockette ? PKG_VOLERR_NO_USB_VOLUME : PKG_VOLERR_NO_VOLUME);
            return false;
        }
    }
    return true;
}

}  // namespace CORVPackageTool
