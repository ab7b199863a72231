// Runs one program with arguments, environment and identity; captures what it writes.
#include "corv/process_runner.h"
#include "io_util.h"

#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <poll.h>
#include <pwd.h>
#include <signal.h>
#include <spawn.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <string>
#include <unordered_map>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"

extern char** environ;

namespace CORVUtils {

namespace {

using Clock = std::chrono::steady_clock;

// Without a pollable process handle (kernels before 5.3) the end of the child shows
// only by asking; this is how often.
constexpr int kReapPollMs = 50;
constexpr size_t kChunk = 64 * 1024;
constexpr gid_t kFallbackSystemGid = 1;

class Fd {
  public:
    explicit Fd(int fd = -1) : fd_(fd) {}
    ~Fd() { reset(); }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    int get() const { return fd_; }
    void reset(int fd = -1) {
        if (fd_ >= 0) {
            close(fd_);
        }
        fd_ = fd;
    }

  private:
    int fd_;
};

struct Pipe {
    Fd read;
    Fd write;
    bool open() {
        int fds[2];
        if (pipe2(fds, O_CLOEXEC) != 0) {
            return false;
        }
        read.reset(fds[0]);
        write.reset(fds[1]);
        return true;
    }
};

// A descriptor that polls readable once `pid` has ended, or -1 where the kernel has none.
int processHandle(pid_t pid) {
#ifdef SYS_pidfd_open
    return static_cast<int>(syscall(SYS_pidfd_open, pid, 0));
#else
    (void)pid;
    return -1;
#endif
}

int exitOf(int status) {
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

pid_t waitBlocking(pid_t pid, int* status) {
    pid_t rc;
    do {
        rc = waitpid(pid, status, 0);
    } while (rc < 0 && errno == EINTR);
    return rc;
}

using corvplat::writeAll;

// Where the platform set-up puts a `gzip` that decompresses on several cores (Debian's
// pigz), when the machine has one. tar runs whatever `gzip` it finds first on PATH.
constexpr char kTarGzipDir[] = "/usr/corv/libexec/tar-gzip";
constexpr char kDefaultPath[] = "/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin";

// The PATH of a /bin/tar child: the faster gzip first. Other programs, package scripts
// above all, get the caller's PATH unchanged.
void preferFastGzip(const std::string& program, std::vector<std::string>& env,
                    std::unordered_map<std::string, size_t>& where) {
    if (program != "/bin/tar" || access((std::string(kTarGzipDir) + "/gzip").c_str(), X_OK) != 0) {
        return;
    }
    auto it = where.find("PATH");
    if (it == where.end()) {
        where.emplace("PATH", env.size());
        env.push_back(std::string("PATH=") + kTarGzipDir + ":" + kDefaultPath);
    } else {
        env[it->second].insert(5, std::string(kTarGzipDir) + ":");
    }
}

// NAME=value strings: the caller's environment (unless `clear`) with the added entries on
// top.
std::vector<std::string> childEnvironment(
    const std::string& program, const std::vector<std::pair<std::string, std::string>>& added,
    bool clear) {
    std::vector<std::string> env;
    std::unordered_map<std::string, size_t> where;
    for (char** p = clear ? nullptr : environ; p != nullptr && *p != nullptr; ++p) {
        std::string entry(*p);
        std::string name = entry.substr(0, entry.find('='));
        auto it = where.find(name);
        if (it != where.end()) {
            env[it->second] = std::move(entry);
        } else {
            where.emplace(std::move(name), env.size());
            env.push_back(std::move(entry));
        }
    }
    for (const auto& [name, value] : added) {
        std::string entry = name + "=" + value;
        auto it = where.find(name);
        if (it != where.end()) {
            env[it->second] = std::move(entry);
        } else {
            where.emplace(name, env.size());
            env.push_back(std::move(entry));
        }
    }
    preferFastGzip(program, env, where);
    return env;
}

// Whether `program` with `args` is "rm -rf" of paths that do not exist or "mkdir -p" of
// directories that do: commands whose whole effect is known without running them.
bool doesNothing(const std::string& program, const std::vector<std::string>& args) {
    const bool rm = program == "/bin/rm";
    if (!(rm || program == "/bin/mkdir") || args.size() < 2 || args[0] != (rm ? "-rf" : "-p")) {
        return false;
    }
    for (size_t i = 1; i < args.size(); ++i) {
        struct stat st {};
        if (args[i].empty() || args[i][0] != '/') {
            return false;
        }
        const bool absent = lstat(args[i].c_str(), &st) != 0 && errno == ENOENT;
        const bool isDir = !rm && stat(args[i].c_str(), &st) == 0 && S_ISDIR(st.st_mode);
        if (rm ? !absent : !isDir) {
            return false;
        }
    }
    return true;
}

std::vector<char*> pointers(std::vector<std::string>& strings) {
    std::vector<char*> out;
    out.reserve(strings.size() + 1);
    for (std::string& s : strings) {
        out.push_back(&s[0]);
    }
    out.push_back(nullptr);
    return out;
}

// What the child is given, ready before it exists: after fork only async-signal-safe
// calls may run.
struct Launch {
    const char* path;
    char* const* argv;
    char* const* envp;
    const char* workdir;  // null: the caller's
    int stdoutFd;         // -1: inherited
    int stderrFd;
};

struct Identity {
    uid_t uid;
    gid_t gid;
    const std::vector<gid_t>* groups;
};

pid_t spawnPlain(const Launch& launch) {
    posix_spawnattr_t attr;
    posix_spawn_file_actions_t actions;
    if (posix_spawnattr_init(&attr) != 0) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    if (posix_spawn_file_actions_init(&actions) != 0) {
        posix_spawnattr_destroy(&attr);
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    sigset_t none;
    sigset_t all;
    sigemptyset(&none);
    sigfillset(&all);
    bool ok = posix_spawnattr_setsigmask(&attr, &none) == 0 &&
              posix_spawnattr_setsigdefault(&attr, &all) == 0 &&
              posix_spawnattr_setpgroup(&attr, 0) == 0 &&
              posix_spawnattr_setflags(&attr, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF |
                                                  POSIX_SPAWN_SETPGROUP) == 0;
    if (ok && launch.stdoutFd >= 0) {
        ok = posix_spawn_file_actions_adddup2(&actions, launch.stdoutFd, STDOUT_FILENO) == 0;
    }
    if (ok && launch.stderrFd >= 0) {
        ok = posix_spawn_file_actions_adddup2(&actions, launch.stderrFd, STDERR_FILENO) == 0;
    }
    if (ok && launch.workdir != nullptr) {
        ok = posix_spawn_file_actions_addchdir_np(&actions, launch.workdir) == 0;
    }
    pid_t pid = -1;
    int err =
        ok ? posix_spawn(&pid, launch.path, &actions, &attr, launch.argv, launch.envp) : ENOMEM;
    posix_spawn_file_actions_destroy(&actions);
    posix_spawnattr_destroy(&attr);
    if (err != 0) {
        errno = err;
        CORV_LOG_ERR("Failed to run %s, %m", launch.path);
        VLIBCErrSet(err == ENOENT ? ERR_NO_SUCH_FILE : ERR_OPEN_FAILED);
        return -1;
    }
    return pid;
}

[[noreturn]] void childFail(int report) {
    int err = errno;
    ssize_t ignored = write(report, &err, sizeof(err));
    (void)ignored;
    _exit(127);
}

void childRedirect(int fd, int target, int report) {
    if (fd < 0) {
        return;
    }
    if (fd == target) {
        // dup2 onto itself keeps close-on-exec; the child must keep this one.
        if (fcntl(fd, F_SETFD, 0) != 0) {
            childFail(report);
        }
    } else if (dup2(fd, target) < 0) {
        childFail(report);
    }
}

// posix_spawn cannot change the identity, so this path forks. The child reports a
// failure before or at exec through a close-on-exec pipe: an empty read means exec
// succeeded.
pid_t spawnAs(const Launch& launch, const Identity& id) {
    Pipe report;
    if (!report.open()) {
        CORV_LOG_ERR("Failed to create a pipe for %s, %m", launch.path);
        VLIBCErrSet(ERR_OPEN_FAILED);
        return -1;
    }
    pid_t pid = fork();
    if (pid < 0) {
        CORV_LOG_ERR("Failed to fork for %s, %m", launch.path);
        VLIBCErrSet(ERR_CREATE_FAILED);
        return -1;
    }
    if (pid == 0) {
        const int fd = report.write.get();
        setpgid(0, 0);
        childRedirect(launch.stdoutFd, STDOUT_FILENO, fd);
        childRedirect(launch.stderrFd, STDERR_FILENO, fd);
        if (launch.workdir != nullptr && chdir(launch.workdir) != 0) {
            childFail(fd);
        }
        if (setgroups(id.groups->size(), id.groups->data()) != 0 || setgid(id.gid) != 0 ||
            setuid(id.uid) != 0) {
            childFail(fd);
        }
        struct sigaction dfl {};
        dfl.sa_handler = SIG_DFL;
        for (int sig = 1; sig < NSIG; ++sig) {
            sigaction(sig, &dfl, nullptr);  // fails harmlessly for KILL, STOP and the like
        }
        sigset_t none;
        sigemptyset(&none);
        sigprocmask(SIG_SETMASK, &none, nullptr);
        execve(launch.path, launch.argv, launch.envp);
        childFail(fd);
    }
    setpgid(pid, pid);  // either side may be first; the group must exist before a kill
    report.write.reset();
    int err = 0;
    ssize_t n;
    do {
        n = read(report.read.get(), &err, sizeof(err));
    } while (n < 0 && errno == EINTR);
    if (n > 0) {
        int status = 0;
        waitBlocking(pid, &status);
        errno = err;
        CORV_LOG_ERR("Failed to run %s as %d:%d, %m", launch.path, static_cast<int>(id.uid),
                     static_cast<int>(id.gid));
        VLIBCErrSet(err == ENOENT ? ERR_NO_SUCH_FILE : ERR_OPEN_FAILED);
        return -1;
    }
    return pid;
}

// One output stream of the child while it is collected.
struct Stream {
    Fd* fd;
    std::string* kept;
};

class Collector {
  public:
    explicit Collector(int teeFd) : teeFd_(teeFd), buffer_(kChunk) {}

    // Reads once; false when the stream is over.
    bool readSome(Stream& s) {
        ssize_t n = read(s.fd->get(), buffer_.data(), kChunk);
        if (n < 0) {
            return errno == EAGAIN || errno == EINTR;
        }
        if (n == 0) {
            return false;
        }
        take(s, static_cast<size_t>(n));
        return true;
    }

    // What is in the pipe now, and nothing that comes later: whoever still holds the
    // other end (a daemon the child started) may write for ever.
    void drain(Stream& s) {
        int avail = 0;
        if (ioctl(s.fd->get(), FIONREAD, &avail) != 0) {
            return;
        }
        size_t left = avail > 0 ? static_cast<size_t>(avail) : 0;
        while (left > 0) {
            ssize_t n = read(s.fd->get(), buffer_.data(), std::min(left, kChunk));
            if (n <= 0) {
                break;
            }
            take(s, static_cast<size_t>(n));
            left -= static_cast<size_t>(n);
        }
    }

  private:
    void take(Stream& s, size_t n) {
        const size_t room =
            ProcessRunner::kCaptureLimit - std::min(s.kept->size(), ProcessRunner::kCaptureLimit);
        s.kept->append(buffer_.data(), std::min(n, room));
        if (teeFd_ >= 0 && !writeAll(teeFd_, buffer_.data(), n)) {
            CORV_LOG_ERR("Failed to copy the output to fd %d, %m", teeFd_);
            teeFd_ = -1;
        }
    }

    int teeFd_;
    std::vector<char> buffer_;
};

// How a wait for the child ended.
enum class Waited { kExited, kTimedOut, kFailed };

// Reads the child's output while it runs, until it ends (its wait status in `status`) or
// `timeoutSeconds` pass (0: no limit). The pidfd, where the kernel has one, wakes the poll
// at the child's end; without it the poll wakes every kReapPollMs to look.
Waited collectUntilExit(pid_t pid, int timeoutSeconds, Stream (&streams)[2], Collector& collector,
                        int& status) {
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(timeoutSeconds);
    Fd exitFd(processHandle(pid));
    for (;;) {
        // The child's end; after it only what the pipes hold already is read.
        pid_t reaped = waitpid(pid, &status, WNOHANG);
        if (reaped == pid) {
            for (Stream& s : streams) {
                if (s.fd->get() >= 0) {
                    collector.drain(s);
                }
            }
            return Waited::kExited;
        }
        if (reaped < 0 && errno != EINTR) {
            return Waited::kFailed;
        }
        int timeoutMs = -1;
        if (timeoutSeconds > 0) {
            auto left =
                std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
            if (left.count() <= 0) {
                return Waited::kTimedOut;
            }
            timeoutMs = static_cast<int>(left.count());
        }
        if (exitFd.get() < 0 && (timeoutMs < 0 || timeoutMs > kReapPollMs)) {
            timeoutMs = kReapPollMs;
        }
        struct pollfd pfds[3];
        Stream* owners[3] = {};
        nfds_t n = 0;
        for (Stream& s : streams) {
            if (s.fd->get() >= 0) {
                owners[n] = &s;
                pfds[n++] = {s.fd->get(), POLLIN, 0};
            }
        }
        if (exitFd.get() >= 0) {
            pfds[n++] = {exitFd.get(), POLLIN, 0};
        }
        if (n == 0) {
            // Nothing to read and nothing to wake us: the child's end is all there is.
            if (timeoutSeconds == 0 && waitBlocking(pid, &status) == pid) {
                return Waited::kExited;
            }
            poll(nullptr, 0, timeoutMs);
            continue;
        }
        if (poll(pfds, n, timeoutMs) < 0) {
            continue;  // EINTR; anything else shows again at waitpid
        }
        for (nfds_t i = 0; i < n; ++i) {
            if (owners[i] != nullptr && (pfds[i].revents & (POLLIN | POLLHUP | POLLERR)) &&
                !collector.readSome(*owners[i])) {
                owners[i]->fd->reset();
            }
        }
    }
}

}  // namespace

ProcessRunner::ProcessRunner(std::string program, std::vector<std::string> args)
    : program_(std::move(program)), args_(std::move(args)) {}

ProcessRunner::ProcessRunner(std::string program, std::initializer_list<std::string> args)
    : program_(std::move(program)), args_(args) {}

void ProcessRunner::addArguments(const std::string& arg) {
    args_.push_back(arg);
}

void ProcessRunner::addEnv(const std::string& name, const std::string& value) {
    env_.emplace_back(name, value);
}

void ProcessRunner::clearEnvironment() {
    clearEnv_ = true;
}

bool ProcessRunner::setRuntimeIdentity(const std::string& user, bool ownGroup) {
    std::vector<char> buf(16384);
    struct passwd pw {};
    struct passwd* found = nullptr;
    int rc;
    while ((rc = getpwnam_r(user.c_str(), &pw, buf.data(), buf.size(), &found)) == ERANGE) {
        buf.resize(buf.size() * 2);
    }
    if (rc != 0 || found == nullptr) {
        CORV_LOG_ERR("Failed to find user %s", user.c_str());
        VLIBCErrSet(ERR_NO_SUCH_USER);
        return false;
    }
    gid_t gid = pw.pw_gid;
    if (!ownGroup) {
        std::vector<char> gbuf(65536);
        struct group gr {};
        struct group* grFound = nullptr;
        while ((rc = getgrnam_r("system", &gr, gbuf.data(), gbuf.size(), &grFound)) == ERANGE) {
            gbuf.resize(gbuf.size() * 2);
        }
        gid = (rc == 0 && grFound != nullptr) ? gr.gr_gid : kFallbackSystemGid;
    }
    std::vector<gid_t> groups(32);
    int count = static_cast<int>(groups.size());
    while (getgrouplist(pw.pw_name, gid, groups.data(), &count) < 0) {
        if (count <= static_cast<int>(groups.size())) {
            CORV_LOG_ERR("Failed to list the groups of %s", user.c_str());
            VLIBCErrSet(ERR_NO_SUCH_GROUP);
            return false;
        }
        groups.resize(static_cast<size_t>(count));
    }
    groups.resize(static_cast<size_t>(count));
    hasIdentity_ = true;
    uid_ = pw.pw_uid;
    gid_ = gid;
    groups_ = std::move(groups);
    return true;
}

void ProcessRunner::setTimeout(int seconds) {
    timeout_ = seconds > 0 ? seconds : 0;
}

void ProcessRunner::setArgZero(const std::string& name) {
    argZero_ = name;
}

void ProcessRunner::setWorkingDirectory(const std::string& dir) {
    workdir_ = dir;
}

int ProcessRunner::run(bool wait, bool capture) {
    return run(1, wait, capture, -1);
}

int ProcessRunner::run(int, bool wait, bool capture, int fd) {
    out_.clear();
    err_.clear();
    pid_ = -1;
    if (!hasIdentity_ && doesNothing(program_, args_)) {
        return 0;  // a process start costs more than many a whole operation of ours
    }
    // Nobody would read the pipes of a child that is not waited for.
    capture = capture && wait;

    std::vector<std::string> argStrings;
    argStrings.reserve(args_.size() + 1);
    argStrings.push_back(argZero_.empty() ? program_ : argZero_);
    argStrings.insert(argStrings.end(), args_.begin(), args_.end());
    std::vector<std::string> envStrings = childEnvironment(program_, env_, clearEnv_);
    std::vector<char*> argv = pointers(argStrings);
    std::vector<char*> envp = pointers(envStrings);

    Pipe out;
    Pipe err;
    if (capture && (!out.open() || !err.open())) {
        CORV_LOG_ERR("Failed to create pipes for %s, %m", program_.c_str());
        VLIBCErrSet(ERR_OPEN_FAILED);
        return -1;
    }
    Launch launch{program_.c_str(),
                  argv.data(),
                  envp.data(),
                  workdir_.empty() ? nullptr : workdir_.c_str(),
                  capture ? out.write.get() : fd,
                  capture ? err.write.get() : fd};
    Identity id{uid_, gid_, &groups_};
    pid_ = hasIdentity_ ? spawnAs(launch, id) : spawnPlain(launch);
    if (pid_ < 0) {
        return -1;
    }
    out.write.reset();
    err.write.reset();
    if (!wait) {
        return 0;
    }

    Collector collector(fd);
    Stream streams[] = {{&out.read, &out_}, {&err.read, &err_}};
    for (Stream& s : streams) {
        if (s.fd->get() >= 0) {
            fcntl(s.fd->get(), F_SETFL, O_NONBLOCK);
        }
    }
    int status = 0;
    switch (collectUntilExit(pid_, timeout_, streams, collector, status)) {
        case Waited::kExited:
            return exitOf(status);
        case Waited::kFailed:
            CORV_LOG_ERR("Failed to wait for %s, %m", program_.c_str());
            VLIBCErrSet(ERR_BAD_PARAMETERS);
            return -1;
        case Waited::kTimedOut:
            break;
    }

    CORV_LOG_ERR("%s did not end within %d seconds, killed", program_.c_str(), timeout_);
    kill(-pid_, SIGKILL);
    kill(pid_, SIGKILL);  // in case it left its group
    waitBlocking(pid_, &status);
    VLIBCErrSet(ERR_TIMEOUT);
    return -1;
}

namespace {

std::string quoted(const std::string& word) {
    if (!word.empty() && word.find_first_of(" \t\n\"'") == std::string::npos) {
        return word;
    }
    std::string out = "\"";
    for (char c : word) {
        if (c == '"' || c == '\\') {
            out += '\\';
        }
        out += c;
    }
    out += '"';
    return out;
}

}  // namespace

std::string ProcessRunner::toString() const {
    std::string line = quoted(program_);
    for (const std::string& arg : args_) {
        line += ' ';
        line += quoted(arg);
    }
    return line;
}

}  // namespace CORVUtils
