// The system-wide package lock and the flags that refuse it.
#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

#include <atomic>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"

namespace CORVPackageTool {

namespace {

constexpr int kPkgLockExclusiveWait = VLIBC_LOCK_PKG | VLIBC_LOCK_EXCLUSIVE | VLIBC_LOCK_WAIT;
constexpr const char* kPkgLockFile = "/tmp/lock/lock_pkg";
constexpr const char* kUpgradeStopServiceFlag = "/tmp/upgrade_stop_service";
constexpr const char* kNormalShutdownFlag = "/var/.NormalShutdown";
constexpr const char* kUpgradeBootupFlag = "/var/.UpgradeBootup";

std::atomic<bool> g_skipUpgradeCheck{false};

// Who holds the lock, for the log of a boot that goes on without it.
void logLockHolders() {
    const char* argv[] = {"/sbin/lslocks", "-r", "-n", "-u", nullptr};
    FILE* out = VLIBCPopenv(argv[0], "r", argv);
    if (out == nullptr) {
        CORV_LOG_ERR("failed to popen(%s), errno=%m", argv[0]);
        return;
    }
    char line[1024];
    while (fgets(line, sizeof(line), out) != nullptr) {
        if (strstr(line, kPkgLockFile) != nullptr) {
            line[strcspn(line, "\n")] = '\0';
            CORV_LOG_ERR("self: %d, Lock process: %s", static_cast<int>(getpid()), line);
        }
    }
    VLIBCPclose(out);
}

}  // namespace

bool PackageManager::ExLock(int seconds) {
    if (VLIBCFileLock(kPkgLockExclusiveWait, seconds) != 0) {
        // Only the first boot after an OS upgrade goes on without the lock.
        int err = errno;
        if (err != EAGAIN) {
            errno = err;
            CORV_LOG_ERR("Failed to lock, corverr=[0x%04X %s:%d], %m", VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
        }
        if (!VLIBCFileExist(kUpgradeBootupFlag)) {
            return false;
        }
        logLockHolders();
    }
    // The lock stays held on these refusals: the process is about to be stopped
    // anyway, and nobody else may start work meanwhile.
    if (!g_skipUpgradeCheck && VLIBCFileExist(kUpgradeStopServiceFlag)) {
        CORV_LOG_ERR("Failed to lock, %s exists", kUpgradeStopServiceFlag);
        return false;
    }
    if (VLIBCFileExist(kNormalShutdownFlag)) {
        CORV_LOG_ERR("Failed to lock, %s exists", kNormalShutdownFlag);
        return false;
    }
    return true;
}

void PackageManager::UnLock() {
    VLIBCFileUnlock(VLIBC_LOCK_PKG);
}

void PackageManager::setSkipUpgradeCheck(bool skip) {
    g_skipUpgradeCheck = skip;
}

}  // namespace CORVPackageTool
