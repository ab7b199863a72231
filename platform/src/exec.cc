// Running programs by path: to completion, detached, or through a pipe. Children are
// made with posix_spawn, which does not copy the caller's memory as fork would.
#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <stdarg.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <mutex>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"

extern char** environ;

namespace {

// Attributes and file actions of one spawn, released on every path.
class Spawn {
  public:
    Spawn() {
        ok_ = posix_spawnattr_init(&attr_) == 0;
        if (posix_spawn_file_actions_init(&actions_) != 0) {
            if (ok_) {
                posix_spawnattr_destroy(&attr_);
            }
            ok_ = false;
            return;
        }
        // A child starts from a clean slate of signals: what the caller blocks or ignores
        // for itself is none of the child's business.
        sigset_t none;
        sigset_t all;
        sigemptyset(&none);
        sigfillset(&all);
        ok_ = ok_ && posix_spawnattr_setsigmask(&attr_, &none) == 0 &&
              posix_spawnattr_setsigdefault(&attr_, &all) == 0 &&
              posix_spawnattr_setflags(&attr_, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF) == 0;
    }
    ~Spawn() {
        posix_spawn_file_actions_destroy(&actions_);
        posix_spawnattr_destroy(&attr_);
    }
    Spawn(const Spawn&) = delete;
    Spawn& operator=(const Spawn&) = delete;

    void nullOn(int target) {
        ok_ = ok_ && posix_spawn_file_actions_addopen(&actions_, target, "/dev/null",
                                                      target == 0 ? O_RDONLY : O_WRONLY, 0) == 0;
    }
    void dupTo(int fd, int target) {
        ok_ = ok_ && posix_spawn_file_actions_adddup2(&actions_, fd, target) == 0;
    }

    // The child's pid, or -1 with the cause in the slot.
    pid_t start(const char* path, const char* const* argv) {
        if (!ok_) {
            CORV_LOG_ERR("Failed to prepare to run %s", path);
            VLIBCErrSet(ERR_OUT_OF_MEMORY);
            return -1;
        }
        pid_t pid = -1;
        int err =
            posix_spawn(&pid, path, &actions_, &attr_, const_cast<char* const*>(argv), environ);
        if (err != 0) {
            errno = err;
            CORV_LOG_ERR("Failed to run %s, %m", path);
            VLIBCErrSet(err == ENOENT ? ERR_NO_SUCH_FILE : ERR_OPEN_FAILED);
            errno = err;
            return -1;
        }
        return pid;
    }

