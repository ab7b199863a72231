// Every named step of install, upgrade, uninstall, start and stop, interrupted there: the
// step failed, the process killed, or the volume full. Whatever is left, the registry
// reads, the lock is free, the package next to it is untouched, and one more install of the
// same file brings the package back. The steps come from the roads themselves
// (CORVPKG_FAULT_TRACE), so a step added to a road is walked without a word here.
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
    bool upgradeFile;  // the command installs v2, and so does the recovery
    // Start and stop are killed at every step inside the upgrade and the uninstall, where
    // the running state to come back to is known; on their own they are only failed.
    bool killed;
    int shards;  // the walk is cut in this many tests, each of bearable length
    std::set<std::string> leftStopped;
    // Steps killed in another road, where what the kill must leave is told more sharply.
    std::set<std::string> walkedElsewhere = {};
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

const Road kRoads[] = {
    {"install",
     false,
     [](auto& v1, auto&) {
         return std::vector<std::string>{"install", v1};
     },
     false,
     true,
     2,
     {"install:start"},
     // Inside a fresh install a crash before `enabled` may end either way; the upgrade
     // kills the same steps with the package's running state to come back to.
     kBeforeEnabled},
    {"upgrade",
     true,
     [](auto&, auto& v2) {
         return std::vector<std::string>{"install", v2};
     },
     true,
     true,
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
     true,
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
     false,
     1,
     {}},
    {"start",
     false,
     [](auto&, auto&) {
         return std::vector<std::string>{"start", "demo"};
     },
     false,
     false,
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

// A step the command passed through, and whether the room on the volume changed while it
// ran (it wrote or removed files there).
struct Step {
    std::string name;
    bool roomChanged;
};

bool startsWith(const std::string& text, const std::string& prefix) {
    return text.rfind(prefix, 0) == 0;
}

class FaultWalk : public ::testing::TestWithParam<Walk> {
  protected:
    void SetUp() override {
        const std::string test = ::testing::UnitTest::GetInstance()->current_test_info()->name();
        if (startsWith(test, "VolumeFull") && road().name != std::string("install") &&
            road().name != std::string("upgrade")) {
            GTEST_SKIP() << "nothing of size is written";
        }
        v1_ = testutil::buildPackage(testutil::recordingPackage("demo", "1.0-0001"));
        v2_ = testutil::buildPackage(testutil::recordingPackage("demo", "2.0-0001"));
        ASSERT_EQ(corvpkg({"install", testutil::buildPackage(testutil::recordingPackage("other")),
                           "--no-verify"})
                      .status,
                  0);
    }

    const Road& road() const { return *GetParam().road; }
    bool ownStep(const std::string& step) const {
        return startsWith(step, road().name + std::string(":"));
    }

    std::string recoveryFile() const { return road().upgradeFile ? v2_ : v1_; }

    // The package installed (v1, or v2 once an upgrade went through) and running or not.
    // A package left broken is repaired by an install of the file on the way.
    void bringToStart(bool afterFailure = false) {
        const Road& road = this->road();
        if (road.name == std::string("install")) {
            if (status("demo") != 255) {
                ASSERT_EQ(corvpkg({"uninstall", "demo", "--force"}).status, 0);
            }
            return;
        }
        if (status("demo") == 255) {
            ASSERT_EQ(corvpkg({"install", v1_, "--no-verify"}).status, 0);
        } else if (status("demo") == 150) {
            testutil::RunResult r = corvpkg({"install", recoveryFile(), "--no-verify"});
            ASSERT_EQ(r.status, 0) << "the broken package is not repaired: " << r.out << r.err;
        }
        if ((status("demo") == 0) != road.runningBefore) {
            testutil::RunResult r = corvpkg({road.runningBefore ? "start" : "stop", "demo"});
            // A road that failed after it gave back the package's running resources (an
            // uninstall goes forward once they are released) leaves a package that only a
            // new install of its file makes whole; the uninstall had stopped it for good.
            if (r.status != 0 && afterFailure && road.runningBefore) {
                r = corvpkg({"install", recoveryFile(), "--no-verify"});
                ASSERT_EQ(r.status, 0) << "no repair: " << r.out << r.err;
                if (status("demo") != 0) {
                    r = corvpkg({"start", "demo"});
                }
            }
            ASSERT_EQ(r.status, 0) << r.out << r.err;
        }
        ASSERT_EQ(status("demo") == 0, road.runningBefore) << status("demo");
    }

    std::vector<std::string> command() const {
        std::vector<std::string> args = road().command(v1_, v2_);
        if (args[0] == "install") {
            args.push_back("--no-verify");
        }
        return args;
    }

    // The road:step names the command passes through, in order, each once; this test's
    // share of them.
    std::vector<Step> steps() {
        bringToStart();
        testutil::removeAll(kTrace);
        setenv("CORVPKG_FAULT_TRACE", kTrace, 1);
        testutil::RunResult r = corvpkg(command());
        unsetenv("CORVPKG_FAULT_TRACE");
        EXPECT_EQ(r.status, 0) << r.err;
        std::vector<std::pair<std::string, std::string>> entries;  // name, free bytes on entry
        std::istringstream lines(testutil::readFile(kTrace));
        for (std::string line; std::getline(lines, line);) {
            const size_t tab = line.find('\t');
            entries.emplace_back(line.substr(0, tab),
                                 tab == std::string::npos ? "" : line.substr(tab + 1));
        }
        // The dispatcher's steps before it picks the upgrade are those of every install,
        // walked with the fresh one.
        size_t first = 0;
        if (road().name == std::string("upgrade")) {
            while (first < entries.size() && !ownStep(entries[first].first)) {
                ++first;
            }
        }
        std::vector<Step> out;
        std::set<std::string> seen;
        for (size_t i = first; i < entries.size(); ++i) {
            const bool changed =
                i + 1 == entries.size() || entries[i + 1].second != entries[i].second;
            if (road().walkedElsewhere.count(entries[i].first) ||
                !seen.insert(entries[i].first).second) {
                continue;
            }
            if (seen.size() % road().shards == size_t(GetParam().shard)) {
                out.push_back({entries[i].first, changed});
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
        if (road().leftStopped.count(step)) {
            EXPECT_TRUE(after == 0 || after == 3) << after;
        } else {
            EXPECT_EQ(after, running ? 0 : 3) << "running state after the recovery";
        }
    }

    // A step of the road itself that fails gives a clean failure (or, for a step whose
    // failure the road only notes, a success), and the road can be gone again.
    void failAt(const std::string& step) {
        testutil::RunResult r = corvpkg(command(), step + ":fail");
        EXPECT_TRUE(r.status == 0 || r.status == 1) << r.out << r.err;
        expectConsistent();
    }

    // Start and stop, on their own: the same command again, without a fault, does what
    // was asked.
    void expectRepeatable() {
        testutil::RunResult r = corvpkg(command());
        EXPECT_EQ(r.status, 0) << r.out << r.err;
        EXPECT_EQ(status("demo"), road().runningBefore ? 3 : 0);
    }

    std::string v1_;
    std::string v2_;
};

// Each step fails first; what the failure leaves is brought back to where the road starts
// (an uninstall, a repair, a start or stop), then the same step is killed.
TEST_P(FaultWalk, FailedAndKilledAtEveryStep) {
    const std::vector<Step> walk = steps();
    ASSERT_GT(walk.size(), 3u);
    for (const Step& step : walk) {
        SCOPED_TRACE(step.name);
        bringToStart();
        if (ownStep(step.name) || startsWith(step.name, "dispatch:")) {
            failAt(step.name);
            if (!road().killed) {
                expectRepeatable();
                continue;
            }
            bringToStart(true);
        }
        if (!road().killed) {
            continue;
        }
        testutil::RunResult r = corvpkg(command(), step.name + ":kill");
        EXPECT_EQ(r.status, kKilled) << r.out << r.err;
        expectConsistent();
        expectRecovery(step.name);
    }
}

// The roads that write the payload, filled up at their own steps that take or give back
// room: between two of those a full volume meets the same writes. The steps of the roads
// they call on the way are filled up in their own walk.
TEST_P(FaultWalk, VolumeFullAtEveryStep) {
    bool first = true;
    for (const Step& step : steps()) {
        if (!ownStep(step.name) || (!first && !step.roomChanged)) {
            continue;
        }
        first = false;
        SCOPED_TRACE(step.name);
        bringToStart();
        testutil::RunResult r = corvpkg(command(), step.name + ":fill");
        ASSERT_TRUE(testutil::exists(kFiller)) << "the volume was not filled";
        testutil::removeAll(kFiller);
        EXPECT_TRUE(r.status == 0 || r.status == 1) << r.out << r.err;
        expectConsistent();
        expectRecovery(step.name);
    }
}

void PrintTo(const Walk& walk, std::ostream* out) {
    *out << walk.road->name << " share " << walk.shard;
}

INSTANTIATE_TEST_SUITE_P(Roads, FaultWalk, ::testing::ValuesIn(walks()), [](const auto& info) {
    return std::string(info.param.road->name) + std::to_string(info.param.shard);
});

}  // namespace
