// Start and stop of real packages through their generated jobs, in the sandbox. The
// packages' scripts record what ran in one shared log, so that order is visible.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <string>
#include <vector>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglimit.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

const char* const kLog = testutil::kStartStopLog;
const char kPluginLog[] = "/tmp/plugin.log";
const PKG_INSTALLATION_TYPE kUserStart = static_cast<PKG_INSTALLATION_TYPE>(8);
const PKG_INSTALLATION_TYPE kUserStop = static_cast<PKG_INSTALLATION_TYPE>(0x10);
const PKG_INSTALLATION_TYPE kBoot = static_cast<PKG_INSTALLATION_TYPE>(0);

// The scripted plug-in as worker "hold" of the enable and disable phases.
void registerHoldWorker() {
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        std::string(R"({"workers":[{"id":"hold","interval":"0x0044","major":1,)") +
                            R"("minor":0,"path":")" + CORVPKG_TEST_PLUGIN_PATH + "\"}]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
    setenv("CORV_TEST_PLUGIN_LOG", kPluginLog, 1);
}

testutil::TestPackage startable(const std::string& name) {
    testutil::TestPackage pkg(name);
    pkg.info["displayname"] = "Display " + name;
    pkg.scripts["start-stop-status"] = testutil::statefulScript(name);
    pkg.conf["resource"] = R"({"service-cfg":{}})";
    return pkg;
}

// Installed as the installer leaves a package: registry, payload, and its generated job.
void install(const testutil::TestPackage& pkg) {
    testutil::installFixture(pkg, false);
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
}

bool enabled(const std::string& name) {
    return testutil::exists("/var/packages/" + name + "/enabled");
}

// "app" depends on "base"; both installed and started.
void startChain() {
    testutil::TestPackage base = startable("base");
    testutil::TestPackage app = startable("app");
    app.info["install_dep_packages"] = "base";
    install(base);
    install(app);
    PackageManager pm;
    ASSERT_EQ(pm.serviceControl(kUserStart, "base", true, nullptr, nullptr, nullptr, true, true),
              1);
    ASSERT_EQ(pm.serviceControl(kUserStart, "app", true, nullptr, nullptr, nullptr, true, true), 1);
}

void clearLog() {
    unlink(kLog);
    unlink(kPluginLog);
}

}  // namespace

TEST(StartStop, ChainStopsDependentsFirstAndStartsThemAfter) {
    ASSERT_NO_FATAL_FAILURE(startChain());
    PackageManager pm;
    EXPECT_EQ(pm.getPkgStatus("app"), 0);

    clearLog();
    EXPECT_EQ(pm.serviceControl(kUserStop, "base", false, nullptr, nullptr, nullptr, true, true),
              1);
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"app stop", "base stop"}));
    EXPECT_FALSE(enabled("app"));
    EXPECT_FALSE(enabled("base"));
    EXPECT_EQ(pm.getPkgStatus("base"), 3);

    // The same list drives the start backwards: the package first, its dependents after.
    clearLog();
    std::vector<std::string> order = {"app", "base"};
    EXPECT_EQ(pm.serviceControl(kUserStart, "base", true, nullptr, nullptr, &order, true, true), 1);
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"base start", "app start"}));
    EXPECT_TRUE(enabled("app"));
    EXPECT_EQ(pm.getPkgStatus("app"), 0);
    EXPECT_EQ(pm.getResult(), PKG_OK);
}

