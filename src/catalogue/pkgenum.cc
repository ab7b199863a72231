// Listings of the installed packages and reads of single ones. There is no index: every
// listing walks /var/packages and reads each INFO with the caller's mask.
#include <dirent.h>
#include <string.h>
#include <unistd.h>

#include <functional>
#include <string>

#include "catalogue/pkginfo_private.h"
#include "corv/handles.h"
#include "corv/log.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kRegistry = "/var/packages";

// Calls `visit` with the name of each sub-directory of `path`, in directory order. A
// symbolic link is no package. False when the directory cannot be opened.
bool walkPackageDirs(const char* path, const std::function<void(const char*)>& visit) {
    CORVUniqueDir dir{opendir(path)};
    if (!dir) {
        return false;
    }
    while (struct dirent* entry = readdir(dir.get())) {
        if (entry->d_type != DT_DIR || strcmp(entry->d_name, ".") == 0 ||
            strcmp(entry->d_name, "..") == 0) {
            continue;
        }
        visit(entry->d_name);
    }
    return true;
}

std::string packageDir(const char* base, const char* name) {
    return std::string(base) + "/" + name;
}

}  // namespace

std::vector<std::string> PackageManager::enumPackages(const std::set<std::string>& volumes,
                                                      unsigned long long mask) {
    std::vector<std::string> names;
    walkPackageDirs(kRegistry, [&](const char* name) {
        const std::string dir = packageDir(kRegistry, name);
        PackageInfo info;
        if (!PMSLoadPKGInfoFile(dir, info, nullptr, mask)) {
            return;
        }
        // "/volume1" must not take in "/volume10/...".
        const std::string target = PMSReadLink(dir + "/target");
        if (target.empty() || volumes.empty()) {
            names.push_back(name);
            return;
        }
        for (std::string volume : volumes) {
            if (volume.empty() || volume.back() != '/') {
                volume += '/';
            }
            if (target.compare(0, volume.size(), volume) == 0) {
                names.push_back(name);
                return;
            }
        }
    });
    return names;
}

std::vector<std::string> PackageManager::enumPackages(const char* volume, unsigned long long mask) {
    std::set<std::string> volumes;
    if (volume != nullptr) {
        volumes.insert(volume);
    }
    return enumPackages(volumes, mask);
}

PackageBasicInfoMap PackageManager::enumPackageMap(unsigned long long mask) {
    PackageBasicInfoMap map;
    walkPackageDirs(kRegistry, [&](const char* name) {
        PackageInfo info;
        if (PMSLoadPKGInfoFile(packageDir(kRegistry, name), info, nullptr, mask)) {
            // Keyed by the directory, which is what the registry answers to.
            map.insertPackagae(name, info.version, info.beta, PKG_COMPOP_NONE);
        }
    });
    return map;
}

void PackageManager::enumPackageInfoMap(std::map<std::string, PackageInfo>& out,
                                        const char* language, unsigned long long mask) {
    walkPackageDirs(kRegistry, [&](const char* name) {
        PackageInfo info;
        if (PMSLoadPKGInfoFile(packageDir(kRegistry, name), info, language, mask)) {
            out.emplace(info.package, info);
        }
    });
}

bool PackageManager::enumPackageInfoByPath(const char* path, std::vector<PackageInfo>& out,
                                           std::vector<std::string>& failed, const char* language,
                                           unsigned long long mask) {
    if (path == nullptr) {
        setResult(PKG_ERR_ENUMERATION);
        return false;
    }
    // A directory without INFO is no package and no failure.
    bool opened = walkPackageDirs(path, [&](const char* name) {
        const std::string dir = packageDir(path, name);
        if (access((dir + "/INFO").c_str(), F_OK) != 0) {
            return;
        }
        PackageInfo info;
        if (PMSLoadPKGInfoFile(dir, info, language, mask)) {
            out.push_back(info);
        } else {
            failed.push_back(name);
        }
    });
    if (!opened) {
        CORV_LOG_ERR("Failed to opendir: %s, %m", path);
        setResult(PKG_ERR_ENUMERATION);
        return false;
    }
    if (failed.empty()) {
        return true;
    }
    setResult(PKG_ERR_ENUMERATION, Json::Value(Json::arrayValue));
    return false;
}

bool PackageManager::enumPackageInfo(std::vector<PackageInfo>& out, const char* language,
                                     unsigned long long mask) {
    std::vector<std::string> failed;
    return enumPackageInfoByPath(kRegistry, out, failed, language, mask);
}

bool PackageManager::getPackageInfoByPathAndInfoType(const char* dir, PackageInfo& info,
                                                     const char* language,
                                                     unsigned long long mask) {
    if (dir == nullptr) {
        return false;
    }
    bool ok = PMSLoadPKGInfoFile(dir, info, language, mask);
    info.script_mask = PMGetScriptMask(std::string(dir) + "/scripts");
    for (const std::string& candidate : PMSUIFileCandidates(language, PKG_UNINSTALL)) {
        if (access((std::string(dir) + "/" + candidate).c_str(), F_OK) == 0) {
            info.has_uninstall_wizard = true;
            break;
        }
    }
    return ok;
}

bool PackageManager::getPackageInfoByPath(const char* dir, PackageInfo& info,
                                          const char* language) {
    return getPackageInfoByPathAndInfoType(dir, info, language, PKG_INFO_MASK_ALL);
}

bool PackageManager::getPackageInfoByPathAndName(const char* base, const std::string& name,
                                                 PackageInfo& info, const char* language,
                                                 unsigned long long mask) {
    if (base == nullptr) {
        return false;
    }
    const std::string dir = std::string(base) + "/" + name;
    return getPackageInfoByPathAndInfoType(dir.c_str(), info, language, mask);
}

bool PackageManager::getInstallPackageInfo(const std::string& name, PackageInfo& info,
                                           const char* language, unsigned long long mask) {
    return getPackageInfoByPathAndName(kRegistry, name, info, language, mask);
}

bool PackageManager::getPackageInfo(const std::string& name, PackageInfo& info,
                                    const char* language, unsigned long long mask) {
    bool ok = getInstallPackageInfo(name, info, language, mask);
    setResult(ok ? PKG_OK : PKG_ERR_NOT_INSTALLED);
    return ok;
}

bool PackageManager::getPackageInfo(std::vector<std::string>& names, std::vector<PackageInfo>& out,
                                    const char* language, unsigned long long mask) {
    bool all = true;
    for (const std::string& name : names) {
        PackageInfo info;
        if (!getPackageInfo(name, info, language, mask)) {
            CORV_LOG_ERR("get %s pkginfo failed ... [%m]", name.c_str());
            all = false;
        }
        out.push_back(info);
    }
    return all;
}

}  // namespace CORVPackageTool
