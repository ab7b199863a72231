// What an unpacked package file may hold. Its control members are read, written through
// (conf/resource.own), changed (script modes) and run by root: a member that is a link
// could point any of that at a file outside the package, and a pipe or device would
// stall the reads. Its payload goes to the package's own user, who must not get devices.
#include <ftw.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "corvpkg/pkgfile.h"

namespace CORVPackageTool {

namespace {

const char* kindOf(mode_t mode) {
    if (S_ISLNK(mode)) {
        return "a symbolic link";
    }
    if (S_ISCHR(mode) || S_ISBLK(mode)) {
        return "a device node";
    }
    if (S_ISFIFO(mode)) {
        return "a named pipe";
    }
    if (S_ISSOCK(mode)) {
        return "a socket";
    }
    return "not a regular file";
}

int refuseOddMember(const char* path, const struct stat* st, int type, struct FTW*) {
    if (type == FTW_D || (type == FTW_F && S_ISREG(st->st_mode))) {
        return 0;
    }
    const char* kind = type == FTW_SL || type == FTW_SLN ? "a symbolic link"
                       : type == FTW_F                   ? kindOf(st->st_mode)
                                                         : "unreadable";
    CORV_LOG_ERR(
        "Refused package member %s: %s, where only regular files and directories "
        "may stand",
        path, kind);
    return 1;
}

int dropSpecialFile(const char* path, const struct stat* st, int type, struct FTW*) {
    if (type != FTW_F) {
        return 0;
    }
    const mode_t mode = st->st_mode;
    if (S_ISCHR(mode) || S_ISBLK(mode) || S_ISFIFO(mode) || S_ISSOCK(mode)) {
        if (unlink(path) != 0) {
            CORV_LOG_ERR("Failed to drop %s from the payload, %m", path);
            return 1;
        }
        CORV_LOG_ERR("Dropped %s from the payload: %s is never installed", path, kindOf(mode));
        return 0;
    }
    // Set-id bits are given only on purpose, by the package's privilege file, later.
    if (S_ISREG(mode) && (mode & (S_ISUID | S_ISGID)) != 0 &&
        chmod(path, mode & 07777 & ~(S_ISUID | S_ISGID)) != 0) {
        CORV_LOG_ERR("Failed to clear the set-id bits of %s, %m", path);
        return 1;
    }
    return 0;
}

}  // namespace

bool PMSCheckPackageMembers(const std::string& dir) {
    return nftw(dir.c_str(), refuseOddMember, 16, FTW_PHYS) == 0;
}

bool PMSDropSpecialFiles(const std::string& payloadDir) {
    return nftw(payloadDir.c_str(), dropSpecialFile, 16, FTW_PHYS) == 0;
}

}  // namespace CORVPackageTool
