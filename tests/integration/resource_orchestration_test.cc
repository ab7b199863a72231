// Acquire, Release and Update of installed and unpacked packages, with scripted workers
// that the test plug-in provides through provider files, as another package would.
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"
#include "corvpkg/worker.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using namespace CORVPackageTool::Resource;
using CORV::PkgUtils::WorkerResp;

namespace {

const char kPlugin[] = CORVPKG_TEST_PLUGIN_PATH;
const char kCallLog[] = "/tmp/plugin-calls";
const char kOwn[] = "/var/packages/demo/conf/resource.own";
const char kRequest[] = "/var/packages/demo/conf/resource";

Json::Value entry(const std::string& id, const std::string& interval,
                  const std::string& path = kPlugin) {
    Json::Value e(Json::objectValue);
    e["id"] = id;
    e["interval"] = interval;
    e["major"] = 1;
    e["minor"] = 0;
    e["path"] = path;
    return e;
}

// One provider "workers" with the given entries, as the worker-plugin worker writes it.
void provide(const std::vector<Json::Value>& entries) {
    Json::Value conf(Json::objectValue);
    conf["workers"] = Json::Value(Json::arrayValue);
    for (const Json::Value& e : entries) {
        conf["workers"].append(e);
    }
    testutil::writeFile(std::string(kProviderDir) + "/workers", toString(conf));
    testutil::writeFile(std::string(kProviderDir) + "/global", R"({"providers":["workers"]})");
}

Json::Value parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

Json::Value readJson(const std::string& path) {
    Json::Value value;
    EXPECT_TRUE(fromFile(path, value)) << path;
    return value;
}

// The worker operations of the call log, without the Init/Free/destroy lines.
std::string operations() {
    if (!testutil::exists(kCallLog)) {
        return "";
    }
    std::istringstream in(testutil::readFile(kCallLog));
    std::string out;
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("init", 0) == 0 || line.rfind("free", 0) == 0 ||
            line.rfind("destroy", 0) == 0) {
            continue;
        }
        out += (out.empty() ? "" : ", ") + line;
    }
    return out;
}

// How many workers were made, freed through the plug-in and destroyed.
std::string lifecycle() {
    std::istringstream in(testutil::exists(kCallLog) ? testutil::readFile(kCallLog) : "");
    int made = 0, freed = 0, destroyed = 0;
    for (std::string line; std::getline(in, line);) {
        made += line.rfind("init ", 0) == 0;
        freed += line.rfind("free ", 0) == 0;
        destroyed += line.rfind("destroy ", 0) == 0;
    }
    return std::to_string(made) + " made, " + std::to_string(freed) + " freed, " +
           std::to_string(destroyed) + " destroyed";
}

class PluginOrchestration : public ::testing::Test {
  protected:
    void SetUp() override {
        setenv("CORV_TEST_PLUGIN_LOG", kCallLog, 1);
        unsetenv("CORV_TEST_PLUGIN_INIT_NULL");
        unsetenv("CORV_TEST_PLUGIN_UPDATABLE");
        // a, b, c: preinst to preuninst; p, q, r: postinst to postuninst; u: updatable use.
        provide({entry("a", "0x0011"), entry("b", "0x0011"), entry("c", "0x0011"),
                 entry("p", "0x0022"), entry("q", "0x0022"), entry("r", "0x0022"),
                 entry("u", "0x0044")});
        info.package = "demo";
        CORVLogSetSink([this](int, const std::string& line) { log.push_back(line); });
    }
    void TearDown() override { CORVLogSetSink(nullptr); }

    void install(const std::string& request) {
        testutil::TestPackage pkg("demo");
        pkg.conf["resource"] = request;
        testutil::installFixture(pkg);
    }
    bool logged(const std::string& text) const {
        for (const std::string& line : log) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }

    PackageInfo info;
    WorkerResp resp;
    std::vector<std::string> log;
};

}  // namespace

