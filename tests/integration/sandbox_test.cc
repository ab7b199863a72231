// Checks, from inside, the machine corv-sandbox gives each integration test case: the
// other integration tests rely on every property checked here.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <net/if.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <linux/capability.h>

#include <fstream>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

constexpr long kTmpfsMagic = 0x01021994;
constexpr long kOverlayfsMagic = 0x794c7630;

class Fd {
  public:
    explicit Fd(int fd) : fd_(fd) {}
    ~Fd() {
        if (fd_ >= 0)
            close(fd_);
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    int get() const { return fd_; }

  private:
    int fd_;
};

// Removes a file when the test is done with it, whatever the outcome.
class RemoveOnExit {
  public:
    explicit RemoveOnExit(std::string path) : path_(std::move(path)) {}
    ~RemoveOnExit() { unlink(path_.c_str()); }
    RemoveOnExit(const RemoveOnExit&) = delete;
    RemoveOnExit& operator=(const RemoveOnExit&) = delete;

  private:
    std::string path_;
};

std::vector<std::string> list_dir(const std::string& path) {
    std::vector<std::string> names;
    DIR* dir = opendir(path.c_str());
    if (!dir)
        return names;
    while (const dirent* entry = readdir(dir)) {
        const std::string name = entry->d_name;
        if (name != "." && name != "..")
            names.push_back(name);
    }
    closedir(dir);
    return names;
}

std::string read_file(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream content;
    content << in.rdbuf();
    return content.str();
}

// The size the sandbox was asked to give /volume1 (CORV_SANDBOX_VOLUMES lists
// "/volumeN:BYTES" words); 64 MiB, its default, if not said.
unsigned long long volume1_bytes() {
    const char* volumes = getenv("CORV_SANDBOX_VOLUMES");
    std::istringstream words(volumes ? volumes : "");
    std::string word;
    while (words >> word)
        if (word.rfind("/volume1:", 0) == 0)
            return std::stoull(word.substr(9));
    return 64ull << 20;
}

long fs_type(const char* path) {
    struct statfs st;
    return statfs(path, &st) == 0 ? static_cast<long>(st.f_type) : -1;
}

dev_t device_of(const char* path) {
    struct stat st;
    return stat(path, &st) == 0 ? st.st_dev : 0;
}

class SandboxTest : public ::testing::Test {
  protected:
    void SetUp() override {
        const char* marker = getenv("CORV_SANDBOX");
        if (!marker || std::string(marker) != "1")
            GTEST_SKIP() << "only meaningful inside corv-sandbox";
    }
};

TEST_F(SandboxTest, RunsAsRoot) {
    EXPECT_EQ(getuid(), 0u);
    EXPECT_EQ(geteuid(), 0u);
}

TEST_F(SandboxTest, RootIsAWritableOverlay) {
    EXPECT_EQ(fs_type("/"), kOverlayfsMagic);
    const std::string probe = "/etc/corv-sandbox-probe";
    RemoveOnExit cleanup(probe);
    {
        std::ofstream out(probe);
        out << "written inside\n";
    }
    EXPECT_EQ(read_file(probe), "written inside\n");
}

TEST_F(SandboxTest, Volume1IsASizeLimitedTmpfs) {
    EXPECT_EQ(fs_type("/volume1"), kTmpfsMagic);
    EXPECT_NE(device_of("/volume1"), device_of("/"));
    struct statvfs st;
    ASSERT_EQ(statvfs("/volume1", &st), 0) << strerror(errno);
    EXPECT_EQ(static_cast<unsigned long long>(st.f_blocks) * st.f_frsize, volume1_bytes());
    EXPECT_FALSE(st.f_flag & ST_RDONLY);
}

TEST_F(SandboxTest, FullVolumeFailsWithNoSpace) {
    const unsigned long long size = volume1_bytes();
    if (size > (256ull << 20))
        GTEST_SKIP() << "/volume1 is too large to fill in a test";
    const std::string path = "/volume1/corv-sandbox-fill";
    RemoveOnExit cleanup(path);
    Fd fd(open(path.c_str(), O_CREAT | O_WRONLY | O_TRUNC | O_CLOEXEC, 0644));
    ASSERT_GE(fd.get(), 0) << strerror(errno);
    const std::vector<char> chunk(1 << 20, 'x');
    unsigned long long written = 0;
    int error = 0;
    // Bounded, in case the volume were not limited at all.
    while (written < 2 * size) {
        const ssize_t n = write(fd.get(), chunk.data(), chunk.size());
        if (n < 0) {
            error = errno;
            break;
        }
        written += static_cast<unsigned long long>(n);
    }
    EXPECT_EQ(error, ENOSPC);
    EXPECT_LE(written, size);
    EXPECT_GE(written, size - size / 16);
}

TEST_F(SandboxTest, TmpIsAFreshTmpfs) {
    EXPECT_EQ(fs_type("/tmp"), kTmpfsMagic);
    EXPECT_NE(device_of("/tmp"), device_of("/"));
    struct stat st;
    ASSERT_EQ(stat("/tmp", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 01777u);
    // Only what the platform set-up creates; nothing of the host's /tmp, except the tree
    // this test runs from when that lives there (the sandbox shares it on purpose).
    char self[4096] = "";
    ssize_t n = readlink("/proc/self/exe", self, sizeof(self) - 1);
    const std::string exe = n > 0 ? std::string(self, static_cast<size_t>(n)) : "";
    for (const auto& name : list_dir("/tmp")) {
        if (exe.rfind("/tmp/" + name + "/", 0) == 0) {
            continue;
        }
        EXPECT_EQ(name, "lock");
    }
    EXPECT_EQ(fs_type("/run"), kTmpfsMagic);
}

TEST_F(SandboxTest, RunsInAFreshPidNamespace) {
    // PID 1 is the sandbox itself, and the test binary is its child.
    const std::string cmdline = read_file("/proc/1/cmdline");
    const std::string argv0 = cmdline.substr(0, cmdline.find('\0'));
    EXPECT_EQ(argv0.substr(argv0.find_last_of('/') + 1), "corv-sandbox");
    EXPECT_EQ(getppid(), 1);
    EXPECT_LT(getpid(), 100);
    int processes = 0;
    for (const auto& name : list_dir("/proc"))
        if (name.find_first_not_of("0123456789") == std::string::npos)
            ++processes;
    EXPECT_LE(processes, 5);
}

TEST_F(SandboxTest, NetworkHasOnlyLoopback) {
    std::vector<std::string> names;
    if (struct if_nameindex* interfaces = if_nameindex()) {
        for (auto* i = interfaces; i->if_index != 0; ++i)
            names.push_back(i->if_name);
        if_freenameindex(interfaces);
    }
    EXPECT_EQ(names, std::vector<std::string>{"lo"});

    Fd sock(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    ASSERT_GE(sock.get(), 0);
    struct ifreq request;
    memset(&request, 0, sizeof request);
    strncpy(request.ifr_name, "lo", IFNAMSIZ - 1);
    ASSERT_EQ(ioctl(sock.get(), SIOCGIFFLAGS, &request), 0) << strerror(errno);
    EXPECT_TRUE(request.ifr_flags & IFF_UP);
    // sysfs describes the same namespace.
    EXPECT_EQ(list_dir("/sys/class/net"), std::vector<std::string>{"lo"});
}

TEST_F(SandboxTest, HasItsOwnHostName) {
    char name[256] = {};
    ASSERT_EQ(gethostname(name, sizeof name - 1), 0);
    EXPECT_STREQ(name, "corv-sandbox");
}

TEST_F(SandboxTest, SysIsReadOnly) {
    struct statvfs st;
    ASSERT_EQ(statvfs("/sys", &st), 0);
    EXPECT_TRUE(st.f_flag & ST_RDONLY);
}

TEST_F(SandboxTest, HostWideKnobsAreOutOfReach) {
    struct statvfs st;
    ASSERT_EQ(statvfs("/proc/sys", &st), 0);
    EXPECT_TRUE(st.f_flag & ST_RDONLY);
    for (int capability : {CAP_SYS_MODULE, CAP_SYS_TIME, CAP_SYS_BOOT})
        EXPECT_EQ(prctl(PR_CAPBSET_READ, capability, 0, 0, 0), 0) << capability;
    EXPECT_EQ(prctl(PR_CAPBSET_READ, CAP_SYS_ADMIN, 0, 0, 0), 1);
}

TEST_F(SandboxTest, DevIsMinimal) {
    Fd null(open("/dev/null", O_WRONLY | O_CLOEXEC));
    ASSERT_GE(null.get(), 0) << strerror(errno);
    EXPECT_EQ(write(null.get(), "x", 1), 1);
    Fd urandom(open("/dev/urandom", O_RDONLY | O_CLOEXEC));
    ASSERT_GE(urandom.get(), 0) << strerror(errno);
    char byte;
    EXPECT_EQ(read(urandom.get(), &byte, 1), 1);
    // None of the host's disks.
    for (const auto& name : list_dir("/dev")) {
        struct stat st;
        ASSERT_EQ(lstat(("/dev/" + name).c_str(), &st), 0);
        EXPECT_FALSE(S_ISBLK(st.st_mode)) << name;
    }
    EXPECT_EQ(fs_type("/dev/shm"), kTmpfsMagic);
}

TEST_F(SandboxTest, PlatformSetUpRanFirst) {
    const std::string unique = read_file("/etc.defaults/corvinfo.conf");
    EXPECT_EQ(unique.rfind("unique=\"corv_", 0), 0u) << unique;
    const std::string conf = read_file("/etc/corvinfo.conf");
    EXPECT_NE(conf.find("language=\"enu\"\n"), std::string::npos) << conf;
    EXPECT_NE(conf.find("timezone=\"UTC\"\n"), std::string::npos) << conf;
    struct stat st;
    ASSERT_EQ(stat("/var/packages", &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_EQ(st.st_mode & 07777, 0755u);
    for (const char* dir : {"/usr/local/etc/rc.d", "/usr/corv/etc/corvservice.d",
                            "/usr/corv/corvpkg", "/tmp/lock", "/var/log"})
        EXPECT_EQ(access(dir, F_OK), 0) << dir;
}

TEST_F(SandboxTest, SourceTreeIsVisible) {
    const std::string setup =
        std::string(CORVPKG_SOURCE_DIR) + "/tools/platform/corv-platform-setup";
    EXPECT_EQ(access(setup.c_str(), X_OK), 0) << setup;
    char cwd[4096];
    ASSERT_NE(getcwd(cwd, sizeof cwd), nullptr);
    EXPECT_EQ(access(cwd, W_OK), 0) << cwd;
}

}  // namespace
