// The processes of jobs: scripts run to their end under a time-out, main processes
// started detached and ended by signal, and the job's log.
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "init_job.h"
#include "io_util.h"

extern char** environ;

namespace CORVInit {

namespace {

using Clock = std::chrono::steady_clock;

// Jobs run with a fixed environment of their own, whoever asked for them: what a
// caller happens to have set (a test's variables, a user's shell) must not change what a
// job does.
constexpr char kJobPath[] = "PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin";
constexpr char kShell[] = "/bin/sh";
constexpr long kPollNanoseconds = 20 * 1000 * 1000;

using corvplat::UniqueFd;

std::vector<char*> pointers(std::vector<std::string>& strings) {
    std::vector<char*> out;
    for (std::string& s : strings) {
        out.push_back(&s[0]);
    }
    out.push_back(nullptr);
    return out;
}

// The shell words that run a process of the job: a script with -e, as upstart does, or
// the one command line in place of the shell.
std::vector<std::string> shellWords(const Job& job, const Process& process, const char* what) {
    if (process.isScript) {
        return {kShell, "-e", "-c", process.text, job.name + " " + what};
    }
    return {kShell, "-c", "exec " + process.text};
}

// In the second child only async-signal-safe calls: the caller may have threads.
[[noreturn]] void execDetached(char* const* argv, char* const* envp, int inFd, int outFd) {
    setsid();
    dup2(inFd, STDIN_FILENO);
    dup2(outFd, STDOUT_FILENO);
    dup2(outFd, STDERR_FILENO);
    // Nothing of the caller's may stay open in a process that outlives it: a lock
    // descriptor kept by a daemon would hold the job's lock for ever.
    if (close_range(3, ~0U, 0) != 0) {
        for (int fd = 3; fd < 1024; ++fd) {
            close(fd);
        }
    }
    struct sigaction dfl {};
    dfl.sa_handler = SIG_DFL;
    for (int sig = 1; sig < NSIG; ++sig) {
        sigaction(sig, &dfl, nullptr);  // fails harmlessly for KILL, STOP and the like
    }
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    if (chdir("/") != 0) {
        _exit(126);
    }
    execve(argv[0], argv, envp);
    _exit(127);
}

// Starts `argv` as the grandchild of this process, in a session of its own, so that it
// is nobody's child here (no zombie to reap) and no signal for the caller's terminal or
// process group reaches it. Its pid, or -1.
int spawnDaemon(std::vector<std::string> argv, std::vector<std::string> env, int outFd) {
    std::vector<char*> args = pointers(argv);
    std::vector<char*> envp = pointers(env);
    UniqueFd devNull(open("/dev/null", O_RDWR | O_CLOEXEC));
    int fds[2];
    if (devNull.get() < 0 || pipe2(fds, O_CLOEXEC) != 0) {
        CORV_LOG_ERR("Failed to prepare to start %s, %m", argv[0].c_str());
        VLIBCErrSet(ERR_OPEN_FAILED);
        return -1;
    }
    UniqueFd readEnd(fds[0]);
    UniqueFd writeEnd(fds[1]);
    const int out = outFd >= 0 ? outFd : devNull.get();
    pid_t child = VLIBCProcFork();
    if (child < 0) {
        return -1;
    }
    if (child == 0) {
        pid_t grandchild = fork();
        if (grandchild == 0) {
            execDetached(args.data(), envp.data(), devNull.get(), out);
        }
        ssize_t written = write(writeEnd.get(), &grandchild, sizeof grandchild);
        _exit(written == sizeof grandchild && grandchild > 0 ? 0 : 1);
    }
    writeEnd.reset();
    pid_t pid = -1;
    ssize_t n;
    do {
        n = read(readEnd.get(), &pid, sizeof pid);
    } while (n < 0 && errno == EINTR);
    int status = 0;
    while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
    }
    if (n != sizeof pid || pid <= 0) {
        CORV_LOG_ERR("Failed to start %s in the background", argv[0].c_str());
        VLIBCErrSet(ERR_CREATE_FAILED);
        return -1;
    }
    return pid;
}

void nap() {
    struct timespec ts = {0, kPollNanoseconds};
    nanosleep(&ts, nullptr);
}

// A descriptor that polls readable when `pid` ends, or -1 where the kernel has none. The
// process need not be our child: a job's main process is the grandchild of its starter.
int processHandle(int pid) {
#ifdef SYS_pidfd_open
    return static_cast<int>(syscall(SYS_pidfd_open, pid, 0));
#else
    (void)pid;
    return -1;
#endif
}

// Waits up to `seconds` for the process to end. True when it did. The end is waited for
// through a process handle; asking at intervals is left for kernels without one.
bool waitForEnd(int pid, unsigned long long startTime, int seconds) {
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(seconds);
    UniqueFd handle(processHandle(pid));
    while (ProcessStartTime(pid) == startTime) {
        const Clock::time_point now = Clock::now();
        if (now >= deadline) {
            return false;
        }
        if (handle.get() < 0) {
            nap();
            continue;
        }
        // The handle was opened before the start time was compared, so it is this
        // process's and not a later one's that took over the number.
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - now);
        struct pollfd ended = {handle.get(), POLLIN, 0};
        if (poll(&ended, 1, static_cast<int>(left.count()) + 1) < 0 && errno != EINTR) {
            handle.reset();
        }
    }
    return true;
}

}  // namespace