TEST_F(PluginOrchestration, AcquireInProviderOrderReleaseInReverse) {
    install(R"({"r":{"tag":"r"},"q":{"tag":"q"},"p":{"tag":"p","path":"{{dir}}/x"}})");
    Json::Value variables = parse(R"({"dir":"/volume1/data"})");
    ASSERT_TRUE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, &variables, ""));
    EXPECT_EQ(operations(), "acquire p, acquire q, acquire r");
    EXPECT_EQ(lifecycle(), "3 made, 3 freed, 3 destroyed");
    Json::Value own = readJson(kOwn);
    EXPECT_EQ(own["p"]["seen"]["request"]["path"].asString(), "/volume1/data/x");
    EXPECT_EQ(own["p"]["seen"]["root"].asString(), "/var/packages/demo/target");
    EXPECT_EQ(own["p"]["seen"]["type"].asUInt(), 1u);
    EXPECT_EQ(own["q"]["acquired"].asInt(), 1);
    struct stat st {};
    ASSERT_EQ(stat(kOwn, &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);
    EXPECT_TRUE(logged("Acquire p for demo when 0x0001 (done)"));

    testutil::removeAll(kCallLog);
    ASSERT_TRUE(Release(TIMING_POSTUNINST, info, PKG_UNINSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "release r, release q, release p");
    EXPECT_EQ(readJson(kOwn)["p"]["released"].asBool(), true);
    EXPECT_TRUE(logged("Release r for demo when 0x0004 (done)"));
}

TEST_F(PluginOrchestration, PreinstFailureRollsBackFromTheFailingWorkerAndWritesTheOwnFile) {
    testutil::TestPackage pkg("demo");
    pkg.conf["resource"] =
        R"({"a":{"tag":"a"},"b":{"tag":"b","fail":["acquire"],"message":"pkgmgr:b_failed"},)"
        R"("c":{"tag":"c"}})";
    testutil::writePackageDir("/tmp/pkginstall", pkg);
    EXPECT_FALSE(Acquire(TIMING_PREINST, info, PKG_INSTALL, resp, nullptr, "/tmp/pkginstall"));
    EXPECT_EQ(operations(), "acquire a, acquire b, rollback b, rollback a");
    EXPECT_EQ(lifecycle(), "2 made, 2 freed, 2 destroyed");
    Json::Value own = readJson("/tmp/pkginstall/conf/resource.own");
    EXPECT_TRUE(own["a"]["rolled_back"].asBool());
    EXPECT_TRUE(own["b"]["rolled_back"].asBool());
    EXPECT_EQ(own["a"]["seen"]["root"].asString(), "/tmp/pkginstall/package");
    EXPECT_FALSE(own.isMember("c"));
    EXPECT_EQ(toString(resp.GetErrJsonArray()),
              R"([{"key":"b_failed","params":["b"],"sec":"pkgmgr"}])");
    EXPECT_FALSE(testutil::exists(kOwn)) << "nothing under /var/packages";
}

TEST_F(PluginOrchestration, PostinstFailureRollsNothingBackAndTheLaterWorkersRun) {
    install(R"({"p":{"tag":"p"},"q":{"tag":"q","fail":["acquire"]},"r":{"tag":"r"}})");
    EXPECT_FALSE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "acquire p, acquire q, acquire r");
    Json::Value own = readJson(kOwn);
    EXPECT_EQ(own["r"]["acquired"].asInt(), 1);
    EXPECT_FALSE(own["q"].isMember("acquired"));
    EXPECT_TRUE(logged("Acquire q for demo when 0x0001 (fail)"));
}