  private:
    posix_spawnattr_t attr_;
    posix_spawn_file_actions_t actions_;
    bool ok_ = false;
};

// The exit status, 128 + signal for a killed child, -1 when it cannot be waited for.
int waitExit(pid_t pid) {
    int status = 0;
    pid_t rc;
    do {
        rc = waitpid(pid, &status, 0);
    } while (rc < 0 && errno == EINTR);
    if (rc < 0) {
        CORV_LOG_ERR("Failed to wait for %d, %m", static_cast<int>(pid));
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (WIFSIGNALED(status)) {
        return 128 + WTERMSIG(status);
    }
    return WEXITSTATUS(status);
}

// The arguments after the fixed ones, up to a null pointer, behind argv[0] = path.
std::vector<const char*> collectArgs(const char* path, va_list ap) {
    std::vector<const char*> argv{path};
    while (const char* arg = va_arg(ap, const char*)) {
        argv.push_back(arg);
    }
    argv.push_back(nullptr);
    return argv;
}

int runArgv(const char* path, const char* const* argv, int flags) {
    if (path == nullptr || argv == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    Spawn spawn;
    if (flags & VLIBC_EXEC_NULL_STDIN) {
        spawn.nullOn(STDIN_FILENO);
    }
    if (flags & VLIBC_EXEC_NULL_STDOUT) {
        spawn.nullOn(STDOUT_FILENO);
    }
    if (flags & VLIBC_EXEC_NULL_STDERR) {
        spawn.nullOn(STDERR_FILENO);
    }
    pid_t pid = spawn.start(path, argv);
    if (pid < 0) {
        return -1;
    }
    return (flags & VLIBC_EXEC_WAIT) ? waitExit(pid) : 0;
}

// Which child is behind each pipe, for VLIBCPclose.
std::mutex g_pipesMutex;
std::map<FILE*, pid_t> g_pipes;

}  // namespace

int VLIBCExec(const char* path, ...) {
    va_list ap;
    va_start(ap, path);
    std::vector<const char*> argv = collectArgs(path, ap);
    va_end(ap);
    return runArgv(path, argv.data(), VLIBC_EXEC_WAIT);
}

int VLIBCExecl(const char* path, int flags, ...) {
    va_list ap;
    va_start(ap, flags);
    std::vector<const char*> argv = collectArgs(path, ap);
    va_end(ap);
    return runArgv(path, argv.data(), flags);
}

int VLIBCExecv(const char* path, const char* const* argv, int wait) {
    const char* const alone[] = {path, nullptr};
    return runArgv(path, argv ? argv : alone, wait ? VLIBC_EXEC_WAIT : 0);
}

FILE* VLIBCPopenv(const char* path, const char* mode, const char* const* argv) {
    if (path == nullptr || mode == nullptr || (mode[0] != 'r' && mode[0] != 'w')) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return nullptr;
    }
    const bool reading = mode[0] == 'r';
    // Both ends close on exec: other children started meanwhile must not hold the pipe,
    // or the reader would never see its end.
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        CORV_LOG_ERR("Failed to create a pipe for %s, %m", path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return nullptr;
    }
    const int ours = reading ? fds[0] : fds[1];
    const int theirs = reading ? fds[1] : fds[0];
    pid_t pid = -1;
    {
        Spawn spawn;
        spawn.dupTo(theirs, reading ? STDOUT_FILENO : STDIN_FILENO);
        if (strchr(mode, 'q') != nullptr) {
            spawn.nullOn(STDERR_FILENO);
        }
        const char* const alone[] = {path, nullptr};
        pid = spawn.start(path, argv ? argv : alone);
    }
    close(theirs);
    if (pid < 0) {
        close(ours);
        return nullptr;
    }
    FILE* stream = fdopen(ours, reading ? "r" : "w");
    if (stream == nullptr) {
        CORV_LOG_ERR("Failed to open the pipe of %s, %m", path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        close(ours);
        waitExit(pid);
        return nullptr;
    }
    std::lock_guard<std::mutex> guard(g_pipesMutex);
    g_pipes[stream] = pid;
    return stream;
}

FILE* VLIBCPopen(const char* path, const char* mode, ...) {
    va_list ap;
    va_start(ap, mode);
    std::vector<const char*> argv = collectArgs(path, ap);
    va_end(ap);
    return VLIBCPopenv(path, mode, argv.data());
}

int VLIBCPclose(FILE* stream) {
    pid_t pid = -1;
    {
        std::lock_guard<std::mutex> guard(g_pipesMutex);
        auto it = g_pipes.find(stream);
        if (it != g_pipes.end()) {
            pid = it->second;
            g_pipes.erase(it);
        }
    }
    if (pid < 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    // Closing first: a writer's child sees the end of its input, a reader's child that
    // still writes gets SIGPIPE instead of blocking for ever.
    fclose(stream);
    return waitExit(pid);
}

pid_t VLIBCProcFork() {
    pid_t pid = fork();
    if (pid < 0) {
        CORV_LOG_ERR("Failed to fork, %m");
        VLIBCErrSet(ERR_CREATE_FAILED);
    }
    return pid;
}

int VLIBCProcAlive(pid_t pid) {
    if (pid <= 0) {
        return 0;
    }
    // EPERM: the process exists, it is only somebody else's.
    return kill(pid, 0) == 0 || errno == EPERM ? 1 : 0;
}
