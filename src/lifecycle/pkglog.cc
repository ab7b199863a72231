// Script runs with their lines in the operations log, the progress file, and the hook
// programs run after every operation.
#include <dirent.h>
#include <fcntl.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "common/regular_file.h"
#include "corv/handles.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/pkglog.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {

constexpr size_t kLogLineSize = 0x1100;
constexpr size_t kReadBlock = 512;
constexpr size_t kProgressSize = 64;

void unsetHookVariables() {
    unsetenv("CORVPKG_PKG_STATUS");
    unsetenv("CORVPKG_OLD_PKGVER");
    unsetenv("CORVPKG_PKGNAME");
    unsetenv("CORVPKG_PKGVER");
    unsetenv("CORVPKG_BOOT_STATUS");
}

}  // namespace

std::string PMSGetProgressPath(const std::string& name) {
    return "/tmp/install_progress_" + name;
}

void PMSWriteSysLog(const char* message) {
    if (message == nullptr || message[0] == '\0') {
        return;
    }
    char stamp[64] = "";
    time_t now = time(nullptr);
    struct tm local {};
    if (localtime_r(&now, &local) != nullptr) {
        strftime(stamp, sizeof(stamp), "%Y/%m/%d %H:%M:%S", &local);
    }
    CORVUniqueFile log{fopen(PKG_OPERATIONS_LOG, "ae")};
    if (log) {
        fprintf(log.get(), "%s\t%s\n", stamp, message);
    }
}

void PMSWriteSysLogf(const char* format, ...) {
    char line[4096];
    va_list args;
    va_start(args, format);
    vsnprintf(line, sizeof(line), format, args);
    va_end(args);
    PMSWriteSysLog(line);
}

int PMSRunAndWriteScriptLog(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                            CORVUtils::ProcessRunner& runner, int mode) {
    const std::string command = runner.toString();
    char line[kLogLineSize];
    snprintf(line, sizeof(line), "%s %s %s Begin %s", parseInstallTypeToStr(type),
             info.package.c_str(), info.version.c_str(), command.c_str());
    PMSWriteSysLog(line);
    // A log that cannot be opened does not stop the script.
    int fd = open(PKG_OPERATIONS_LOG, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to open /var/log/corvpkg.log, %m");
    }
    int ret = runner.run(mode == -1 ? 1 : mode, true, true, fd);
    if (fd >= 0) {
        close(fd);
    }
    snprintf(line, sizeof(line), "%s %s %s End %s ret=[%d]", parseInstallTypeToStr(type),
             info.package.c_str(), info.version.c_str(), command.c_str(), ret);
    PMSWriteSysLog(line);
    return ret;
}

std::string PMSReadPackageLog(const std::string& path) {
    std::string content;
    UniqueFd fd = PMSOpenRegularFile(path);
    if (!fd) {
        return content;
    }
    char block[kReadBlock + 1];
    ssize_t n;
    while (memset(block, 0, sizeof(block)), (n = VLIBCRead(fd.get(), block, kReadBlock)) > 0) {
        // The text is for people: a NUL byte ends what is shown of its block.
        content.append(block, strlen(block));
    }
    return content;
}

double PMSGetProgress(const std::string& name) {
    // No file, no lock to wait for.
    const std::string path = PMSGetProgressPath(name);
    if (access(path.c_str(), F_OK) != 0) {
        return -1.0;
    }
    // The script writes under the same lock.
    double progress = -1.0;
    int fd = -1;
    if (VLIBCFileLockTimeByFile(path.c_str(), 0, 60, &fd) != 0) {
        CORV_LOG_ERR("Failed to Lock file, %s, %m", path.c_str());
    } else {
        char buf[kProgressSize] = "";
        if (VLIBCRead(fd, buf, sizeof(buf) - 1) != -1) {
            progress = strtod(buf, nullptr);
        }
    }
    VLIBCFileUnlockByFile(fd);
    return progress;
}

int PMSCheckServiesStatus(const PackageInfo& info, const PackageInfo* oldInfo,
                          PKG_INSTALLATION_TYPE type, int startFlag) {
    unsetenv("CORVPKG_BOOT_STATUS");
    if (access(PKG_HOOKS_DIR, F_OK) != 0) {
        unsetHookVariables();
        return 1;
    }
    CORVUniqueDir dir{opendir(PKG_HOOKS_DIR)};
    if (!dir) {
        unsetHookVariables();
        return 0;
    }
    if (type == 0) {
        setenv("CORVPKG_BOOT_STATUS", startFlag == 1 ? "UPSTART" : "SHUTDOWN", 1);
    } else if (const char* word = PMSStatusWord(type)) {
        setenv("CORVPKG_PKG_STATUS", word, 1);
    } else {
        unsetenv("CORVPKG_PKG_STATUS");
    }
    if (startFlag == 1) {
        setenv("CORVPKG_PKG_STATUS", "START", 1);
    } else if (startFlag == 0) {
        setenv("CORVPKG_PKG_STATUS", "STOP", 1);
    }
    setenv("CORVPKG_PKGNAME", info.package.c_str(), 1);
    setenv("CORVPKG_PKGVER", info.version.c_str(), 1);
    if (oldInfo != nullptr) {
        setenv("CORVPKG_OLD_PKGVER", oldInfo->version.c_str(), 1);
    } else {
        unsetenv("CORVPKG_OLD_PKGVER");
    }
    // Links count only when they lead to a regular file.
    while (struct dirent* entry = readdir(dir.get())) {
        if (strcmp(entry->d_name, ".") == 0 || strcmp(entry->d_name, "..") == 0) {
            continue;
        }
        char path[4096];
        snprintf(path, sizeof(path), "%s/%s", PKG_HOOKS_DIR, entry->d_name);
        bool run = entry->d_type == DT_REG;
        if (entry->d_type == DT_LNK || entry->d_type == DT_UNKNOWN) {
            struct stat st {};
            run = stat(path, &st) == 0 && S_ISREG(st.st_mode);
        }
        if (run) {
            VLIBCExecv(path, nullptr, 1);
        }
    }
    unsetHookVariables();
    return 1;
}

}  // namespace CORVPackageTool