TEST_F(PluginOrchestration, ReleasePassesOverWhatOwnLacksAndGoesOnAfterAFailure) {
    install(R"({"p":{"tag":"p","fail":["release"]},"q":{"tag":"q"},"r":{"tag":"r"}})");
    testutil::writeFile(kOwn, R"({"p":{"tag":"p"},"r":{"tag":"r-own"},"gone":{}})");
    EXPECT_FALSE(Release(TIMING_POSTUNINST, info, PKG_UNINSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "release r, release p");
    Json::Value own = readJson(kOwn);
    EXPECT_TRUE(own["r"]["released"].asBool());
    EXPECT_FALSE(own["p"].isMember("released"));
    EXPECT_FALSE(own.isMember("q"));
    EXPECT_TRUE(own.isMember("gone"));
    EXPECT_TRUE(logged("Release p for demo when 0x0004 (fail)"));
}

TEST_F(PluginOrchestration, ReleaseOfASectionTheRequestNoLongerHasGetsNull) {
    install(R"({"q":{"tag":"q"}})");
    testutil::writeFile(kOwn, R"({"p":{"tag":"p-own"},"q":{}})");
    ASSERT_TRUE(Release(TIMING_POSTUNINST, info, PKG_UNINSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "release q, release p-own (no request)");
}

TEST_F(PluginOrchestration, UpdateRefusesAWorkerThatIsNotUpdatableBeforeReadingTheRequest) {
    install("this is no JSON");
    VLIBCErrSet(0);
    EXPECT_FALSE(Update(info, "u", parse(R"({"k":1})"), resp));
    EXPECT_EQ(VLIBCErrGet(), ERR_NOT_APPLICABLE);
    EXPECT_EQ(operations(), "");
    EXPECT_EQ(lifecycle(), "1 made, 1 freed, 1 destroyed");

    setenv("CORV_TEST_PLUGIN_UPDATABLE", "1", 1);
    VLIBCErrSet(0);
    EXPECT_FALSE(Update(info, "u", parse(R"({"k":1})"), resp)) << "now the request counts";
    EXPECT_EQ(VLIBCErrGet(), ERR_READ_FAILED);
}

TEST_F(PluginOrchestration, UpdateHandsTheArgumentsToTheWorkerAndRecordsOwn) {
    setenv("CORV_TEST_PLUGIN_UPDATABLE", "1", 1);
    install(R"({"u":{"tag":"u","gone":"{{nothing}}"}})");
    ASSERT_TRUE(Update(info, "u", parse(R"({"port":8080})"), resp));
    EXPECT_EQ(operations(), "update u");
    EXPECT_EQ(toString(readJson(kOwn)), R"({"u":{"updated":{"port":8080}}})");
    EXPECT_TRUE(logged("Update u for demo"));
}

TEST_F(PluginOrchestration, UpdateOutcomes) {
    setenv("CORV_TEST_PLUGIN_UPDATABLE", "1", 1);
    struct {
        const char* id;
        const char* request;  // null: no request file
        bool result;
        const char* operations;
        bool ownWritten;
    } const kCases[] = {
        {"u", R"({"other":{}})", true, "", false},
        {"u", nullptr, true, "", false},
        {"u", R"({"u":{"tag":"u","fail":["update"]}})", false, "update u", false},
        {"u", R"({"u":"a text"})", true, "", false},
        {"u", R"({"u":"{{gone}}"})", true, "update ?", true},
        {"nobody", R"({"nobody":{}})", false, "", false},
        {"", R"({})", false, "", false},
    };
    for (const auto& c : kCases) {
        testutil::removeAll("/var/packages/demo");
        testutil::removeAll(kCallLog);
        testutil::TestPackage pkg("demo");
        if (c.request) {
            pkg.conf["resource"] = c.request;
        }
        testutil::installFixture(pkg);
        const std::string what = std::string(c.id) + " with " + (c.request ? c.request : "none");
        EXPECT_EQ(Update(info, c.id, parse(R"({"x":1})"), resp), c.result) << what;
        EXPECT_EQ(operations(), c.operations) << what;
        EXPECT_EQ(testutil::exists(kOwn), c.ownWritten) << what;
    }
    EXPECT_TRUE(logged("Failed to find runnable worker for nobody"));
}

TEST_F(PluginOrchestration, BackupAndRestoreCarryTheOwnFileAcrossAnUpgrade) {
    install(R"({"a":{"tag":"a"},"p":{"tag":"p"}})");
    ASSERT_TRUE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    testutil::writeFile(kOwn, R"({"a":{"tag":"a","acquired":1},"p":{"tag":"p","acquired":1}})");

    // The old version goes.
    ASSERT_TRUE(Release(TIMING_POSTUNINST, info, PKG_UPGRADE, resp, nullptr, ""));
    ASSERT_TRUE(BackupResourceFile("demo"));
    const std::string backup = "/var/tmp/resource.demo." + std::to_string(getpid());
    EXPECT_TRUE(testutil::exists(backup));
    EXPECT_FALSE(testutil::exists(kOwn)) << "moved, not copied";
    const std::string saved = testutil::readFile(backup);

    // The new version arrives.
    testutil::TestPackage next("demo", "2.0-0001");
    next.conf["resource"] = R"({"a":{"tag":"a2"}})";
    testutil::writePackageDir("/tmp/pkginstall", next);
    ASSERT_TRUE(InitRequiredFields("demo", "/tmp/pkginstall"));
    ASSERT_TRUE(RestoreResourceFile("demo", "/tmp/pkginstall"));
    EXPECT_EQ(testutil::readFile(backup), saved) << "the backup stays";
    EXPECT_EQ(readJson("/tmp/pkginstall/conf/resource.own"), parse(saved));

    testutil::removeAll(kCallLog);
    ASSERT_TRUE(Acquire(TIMING_PREINST, info, PKG_UPGRADE, resp, nullptr, "/tmp/pkginstall"));
    EXPECT_EQ(operations(), "acquire a2");
    Json::Value own = readJson("/tmp/pkginstall/conf/resource.own");
    EXPECT_EQ(own["a"]["acquired"].asInt(), 2) << "the new worker saw the old record";
    EXPECT_EQ(own["a"]["seen"]["type"].asUInt(), 2u);
    EXPECT_TRUE(own["p"]["released"].asBool());
    EXPECT_EQ(toString(readJson("/tmp/pkginstall/conf/resource")["service-cfg"]), "{}");
}

TEST_F(PluginOrchestration, BackupAndRestoreWithoutOwnFileDoNothing) {
    install(R"({})");
    ASSERT_TRUE(BackupResourceFile("demo"));
    EXPECT_FALSE(testutil::exists("/var/tmp/resource.demo." + std::to_string(getpid())));
    testutil::writePackageDir("/tmp/pkginstall", testutil::TestPackage("demo"));
    ASSERT_TRUE(RestoreResourceFile("demo", "/tmp/pkginstall"));
    EXPECT_FALSE(testutil::exists("/tmp/pkginstall/conf/resource.own"));
}

TEST_F(PluginOrchestration, WorkersFileHelpersOnTheRegistry) {
    install(R"({"a":{"k":"v"}})");
    Json::Value out;
    ASSERT_TRUE(GetRequestObject("demo", "a", out));
    EXPECT_EQ(toString(out), R"({"k":"v"})");
    VLIBCErrSet(0);
    EXPECT_FALSE(GetRequestObject("demo", "b", out));
    EXPECT_EQ(VLIBCErrGet(), 0x2000);
    VLIBCErrSet(0);
    EXPECT_FALSE(GetOwnObject("demo", "a", out));
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);

    ASSERT_TRUE(ReplaceOwnObject("demo", "a", parse(R"({"made":["x"]})")));
    ASSERT_TRUE(ReplaceOwnObject("demo", "b", Json::Value(true)));
    ASSERT_TRUE(ReplaceOwnObject("demo", "a", parse(R"({"made":["y"]})")));
    EXPECT_EQ(toString(readJson(kOwn)), R"({"a":{"made":["y"]},"b":true})");
    ASSERT_TRUE(GetOwnObject("demo", "b", out));
    EXPECT_EQ(toString(out), "true");

    struct {
        const char* pkg;
        const char* id;
    } const kEmpty[] = {{"", "a"}, {"demo", ""}};
    for (const auto& e : kEmpty) {
        VLIBCErrSet(0);
        EXPECT_FALSE(GetRequestObject(e.pkg, e.id, out)) << e.pkg << "/" << e.id;
        EXPECT_FALSE(GetOwnObject(e.pkg, e.id, out)) << e.pkg << "/" << e.id;
        EXPECT_FALSE(ReplaceOwnObject(e.pkg, e.id, out)) << e.pkg << "/" << e.id;
        EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
    }
    testutil::writeFile(kOwn, "{broken");
    EXPECT_FALSE(ReplaceOwnObject("demo", "a", out));
    EXPECT_EQ(testutil::readFile(kOwn), "{broken");
}

TEST_F(PluginOrchestration, InitRequiredFieldsOnARegisteredPackage) {
    testutil::installFixture(testutil::TestPackage("demo"));
    ASSERT_TRUE(InitRequiredFields("demo", ""));
    EXPECT_EQ(toString(readJson(kRequest)), R"({"service-cfg":{}})");
}

TEST_F(PluginOrchestration, EnvironmentFromAPluginReachesTheNextScript) {
    install(R"({"p":{"tag":"p","env":{"CORVPKG_TEST_SHARE":"music"}}})");
    ASSERT_TRUE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    CORVUtils::ProcessRunner runner("/usr/bin/env");
    resp.DumpEnv(runner);
    ASSERT_EQ(runner.run(true, true), 0);
    std::istringstream lines(runner.getCapturedOutput());
    bool found = false;
    for (std::string line; std::getline(lines, line);) {
        found = found || line == "CORVPKG_TEST_SHARE=music";
    }
    EXPECT_TRUE(found) << runner.getCapturedOutput();
}

TEST_F(PluginOrchestration, AWorkerThatCantBeMadeOrLoadedCostsOnlyItself) {
    provide({entry("p", "0x0022"), entry("q", "0x0022", "/nonexistent/plugin.so"),
             entry("r", "0x0022")});
    install(R"({"p":{"tag":"p"},"q":{"tag":"q"},"r":{"tag":"r"}})");
    ASSERT_TRUE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "acquire p, acquire r");

    setenv("CORV_TEST_PLUGIN_INIT_NULL", "1", 1);
    testutil::removeAll(kCallLog);
    EXPECT_TRUE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "");
    EXPECT_TRUE(logged("Failed to create worker for p, ignore it [0x"));
    EXPECT_TRUE(logged("Failed to create worker for r, ignore it [0x"));
}

TEST_F(PluginOrchestration, AMalformedProviderListFailsThePhase) {
    install(R"({"p":{"tag":"p"}})");
    testutil::writeFile(std::string(kProviderDir) + "/global", R"({"providers":"workers"})");
    VLIBCErrSet(0);
    EXPECT_FALSE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_EQ(VLIBCErrGet(), ERR_MALFORMED);
    EXPECT_TRUE(logged("Failed to find runnable workers [0x4000"));
    EXPECT_EQ(operations(), "");
    EXPECT_FALSE(testutil::exists(kOwn));
}

TEST_F(PluginOrchestration, NoProvidersAtAllIsNoWorkerAtAll) {
    testutil::removeAll(kProviderDir);
    install(R"({"p":{"tag":"p"}})");
    EXPECT_TRUE(Acquire(TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_EQ(operations(), "");
    EXPECT_EQ(toString(readJson(kOwn)), "{}");
}
