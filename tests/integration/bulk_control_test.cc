// Every package at once, as at boot and shutdown, and the packages that need a system
// service: real packages with generated jobs in the sandbox, whose scripts log the order.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include "corv/service.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

const PKG_INSTALLATION_TYPE kUserStart = static_cast<PKG_INSTALLATION_TYPE>(8);

testutil::TestPackage startable(const std::string& name, const std::string& dependsOn = "") {
    testutil::TestPackage pkg(name);
    pkg.scripts["start-stop-status"] = testutil::statefulScript(name);
    pkg.conf["resource"] = R"({"service-cfg":{}})";
    if (!dependsOn.empty()) {
        pkg.info["install_dep_packages"] = dependsOn;
    }
    return pkg;
}

// Installed as the installer leaves a package (registry, payload, generated job), and
// started by the user when `start`.
void install(const testutil::TestPackage& pkg, bool start = true) {
    testutil::installFixture(pkg, false);
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    if (start) {
        PackageManager pm;
        ASSERT_EQ(
            pm.serviceControl(kUserStart, pkg.name, true, nullptr, nullptr, nullptr, false, false),
            1)
            << pkg.name;
    }
}

// top -> mid -> base, all started.
void installChain() {
    ASSERT_NO_FATAL_FAILURE(install(startable("base")));
    ASSERT_NO_FATAL_FAILURE(install(startable("mid", "base")));
    ASSERT_NO_FATAL_FAILURE(install(startable("top", "mid")));
    unlink(testutil::kStartStopLog);
}

bool enabled(const std::string& name) {
    return testutil::exists("/var/packages/" + name + "/enabled");
}

void registerInterest(const std::string& name, const std::string& key, const std::string& json) {
    testutil::writeFile("/var/packages/" + name + "/etc/corvpkg_conf/reg_" + key, json);
}

// The progress lines of a verbose walk as "status id number/total".
std::vector<std::string> progress(const std::string& out) {
    std::vector<std::string> lines;
    std::istringstream in(out);
    for (std::string line; std::getline(in, line);) {
        Json::Value value;
        if (line.empty() || line[0] != '{' || !fromString(line, value)) {
            continue;
        }
        lines.push_back(value["status"].asString() + " " + value["action"].asString() + " " +
                        value["id"].asString() + " " + value["number"].asString() + "/" +
                        value["total"].asString());
    }
    return lines;
}

testutil::RunResult corvpkg(const std::vector<std::string>& args) {
    return testutil::run(CORVPKG_CLI_PATH, args);
}

}  // namespace

TEST(BulkControl, StopAllPausesDependentsFirstAndStartAllResumesDependenciesFirst) {
    ASSERT_NO_FATAL_FAILURE(installChain());
    testutil::RunResult stop = corvpkg({"stop-all"});
    ASSERT_EQ(stop.status, 0) << stop.out << stop.err;
    EXPECT_EQ(testutil::startStopActions(),
              (std::vector<std::string>{"top stop", "mid stop", "base stop"}));
    EXPECT_EQ(
        progress(stop.out),
        (std::vector<std::string>{"begin stop top 1/3", "end stop top 1/3", "begin stop mid 2/3",
                                  "end stop mid 2/3", "begin stop base 3/3", "end stop base 3/3"}));
    EXPECT_NE(stop.out.find("Total:\t3 packages\n"), std::string::npos) << stop.out;
    // A shutdown keeps the user's intent: the flags stay, the jobs are only paused.
    PackageManager pm;
    for (const char* name : {"top", "mid", "base"}) {
        EXPECT_TRUE(enabled(name)) << name;
        EXPECT_EQ(pm.getPkgStatus(name), 3) << name;
    }

    unlink(testutil::kStartStopLog);
    testutil::RunResult start = corvpkg({"start-all"});
    ASSERT_EQ(start.status, 0) << start.out << start.err;
    EXPECT_EQ(testutil::startStopActions(),
              (std::vector<std::string>{"base start", "mid start", "top start"}));
    EXPECT_NE(start.out.find("Begin:\tReload relative services\nEnd:\tReload relative services\n"),
              std::string::npos)
        << start.out;
    for (const char* name : {"top", "mid", "base"}) {
        EXPECT_EQ(pm.getPkgStatus(name), 0) << name;
    }
}

TEST(BulkControl, PackageThatIsNotEnabledIsPassedOverWithoutFailure) {
    ASSERT_NO_FATAL_FAILURE(install(startable("on")));
    ASSERT_NO_FATAL_FAILURE(install(startable("off"), false));
    unlink(testutil::kStartStopLog);
    testutil::RunResult stop = corvpkg({"stop-all"});
    ASSERT_EQ(stop.status, 0) << stop.out << stop.err;
    EXPECT_EQ(testutil::startStopActions(), std::vector<std::string>{"on stop"});
    std::vector<std::string> lines = progress(stop.out);
    EXPECT_EQ(std::count(lines.begin(), lines.end(), "end stop off 1/2") +
                  std::count(lines.begin(), lines.end(), "end stop off 2/2"),
              0)
        << stop.out;
    EXPECT_FALSE(enabled("off"));
    // A shutdown reloads no daemons.
    EXPECT_EQ(stop.out.find("Reload relative services"), std::string::npos) << stop.out;
}