TEST(StartStop, RefusingPrestartLeavesNothingAcquired) {
    registerHoldWorker();
    testutil::TestPackage pkg = startable("demo");
    pkg.info["precheckstartstop"] = "yes";
    pkg.conf["resource"] = R"({"service-cfg":{},"hold":{"tag":"h"}})";
    install(pkg);
    testutil::writeFile("/tmp/demo.pre", "1");
    clearLog();
    PackageManager pm;
    EXPECT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_PRESTART_FAILED);
    EXPECT_EQ(testutil::startStopActions(), std::vector<std::string>{"demo prestart"});
    EXPECT_FALSE(enabled("demo"));
    EXPECT_EQ(testutil::readFile(kPluginLog).find("acquire"), std::string::npos);
    // The script saw the task record of the running start.
    Json::Value task;
    ASSERT_TRUE(fromString(testutil::readFile("/tmp/demo.task"), task));
    EXPECT_EQ(task["data"]["status"].asString(), "starting");
    EXPECT_EQ(task["data"]["id"].asString(), "demo");
    EXPECT_FALSE(testutil::exists("/run/corv/task/@administrators/@CORVPKG_STARTSTOP_demo.json"));

    // Agreeing, the same start acquires and runs.
    unlink("/tmp/demo.pre");
    EXPECT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              1);
    EXPECT_NE(testutil::readFile(kPluginLog).find("acquire h"), std::string::npos);
    EXPECT_TRUE(enabled("demo"));
}

TEST(StartStop, StaleJobIsStoppedBeforeTheStart) {
    install(startable("demo"));
    PackageManager pm;
    ASSERT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              1);
    // The package stopped behind the job's back: the job still runs.
    unlink("/tmp/demo.running");
    int state = 0;
    ASSERT_EQ(VLIBServiceStatusGet("pkgctl-demo", &state), 0);
    ASSERT_EQ(state, VLIB_SERVICE_STATE_RUNNING);
    clearLog();
    EXPECT_EQ(pm.serviceControlAction(kUserStart, "demo", true, nullptr, nullptr, MSG_TYPE_PARAM),
              1);
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"demo stop", "demo start"}));
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
}

TEST(StartStop, ShutdownPausesAndKeepsTheIntent) {
    registerHoldWorker();
    testutil::TestPackage pkg = startable("demo");
    pkg.conf["resource"] = R"({"service-cfg":{},"hold":{"tag":"h"}})";
    install(pkg);
    PackageManager pm;
    ASSERT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              1);
    clearLog();
    EXPECT_EQ(pm.serviceControlAction(kBoot, "demo", false, nullptr, nullptr, MSG_TYPE_LOG), 1);
    EXPECT_TRUE(enabled("demo"));
    EXPECT_EQ(testutil::readFile(kPluginLog).find("release"), std::string::npos);
    EXPECT_EQ(pm.getPkgStatus("demo"), 3);
    // Boot resumes what shutdown paused.
    EXPECT_EQ(pm.serviceControlAction(kBoot, "demo", true, nullptr, nullptr, MSG_TYPE_LOG), 1);
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
    // A user's stop takes the intent back and releases.
    EXPECT_EQ(pm.serviceControl(kUserStop, "demo", false, nullptr, nullptr, nullptr, true, true),
              1);
    EXPECT_FALSE(enabled("demo"));
    EXPECT_NE(testutil::readFile(kPluginLog).find("release h"), std::string::npos);
}

TEST(StartStop, RequiredServiceOffIsNamed) {
    testutil::TestPackage pkg = startable("demo");
    pkg.info["start_dep_services"] = "ssh";
    install(pkg);
    testutil::writeFile("/var/packages/demo/enabled", "");
    ASSERT_EQ(VLIBServiceIsEnabled("ssh-shell"), 0);
    PackageManager pm;
    EXPECT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              0);
    Json::Value data;
    EXPECT_EQ(pm.getResult(data), PKG_ERR_SERVICE_NOT_STARTED);
    ASSERT_TRUE(data.isArray());
    ASSERT_EQ(data.size(), 1u);
    char display[0x200] = "";
    ASSERT_GE(VLIBServicecfgDisplayNameGet("ssh-shell", display, sizeof(display)), 0);
    EXPECT_EQ(data[0].asString(), display);
    EXPECT_FALSE(enabled("demo"));
    EXPECT_EQ(testutil::readFile(kLog), "");
}

