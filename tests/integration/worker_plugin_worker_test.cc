// "worker-plugin": a package that brings a worker of its own (the project's scripted test
// plug-in) registers it as a provider, and other packages' requests for its id reach it.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <string>

#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

const char kLog[] = "/tmp/plugin.log";
const char kDir[] = "/usr/local/share/corvpkg/";

std::string manifestEntry(const std::string& id, const std::string& acquire,
                          const std::string& release, const std::string& relpath, int minor = 0) {
    return R"({"id":")" + id + R"(","acquire":")" + acquire + R"(","release":")" + release +
           R"(","relpath":")" + relpath + R"(","api-version":{"major":1,"minor":)" +
           std::to_string(minor) + "}}";
}

testutil::TestPackage provider(const std::string& name, const std::string& plugins) {
    testutil::TestPackage pkg = testutil::recordingPackage(name);
    pkg.conf["resource"] = R"({"service-cfg":{},"worker-plugin":{"plugins":[)" + plugins + "]}}";
    pkg.payload["lib/worker.so"] = testutil::readFile(CORVPKG_TEST_PLUGIN_PATH);
    return pkg;
}

Json::Value jsonOf(const std::string& path) {
    Json::Value value;
    fromFile(path, value);
    return value;
}

}  // namespace

TEST(WorkerPluginWorker, ABroughtWorkerServesOtherPackagesUntilItsProviderGoes) {
    setenv("CORV_TEST_PLUGIN_LOG", kLog, 1);
    PackageManager pm;
    // Of the manifest only the well-formed element of interface 1.0 counts.
    ASSERT_EQ(
        testutil::installBuilt(
            pm,
            provider("bringer",
                     manifestEntry("scripted", "postinst", "preuninst", "lib/worker.so") + "," +
                         manifestEntry("bad-phase", "install", "preuninst", "lib/worker.so") + "," +
                         manifestEntry("outside", "postinst", "preuninst", "../../../../bin/sh") +
                         ",7")),
        1);
    Json::Value own = jsonOf(std::string(kDir) + "bringer");
    ASSERT_EQ(own["workers"].size(), 1u) << toString(own);
    EXPECT_EQ(own["workers"][0]["id"].asString(), "scripted");
    EXPECT_EQ(own["workers"][0]["interval"].asString(), "0x0012");
    EXPECT_EQ(own["workers"][0]["path"].asString(), "/var/packages/bringer/target/lib/worker.so");
    EXPECT_EQ(toString(jsonOf(std::string(kDir) + "global")["providers"]), R"(["bringer"])");

    testutil::TestPackage user = testutil::recordingPackage("user");
    user.conf["resource"] = R"({"service-cfg":{},"scripted":{"tag":"from-user"}})";
    ASSERT_EQ(testutil::installBuilt(pm, user), 1);
    EXPECT_NE(testutil::readFile(kLog).find("acquire from-user"), std::string::npos)
        << testutil::readFile(kLog);
    ASSERT_EQ(pm.uninstall("user", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    EXPECT_NE(testutil::readFile(kLog).find("release from-user"), std::string::npos);

    ASSERT_EQ(pm.uninstall("bringer", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    EXPECT_EQ(toString(jsonOf(std::string(kDir) + "global")["providers"]), "[]");
    EXPECT_TRUE(testutil::exists(std::string(kDir) + "bringer"));
    EXPECT_FALSE(jsonOf(std::string(kDir) + "bringer").isMember("workers"));
}

TEST(WorkerPluginWorker, AllBadManifestsWriteNoFileAndABuiltinIdIsNeverTakenOver) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(
                  pm, provider("badonly",
                               manifestEntry("", "postinst", "preuninst", "lib/worker.so") + "," +
                                   manifestEntry("x", "postinst", "halt-ish", "lib/worker.so"))),
              1);
    EXPECT_FALSE(testutil::exists(std::string(kDir) + "global"));
    EXPECT_FALSE(testutil::exists(std::string(kDir) + "badonly"));

    // A plug-in for "port-config" is registered, but the built-in keeps its id.
    setenv("CORV_TEST_PLUGIN_LOG", kLog, 1);
    ASSERT_EQ(testutil::installBuilt(
                  pm, provider("usurper", manifestEntry("port-config", "postinst", "postuninst",
                                                        "lib/worker.so"))),
              1);
    testutil::TestPackage user = testutil::recordingPackage("user");
    user.conf["resource"] =
        R"({"service-cfg":{},"port-config":{"protocol-file":"conf/p.sc","tag":"t"}})";
    user.payload["conf/p.sc"] = "[u]\ndst.ports=\"18700/tcp\"\n";
    ASSERT_EQ(testutil::installBuilt(pm, user), 1);
    EXPECT_EQ(testutil::readFile(kLog).find("acquire t"), std::string::npos);
    EXPECT_TRUE(testutil::exists("/usr/local/etc/services.d/user.sc"));
}
