// Where packages live and where temporary files may go: package targets, volumes, the
// temporary, list and download directories, and the machine's architecture and model.
// Functions return false and leave the reason in the platform's error slot (VLIBCErrGet):
// 0x0600 no such volume, 0x0C00 directory not made, 0x2900 not enough space, 0x3100 no
// volume on a small-box model, 0x8300 no volume, 0x8400 volume not ready, 0xDD00 no volume
// ready.
#pragma once

#include <json/json.h>

#include <string>

#include "corvpkg/pkginfo.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

class PackageManager;

// Safety margins: on a data volume, and on the root file system.
constexpr unsigned long long PKG_VOLUME_MARGIN = 0xA00000ULL;
constexpr unsigned long long PKG_ROOT_MARGIN = 0xC800000ULL;
constexpr const char* PKG_SYSTEM_INSTALL_PATH = "/usr/local/packages";
constexpr const char* PKG_NOT_VOLUME_PATH = "not_volume_path";
constexpr const char* PKG_DEF_VOL_KEY = "pkg_def_intall_vol";
constexpr const char* PKG_LIST_TMP_LINK = "/tmp/pkglist.tmp";

enum {
    PKG_VOLERR_NO_SUCH_VOLUME = 0x0600,
    PKG_VOLERR_MKDIR = 0x0C00,
    PKG_VOLERR_NO_SPACE = 0x2900,
    PKG_VOLERR_NO_USB_VOLUME = 0x3100,
    PKG_VOLERR_NO_VOLUME = 0x8300,
    PKG_VOLERR_NOT_READY = 0x8400,
    PKG_VOLERR_NONE_READY = 0xDD00,
};

// Paths of packages.
CORVPKG_API std::string PMSReadLink(const std::string& path);  // "" when no link
CORVPKG_API bool PMSCheckIsExec(const std::string& path);      // owner-executable, not empty
CORVPKG_API bool PMSCheckEnabledFile(const char* dir);         // <dir>/enabled exists
// The volume of a registry directory's `target` link ("/volume1"), "not_volume_path" for
// a package on the system install path, "" without a link.
CORVPKG_API std::string PMSGetPackageTargetVolByPath(const char* dir);
// The `target` link of an installed package when it leads to a directory, else "".
CORVPKG_API std::string PMSGetPackageTarget(const std::string& name);
CORVPKG_API bool PMSGetPackageVol(const std::string& name, std::string& volume);
CORVPKG_API bool PMSGetSystemInstallPath(std::string& path);

// Temporary space. `size` is what the caller will put there.
CORVPKG_API bool PMSGetTmpDir(unsigned long long size, const char* volume, std::string& dir);
CORVPKG_API bool PMSGetTmpDir(unsigned long long size, std::string& dir);
CORVPKG_API bool PMSGetSystemTmpDir(unsigned long long size, std::string& dir);
// The folder of the package lists, behind the fixed link /tmp/pkglist.tmp.
CORVPKG_API bool PMSGetListTmpDir(std::string& dir);
CORVPKG_API bool PMSCreateDownloadTmpDir(const char* volume, const char* subdir,
                                         unsigned long long size, std::string& dir);
bool PMSCreateTmpFile(std::string& path);
bool PMSCreateTmpFolder(std::string& path);
// The file's content, at most `limit` bytes when `limit` is not 0. A short read fails.
CORVPKG_API bool PMReadFile(const char* path, unsigned int limit, std::string& content,
                            unsigned long long* readSize);
// The image cache folder of one package version; other versions' folders are removed.
CORVPKG_API bool PMSGetImageTmpPath(const char* category, const char* packageName,
                                    const char* version, std::string& path);

// Whether a package is installed and usable: registry, INFO, a target directory on a
// volume that has not failed.
CORVPKG_API bool PMSCheckPackage(const std::string& name);

// Volumes.
CORVPKG_API bool PMSGetPackageDefVol(std::string& volume);
CORVPKG_API bool PMSSavePackageDefVolPath(const char* path);
CORVPKG_API int VolumeCountGet(int kinds);
// The volume exists, is ready and has at least `size` bytes free.
CORVPKG_API bool PMSCheckVolStatus(const char* volume, unsigned long long size);
bool PMSCheckFreeSpace(const char* path, unsigned long long size);

// Full volumes in words. The bytes free for this process on the file system of `path`
// (0 when it cannot be asked).
unsigned long long PMSFreeBytes(const std::string& path);
// The size of the file at `path`; 0 when there is none.
unsigned long long PMSFileBytes(const std::string& path);
// The sum of the sizes that `archive` lists, of all members or of `member` only.
unsigned long long PMSArchiveBytes(const std::string& archive, bool compressed,
                                   const std::string& member);
// What the payload of the package unpacked in `workDir` takes unpacked: the sizes listed
// in <workDir>/package.tgz, or the INFO's extractsize when that says more.
unsigned long long PMSPayloadSize(const PackageInfo& info, const std::string& workDir);
// Logs "Volume <v> is full: <needed> bytes needed, <free> bytes free" for the volume of
// `path` and sets the JSON parameter "no_space" of `pm` to {"volume", "needed", "free"}.
void PMSReportNoSpace(PackageManager& pm, const std::string& path, unsigned long long needed,
                      unsigned long long free);
// After an unpack into `dir` failed: when `needed` bytes did not fit in what was free
// before it (free now plus what it wrote under `dir`), reports the full volume as above
// and gives true.
bool PMSExplainFailedUnpack(PackageManager& pm, const std::string& dir, unsigned long long needed);

// Architecture and model of a package against this machine.
CORVPKG_API bool PMSCheckPackageArchMatched(const PackageInfo& info);
CORVPKG_API bool PMSCheckPackageModelMatched(const PackageInfo& info);
CORVPKG_API bool PMSCheckPackageArchModelMatched(const PackageInfo& info);

}  // namespace CORVPackageTool

namespace CORVPackageTool {
// What this machine offers packages, for people and scripts: the OS version, platform
// code and architecture mask, model ("unique"), small-box flag, volumes with free bytes
// and readiness, the default volume, and the temporary directory that an install of
// `installSize` bytes would use (or the platform error why there is none).
CORVPKG_API Json::Value PMSGetSystemInfo(unsigned long long installSize);
}  // namespace CORVPackageTool
