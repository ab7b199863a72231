// Every named step of install, upgrade, uninstall, start and stop, interrupted there: the
// process killed, or the volume full. Whatever is left, the registry reads, the lock is
// free, the package next to it is untouched, and one more install of the same file brings
// the package back. The steps come from the roads themselves (CORVPKG_FAULT_TRACE), so a
// step added to a road is walked without a word here.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "corv/fault.h"
#include "corvpkg/packagemanager.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

constexpr int kKilled = 128 + SIGKILL;
const char kTrace[] = "/tmp/fault.trace";
const char kFiller[] = "/volume1/" CORV_FAULT_FILL_FILE;

testutil::RunResult corvpkg(const std::vector<std::string>& args, const std::string& fault = "") {
    if (!fault.empty()) {
        setenv("CORVPKG_FAULT", fault.c_str(), 1);
    }
    testutil::RunResult r = testutil::run(CORVPKG_CLI_PATH, args);
    unsetenv("CORVPKG_FAULT");
    return r;
}

int status(const std::string& name) {
    return PackageManager().getPkgStatus(name);
}

std::string version(const std::string& name) {
    PackageInfo info;
    return PackageManager().getPackageInfo(name, info, nullptr, PKG_INFO_MASK_ALL) ? info.version
                                                                                   : "";
}

// One road as the command line drives it: the state it starts from, the command, and the
// file whose install restores the package afterwards. `leftStopped`: the steps at which a
// crash leaves no word on disk of the wish to run, so that the recovery may end stopped.
struct Road {
    const char* name;
    bool runningBefore;
    std::vector<std::string> (*command)(const std::string& v1, const std::string& v2);
    bool upgradeFile;      // the command installs v2, and so does the recovery
    bool eitherEndIsFine;  // start/stop: an interrupted change of intent may have taken hold
    int shards;            // the walk is cut in this many tests, each of bearable length
    std::set<std::string> leftStopped;
};

// A fresh install removes `installing` before it starts the package, and the start writes
// `enabled` only after its checks, the package's prestart and the resources of the running
// state: in between nothing tells that the package was to run.
const std::set<std::string> kBeforeEnabled = {"start:open-task",
                                              "start:lock",
                                              "start:list-packages",
                                              "start:drive-packages",
                                              "start:begin",
                                              "start:check-required-services",
                                              "start:check-version-limits",
                                              "start:check-arch",
                                              "start:check-volume",
                                              "start:check-control-script",
                                              "start:prepare-messages",
                                              "start:ask-package",
                                              "start:mark-enabled",
                                              "start:change-intent"};

std::set<std::string> with(std::set<std::string> steps, const std::set<std::string>& more) {
    steps.insert(more.begin(), more.end());
    return steps;
}

const Road kRoads[] = {
    {"install", false,
     [](auto& v1, auto&) {
         return std::vector<std::string>{"install", v1};
     },
     false, false, 2, with(kBeforeEnabled, {"install:start"})},
    {"upgrade",
     true,
     [](auto&, auto& v2) {
         return std::vector<std::string>{"install", v2};
     },
     true,
     false,
     4,
     {}},
    // An uninstall stops the package for good (no pause, no flag) before its preuninst;
    // until the payload is gone the package stands installed and stopped.
    {"uninstall",
     true,
     [](auto&, auto&) {
         return std::vector<std::string>{"uninstall", "demo"};
     },
     false,
     false,
     2,
     {"stop:restart-related-services", "stop:close-task", "stop:keep-store-linux-mode",
      "stop:log-outcome", "stop:run-hooks", "uninstall:run-preuninst",
      "uninstall:release-preuninst-resources", "uninstall:remove-payload"}},
    {"stop",
     true,
     [](auto&, auto&) {
         return std::vector<std::string>{"stop", "demo"};
     },
     false,
     true,
     1,
     {}},
    {"start",
     false,
     [](auto&, auto&) {
         return std::vector<std::string>{"start", "demo"};
     },
     false,
     true,
     1,
     {}},
};

// One test of the walk: the road and the share of its steps (every shards-th from shard).
struct Walk {
    const Road* road;
    int shard;
};

std::vector<Walk> walks() {
    std::vector<Walk> out;
    for (const Road& road : kRoads) {
        for (int shard = 0; shard < road.shards; ++shard) {
            out.push_back({&road, shard});
        }
    }
    return out;
}

class FaultWalk : public ::testing::TestWithParam<Walk> {
  protected:
    void SetUp() override {
        v1_ = testutil::buildPackage(testutil::recordingPackage("demo", "1.0-0001"));
        v2_ = testutil::buildPackage(testutil::recordingPackage("demo", "2.0-0001"));
        ASSERT_EQ(corvpkg({"install", testutil::buildPackage(testutil::recordingPackage("other")),
                           "--no-verify"})
                      .status,
                  0);
    }