std::vector<std::string> JobEnvironment(const Job& job, const Variables& extra) {
    std::vector<std::string> env{kJobPath, "TERM=linux", "UPSTART_JOB=" + job.name};
    for (const auto& [name, value] : job.env) {
        env.push_back(name + "=" + value);
    }
    for (const auto& [name, value] : extra) {
        env.push_back(name + "=" + value);
    }
    return env;
}

int OpenJobLog(const Job& job) {
    if (job.consoleLog) {
        const std::string path = std::string(kLogDir) + "/" + job.name + ".log";
        if (CORVFSMkdirP(kLogDir, nullptr, 1, -1, -1, 0755) == 0) {
            int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0640);
            if (fd >= 0) {
                return fd;
            }
        }
        CORV_LOG_ERR("Failed to open %s, %m; the output of %s is lost", path.c_str(),
                     job.name.c_str());
    }
    return open("/dev/null", O_WRONLY | O_CLOEXEC);
}

int RunJobProcess(const Job& job, const Process& process, const char* what,
                  const Variables& extra) {
    std::vector<std::string> words = shellWords(job, process, what);
    CORVUtils::ProcessRunner runner(words[0],
                                    std::vector<std::string>(words.begin() + 1, words.end()));
    // A job must not see the environment of whoever asked for it.
    runner.clearEnvironment();
    for (const std::string& entry : JobEnvironment(job, extra)) {
        const size_t eq = entry.find('=');
        runner.addEnv(entry.substr(0, eq), entry.substr(eq + 1));
    }
    runner.setWorkingDirectory("/");
    runner.setTimeout(kScriptTimeout);
    UniqueFd log(OpenJobLog(job));
    int rc = runner.run(1, true, false, log.get());
    if (rc < 0) {
        CORV_LOG_ERR("%s of %s did not finish [0x%04X %s:%d]", what, job.name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
    }
    return rc;
}

int SpawnMainProcess(const Job& job) {
    UniqueFd log(OpenJobLog(job));
    int pid = spawnDaemon(shellWords(job, job.main, "main"), JobEnvironment(job, {}), log.get());
    if (pid < 0) {
        CORV_LOG_ERR("Failed to start the main process of %s", job.name.c_str());
    }
    return pid;
}

int SpawnDetached(const std::vector<std::string>& argv) {
    const std::string held = std::string(kHeldJobsVar) + "=";
    std::vector<std::string> env;
    for (char** p = environ; p != nullptr && *p != nullptr; ++p) {
        if (strncmp(*p, held.c_str(), held.size()) != 0) {
            env.emplace_back(*p);
        }
    }
    return spawnDaemon(argv, std::move(env), -1);
}

unsigned long long ProcessStartTime(int pid) {
    if (pid <= 0) {
        return 0;
    }
    std::string text;
    if (!ReadTextFile("/proc/" + std::to_string(pid) + "/stat", &text)) {
        return 0;
    }
    // "pid (comm) state ppid ...": comm may hold anything, the fields after it are plain.
    size_t close = text.rfind(')');
    if (close == std::string::npos || close + 2 >= text.size()) {
        return 0;
    }
    const char* p = text.c_str() + close + 2;
    if (*p == 'Z' || *p == 'X' || *p == 'x') {
        return 0;  // ended; only its parent has not collected it yet
    }
    // The start time is field 22; the state is field 3.
    for (int field = 3; field < 22 && p != nullptr; ++field) {
        p = strchr(p, ' ');
        if (p != nullptr) {
            ++p;
        }
    }
    return p != nullptr ? strtoull(p, nullptr, 10) : 0;
}

int EndProcess(int pid, unsigned long long startTime, int signal) {
    if (startTime == 0 || ProcessStartTime(pid) != startTime) {
        return 0;
    }
    // The main process leads a process group of its own: its children end with it.
    kill(-pid, signal);
    kill(pid, signal);
    if (waitForEnd(pid, startTime, kStopTimeout)) {
        return 0;
    }
    CORV_LOG_ERR("Process %d did not end within %d seconds of signal %d; killing it", pid,
                 kStopTimeout, signal);
    kill(-pid, SIGKILL);
    kill(pid, SIGKILL);
    if (waitForEnd(pid, startTime, kKillTimeout)) {
        return 0;
    }
    CORV_LOG_ERR("Process %d survived SIGKILL", pid);
    VLIBCErrSet(ERR_TIMEOUT);
    return -1;
}

bool IsHeldByAncestor(const std::string& name) {
    const char* held = getenv(kHeldJobsVar);
    if (held == nullptr) {
        return false;
    }
    const std::string list = std::string(" ") + held + " ";
    return list.find(" " + name + " ") != std::string::npos;
}

}  // namespace CORVInit
