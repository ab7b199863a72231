// Paths of installed packages, and the temporary, list, download and image folders.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <string>

#include "common/regular_file.h"
#include "corv/handles.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

constexpr size_t kPathSize = 4096;
constexpr const char* kRegistryDir = "/var/packages/";
constexpr const char* kImageCacheFallback = "/tmp/@corvpkg/";

// Temporary folders are shared by the package scripts of every user, hence 0777.
bool makeSharedDir(const std::string& path) {
    if (CORVFSMkdirP(path.c_str(), nullptr, 1, -1, -1, 0777) < 0) {
        CORV_LOG_ERR("Failed to mkdir : %s , errno=%m", path.c_str());
        return false;
    }
    return true;
}

bool startsWith(const std::string& text, const char* prefix) {
    return text.compare(0, strlen(prefix), prefix) == 0;
}

bool prepareDownloadDir(const char* subdir, const char* volume, unsigned long long size,
                        std::string& dir) {
    std::string base;
    bool systemDir = false;
    if (!PMSGetTmpDir(size, volume, base)) {
        if (!PMSGetSystemTmpDir(size, base)) {
            return false;
        }
        systemDir = true;
    }
    base += "/@corvpkg/@download";
    if (!makeSharedDir(base)) {
        return false;
    }
    // Nothing else cleans the root file system, so old downloads go here.
    if (systemDir) {
        VLIBCExec("/usr/bin/find", base.c_str(), "-maxdepth", "1", "-type", "f", "!", "-mtime",
                  "-1", "-exec", "rm", "-rf", "{}", ";", nullptr);
    }
    std::string path = base + "/" + (subdir ? subdir : "");
    if (!makeSharedDir(path)) {
        return false;
    }
    dir = path;
    return true;
}

}  // namespace

std::string PMSReadLink(const std::string& path) {
    char buf[kPathSize];
    ssize_t n = readlink(path.c_str(), buf, sizeof(buf) - 1);
    if (n <= 0) {
        return "";
    }
    buf[n] = '\0';
    return buf;
}

bool PMSCheckIsExec(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 && (st.st_mode & S_IXUSR) != 0 && st.st_size != 0;
}

bool PMSCheckEnabledFile(const char* dir) {
    if (dir == nullptr) {
        return false;
    }
    std::string path = std::string(dir) + "/enabled";
    return access(path.c_str(), F_OK) == 0;
}

std::string PMSGetPackageTargetVolByPath(const char* dir) {
    if (dir == nullptr) {
        return "";
    }
    std::string target = PMSReadLink(std::string(dir) + "/target");
    if (target.empty()) {
        return "";
    }
    if (startsWith(target, PKG_SYSTEM_INSTALL_PATH)) {
        return PKG_NOT_VOLUME_PATH;
    }
    // "/volume2" alone has no second "/" and stays whole.
    return target.substr(0, target.find('/', 1));
}

std::string PMSGetPackageTarget(const std::string& name) {
    std::string link = kRegistryDir + name + "/target";
    if (!VLIBCFileCheckDir(link.c_str())) {
        return "";
    }
    return PMSReadLink(link);
}

bool PMSGetPackageVol(const std::string& name, std::string& volume) {
    if (name.empty()) {
        return false;
    }
    std::string target = PMSReadLink(kRegistryDir + name + "/target");
    if (target.empty()) {
        CORV_LOG_ERR("Failed to resovle package target %s", name.c_str());
        return false;
    }
    if (startsWith(target, PKG_SYSTEM_INSTALL_PATH)) {
        volume = PKG_SYSTEM_INSTALL_PATH;
        return true;
    }
    char parsed[kPathSize] = "";
    if (VolumePathParseEx(target.c_str(), parsed) < 0) {
        CORV_LOG_ERR("Failed to parse volume path: %s", target.c_str());
        return false;
    }
    volume = parsed;
    return true;
}

bool PMSGetSystemInstallPath(std::string& path) {
    if (CORVFSMkdirP(PKG_SYSTEM_INSTALL_PATH, nullptr, 1, -1, -1, 0755) < 0) {
        CORV_LOG_ERR("Failed to mkdir %s, %m", PKG_SYSTEM_INSTALL_PATH);
        return false;
    }
    path = PKG_SYSTEM_INSTALL_PATH;
    return true;
}