TEST(BulkControl, VolumeFilterHandlesOnlyPackagesThatNeedAListedVolume) {
    ASSERT_NO_FATAL_FAILURE(install(startable("onvol1")));
    ASSERT_NO_FATAL_FAILURE(install(startable("nofile")));
    ASSERT_NO_FATAL_FAILURE(install(startable("needsnone")));
    ASSERT_NO_FATAL_FAILURE(install(startable("badfile")));
    ASSERT_NO_FATAL_FAILURE(install(startable("strings")));
    registerInterest("onvol1", "volume", R"(["/volume1"])");
    registerInterest("needsnone", "volume", "[]");
    registerInterest("badfile", "volume", "");                    // unreadable: taken along
    registerInterest("strings", "volume", R"(["/volume1", 7])");  // not all strings: taken along

    struct Case {
        const char* filter;
        std::vector<std::string> stopped;
    };
    const Case cases[] = {
        {"/volume2,/volume3", {"badfile stop", "nofile stop", "strings stop"}},
        {"/volume1", {"badfile stop", "nofile stop", "onvol1 stop", "strings stop"}},
    };
    for (const Case& c : cases) {
        unlink(testutil::kStartStopLog);
        testutil::RunResult stop = corvpkg({"stop-all", "--filter", c.filter, "--key", "volume"});
        EXPECT_EQ(stop.status, 0) << c.filter << stop.out << stop.err;
        std::vector<std::string> actions = testutil::startStopActions();
        std::sort(actions.begin(), actions.end());
        EXPECT_EQ(actions, c.stopped) << "filter " << c.filter;
        std::vector<std::string> lines = progress(stop.out);
        const size_t skips = std::count_if(lines.begin(), lines.end(), [](const std::string& l) {
            return l.rfind("skip stop ", 0) == 0;
        });
        EXPECT_EQ(skips, 5 - c.stopped.size()) << "filter " << c.filter << "\n" << stop.out;
        // Bring the stopped ones back for the next case.
        ASSERT_EQ(corvpkg({"start-all", "--quiet"}).status, 0);
    }
    // A filter without its key is a usage error.
    EXPECT_EQ(corvpkg({"stop-all", "--filter", "/volume1"}).status, 2);
}

TEST(BulkControl, ServiceDownStopsOnlyThePackagesThatNeedIt) {
    testutil::TestPackage ssh = startable("needsssh");
    ssh.info["start_dep_services"] = "ssh";
    ASSERT_EQ(VLIBServiceStart("ssh-shell", 0), 0);
    ASSERT_NO_FATAL_FAILURE(install(ssh));
    ASSERT_NO_FATAL_FAILURE(install(startable("plain")));
    unlink(testutil::kStartStopLog);

    testutil::RunResult down = corvpkg({"service-down", "ssh-shell"});
    ASSERT_EQ(down.status, 0) << down.out << down.err;
    EXPECT_EQ(testutil::startStopActions(), std::vector<std::string>{"needsssh stop"});
    EXPECT_NE(down.out.find("Stop needsssh successfully (1/1)\n"), std::string::npos) << down.out;
    EXPECT_TRUE(enabled("needsssh"));

    testutil::RunResult up = corvpkg({"service-up", "ssh-shell"});
    ASSERT_EQ(up.status, 0) << up.out << up.err;
    EXPECT_EQ(testutil::startStopActions(),
              (std::vector<std::string>{"needsssh stop", "needsssh start"}));
    PackageManager pm;
    EXPECT_EQ(pm.getPkgStatus("needsssh"), 0);
    // A service that no package needs drives nothing.
    EXPECT_EQ(corvpkg({"service-down", "pgsql"}).status, 0);
    EXPECT_EQ(testutil::startStopActions().size(), 2u);
}

TEST(BulkControl, BootJobStartsAllAtStartupAndStopsAllAtShutdown) {
    ASSERT_NO_FATAL_FAILURE(installChain());
    PackageManager pm;
    ASSERT_EQ(pm.serviceControlOnOffALL(false, false, nullptr, nullptr), 1);
    unlink(testutil::kStartStopLog);

    testutil::RunResult boot = testutil::run("/sbin/initctl", {"emit", "startup"});
    ASSERT_EQ(boot.status, 0) << boot.err;
    EXPECT_EQ(testutil::startStopActions(),
              (std::vector<std::string>{"base start", "mid start", "top start"}));

    unlink(testutil::kStartStopLog);
    testutil::RunResult halt = testutil::run("/sbin/initctl", {"emit", "shutdown"});
    ASSERT_EQ(halt.status, 0) << halt.err;
    EXPECT_EQ(testutil::startStopActions(),
              (std::vector<std::string>{"top stop", "mid stop", "base stop"}));
    EXPECT_TRUE(enabled("top"));
}
