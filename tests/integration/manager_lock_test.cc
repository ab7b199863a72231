// The system-wide package lock between real processes, and the flag files that refuse it.
#include <errno.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <string>

#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "support/files.h"

using namespace CORVPackageTool;
using Clock = std::chrono::steady_clock;

namespace {

// A child process that takes the package lock, reports it through a pipe, holds it for
// `holdMs` and exits (which releases it).
class LockHolder {
  public:
    explicit LockHolder(int holdMs, int waitSeconds = 5) {
        int fds[2];
        if (pipe(fds) != 0) {
            return;
        }
        pid_ = fork();
        if (pid_ == 0) {
            close(fds[0]);
            char ok = PackageManager::ExLock(waitSeconds) ? '1' : '0';
            if (write(fds[1], &ok, 1) != 1) {
                _exit(3);
            }
            usleep(static_cast<useconds_t>(holdMs) * 1000);
            _exit(0);
        }
        close(fds[1]);
        char ok = '0';
        locked_ = read(fds[0], &ok, 1) == 1 && ok == '1';
        close(fds[0]);
    }
    ~LockHolder() { wait(); }
    bool locked() const { return locked_; }
    void wait() {
        if (pid_ > 0) {
            int status = 0;
            waitpid(pid_, &status, 0);
            pid_ = -1;
        }
    }

  private:
    pid_t pid_ = -1;
    bool locked_ = false;
};

double secondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

class ManagerLock : public ::testing::Test {
  protected:
    void TearDown() override {
        PackageManager::UnLock();
        PackageManager::setSkipUpgradeCheck(false);
        testutil::removeAll("/var/.UpgradeBootup");
        testutil::removeAll("/var/.NormalShutdown");
        testutil::removeAll("/tmp/upgrade_stop_service");
    }
};

}  // namespace

TEST_F(ManagerLock, CreatesTheLockDirectoryAndReenters) {
    testutil::removeAll("/tmp/lock");
    ASSERT_TRUE(PackageManager::ExLock(1));
    EXPECT_TRUE(testutil::exists("/tmp/lock/lock_pkg"));
    EXPECT_TRUE(PackageManager::ExLock(0)) << "the holder may take the lock again";
    PackageManager::UnLock();
}

TEST_F(ManagerLock, BusyLockTimesOutWithEagain) {
    LockHolder holder(3000);
    ASSERT_TRUE(holder.locked());
    auto start = Clock::now();
    EXPECT_FALSE(PackageManager::ExLock(1));
    double waited = secondsSince(start);
    EXPECT_GE(waited, 0.9);
    EXPECT_LT(waited, 2.5);
    errno = 0;
    EXPECT_EQ(VLIBCFileLock(VLIBC_LOCK_PKG | VLIBC_LOCK_EXCLUSIVE | VLIBC_LOCK_WAIT, 0), -1);
    EXPECT_EQ(errno, EAGAIN);
}

TEST_F(ManagerLock, WaiterGetsTheLockWhenTheHolderEnds) {
    LockHolder holder(800);
    ASSERT_TRUE(holder.locked());
    auto start = Clock::now();
    EXPECT_TRUE(PackageManager::ExLock(10));
    double waited = secondsSince(start);
    EXPECT_GE(waited, 0.5);
    EXPECT_LT(waited, 5.0);
}

TEST_F(ManagerLock, FlagFiles) {
    // A shutdown refuses even though the lock was got, and keeps holding it.
    testutil::writeFile("/var/.NormalShutdown", "");
    EXPECT_FALSE(PackageManager::ExLock(1));
    {
        LockHolder other(0, 1);
        EXPECT_FALSE(other.locked()) << "a refused ExLock still holds the lock";
    }
    PackageManager::UnLock();
    testutil::removeAll("/var/.NormalShutdown");

    // The OS upgrade flag refuses unless told to skip it; the shutdown flag never is.
    testutil::writeFile("/tmp/upgrade_stop_service", "");
    EXPECT_FALSE(PackageManager::ExLock(1));
    PackageManager::UnLock();
    PackageManager::setSkipUpgradeCheck(true);
    EXPECT_TRUE(PackageManager::ExLock(1));
    PackageManager::UnLock();
    testutil::writeFile("/var/.NormalShutdown", "");
    EXPECT_FALSE(PackageManager::ExLock(1));
    PackageManager::UnLock();
}

TEST_F(ManagerLock, FirstBootAfterUpgradeGoesOnWithoutTheLock) {
    LockHolder holder(3000);
    ASSERT_TRUE(holder.locked());
    testutil::writeFile("/var/.UpgradeBootup", "");
    EXPECT_TRUE(PackageManager::ExLock(1));
    testutil::writeFile("/tmp/upgrade_stop_service", "");
    EXPECT_FALSE(PackageManager::ExLock(0)) << "the upgrade flag still refuses";
}
