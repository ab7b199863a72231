// corv-sandbox: runs a command as root in a throw-away copy of this machine.
//
// The package engine writes to fixed system paths (/var/packages, /volume1, /usr/corv,
// /etc/corvinfo.conf ...). Tests, the demo and benchmarks must be able to do that freely
// without ever touching the host, and each test case wants a machine of its own. This
// program gives it one in a few milliseconds, using nothing but namespaces and mounts:
//
//   * new mount, PID and UTS namespaces, and a new network namespace holding only a
//     loopback interface (--host-net keeps the host's network);
//   * the root is an overlayfs whose lower layer is the host's root filesystem and whose
//     upper layer lives on a private tmpfs (or in --keep DIR), so every change is
//     copy-on-write and vanishes with the sandbox;
//   * fresh tmpfs on /tmp and /run, fresh /proc (with /proc/sys read-only), a minimal /dev
//     (the host's terminals only when run from one), a read-only /sys;
//   * size-limited tmpfs volumes (/volume1, 64 MiB, by default), so a full volume is real;
//     CORV_SANDBOX_VOLUMES tells the command which ("/volume1:67108864 ...");
//   * no CAP_SYS_MODULE, CAP_SYS_TIME or CAP_SYS_BOOT, which no namespace confines.
//
// --keep DIR keeps the upper layer in DIR/upper (deletions show there as overlayfs
// whiteouts) and the volumes' contents in DIR/volumes/, and a later run with the same DIR
// starts from them; /tmp and /run start empty all the same, as after a reboot.
//
// Process layout. The process started by the caller (the supervisor) stays in the host's
// namespaces; it forks the sandbox's PID 1, which builds the mounts, runs --init, runs the
// command and reaps whatever the command orphans. When PID 1 exits the kernel kills every
// process left in its PID namespace, so nothing the command started can outlive the
// sandbox. PID 1 also dies with the supervisor (PR_SET_PDEATHSIG), so killing the
// supervisor - as ctest does on a timeout - tears the whole sandbox down.
//
// What of the host is visible. Overlayfs only shows the root filesystem itself, not the
// filesystems mounted on it. Paths the command needs that live elsewhere are passed through
// by bind mounts, read-write, at the same place:
// every --bind PATH, exactly as given (file or directory);
// for the working directory and for every absolute path among the command, its
//      arguments (also the value of NAME=/path arguments) and --init: if the path lies on
//      a filesystem other than the root one, the mount point of that filesystem (with
//      everything mounted below it) - e.g. /work when /work is a mount of its own; if it
//      lies below /tmp, /run or a volume, which the sandbox replaces with its own, the
//      top-level directory under that (/tmp/x for /tmp/x/y/z), or the mount point of its
//      filesystem when that is deeper.
// Paths on the root filesystem need nothing: the overlay shows them, copy-on-write. Paths
// under /proc, /sys and /dev are the sandbox's own. A mount point that is or contains a
// system tree (/usr, /etc, /var ...) is never passed through implicitly, as that would let
// the engine write to the host; name it with --bind to share it anyway.
//
// Exit status: the command's, or 128+N when it was killed by signal N; 125 when the
// sandbox itself could not be set up (usage, not root, no namespaces or overlayfs, a
// failing --init); 126/127 when the command cannot be executed / is not found.

#include <ctype.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <net/if.h>
#include <poll.h>
#include <sched.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <linux/capability.h>

#include <algorithm>
#include <cstdint>
#include <fstream>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace {

constexpr char kProgram[] = "corv-sandbox";
constexpr char kHostname[] = "corv-sandbox";
constexpr int kSandboxFailed = 125;
constexpr int kCannotExecute = 126;
constexpr int kNotFound = 127;
constexpr std::uint64_t kDefaultVolumeBytes = 64ull << 20;

// Where PID 1 mounts its scratch tmpfs (overlay upper layer and the new root's mount
// point) before pivoting. It is only ever mounted in the sandbox's own mount namespace;
// host paths below it that are still needed are reached through descriptors opened first.
constexpr char kScratch[] = "/tmp";

// Signals the supervisor and PID 1 pass on to the command instead of dying of them.
constexpr int kForwardedSignals[] = {SIGTERM, SIGINT, SIGHUP, SIGQUIT, SIGUSR1, SIGUSR2};

class Error : public std::runtime_error {
  public:
    using std::runtime_error::runtime_error;
};

[[noreturn]] void fail(const std::string& what) {
    throw Error(what);
}

[[noreturn]] void fail_errno(const std::string& what) {
    throw Error(what + ": " + strerror(errno));
}

void warn(const std::string& what) {
    fprintf(stderr, "%s: %s\n", kProgram, what.c_str());
}

