// The package's own init jobs and the dependency answers that the generators need.
#include <errno.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/pkginfo_private.h"
#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/service.h"

namespace CORVPackageTool {
namespace Service {

namespace {

const char kJobPrefix[] = "pkg-";
const char kInitDir[] = "/etc/init/";

bool HasJobPrefix(const std::string& job) {
    const size_t len = sizeof(kJobPrefix) - 1;
    return job.size() > len && job.compare(0, len, kJobPrefix) == 0;
}

std::string PackageDir(const std::string& name) {
    return "/var/packages/" + name;
}

// A missing file is what the caller wants, so only other failures are worth a word; the
// work goes on either way because half-removed jobs are worse than a logged one.
void UnlinkQuietly(const std::string& path) {
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
    }
}

void RemoveJobFiles(const std::string& job) {
    UnlinkQuietly(kInitDir + job + ".conf");
    UnlinkQuietly(kInitDir + job + ".override");
}

bool LoadInstalledInfo(const std::string& name, PackageInfo& info, unsigned long long mask) {
    return PMSLoadPKGInfoFile(PackageDir(name), info, nullptr, mask);
}

}  // namespace

std::string PackageJobName(const std::string& name) {
    return "pkgctl-" + name;
}

std::string JobAdapterPath(const std::string& name) {
    return kInitDir + PackageJobName(name) + ".conf";
}

std::string ServiceCfgPath(const std::string& name) {
    return std::string(VLIB_SERVICE_CFG_DIR) + "/" + PackageJobName(name) + ".cfg";
}

bool EnumAvailableJobs(const std::string& name, std::vector<std::string>& jobs) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string dir = PackageDir(name) + "/conf/upstart";
    if (VLIBCFileCheckDir(dir.c_str()) != 1) {
        jobs.clear();
        return true;
    }
    SzList list(0x400);
    if (!list) {
        CORV_LOG_ERR("Failed to alloc list [0x%04X %s:%d]", VLIBCErrGet(), VLIBCErrorGetFile(),
                     VLIBCErrorGetLine());
        return false;
    }
    if (VLIBCFileEnumDir(dir.c_str(), ".conf", list.addr(), 0x84) < 0) {
        CORV_LOG_ERR("Failed to enum jobs under %s [0x%04X %s:%d]", dir.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    jobs.clear();
    for (int i = 0; i < VLIBCSzListCount(list.get()); ++i) {
        std::string entry = VLIBCSzListGet(list.get(), i);
        const size_t dot = entry.rfind('.');
        if (dot != std::string::npos) {
            entry.erase(dot);
        }
        if (HasJobPrefix(entry)) {
            jobs.push_back(entry);
        }
    }
    return true;
}

bool InstallJobs(const std::string& name, const std::vector<std::string>& jobs, bool force) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string cgroupCpu = "cgroup cpuacct \"" + PackageJobName(name) + "\"\n";
    const std::string cgroupMem = "cgroup memory \"" + PackageJobName(name) + "\"\n";
    std::vector<std::string> installed;
    auto undo = [&installed]() {
        for (const std::string& job : installed) {
            RemoveJobFiles(job);
        }
    };
    for (const std::string& job : jobs) {
        if (!HasJobPrefix(job)) {
            continue;
        }
        const std::string dest = kInitDir + job + ".conf";
        if (!force && VLIBCFileExist(dest.c_str()) == 1) {
            continue;
        }
        const std::string source = PackageDir(name) + "/conf/upstart/" + job + ".conf";
        if (VLIBCExecl("/bin/cp", 0xbb, "-f", source.c_str(), dest.c_str(), nullptr) != 0) {
            CORV_LOG_ERR("Failed to copy %s to %s", source.c_str(), dest.c_str());
            VLIBCErrSet(ERR_COPY_FAILED);
            undo();
            return false;
        }
        if (VLIBCFileAddLine(dest.c_str(), 0, cgroupCpu.c_str(), 0) < 0 ||
            VLIBCFileAddLine(dest.c_str(), 0, cgroupMem.c_str(), 0) < 0) {
            CORV_LOG_ERR("Failed to add cgroup to %s", dest.c_str());
        }
        installed.push_back(job);
        if (!ValidateJob(job)) {
            undo();
            return false;
        }
    }
    return true;
}

void UnlinkAllJobs(const std::string& name, const std::vector<std::string>& jobs) {
    if (!name.empty()) {
        RemoveJobFiles(PackageJobName(name));
    }
    for (const std::string& job : jobs) {
        if (HasJobPrefix(job)) {
            RemoveJobFiles(job);
        }
    }
}

void UnlinkServiceCfg(const std::string& name) {
    if (name.empty()) {
        return;
    }
    static const char* const kDirs[] = {"/usr/corv/etc/corvservice.d/",
                                        "/usr/corv/etc/corvservice.override/",
                                        "/run/corvservice/service/"};
    for (const char* dir : kDirs) {
        UnlinkQuietly(dir + PackageJobName(name) + ".cfg");
    }
}

bool ValidateJob(const std::string& job) {
    if (job.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (VLIBCExecl("/sbin/initctl", 0xbb, "status", job.c_str(), nullptr) == 0) {
        return true;
    }
    CORV_LOG_ERR("Invalid job %s", job.c_str());
    VLIBCErrSet(ERR_MALFORMED);
    return false;
}

bool GetDependentPkg(const std::string& name, std::set<std::string>& out,
                     std::string (*convert)(const std::string&)) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    PackageInfo info;
    if (!LoadInstalledInfo(name, info, INFO_MASK_DEP_PACKAGES)) {
        return false;
    }
    for (const PackageBasicInfo& dep : info.dep_packages) {
        if (dep.package == name) {
            continue;
        }
        out.insert(convert != nullptr ? convert(dep.package) : dep.package);
    }
    return true;
}

bool GetDependentService(const std::string& name, std::set<std::string>& out) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    PackageInfo info;
    if (!LoadInstalledInfo(name, info, INFO_MASK_START_DEP_SERVICES)) {
        return false;
    }
    const PackageInfoExtraPrivate* extra = info.extra.priv();
    if (extra != nullptr) {
        out.insert(extra->start_dep_service_set.begin(), extra->start_dep_service_set.end());
    }
    return true;
}

bool GetDependentJob(const std::string& name, std::set<std::string>& out) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    std::set<std::string> services;
    if (!GetDependentService(name, services)) {
        return false;
    }
    SzList list(0x400);
    if (!list) {
        return false;
    }
    for (const std::string& service : services) {
        VLIBCSzListRemoveAll(list.get());
        if (VLIBServicecfgInfoGet(service.c_str(), 4, list.addr()) < 0) {
            CORV_LOG_ERR("Failed to get dependent jobs for %s[0x%04X %s:%d]", service.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
        for (int i = 0; i < VLIBCSzListCount(list.get()); ++i) {
            out.insert(VLIBCSzListGet(list.get(), i));
        }
    }
    return true;
}

}  // namespace Service
}  // namespace CORVPackageTool
