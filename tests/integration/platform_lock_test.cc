// The platform's named lock and file locks between real processes, and running a program
// as another user.
#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <sstream>
#include <string>

#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "support/files.h"

using Clock = std::chrono::steady_clock;

namespace {

constexpr int kPkgWait = VLIBC_LOCK_PKG | VLIBC_LOCK_EXCLUSIVE | VLIBC_LOCK_WAIT;
constexpr int kPkgTry = VLIBC_LOCK_PKG | VLIBC_LOCK_EXCLUSIVE;
constexpr int kPkgShared = VLIBC_LOCK_PKG | VLIBC_LOCK_WAIT;
constexpr const char* kLockFile = "/tmp/lock/lock_pkg";

double secondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

// Another process that runs `take` (0 is success), says how it went, keeps what it took
// for `holdMs` and exits, which lets go of every lock it has.
class Holder {
  public:
    Holder(std::function<int()> take, int holdMs) {
        int fds[2];
        if (pipe(fds) != 0) {
            return;
        }
        pid_ = fork();
        if (pid_ == 0) {
            close(fds[0]);
            char ok = take() == 0 ? '1' : '0';
            if (write(fds[1], &ok, 1) != 1) {
                _exit(3);
            }
            usleep(static_cast<useconds_t>(holdMs) * 1000);
            _exit(0);
        }
        close(fds[1]);
        char ok = '0';
        took_ = pid_ > 0 && read(fds[0], &ok, 1) == 1 && ok == '1';
        close(fds[0]);
    }
    ~Holder() {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
    }
    bool took() const { return took_; }