bool PMSGetTmpDir(unsigned long long size, const char* volume, std::string& dir) {
    dir.clear();
    // The caller's volume, when it has more than enough room.
    CORVMOUNTVOLINFO info;
    bool chosen = volume != nullptr && CORVMountVolInfoGet(volume, &info) == 0 && info.ready &&
                  info.freeBytes > size;
    // Otherwise any volume with room and the margin.
    if (!chosen) {
        int flags = 0;
        int found = VolumeAvailGet(size + PKG_VOLUME_MARGIN, &info, &flags, 0);
        if (found < 0) {
            CORV_LOG_ERR("VolumeAvailGet() failed!! corverr=[0x%04X]", VLIBCErrGet());
            return false;
        }
        if (found == 0) {
            if (flags & CORV_VOL_AVAIL_TOO_SMALL) {
                VLIBCErrSet(PKG_VOLERR_NO_SPACE);
                return false;
            }
            if ((flags & CORV_VOL_AVAIL_EXISTS) == 0) {
                VLIBCErrSet(PKG_VOLERR_NO_VOLUME);
                return false;
            }
            if (!info.ready) {
                VLIBCErrSet(PKG_VOLERR_NONE_READY);
                return false;
            }
        }
    }
    char tmp[kPathSize] = "";
    if (CORVShareTmpPathGet(info.szMountPath, tmp, sizeof(tmp)) < 0) {
        CORV_LOG_ERR("Fail to get share temp path from [%s]", info.szMountPath);
        return false;
    }
    if (!makeSharedDir(tmp)) {
        return false;
    }
    dir = tmp;
    return true;
}

bool PMSGetTmpDir(unsigned long long size, std::string& dir) {
    return PMSGetTmpDir(size, nullptr, dir);
}

bool PMSGetSystemTmpDir(unsigned long long size, std::string& dir) {
    // /tmp while it has room.
    struct statfs64 tmpStat {};
    if (statfs64("/tmp", &tmpStat) == 0) {
        unsigned long long avail =
            static_cast<unsigned long long>(tmpStat.f_bavail) * tmpStat.f_bsize;
        if (avail >= size + PKG_VOLUME_MARGIN) {
            if (makeSharedDir("/tmp/@tmp")) {
                dir = "/tmp/@tmp";
                return true;
            }
        } else {
            VLIBCErrSet(PKG_VOLERR_NO_SPACE);
        }
    }
    // The root file system, keeping a wide margin so the system itself still runs.
    struct statvfs64 rootStat {};
    if (statvfs64("/", &rootStat) != 0) {
        return false;
    }
    unsigned long long free = static_cast<unsigned long long>(rootStat.f_bfree) * rootStat.f_frsize;
    if (free < size + PKG_ROOT_MARGIN) {
        VLIBCErrSet(PKG_VOLERR_NO_SPACE);
        return false;
    }
    if (CORVFSMkdirP("/var/tmp", nullptr, 1, -1, -1, 0700) < 0) {
        VLIBCErrSet(PKG_VOLERR_MKDIR);
        return false;
    }
    dir = "/var/tmp";
    return true;
}

bool PMSGetListTmpDir(std::string& dir) {
    std::string previous;
    bool previousValid = false;
    struct stat st {};
    if (lstat(PKG_LIST_TMP_LINK, &st) == 0 && S_ISLNK(st.st_mode) &&
        VLIBCFileCheckDir(PKG_LIST_TMP_LINK)) {
        previous = PMSReadLink(PKG_LIST_TMP_LINK);
        previousValid = true;
    }
    std::string base;
    if (!PMSGetTmpDir(PKG_VOLUME_MARGIN, base) && !PMSGetSystemTmpDir(PKG_VOLUME_MARGIN, base)) {
        return false;
    }
    dir = base + "/pkglist.tmp/";
    if (previous == dir) {
        return true;
    }
    // In this order, so that the link dangles only between unlink and symlink.
    if (previousValid && !previous.empty()) {
        VLIBCExec("/bin/rm", "-rf", previous.c_str(), nullptr);
    }
    unlink(PKG_LIST_TMP_LINK);
    if (CORVFSMkdirP(dir.c_str(), nullptr, 1, -1, -1, 0777) < 0) {
        CORV_LOG_ERR("Failed to mkdir %s, %m", dir.c_str());
        return false;
    }
    if (symlink(dir.c_str(), PKG_LIST_TMP_LINK) != 0) {
        CORV_LOG_ERR("Failed to symlink [%s] to [%s]. %m", dir.c_str(), PKG_LIST_TMP_LINK);
        return false;
    }
    return true;
}

