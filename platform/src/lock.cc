// Named system locks (POSIX record locks held by the process) and locks on any file
// (flock on a descriptor of the caller's).
#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <mutex>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kFlagBits = 0xF;
constexpr const char kLockDir[] = "/tmp/lock";
constexpr long kPollNanoseconds = 25 * 1000 * 1000;

void napBetweenTries() {
    struct timespec ts = {0, kPollNanoseconds};
    nanosleep(&ts, nullptr);  // an interruption only makes the next attempt earlier
}

// Tries `attempt` until it succeeds, fails for another reason than "busy", or the time is
// up. `attempt` returns 0, 1 for busy, or -1.
template <typename F>
int retryUntil(int seconds, F&& attempt) {
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(seconds);
    for (;;) {
        int rc = attempt();
        if (rc <= 0) {
            return rc;
        }
        if (seconds <= 0 || Clock::now() >= deadline) {
            return 1;
        }
        napBetweenTries();
    }
}

// The state of one named lock in this process. fcntl locks belong to the process and
// fall the moment any descriptor of the file is closed, so each lock keeps one
// descriptor for the life of the process and nothing else here opens its file.
struct NamedLock {
    NamedLock(int lockId, const char* lockPath) : id(lockId), path(lockPath) {}
    const int id;
    const char* const path;
    std::mutex mutex;
    int fd = -1;
    pid_t owner = 0;  // the process whose state this is; a forked child holds nothing
    bool held = false;
    bool exclusive = false;
};

NamedLock g_locks[] = {
    {VLIBC_LOCK_PKG, "/tmp/lock/lock_pkg"},
};

NamedLock* findLock(int lock) {
    for (NamedLock& entry : g_locks) {
        if (entry.id == (lock & ~kFlagBits)) {
            return &entry;
        }
    }
    return nullptr;
}

// Opens the lock file unless the descriptor still names it. Someone may have removed
// and recreated the file (or its directory); a lock on the old inode would exclude
// nobody. Called only while the lock is not held, so closing loses nothing.
bool openLockFile(NamedLock& lock) {
    struct stat onDisk {};
    struct stat opened {};
    if (lock.fd >= 0 && stat(lock.path, &onDisk) == 0 && fstat(lock.fd, &opened) == 0 &&
        onDisk.st_dev == opened.st_dev && onDisk.st_ino == opened.st_ino) {
        return true;
    }
    if (lock.fd >= 0) {
        close(lock.fd);
        lock.fd = -1;
    }
    if (mkdir(kLockDir, 0755) != 0 && errno != EEXIST) {
        CORV_LOG_ERR("Failed to create %s, %m", kLockDir);
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return false;
    }
    lock.fd = open(lock.path, O_RDWR | O_CREAT | O_CLOEXEC, 0666);
    if (lock.fd < 0) {
        CORV_LOG_ERR("Failed to open %s, %m", lock.path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return false;
    }
    return true;
}

int setRecordLock(int fd, short type) {
    struct flock fl {};
    fl.l_type = type;
    fl.l_whence = SEEK_SET;
    int rc;
    do {
        rc = fcntl(fd, F_SETLK, &fl);
    } while (rc != 0 && errno == EINTR);
    return rc;
}

// One attempt under the lock's mutex: 0 taken, 1 busy, -1 failed.
int tryNamedLock(NamedLock& lock, bool exclusive) {
    std::lock_guard<std::mutex> guard(lock.mutex);
    if (lock.owner != getpid()) {
        lock.owner = getpid();
        lock.held = false;
    }
    if (lock.held && (lock.exclusive || !exclusive)) {
        return 0;
    }
    // Converting a held shared lock to exclusive keeps the descriptor: no reopening.
    if (!lock.held && !openLockFile(lock)) {
        return -1;
    }
    if (setRecordLock(lock.fd, exclusive ? F_WRLCK : F_RDLCK) != 0) {
        if (errno == EAGAIN || errno == EACCES) {
            return 1;
        }
        CORV_LOG_ERR("Failed to lock %s, %m", lock.path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return -1;
    }
    lock.held = true;
    lock.exclusive = exclusive;
    return 0;
}

int timedOut() {
    VLIBCErrSet(ERR_TIMEOUT);
    errno = EAGAIN;
    return -1;
}

}  // namespace

const char* VLIBCLockPath(int lock) {
    NamedLock* entry = findLock(lock);
    if (entry == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return nullptr;
    }
    return entry->path;
}

int VLIBCFileLock(int lock, int seconds) {
    NamedLock* entry = findLock(lock);
    if (entry == nullptr) {
        CORV_LOG_ERR("Unknown lock 0x%X", lock);
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        errno = EINVAL;
        return -1;
    }
    const bool exclusive = (lock & VLIBC_LOCK_EXCLUSIVE) != 0;
    const int wait = (lock & VLIBC_LOCK_WAIT) ? seconds : 0;
    int rc = retryUntil(wait, [&] { return tryNamedLock(*entry, exclusive); });
    return rc > 0 ? timedOut() : rc;
}

int VLIBCFileUnlock(int lock) {
    NamedLock* entry = findLock(lock);
    if (entry == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::lock_guard<std::mutex> guard(entry->mutex);
    if (!entry->held || entry->owner != getpid()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    entry->held = false;
    if (setRecordLock(entry->fd, F_UNLCK) != 0) {
        // Closing the descriptor drops every record lock of the process on the file.
        CORV_LOG_ERR("Failed to unlock %s, %m", entry->path);
        close(entry->fd);
        entry->fd = -1;
    }
    return 0;
}

int VLIBCFileLockTimeByFile(const char* path, int exclusive, int seconds, int* fd) {
    if (path == nullptr || fd == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        errno = EINVAL;
        return -1;
    }
    *fd = -1;
    int handle = open(path, O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    if (handle < 0 && errno == EACCES) {
        // A shared lock is fine on a file that the caller may only read.
        handle = open(path, O_RDONLY | O_CLOEXEC);
    }
    if (handle < 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to open %s, %m", path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        errno = err;
        return -1;
    }
    const int operation = (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB;
    int err = 0;
    int rc = retryUntil(seconds, [&] {
        if (flock(handle, operation) == 0) {
            return 0;
        }
        err = errno;
        return (err == EWOULDBLOCK || err == EINTR) ? 1 : -1;
    });
    if (rc != 0) {
        close(handle);
        if (rc > 0) {
            return timedOut();
        }
        errno = err;
        CORV_LOG_ERR("Failed to lock %s, %m", path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return -1;
    }
    *fd = handle;
    return 0;
}

int VLIBCFileUnlockByFile(int fd) {
    if (fd < 0) {
        return 0;
    }
    flock(fd, LOCK_UN);
    close(fd);
    return 0;
}