  private:
    pid_t pid_ = -1;
    bool took_ = false;
};

// The exit status of `body` run in a child process.
int inChild(const std::function<int()>& body) {
    pid_t pid = fork();
    if (pid == 0) {
        _exit(body());
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 100 + WTERMSIG(status);
}

class PlatformLock : public ::testing::Test {
  protected:
    void TearDown() override { VLIBCFileUnlock(VLIBC_LOCK_PKG); }
};

}  // namespace

TEST_F(PlatformLock, CreatesItsDirectoryAndReenters) {
    testutil::removeAll("/tmp/lock");
    ASSERT_EQ(VLIBCFileLock(kPkgWait, 1), 0);
    struct stat st {};
    ASSERT_EQ(stat("/tmp/lock", &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_TRUE(testutil::exists(kLockFile));
    EXPECT_EQ(VLIBCFileLock(kPkgWait, 0), 0) << "the holder may take it again";
    EXPECT_EQ(VLIBCFileLock(kPkgShared, 0), 0) << "and asking for less keeps what it has";
    EXPECT_EQ(inChild([] { return VLIBCFileLock(kPkgTry, 0) == -1 ? 0 : 1; }), 0)
        << "a shared request did not weaken the exclusive lock";
    EXPECT_EQ(VLIBCFileUnlock(VLIBC_LOCK_PKG), 0) << "one unlock, however often it was taken";
    EXPECT_EQ(VLIBCFileUnlock(VLIBC_LOCK_PKG), -1) << "not held any more";
    EXPECT_EQ(inChild([] { return VLIBCFileLock(kPkgTry, 0) == 0 ? 0 : 1; }), 0);
}

TEST_F(PlatformLock, NamesAndUnknownLocks) {
    EXPECT_STREQ(VLIBCLockPath(0x10000006), kLockFile);
    EXPECT_STREQ(VLIBCLockPath(VLIBC_LOCK_PKG), kLockFile);
    EXPECT_EQ(VLIBCLockPath(0x20000000), nullptr);
    EXPECT_EQ(VLIBCFileLock(0x20000006, 1), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
    EXPECT_EQ(VLIBCFileUnlock(0x20000000), -1);
}

TEST_F(PlatformLock, WaiterGetsItWhenTheHolderEnds) {
    Holder holder([] { return VLIBCFileLock(kPkgWait, 5); }, 800);
    ASSERT_TRUE(holder.took());
    auto start = Clock::now();
    EXPECT_EQ(VLIBCFileLock(0x10000006, 10), 0);
    double waited = secondsSince(start);
    EXPECT_GE(waited, 0.5);
    EXPECT_LT(waited, 3.0);
}

TEST_F(PlatformLock, TimeOutIsEagain) {
    Holder holder([] { return VLIBCFileLock(kPkgWait, 5); }, 4000);
    ASSERT_TRUE(holder.took());
    const struct {
        int lock;
        int seconds;
        double least;
        double most;
    } cases[] = {
        {kPkgWait, 1, 0.9, 2.0},   {kPkgWait, 2, 1.9, 3.0},
        {kPkgWait, 0, 0.0, 0.5},   {kPkgTry, 5, 0.0, 0.5},  // without the wait flag: one try
        {kPkgShared, 0, 0.0, 0.5},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << std::hex << "lock 0x" << c.lock << std::dec << " for "
                                        << c.seconds << " s");
        errno = 0;
        auto start = Clock::now();
        EXPECT_EQ(VLIBCFileLock(c.lock, c.seconds), -1);
        double waited = secondsSince(start);
        EXPECT_EQ(errno, EAGAIN);
        EXPECT_EQ(VLIBCErrGet(), ERR_TIMEOUT);
        EXPECT_GE(waited, c.least);
        EXPECT_LT(waited, c.most);
    }
}

TEST_F(PlatformLock, ChildrenDoNotInheritIt) {
    ASSERT_EQ(VLIBCFileLock(kPkgWait, 1), 0);
    EXPECT_EQ(inChild([] {
                  if (VLIBCFileUnlock(VLIBC_LOCK_PKG) != -1) {
                      return 1;  // the child thought it held the parent's lock
                  }
                  if (VLIBCFileLock(kPkgTry, 0) != -1 || errno != EAGAIN) {
                      return 2;
                  }
                  return 0;
              }),
              0);
    EXPECT_EQ(inChild([] { return VLIBCFileLock(kPkgTry, 0) == -1 ? 0 : 1; }), 0)
        << "the child's attempts left the parent's lock alone";
}

TEST_F(PlatformLock, SharedHoldersExcludeOnlyTheExclusive) {
    Holder reader([] { return VLIBCFileLock(kPkgShared, 5); }, 3000);
    ASSERT_TRUE(reader.took());
    EXPECT_EQ(VLIBCFileLock(kPkgShared, 1), 0);
    EXPECT_EQ(VLIBCFileLock(kPkgTry, 0), -1) << "no upgrade while another reads";
    EXPECT_EQ(VLIBCFileUnlock(VLIBC_LOCK_PKG), 0) << "the shared lock stayed held";
    EXPECT_EQ(VLIBCFileLock(kPkgTry, 0), -1);
}

TEST_F(PlatformLock, ARecreatedLockFileIsStillTheLock) {
    // This process has the old file open; another program removes and recreates it and
    // locks the new one. Locking the old inode would exclude nobody.
    ASSERT_EQ(VLIBCFileLock(kPkgWait, 1), 0);
    ASSERT_EQ(VLIBCFileUnlock(VLIBC_LOCK_PKG), 0);
    testutil::removeAll("/tmp/lock");
    Holder other(
        [] {
            // By hand, as a program that is not this library would do it.
            mkdir("/tmp/lock", 0755);
            int fd = open(kLockFile, O_RDWR | O_CREAT, 0666);
            struct flock fl {};
            fl.l_type = F_WRLCK;
            fl.l_whence = SEEK_SET;
            return fd >= 0 ? fcntl(fd, F_SETLK, &fl) : -1;
        },
        3000);
    ASSERT_TRUE(other.took());
    EXPECT_EQ(VLIBCFileLock(kPkgWait, 0), -1);
    EXPECT_EQ(errno, EAGAIN);
}

TEST_F(PlatformLock, LockByFile) {
    const std::string path = "/tmp/corv-lock-by-file";
    testutil::removeAll(path);
    Holder writer(
        [&] {
            int fd = -1;
            return VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &fd);
        },
        1500);
    ASSERT_TRUE(writer.took());
    EXPECT_TRUE(testutil::exists(path)) << "created when missing";

    int fd = 123;
    auto start = Clock::now();
    errno = 0;
    EXPECT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 0, 1, &fd), -1);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(fd, -1);
    double waited = secondsSince(start);
    EXPECT_GE(waited, 0.9);
    EXPECT_LT(waited, 1.45) << "timed out before the writer let go";

