// Saying in words that a volume is full. An unpack that runs out of room fails like a
// damaged archive (tar exits non-zero either way); these tell the two apart afterwards,
// and give the user what was needed and what was free.
#include <ftw.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <sstream>
#include <string>

#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/volume.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

// nftw() takes no context; one sum runs at a time in a thread.
thread_local unsigned long long t_used = 0;

int addUsed(const char*, const struct stat* st, int type, struct FTW*) {
    if (type != FTW_NS) {
        t_used += static_cast<unsigned long long>(st->st_blocks) * 512;
    }
    return 0;
}

// The bytes that the files under `dir` take on their volume.
unsigned long long usedUnder(const std::string& dir) {
    t_used = 0;
    nftw(dir.c_str(), addUsed, 16, FTW_PHYS);
    return t_used;
}

std::string volumeOf(const std::string& path) {
    char volume[4096] = "";
    if (VolumePathParseEx(path.c_str(), volume) < 0 || volume[0] == '\0') {
        return path;
    }
    return volume;
}

}  // namespace

unsigned long long PMSFreeBytes(const std::string& path) {
    struct statvfs vfs {};
    if (statvfs(path.c_str(), &vfs) != 0) {
        return 0;
    }
    return static_cast<unsigned long long>(vfs.f_bavail) * vfs.f_frsize;
}

unsigned long long PMSFileBytes(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 ? static_cast<unsigned long long>(st.st_size) : 0;
}

unsigned long long PMSArchiveBytes(const std::string& archive, bool compressed,
                                   const std::string& member) {
    CORVUtils::ProcessRunner list("/bin/tar", {compressed ? "tvzf" : "tvf", archive});
    if (!member.empty()) {
        list.addArguments(member);
    }
    if (list.run(true, true) != 0 && list.getCapturedOutput().empty()) {
        return 0;
    }
    // "-rw-r--r-- root/root 3145728 2026-11-24 01:00 path": the third word is the size.
    std::istringstream lines(list.getCapturedOutput());
    std::string line;
    unsigned long long total = 0;
    while (std::getline(lines, line)) {
        std::istringstream words(line);
        std::string mode, owner, size;
        words >> mode >> owner >> size;
        total += strtoull(size.c_str(), nullptr, 10);
    }
    return total;
}

unsigned long long PMSPayloadSize(const PackageInfo& info, const std::string& workDir) {
    // The INFO's extractsize is the packager's word; the listing is what tar was writing.
    const unsigned long long listed = PMSArchiveBytes(workDir + "/package.tgz", true, "");
    const unsigned long long declared =
        info.extractsize > 0 ? static_cast<unsigned long long>(info.extractsize) : 0;
    return listed > declared ? listed : declared;
}

void PMSReportNoSpace(PackageManager& pm, const std::string& path, unsigned long long needed,
                      unsigned long long free) {
    const std::string volume = volumeOf(path);
    CORV_LOG_ERR("Volume %s is full: %llu bytes needed, %llu bytes free", volume.c_str(), needed,
                 free);
    Json::Value space(Json::objectValue);
    space["volume"] = volume;
    space["needed"] = Json::UInt64(needed);
    space["free"] = Json::UInt64(free);
    pm.insertJsonParam("no_space", space);
}

bool PMSExplainFailedUnpack(PackageManager& pm, const std::string& dir, unsigned long long needed) {
    // What the failed unpack wrote is still there and goes with the work directory: it
    // was free before.
    const unsigned long long free = PMSFreeBytes(dir) + usedUnder(dir);
    if (needed == 0 || needed <= free) {
        return false;
    }
    PMSReportNoSpace(pm, dir, needed, free);
    return true;
}

}  // namespace CORVPackageTool