TEST(StartStop, PackageBelowTheLimitIsDisabledWithItsDependentsAtBoot) {
    ASSERT_NO_FATAL_FAILURE(startChain());
    PackageManager pm;
    testutil::writeFile(PKG_LIMIT_CONF, "base=\"2.0\"\n");
    unlink("/var/log/corvnosnotify.log");

    EXPECT_EQ(pm.serviceControlAction(kBoot, "base", true, nullptr, nullptr, MSG_TYPE_LOG), 0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_BELOW_VERSION_LIMIT);
    EXPECT_EQ(pm.getMapParam("oldver"), "2.0");
    EXPECT_FALSE(enabled("base"));
    EXPECT_FALSE(enabled("app"));
    EXPECT_EQ(pm.getPkgStatus("app"), 3);
    const std::string notes = testutil::readFile("/var/log/corvnosnotify.log");
    EXPECT_NE(notes.find("pkgmgr:fail_start_nos_version"), std::string::npos) << notes;
    EXPECT_NE(notes.find("pkgmgr:dep_start_failed"), std::string::npos) << notes;
    EXPECT_NE(notes.find("Display app"), std::string::npos) << notes;
}

TEST(StartStop, FailingStartTakesBackTheIntent) {
    install(startable("demo"));
    testutil::writeFile("/tmp/demo.failstart", "");
    PackageManager pm;
    EXPECT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_START_FAILED);
    EXPECT_FALSE(enabled("demo"));
    EXPECT_NE(pm.getPkgStatus("demo"), 0);
}

TEST(StartStop, WorkerMessageComesFromTheJobsProcess) {
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        std::string(R"({"workers":[{"id":"boot","interval":"0x0088","major":1,)") +
                            R"("minor":0,"path":")" + CORVPKG_TEST_PLUGIN_PATH + "\"}]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
    testutil::TestPackage pkg = startable("demo");
    pkg.conf["resource"] =
        R"({"service-cfg":{},"boot":{"tag":"b","fail":["acquire"],"message":"pkgmgr:boom"}})";
    install(pkg);
    PackageManager pm;
    EXPECT_EQ(pm.serviceControl(kUserStart, "demo", true, nullptr, nullptr, nullptr, true, true),
              0);
    Json::Value msg = pm.getJsonParam("worker_msg");
    ASSERT_TRUE(msg.isArray() && msg.size() == 1u) << toString(msg);
    EXPECT_EQ(msg[0]["sec"].asString(), "pkgmgr") << toString(msg);
    EXPECT_EQ(msg[0]["key"].asString(), "boom") << toString(msg);
}

TEST(StartStop, CommandLineDrivesThePackageAndStatusAgrees) {
    install(startable("demo"));
    testutil::RunResult r = testutil::run(CORVPKG_CLI_PATH, {"start", "demo"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "started demo\n");
    r = testutil::run(CORVPKG_CLI_PATH, {"status", "demo", "--json"});
    Json::Value status;
    ASSERT_TRUE(fromString(r.out, status)) << r.out;
    EXPECT_TRUE(status["running"].asBool());
    r = testutil::run(CORVPKG_CLI_PATH, {"stop", "demo"});
    EXPECT_EQ(r.status, 0) << r.err;
    r = testutil::run(CORVPKG_CLI_PATH, {"status", "demo", "--json"});
    ASSERT_TRUE(fromString(r.out, status)) << r.out;
    EXPECT_FALSE(status["running"].asBool());

    testutil::writeFile("/tmp/demo.failstart", "");
    r = testutil::run(CORVPKG_CLI_PATH, {"start", "demo", "--json"});
    EXPECT_EQ(r.status, 1);
    Json::Value out;
    ASSERT_TRUE(fromString(r.out, out)) << r.out;
    EXPECT_EQ(out["name"].asString(), "PKG_ERR_START_FAILED");
    r = testutil::run(CORVPKG_CLI_PATH, {"start", "nosuch"});
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("error: The package nosuch is not installed."), std::string::npos)
        << r.err;
}