    const Road& road() const { return *GetParam().road; }

    std::string recoveryFile() const { return road().upgradeFile ? v2_ : v1_; }

    // The package installed (v1, or v2 once an upgrade went through) and running or not.
    void bringToStart() {
        const Road& road = this->road();
        if (road.name == std::string("install")) {
            if (status("demo") != 255) {
                ASSERT_EQ(corvpkg({"uninstall", "demo", "--force"}).status, 0);
            }
            return;
        }
        if (status("demo") == 255) {
            ASSERT_EQ(corvpkg({"install", v1_, "--no-verify"}).status, 0);
        }
        if ((status("demo") == 0) != road.runningBefore) {
            ASSERT_EQ(corvpkg({road.runningBefore ? "start" : "stop", "demo"}).status, 0);
        }
    }

    std::vector<std::string> command() const {
        std::vector<std::string> args = road().command(v1_, v2_);
        if (args[0] == "install") {
            args.push_back("--no-verify");
        }
        return args;
    }

    // The road:step names the command passes through, in order, each once.
    std::vector<std::string> steps() {
        bringToStart();
        testutil::removeAll(kTrace);
        setenv("CORVPKG_FAULT_TRACE", kTrace, 1);
        testutil::RunResult r = corvpkg(command());
        unsetenv("CORVPKG_FAULT_TRACE");
        EXPECT_EQ(r.status, 0) << r.err;
        std::vector<std::string> out;
        std::set<std::string> seen;
        std::istringstream lines(testutil::readFile(kTrace));
        for (std::string line; std::getline(lines, line);) {
            if (seen.insert(line).second &&
                seen.size() % road().shards == size_t(GetParam().shard)) {
                out.push_back(line);
            }
        }
        return out;
    }

    // What any interruption must leave: a free lock, a registry that reads, the other
    // package running as it was.
    void expectConsistent() {
        EXPECT_TRUE(PackageManager::ExLock(1)) << "the lock is still held";
        PackageManager::UnLock();
        const std::set<int> known = {0, 1, 2, 3, 150, 255};
        EXPECT_TRUE(known.count(status("demo"))) << status("demo");
        EXPECT_EQ(status("other"), 0);
        EXPECT_EQ(version("other"), "1.0-0001");
    }

    // One more install of the file brings the package back as it was meant to be.
    void expectRecovery(const std::string& step) {
        testutil::RunResult r = corvpkg({"install", recoveryFile(), "--no-verify"});
        ASSERT_EQ(r.status, 0) << r.out << r.err;
        EXPECT_EQ(version("demo"), road().upgradeFile ? "2.0-0001" : "1.0-0001");
        const int after = status("demo");
        const bool running = road().runningBefore || road().name == std::string("install");
        if (road().eitherEndIsFine || road().leftStopped.count(step)) {
            EXPECT_TRUE(after == 0 || after == 3) << after;
        } else {
            EXPECT_EQ(after, running ? 0 : 3) << "running state after the recovery";
        }
    }

    std::string v1_;
    std::string v2_;
};

TEST_P(FaultWalk, KilledAtEveryStep) {
    const std::vector<std::string> walk = steps();
    ASSERT_GT(walk.size(), 3u);
    for (const std::string& step : walk) {
        SCOPED_TRACE(step);
        bringToStart();
        testutil::RunResult r = corvpkg(command(), step + ":kill");
        EXPECT_EQ(r.status, kKilled) << r.out << r.err;
        expectConsistent();
        expectRecovery(step);
    }
}

// The roads that write the payload; the steps of the roads they call on the way are filled
// up in their own walk.
TEST_P(FaultWalk, VolumeFullAtEveryStep) {
    if (road().name != std::string("install") && road().name != std::string("upgrade")) {
        GTEST_SKIP() << "nothing of size is written";
    }
    for (const std::string& step : steps()) {
        if (step.rfind(road().name + std::string(":"), 0) != 0) {
            continue;
        }
        SCOPED_TRACE(step);
        bringToStart();
        testutil::RunResult r = corvpkg(command(), step + ":fill");
        ASSERT_TRUE(testutil::exists(kFiller)) << "the volume was not filled";
        testutil::removeAll(kFiller);
        EXPECT_TRUE(r.status == 0 || r.status == 1) << r.out << r.err;
        expectConsistent();
        expectRecovery(step);
    }
}

void PrintTo(const Walk& walk, std::ostream* out) {
    *out << walk.road->name << " share " << walk.shard;
}

INSTANTIATE_TEST_SUITE_P(Roads, FaultWalk, ::testing::ValuesIn(walks()), [](const auto& info) {
    return std::string(info.param.road->name) + std::to_string(info.param.shard);
});

}  // namespace
