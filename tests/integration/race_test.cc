// Ten processes race install, uninstall, start, stop and status on one package: they meet
// only at the package lock, and whatever order they ran in, the registry reads, the lock is
// free and the package next to it is untouched.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <set>
#include <string>
#include <vector>

#include "corvpkg/packagemanager.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

TEST(Race, TenProcessesLeaveAConsistentRegistry) {
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    const std::string other = testutil::buildPackage(testutil::recordingPackage("other"));
    ASSERT_EQ(testutil::run(CORVPKG_CLI_PATH, {"install", other, "--no-verify"}).status, 0);
    const std::vector<std::vector<std::string>> ops = {{"install", file, "--no-verify"},
                                                       {"uninstall", "demo", "--force"},
                                                       {"start", "demo"},
                                                       {"stop", "demo"},
                                                       {"status", "demo"}};
    std::vector<pid_t> racers;
    for (size_t i = 0; i < 10; ++i) {
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            for (size_t k = 0; k < ops.size(); ++k) {
                testutil::run(CORVPKG_CLI_PATH, ops[(i + k) % ops.size()]);
            }
            _exit(0);
        }
        racers.push_back(pid);
    }
    for (pid_t pid : racers) {
        int status = 0;
        ASSERT_EQ(waitpid(pid, &status, 0), pid);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    }

    EXPECT_TRUE(PackageManager::ExLock(1)) << "the lock is still held";
    PackageManager::UnLock();
    const std::set<int> known = {0, 1, 2, 3, 255};
    EXPECT_TRUE(known.count(PackageManager().getPkgStatus("demo")))
        << PackageManager().getPkgStatus("demo");
    EXPECT_EQ(PackageManager().getPkgStatus("other"), 0);
    EXPECT_EQ(testutil::run(CORVPKG_CLI_PATH, {"list"}).status, 0);
    testutil::RunResult r = testutil::run(CORVPKG_CLI_PATH, {"install", file, "--no-verify"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(PackageManager().getPkgStatus("demo"), 0);
}