bool PMSCreateDownloadTmpDir(const char* volume, const char* subdir, unsigned long long size,
                             std::string& dir) {
    if (volume != nullptr && volume[0] != '\0' && PMSCheckVolStatus(volume, size) &&
        prepareDownloadDir(subdir, volume, size, dir)) {
        return true;
    }
    return prepareDownloadDir(subdir, nullptr, size, dir);
}

static bool tmpBase(std::string& dir) {
    if (PMSGetTmpDir(0, dir) || PMSGetSystemTmpDir(0, dir)) {
        return true;
    }
    dir = "/tmp";
    return true;
}

bool PMSCreateTmpFile(std::string& path) {
    std::string dir;
    tmpBase(dir);
    std::string tmpl = dir + "/XXXXXX";
    int fd = mkstemp(&tmpl[0]);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to mkstemp under %s, %m", dir.c_str());
        return false;
    }
    close(fd);
    path = tmpl;
    return true;
}

bool PMSCreateTmpFolder(std::string& path) {
    std::string dir;
    tmpBase(dir);
    std::string tmpl = dir + "/XXXXXX";
    if (mkdtemp(&tmpl[0]) == nullptr) {
        CORV_LOG_ERR("Failed to mkdtemp under %s, %m", dir.c_str());
        return false;
    }
    path = tmpl;
    return true;
}

bool PMReadFile(const char* path, unsigned int limit, std::string& content,
                unsigned long long* readSize) {
    if (path == nullptr) {
        CORV_LOG_ERR("Bad Parameters");
        return false;
    }
    struct stat st {};
    if (stat(path, &st) != 0) {
        CORV_LOG_ERR("Stat %s error, %s", path, strerror(errno));
        return false;
    }
    unsigned long long want = static_cast<unsigned long long>(st.st_size);
    if (limit != 0 && limit < want) {
        want = limit;
    }
    UniqueFd fd = PMSOpenRegularFile(path);
    if (!fd) {
        CORV_LOG_ERR("Failed to open file %s", path);
        return false;
    }
    std::string data;
    data.resize(want);
    unsigned long long got = 0;
    while (got < want) {
        ssize_t n = VLIBCRead(fd.get(), &data[got], want - got);
        if (n <= 0) {
            break;
        }
        got += static_cast<unsigned long long>(n);
    }
    if (got != want) {
        CORV_LOG_ERR("Failed to read file %s", path);
        return false;
    }
    content.swap(data);
    if (readSize) {
        *readSize = got;
    }
    return true;
}

bool PMSGetImageTmpPath(const char* category, const char* packageName, const char* version,
                        std::string& path) {
    if (category == nullptr || category[0] == '\0' || packageName == nullptr ||
        packageName[0] == '\0') {
        return false;
    }
    std::string root;
    if (!PMSGetListTmpDir(root)) {
        root = kImageCacheFallback;
    }
    if (CORVFSMkdirP(root.c_str(), nullptr, 1, -1, -1, 0777) < 0) {
        if (errno != ENOSPC) {
            CORV_LOG_ERR("Failed to mkdir %s, %m", root.c_str());
        }
        return false;
    }
    const std::string packageDir = root + "icon/" + category + "/" + packageName;
    const std::string cacheDir = packageDir + "/" + (version ? version : "");
    if (CORVFSMkdirP(cacheDir.c_str(), nullptr, 1, -1, -1, 0777) < 0) {
        if (errno != ENOSPC) {
            CORV_LOG_ERR("Failed to mkdir %s, %m", cacheDir.c_str());
        }
        return false;
    }
    // Other versions of the same package are stale.
    if (CORVUniqueDir d{opendir(packageDir.c_str())}) {
        while (struct dirent* entry = readdir(d.get())) {
            const char* name = entry->d_name;
            if (strcmp(name, ".") == 0 || strcmp(name, "..") == 0 || CORVEAIsHiddenDir(name)) {
                continue;
            }
            std::string full = packageDir + "/" + name;
            struct stat st {};
            if (lstat(full.c_str(), &st) != 0 || !(S_ISREG(st.st_mode) || S_ISDIR(st.st_mode))) {
                continue;
            }
            if (version != nullptr && S_ISDIR(st.st_mode) && strcmp(name, version) == 0) {
                continue;
            }
            int rc = VLIBCExec("/bin/rm", "-rf", full.c_str(), nullptr);
            if (rc != 0) {
                CORV_LOG_ERR("Failed to rm %s, err=%d", full.c_str(), rc);
                break;
            }
        }
    }
    path = cacheDir;
    return true;
}

}  // namespace CORVPackageTool