    start = Clock::now();
    ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 0, 5, &fd), 0) << "waits for the writer";
    EXPECT_LT(secondsSince(start), 2.5);
    ASSERT_GE(fd, 0);

    // Shared with a shared one, not with an exclusive one.
    EXPECT_EQ(inChild([&] {
                  int other = -1;
                  return VLIBCFileLockTimeByFile(path.c_str(), 0, 0, &other) == 0 ? 0 : 1;
              }),
              0);
    EXPECT_EQ(inChild([&] {
                  int other = -1;
                  return VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &other) == -1 ? 0 : 1;
              }),
              0);
    EXPECT_EQ(VLIBCFileUnlockByFile(fd), 0);
    EXPECT_EQ(inChild([&] {
                  int other = -1;
                  return VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &other) == 0 ? 0 : 1;
              }),
              0);
    EXPECT_EQ(VLIBCFileUnlockByFile(-1), 0);
    int none = 0;
    EXPECT_EQ(VLIBCFileLockTimeByFile("/nonexistent-dir/x", 1, 0, &none), -1);
}

TEST(PlatformIdentity, RunsAsARealUser) {
    if (getenv("CORV_SANDBOX") == nullptr || geteuid() != 0) {
        GTEST_SKIP() << "creates users: only as root inside the sandbox";
    }
    ASSERT_EQ(VLIBCExec("/usr/sbin/groupadd", "corvtestextra", nullptr), 0);
    ASSERT_EQ(VLIBCExec("/usr/sbin/useradd", "--system", "--no-create-home", "-G", "corvtestextra",
                        "corvtestuser", nullptr),
              0);
    struct passwd* pw = getpwnam("corvtestuser");
    ASSERT_NE(pw, nullptr);
    const uid_t uid = pw->pw_uid;
    const gid_t ownGid = pw->pw_gid;
    struct group* extra = getgrnam("corvtestextra");
    ASSERT_NE(extra, nullptr);
    const gid_t extraGid = extra->gr_gid;
    struct group* system = getgrnam("system");
    const gid_t systemGid = system ? system->gr_gid : 1;

    const struct {
        bool ownGroup;
        gid_t gid;
    } cases[] = {{true, ownGid}, {false, systemGid}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.ownGroup ? "own group" : "system group");
        CORVUtils::ProcessRunner runner("/bin/sh", {"-c", "id -u; id -g; id -G; echo \"$MARK\""});
        ASSERT_TRUE(runner.setRuntimeIdentity("corvtestuser", c.ownGroup));
        runner.addEnv("MARK", "marked");
        ASSERT_EQ(runner.run(true, true), 0) << runner.getCapturedOutputErr();
        std::istringstream out(runner.getCapturedOutput());
        std::string uidLine, gidLine, groupsLine, mark;
        std::getline(out, uidLine);
        std::getline(out, gidLine);
        std::getline(out, groupsLine);
        std::getline(out, mark);
        EXPECT_EQ(uidLine, std::to_string(uid));
        EXPECT_EQ(gidLine, std::to_string(c.gid));
        EXPECT_NE((" " + groupsLine + " ").find(" " + std::to_string(extraGid) + " "),
                  std::string::npos)
            << "supplementary groups: " << groupsLine;
        EXPECT_EQ((" " + groupsLine + " ").find(" 0 "), std::string::npos)
            << "root's groups are dropped: " << groupsLine;
        EXPECT_EQ(mark, "marked");
    }

    // Root's files stay root's.
    testutil::writeFile("/tmp/corv-root-only", "secret");
    chmod("/tmp/corv-root-only", 0600);
    CORVUtils::ProcessRunner reader("/bin/cat", {"/tmp/corv-root-only"});
    ASSERT_TRUE(reader.setRuntimeIdentity("corvtestuser", true));
    EXPECT_NE(reader.run(true, true), 0);
    EXPECT_EQ(reader.getCapturedOutput(), "");
}