// Owns a file descriptor.
class Fd {
  public:
    Fd() = default;
    explicit Fd(int fd) : fd_(fd) {}
    Fd(Fd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
    Fd& operator=(Fd&& other) noexcept {
        if (this != &other) {
            reset();
            fd_ = std::exchange(other.fd_, -1);
        }
        return *this;
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    ~Fd() { reset(); }

    int get() const { return fd_; }
    bool valid() const { return fd_ >= 0; }
    void reset() {
        if (fd_ >= 0)
            close(fd_);
        fd_ = -1;
    }
    // Paths that reach what the descriptor refers to even when a mount hides it or it lies
    // outside the current root: for this process, and - once the sandbox's own /proc is in
    // place - for any process of the sandbox, through PID 1's descriptor table.
    std::string self_path() const { return "/proc/self/fd/" + std::to_string(fd_); }
    std::string pid1_path() const { return "/proc/1/fd/" + std::to_string(fd_); }

  private:
    int fd_ = -1;
};

struct Volume {
    std::string path;
    std::uint64_t bytes = kDefaultVolumeBytes;
};

struct Options {
    std::vector<Volume> volumes;
    bool no_volume = false;
    std::string keep;
    std::vector<std::string> binds;
    bool host_net = false;
    std::string init;
    std::vector<std::string> command;
};

const char kUsage[] =
    "usage: corv-sandbox [--volume /volumeN[:SIZE]]... [--no-volume] [--keep DIR]\n"
    "                    [--bind PATH]... [--host-net] [--init PROGRAM] [--] COMMAND [ARGS...]\n"
    "\n"
    "Runs COMMAND as root in a private, copy-on-write copy of this machine.\n"
    "\n"
    "  --volume /volumeN[:SIZE]  add a tmpfs volume of SIZE (e.g. 32M, 1G; default 64M);\n"
    "                            replaces the default /volume1 of 64M\n"
    "  --no-volume               no volume at all\n"
    "  --keep DIR                keep every change in DIR (upper/, work/, volumes/) and\n"
    "                            start from what DIR already holds\n"
    "  --bind PATH               show the host's PATH read-write at the same place\n"
    "  --host-net                share the host's network instead of loopback only\n"
    "  --init PROGRAM            run PROGRAM inside before COMMAND; its failure aborts\n"
    "\n"
    "The working directory and absolute path arguments on other filesystems are passed\n"
    "through as well. COMMAND sees CORV_SANDBOX=1 and CORV_SANDBOX_VOLUMES (\"/volume1:BYTES\n"
    "...\"). Exit status: COMMAND's (128+N if it was killed by signal N), 125 if the sandbox\n"
    "could not be set up.\n";

[[noreturn]] void usage_error(const std::string& what) {
    fprintf(stderr, "%s: %s (see %s --help)\n", kProgram, what.c_str(), kProgram);
    exit(kSandboxFailed);
}

// "64M", "1G", "512K", "1048576" (bytes); binary units, also written "MB" or "MiB".
bool parse_size(const std::string& text, std::uint64_t* bytes) {
    size_t digits = 0;
    while (digits < text.size() && text[digits] >= '0' && text[digits] <= '9')
        ++digits;
    if (digits == 0 || digits > 15)
        return false;
    const std::uint64_t value = std::stoull(text.substr(0, digits));
    const std::string unit = text.substr(digits);
    int shift = 0;
    if (!unit.empty()) {
        const std::string units = "KMGT";
        const auto index =
            units.find(static_cast<char>(toupper(static_cast<unsigned char>(unit[0]))));
        const std::string rest = unit.substr(1);
        if (index == std::string::npos || !(rest.empty() || rest == "B" || rest == "iB"))
            return false;
        shift = 10 * static_cast<int>(index + 1);
    }
    if (value == 0 || value > (UINT64_MAX >> shift))
        return false;
    *bytes = value << shift;
    return true;
}

Volume parse_volume(const std::string& spec) {
    Volume volume;
    const auto colon = spec.find(':');
    volume.path = spec.substr(0, colon);
    if (colon != std::string::npos && !parse_size(spec.substr(colon + 1), &volume.bytes))
        usage_error("--volume " + spec + ": bad size (expected e.g. 32M or 1G)");
    // A volume is a top-level directory named like the appliance's: /volume1, /volumeUSB1.
    if (volume.path.rfind("/volume", 0) != 0 || volume.path.size() == 7 ||
        volume.path.find('/', 1) != std::string::npos)
        usage_error("--volume " + spec + ": expected /volumeN[:SIZE]");
    return volume;
}

Options parse_options(int argc, char** argv) {
    Options options;
    int i = 1;
    // Accepts "--name value" and "--name=value".
    auto value_of = [&](const std::string& arg, const std::string& name, std::string* value) {
        if (arg == name) {
            if (i + 1 >= argc)
                usage_error(name + " needs a value");
            *value = argv[++i];
            return true;
        }
        if (arg.rfind(name + "=", 0) == 0) {
            *value = arg.substr(name.size() + 1);
            return true;
        }
        return false;
    };
    for (; i < argc; ++i) {
        const std::string arg = argv[i];
        std::string value;
        if (arg == "--") {
            ++i;
            break;
        } else if (arg == "-h" || arg == "--help") {
            fputs(kUsage, stdout);
            exit(0);
        } else if (value_of(arg, "--volume", &value)) {
            options.volumes.push_back(parse_volume(value));
        } else if (arg == "--no-volume") {
            options.no_volume = true;
        } else if (value_of(arg, "--keep", &value)) {
            options.keep = value;
        } else if (value_of(arg, "--bind", &value)) {
            options.binds.push_back(value);
        } else if (arg == "--host-net") {
            options.host_net = true;
        } else if (value_of(arg, "--init", &value)) {
            options.init = value;
        } else if (arg.size() > 1 && arg[0] == '-') {
            usage_error("unknown option " + arg);
        } else {
            break;
        }
    }
    for (; i < argc; ++i)
        options.command.push_back(argv[i]);
    if (options.command.empty())
        usage_error("no command given");
    if (options.no_volume && !options.volumes.empty())
        usage_error("--no-volume and --volume exclude each other");
    if (!options.no_volume && options.volumes.empty())
        options.volumes.push_back(Volume{"/volume1", kDefaultVolumeBytes});
    for (size_t a = 0; a < options.volumes.size(); ++a)
        for (size_t b = a + 1; b < options.volumes.size(); ++b)
            if (options.volumes[a].path == options.volumes[b].path)
                usage_error("volume " + options.volumes[a].path + " given twice");
    for (const auto& bind : options.binds)
        if (bind.empty())
            usage_error("--bind needs a path");
    return options;
}

// ---------------------------------------------------------------------------------------
// Paths and the host's mount table

// True when `path` is `root` or lies below it (both absolute and normalized).
bool in_tree(const std::string& path, const std::string& root) {
    if (root == "/")
        return !path.empty() && path[0] == '/';
    return path == root || (path.size() > root.size() && path.compare(0, root.size(), root) == 0 &&
                            path[root.size()] == '/');
}

std::string join(const std::string& root, const std::string& path) {
    return path == "/" ? root : root + path;
}

std::string real_path(const std::string& path) {
    char resolved[PATH_MAX];
    if (!realpath(path.c_str(), resolved))
        return "";
    return resolved;
}

// The canonical form of the deepest existing ancestor of an absolute path (the path itself
// when it exists), so that an output file yet to be created still tells where it will be.
std::string existing_ancestor(std::string path) {
    while (true) {
        std::string resolved = real_path(path);
        if (!resolved.empty())
            return resolved;
        const auto slash = path.find_last_of('/');
        if (slash == std::string::npos || path == "/")
            return "/";
        path = slash == 0 ? "/" : path.substr(0, slash);
    }
}

// Mount points as written in /proc/self/mountinfo, where space, tab, newline and backslash
// are escaped as \ooo.
std::string unescape_mount_path(const std::string& field) {
    std::string out;
    for (size_t i = 0; i < field.size(); ++i) {
        const auto digit = [&](size_t at) {
            return at < field.size() && field[at] >= '0' && field[at] <= '7';
        };
        if (field[i] == '\\' && digit(i + 1) && digit(i + 2) && digit(i + 3)) {
            out += static_cast<char>((field[i + 1] - '0') * 64 + (field[i + 2] - '0') * 8 +
                                     (field[i + 3] - '0'));
            i += 3;
        } else {
            out += field[i];
        }
    }
    return out;
}

std::vector<std::string> read_mount_points() {
    std::ifstream in("/proc/self/mountinfo");
    if (!in)
        fail_errno("cannot read /proc/self/mountinfo");
    std::vector<std::string> points;
    std::string line;
    while (std::getline(in, line)) {
        // id parent major:minor root mount-point options ...
        size_t pos = 0;
        for (int field = 0; field < 4 && pos != std::string::npos; ++field)
            pos = line.find(' ', pos + 1);
        if (pos == std::string::npos)
            continue;
        const auto end = line.find(' ', pos + 1);
        points.push_back(unescape_mount_path(line.substr(pos + 1, end - pos - 1)));
    }
    return points;
}

// Trees the engine writes to, or that hold the system itself. A separate filesystem that
// is or contains one of them is never passed through without an explicit --bind.
const char* const kProtectedTrees[] = {
    "/bin", "/boot", "/etc", "/etc.defaults", "/lib",       "/lib32", "/lib64",        "/libx32",
    "/opt", "/sbin", "/usr", "/usr/corv",     "/usr/local", "/var",   "/var/packages", "/var/log"};

struct BindPlan {
    std::string path;  // where it is, on the host and in the sandbox
    Fd source;         // opened before the scratch tmpfs can hide it
};

class BindPlanner {
  public:
    BindPlanner(std::vector<std::string> mount_points, const Options& options)
        : mount_points_(std::move(mount_points)) {
        replaced_ = {"/tmp", "/run"};
        for (const auto& volume : options.volumes)
            replaced_.push_back(volume.path);
    }

    void add_explicit(const std::string& path, const std::string& cwd) {
        const std::string absolute = path[0] == '/' ? path : cwd + "/" + path;
        const std::string resolved = real_path(absolute);
        if (resolved.empty())
            fail_errno("--bind " + path);
        if (resolved == "/")
            fail("--bind " + path + ": the root cannot be passed through");
        add(resolved);
    }

    // The working directory or a path named on the command line: pass its filesystem
    // through when the overlay alone would not show it.
    void add_needed(const std::string& path, const char* what) {
        const std::string resolved = existing_ancestor(path);
        if (resolved == "/" || in_tree(resolved, "/proc") || in_tree(resolved, "/sys") ||
            in_tree(resolved, "/dev"))
            return;
        for (const auto& area : replaced_)
            if (resolved == area)
                return;  // the sandbox's own
        std::string anchor;
        for (const auto& point : mount_points_)
            if (point != "/" && in_tree(resolved, point) && point.size() > anchor.size())
                anchor = point;
        for (const auto& area : replaced_) {
            if (!in_tree(resolved, area))
                continue;
            const auto next = resolved.find('/', area.size() + 1);
            const std::string top = resolved.substr(0, next);
            if (top.size() > anchor.size())
                anchor = top;
        }
        if (anchor.empty())
            return;  // on the root filesystem: the overlay shows it
        for (const char* tree : kProtectedTrees) {
            if (in_tree(tree, anchor)) {
                warn(std::string("note: ") + what + " " + path + " is on the filesystem at " +
                     anchor + ", which is not passed through (use --bind " + anchor + ")");
                return;
            }
        }
        add(anchor);
    }

    // Parents first, so that a nested bind lands inside the tree bound before it.
    std::vector<BindPlan> take() {
        std::sort(plans_.begin(), plans_.end(), [](const BindPlan& a, const BindPlan& b) {
            return a.path.size() < b.path.size();
        });
        return std::move(plans_);
    }

  private:
    void add(const std::string& path) {
        for (const auto& plan : plans_)
            if (plan.path == path)
                return;
        Fd fd(open(path.c_str(), O_PATH | O_CLOEXEC));
        if (!fd.valid())
            fail_errno("cannot open " + path);
        plans_.push_back(BindPlan{path, std::move(fd)});
    }

    std::vector<std::string> mount_points_;
    std::vector<std::string> replaced_;
    std::vector<BindPlan> plans_;
};

// Absolute paths named by an argument: "/x/y", or "NAME=/x/y" as in --flag=/x/y.
void collect_path_arguments(const std::vector<std::string>& args, std::vector<std::string>* out) {
    for (const auto& arg : args) {
        if (!arg.empty() && arg[0] == '/') {
            out->push_back(arg);
        } else {
            const auto equals = arg.find('=');
            if (equals != std::string::npos && equals + 1 < arg.size() && arg[equals + 1] == '/')
                out->push_back(arg.substr(equals + 1));
        }
    }
}

// ---------------------------------------------------------------------------------------
// Mounting

void do_mount(const std::string& source, const std::string& target, const char* type,
              unsigned long flags, const std::string& data, const std::string& what) {
    if (mount(source.c_str(), target.c_str(), type, flags, data.empty() ? nullptr : data.c_str()) !=
        0)
        fail_errno("cannot mount " + what + " on " + target);
}

void make_dirs(const std::string& path, mode_t mode) {
    std::string partial;
    size_t pos = 1;
    while (pos <= path.size()) {
        const auto next = path.find('/', pos);
        partial = path.substr(0, next);
        // Checking first avoids a needless copy-up of directories the overlay already has.
        struct stat st;
        if (lstat(partial.c_str(), &st) != 0) {
            if (mkdir(partial.c_str(), mode) != 0 && errno != EEXIST)
                fail_errno("cannot create " + partial);
        } else if (!S_ISDIR(st.st_mode)) {
            errno = ENOTDIR;
            fail_errno("cannot create " + path);
        }
        if (next == std::string::npos)
            break;
        pos = next + 1;
    }
}

void make_file(const std::string& path) {
    struct stat st;
    if (lstat(path.c_str(), &st) == 0)
        return;
    Fd fd(open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0644));
    if (!fd.valid())
        fail_errno("cannot create " + path);
}

void mount_tmpfs(const std::string& target, const std::string& data, unsigned long flags = 0) {
    make_dirs(target, 0755);
    do_mount("tmpfs", target, "tmpfs", flags, data, "a tmpfs");
}

bool on_host_pty() {
    for (int fd = 0; fd <= 2; ++fd) {
        char name[PATH_MAX];
        if (isatty(fd) && ttyname_r(fd, name, sizeof name) == 0 &&
            strncmp(name, "/dev/pts/", 9) == 0)
            return true;
    }
    return false;
}

// A /dev holding only what programs commonly expect. Device nodes are bound from the
// host's /dev rather than created, which also works where mknod is not allowed.
void build_dev(const std::string& root) {
    const std::string dev = root + "/dev";
    mount_tmpfs(dev, "mode=0755", MS_NOSUID | MS_NOEXEC);
    for (const char* node : {"null", "zero", "full", "random", "urandom", "tty"}) {
        const std::string target = dev + "/" + node;
        make_file(target);
        do_mount(std::string("/dev/") + node, target, nullptr, MS_BIND, "",
                 std::string("/dev/") + node);
    }
    make_dirs(dev + "/pts", 0755);
    if (on_host_pty()) {
        // Someone works in the sandbox from a terminal: show the host's terminals, so that
        // the one in use has a name there too (tty, job control, pagers).
        do_mount("/dev/pts", dev + "/pts", nullptr, MS_BIND | MS_REC, "", "/dev/pts");
    } else {
        do_mount("devpts", dev + "/pts", "devpts", MS_NOSUID | MS_NOEXEC,
                 "newinstance,ptmxmode=0666,mode=0620", "devpts");
    }
    mount_tmpfs(dev + "/shm", "mode=1777", MS_NOSUID | MS_NODEV);
    const std::pair<const char*, const char*> links[] = {{"pts/ptmx", "ptmx"},
                                                         {"/proc/self/fd", "fd"},
                                                         {"/proc/self/fd/0", "stdin"},
                                                         {"/proc/self/fd/1", "stdout"},
                                                         {"/proc/self/fd/2", "stderr"}};
    for (const auto& [target, name] : links)
        if (symlink(target, (dev + "/" + name).c_str()) != 0)
            fail_errno("cannot create " + dev + "/" + name);
}

void build_sys(const std::string& root) {
    const std::string sys = root + "/sys";
    make_dirs(sys, 0555);
    // A fresh sysfs describes the sandbox's own network namespace (/sys/class/net).
    const unsigned long flags = MS_RDONLY | MS_NOSUID | MS_NODEV | MS_NOEXEC;
    if (mount("sysfs", sys.c_str(), "sysfs", flags, nullptr) == 0)
        return;
    do_mount("/sys", sys, nullptr, MS_BIND | MS_REC, "", "/sys");
    do_mount("", sys, nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, "", "/sys read-only");
}

void bring_up_loopback() {
    Fd sock(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (!sock.valid())
        fail_errno("cannot open a socket to configure lo");
    struct ifreq request;
    memset(&request, 0, sizeof request);
    strncpy(request.ifr_name, "lo", IFNAMSIZ - 1);
    if (ioctl(sock.get(), SIOCGIFFLAGS, &request) != 0)
        fail_errno("cannot read the flags of lo");
    request.ifr_flags |= IFF_UP | IFF_RUNNING;
    if (ioctl(sock.get(), SIOCSIFFLAGS, &request) != 0)
        fail_errno("cannot bring lo up");
}

// ---------------------------------------------------------------------------------------
// Processes

sigset_t forwarded_and_child_signals() {
    sigset_t set;
    sigemptyset(&set);
    sigaddset(&set, SIGCHLD);
    for (int sig : kForwardedSignals)
        sigaddset(&set, sig);
    return set;
}

bool is_forwarded(int sig) {
    return std::find(std::begin(kForwardedSignals), std::end(kForwardedSignals), sig) !=
           std::end(kForwardedSignals);
}

int exit_code_of(int status) {
    if (WIFEXITED(status))
        return WEXITSTATUS(status);
    if (WIFSIGNALED(status))
        return 128 + WTERMSIG(status);
    return kSandboxFailed;
}

// Starts a program with the signal mask the sandbox was started with.
pid_t spawn(const std::vector<std::string>& argv, const sigset_t& original_mask) {
    std::vector<char*> args;
    for (const auto& arg : argv)
        args.push_back(const_cast<char*>(arg.c_str()));
    args.push_back(nullptr);
    const pid_t pid = fork();
    if (pid < 0)
        fail_errno("cannot fork");
    if (pid == 0) {
        sigprocmask(SIG_SETMASK, &original_mask, nullptr);
        execvp(args[0], args.data());
        const int error = errno;
        fprintf(stderr, "%s: cannot run %s: %s\n", kProgram, args[0], strerror(error));
        _exit(error == ENOENT ? kNotFound : kCannotExecute);
    }
    return pid;
}

// PID 1's loop: waits for `target`, reaping every other process that ends meanwhile (the
// orphans of the namespace are PID 1's children), and passes termination signals on to
// `target`. Returns the wait status of `target`.
int supervise_as_init(pid_t target) {
    const sigset_t set = forwarded_and_child_signals();
    while (true) {
        siginfo_t info;
        if (sigwaitinfo(&set, &info) < 0) {
            if (errno == EINTR)
                continue;
            fail_errno("sigwaitinfo");
        }
        if (info.si_signo != SIGCHLD) {
            kill(target, info.si_signo);
            continue;
        }
        int status = 0;
        pid_t pid;
        while ((pid = waitpid(-1, &status, WNOHANG)) > 0)
            if (pid == target)
                return status;
        if (pid < 0 && errno == ECHILD)
            fail("lost track of process " + std::to_string(target));
    }
}

int run_and_wait(const std::vector<std::string>& argv, const sigset_t& original_mask) {
    return supervise_as_init(spawn(argv, original_mask));
}

// Kills every other process of the namespace and reaps them, so that nothing changes the
// volumes while they are being saved.
void kill_all_others() {
    kill(-1, SIGKILL);
    while (waitpid(-1, nullptr, 0) > 0 || errno == EINTR) {
    }
}

// ---------------------------------------------------------------------------------------
// The sandbox's PID 1

class Sandbox {
  public:
    Sandbox(const Options& options, const sigset_t& original_mask)
        : options_(options), original_mask_(original_mask) {}

    [[noreturn]] void run() {
        enter_namespaces();
        const std::string root = build_root();
        enter_root(root);
        drop_host_wide_capabilities();
        if (!options_.keep.empty())
            restore_volumes();
        setenv("CORV_SANDBOX", "1", 1);
        // Tells what was asked for, so that tests can check it whatever the options were.
        std::string volumes;
        for (const auto& volume : options_.volumes)
            volumes +=
                (volumes.empty() ? "" : " ") + volume.path + ":" + std::to_string(volume.bytes);
        setenv("CORV_SANDBOX_VOLUMES", volumes.c_str(), 1);
        if (!options_.init.empty()) {
            const int status = run_and_wait({options_.init}, original_mask_);
            if (!WIFEXITED(status) || WEXITSTATUS(status) != 0)
                fail("init program " + options_.init + " failed (" + describe(status) + ")");
        }
        const int status = run_and_wait(options_.command, original_mask_);
        if (!options_.keep.empty()) {
            kill_all_others();
            save_volumes();
        }
        _exit(exit_code_of(status));
    }

  private:
    static std::string describe(int status) {
        if (WIFSIGNALED(status))
            return std::string("killed by ") + strsignal(WTERMSIG(status));
        return "exit status " + std::to_string(WEXITSTATUS(status));
    }

    // Most of /proc/sys and sysrq act on the host's kernel, not on the sandbox; nothing
    // the engine does needs to change them.
    static void protect_host_knobs(const std::string& root) {
        for (const char* knob : {"/proc/sys", "/proc/sysrq-trigger"}) {
            const std::string target = root + knob;
            struct stat st;
            if (lstat(target.c_str(), &st) != 0)
                continue;  // a kernel built without it
            do_mount(target, target, nullptr, MS_BIND | MS_REC, "", knob);
            do_mount("", target, nullptr,
                     MS_REMOUNT | MS_BIND | MS_RDONLY | MS_NOSUID | MS_NODEV | MS_NOEXEC, "",
                     std::string(knob) + " read-only");
        }
    }

    // Root in the sandbox is the host's root: the namespaces do not cover kernel modules,
    // the clock or kexec, so what the sandbox runs may not use them.
    static void drop_host_wide_capabilities() {
        for (int capability : {CAP_SYS_MODULE, CAP_SYS_TIME, CAP_SYS_BOOT})
            if (prctl(PR_CAPBSET_DROP, capability, 0, 0, 0) != 0)
                fail_errno("cannot drop capability " + std::to_string(capability));
    }

    void enter_namespaces() {
        int flags = CLONE_NEWNS | CLONE_NEWUTS;
        if (!options_.host_net)
            flags |= CLONE_NEWNET;
        if (unshare(flags) != 0)
            fail_errno("cannot create mount/UTS/network namespaces");
        // Nothing done from here on may propagate back to the host.
        if (mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0)
            fail_errno("cannot make the mounts private");
        if (sethostname(kHostname, strlen(kHostname)) != 0)
            fail_errno("cannot set the host name");
        if (!options_.host_net)
            bring_up_loopback();
    }

    std::string build_root() {
        char buffer[PATH_MAX];
        cwd_ = getcwd(buffer, sizeof buffer) ? buffer : "/";

        // Everything needed from the host below kScratch must be opened before the
        // scratch tmpfs hides it.
        BindPlanner planner(read_mount_points(), options_);
        for (const auto& bind : options_.binds)
            planner.add_explicit(bind, cwd_);
        planner.add_needed(cwd_, "the working directory");
        std::vector<std::string> paths;
        if (!options_.init.empty())
            collect_path_arguments({options_.init}, &paths);
        collect_path_arguments(options_.command, &paths);
        for (const auto& path : paths)
            planner.add_needed(path, "the argument");
        binds_ = planner.take();

        std::string upper, work;
        if (!options_.keep.empty()) {
            const std::string keep =
                options_.keep[0] == '/' ? options_.keep : cwd_ + "/" + options_.keep;
            make_dirs(keep + "/upper", 0755);
            make_dirs(keep + "/work", 0700);
            make_dirs(keep + "/volumes", 0755);
            keep_ = Fd(open(keep.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
            if (!keep_.valid())
                fail_errno("cannot open " + keep);
            upper = keep_.self_path() + "/upper";
            work = keep_.self_path() + "/work";
        }

        do_mount("corv-sandbox", kScratch, "tmpfs", 0, "mode=0700", "the scratch tmpfs");
        const std::string scratch = kScratch;
        const std::string root = scratch + "/root";
        make_dirs(root, 0755);
        if (upper.empty()) {
            upper = scratch + "/upper";
            work = scratch + "/work";
            make_dirs(upper, 0755);
            make_dirs(work, 0700);
        }
        const std::string layers = "lowerdir=/,upperdir=" + upper + ",workdir=" + work;
        if (mount("overlay", root.c_str(), "overlay", 0, layers.c_str()) != 0)
            fail_errno(
                "cannot mount an overlay of / (is overlayfs available? try `modprobe "
                "overlay`)");

        mount_tmpfs(root + "/tmp", "mode=1777", MS_NOSUID | MS_NODEV);
        mount_tmpfs(root + "/run", "mode=0755", MS_NOSUID | MS_NODEV);
        make_dirs(root + "/run/lock", 0755);
        chmod((root + "/run/lock").c_str(), 01777);
        build_dev(root);
        make_dirs(root + "/proc", 0555);
        // This process is PID 1 of the new PID namespace, so the proc it mounts is that
        // namespace's.
        do_mount("proc", root + "/proc", "proc", MS_NOSUID | MS_NODEV | MS_NOEXEC, "", "proc");
        protect_host_knobs(root);
        build_sys(root);
        for (const auto& volume : options_.volumes)
            mount_tmpfs(root + volume.path, "size=" + std::to_string(volume.bytes) + ",mode=0755");

        for (const auto& bind : binds_) {
            const std::string target = join(root, bind.path);
            struct stat st;
            if (fstat(bind.source.get(), &st) != 0)
                fail_errno("cannot inspect " + bind.path);
            if (S_ISDIR(st.st_mode)) {
                make_dirs(target, 0755);
            } else {
                make_dirs(target.substr(0, target.find_last_of('/')), 0755);
                make_file(target);
            }
            do_mount(bind.source.self_path(), target, nullptr, MS_BIND | MS_REC, "", bind.path);
        }
        binds_.clear();
        return root;
    }

    void enter_root(const std::string& root) {
        if (chdir(root.c_str()) != 0)
            fail_errno("cannot enter " + root);
        // pivot_root(".", ".") stacks the old root on top of the new one; detaching it
        // leaves only the new root, with no directory needed to park the old one in.
        if (syscall(SYS_pivot_root, ".", ".") == 0) {
            if (umount2(".", MNT_DETACH) != 0)
                fail_errno("cannot detach the host's root");
        } else if (chroot(".") != 0) {  // e.g. when the host itself runs from a chroot
            fail_errno("cannot change root to " + root);
        }
        if (chdir("/") != 0)
            fail_errno("cannot enter /");
        if (chdir(cwd_.c_str()) != 0) {
            warn("note: the working directory " + cwd_ + " is not in the sandbox; using /");
            cwd_ = "/";
        }
        setenv("PWD", cwd_.c_str(), 1);
    }

    // With --keep, volumes live in DIR/volumes between runs; while the sandbox runs they
    // are tmpfs all the same, so their size limit holds.
    void restore_volumes() {
        for (const auto& volume : options_.volumes) {
            const std::string saved = keep_.pid1_path() + "/volumes" + volume.path;
            if (access(saved.c_str(), F_OK) != 0)
                continue;
            const int status =
                run_and_wait({"cp", "-a", saved + "/.", volume.path + "/"}, original_mask_);
            if (!WIFEXITED(status) || WEXITSTATUS(status) != 0)
                fail("cannot restore " + volume.path + " from " + options_.keep);
        }
    }

    void save_volumes() {
        for (const auto& volume : options_.volumes) {
            const std::string saved = keep_.pid1_path() + "/volumes" + volume.path;
            const std::string fresh = saved + ".new";
            if (run_and_wait({"rm", "-rf", fresh}, original_mask_) != 0 ||
                run_and_wait({"cp", "-a", volume.path, fresh}, original_mask_) != 0) {
                warn("cannot save " + volume.path + " into " + options_.keep);
                continue;
            }
            // Swap atomically, so an interrupted save leaves the previous copy intact.
            if (renameat2(AT_FDCWD, fresh.c_str(), AT_FDCWD, saved.c_str(), RENAME_EXCHANGE) == 0) {
                run_and_wait({"rm", "-rf", fresh}, original_mask_);
            } else if (rename(fresh.c_str(), saved.c_str()) != 0) {
                warn("cannot save " + volume.path + " into " + options_.keep + ": " +
                     strerror(errno));
            }
        }
    }

    const Options& options_;
    const sigset_t original_mask_;
    std::string cwd_;
    std::vector<BindPlan> binds_;
    Fd keep_;
};

// ---------------------------------------------------------------------------------------
// The supervisor, in the host's namespaces

[[noreturn]] void become_pid1(const Options& options, const sigset_t& original_mask,
                              Fd supervisor_alive) {
    try {
        // Die with the supervisor; the pipe tells whether it is already gone.
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        struct pollfd alive = {supervisor_alive.get(), 0, 0};
        if (poll(&alive, 1, 0) > 0 && (alive.revents & (POLLHUP | POLLERR)))
            _exit(kSandboxFailed);
        Sandbox(options, original_mask).run();
    } catch (const std::exception& e) {
        fprintf(stderr, "%s: %s\n", kProgram, e.what());
    }
    _exit(kSandboxFailed);
}

int supervise(pid_t pid1) {
    const sigset_t set = forwarded_and_child_signals();
    int termination_requests = 0;
    while (true) {
        siginfo_t info;
        if (sigwaitinfo(&set, &info) < 0) {
            if (errno == EINTR)
                continue;
            kill(pid1, SIGKILL);
            fail_errno("sigwaitinfo");
        }
        if (info.si_signo == SIGCHLD) {
            int status = 0;
            const pid_t pid = waitpid(pid1, &status, WNOHANG);
            if (pid == pid1)
                return exit_code_of(status);
            continue;
        }
        if (!is_forwarded(info.si_signo))
            continue;
        if (info.si_signo != SIGUSR1 && info.si_signo != SIGUSR2 && ++termination_requests > 1) {
            kill(pid1, SIGKILL);  // asked twice: stop waiting for the command to comply
            continue;
        }
        // A terminal sends its signals to the whole foreground process group, which the
        // command belongs to already.
        if (info.si_code != SI_KERNEL)
            kill(pid1, info.si_signo);
    }
}

int run_sandbox(const Options& options) {
    if (geteuid() != 0)
        fail("must be run as root (it creates namespaces and mounts)");

    // A caller that ignores SIGCHLD would make children vanish without a status.
    signal(SIGCHLD, SIG_DFL);
    sigset_t original_mask;
    const sigset_t blocked = forwarded_and_child_signals();
    sigprocmask(SIG_BLOCK, &blocked, &original_mask);

    int alive[2];
    if (pipe2(alive, O_CLOEXEC) != 0)
        fail_errno("cannot create a pipe");
    Fd alive_read(alive[0]), alive_write(alive[1]);

    // Only the children of this process enter the new PID namespace; the first one is its
    // PID 1.
    if (unshare(CLONE_NEWPID) != 0)
        fail_errno(
            "cannot create a PID namespace (needs CAP_SYS_ADMIN and a kernel with "
            "namespaces)");
    fflush(nullptr);
    const pid_t pid1 = fork();
    if (pid1 < 0)
        fail_errno("cannot fork");
    if (pid1 == 0) {
        alive_write.reset();
        become_pid1(options, original_mask, std::move(alive_read));
    }
    alive_read.reset();
    return supervise(pid1);
}

}  // namespace

int main(int argc, char** argv) {
    const Options options = parse_options(argc, argv);
    try {
        return run_sandbox(options);
    } catch (const std::exception& e) {
        fprintf(stderr, "%s: %s\n", kProgram, e.what());
        return kSandboxFailed;
    }
}
