// Upgrade through the library, in the sandbox: data kept, dependents driven, refusals.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

int upgradeTo(PackageManager& pm, const TestPackage& pkg, bool ignoreDependents = false) {
    const std::string file = testutil::buildPackage(pkg);
    return pm.install(nullptr, file, "/volume1", true, nullptr, "enu", ignoreDependents, false);
}

}  // namespace

TEST(Upgrade, CarriesDataAndRunsEveryScriptOnce) {
    // A worker that counts its acquisitions in the own-file shows the record carried over.
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        std::string(R"({"workers":[{"id":"res","interval":"0x0033","major":1,)") +
                            R"("minor":0,"path":")" + CORVPKG_TEST_PLUGIN_PATH + "\"}]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
    TestPackage v1 = testutil::recordingPackage("demo", "1.0-0001");
    v1.conf["resource"] = R"({"service-cfg":{},"res":{"tag":"r"}})";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, v1), 1);
    Json::Value own;
    ASSERT_TRUE(Resource::GetOwnObject("demo", "res", own));
    const int acquiredBefore = own["acquired"].asInt();
    testutil::writeFile("/usr/corv/etc/packages/demo/data", "user data");
    testutil::clearRecords("demo");

    TestPackage v2 = testutil::recordingPackage("demo", "2.0-0001");
    v2.conf["resource"] = v1.conf["resource"];
    ASSERT_EQ(upgradeTo(pm, v2), 1) << pm.getResult();
    EXPECT_EQ(testutil::scriptsRan("demo"),
              (std::vector<std::string>{"preupgrade", "preuninst", "postuninst", "preinst",
                                        "postinst", "postupgrade"}));
    EXPECT_EQ(testutil::scriptField("demo", "preupgrade", "ver"), "1.0-0001");
    EXPECT_EQ(testutil::scriptField("demo", "postupgrade", "ver"), "2.0-0001");
    EXPECT_EQ(testutil::scriptField("demo", "postupgrade", "old"), "1.0-0001");
    const std::string tmp = testutil::scriptField("demo", "preupgrade", "tmp");
    EXPECT_FALSE(tmp.empty());
    EXPECT_EQ(testutil::scriptField("demo", "postupgrade", "tmp"), tmp);
    EXPECT_FALSE(testutil::exists(tmp));
    EXPECT_EQ(testutil::readFile("/usr/corv/etc/packages/demo/data"), "user data");
    ASSERT_TRUE(Resource::GetOwnObject("demo", "res", own));
    EXPECT_GT(own["acquired"].asInt(), acquiredBefore);
    EXPECT_EQ(own["seen"]["type"].asInt(), 2);
    PackageInfo info;
    ASSERT_TRUE(pm.getPackageInfo("demo", info, nullptr, PKG_INFO_MASK_ALL));
    EXPECT_EQ(info.version, "2.0-0001");
    EXPECT_EQ(testutil::readFile("/volume1/@appstore/demo/bin/app"),
              "#!/bin/sh\necho app 2.0-0001\n");
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
    EXPECT_FALSE(testutil::exists("/var/packages/demo/installing"));
}

TEST(Upgrade, SameVersionIsAReinstallAndOlderIsRefused) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo", "2.0-0001")), 1);
    testutil::clearRecords("demo");
    EXPECT_EQ(upgradeTo(pm, testutil::recordingPackage("demo", "2.0-0001")), 1);
    EXPECT_EQ(testutil::scriptsRan("demo").front(), "preupgrade");

    testutil::clearRecords("demo");
    PackageManager older;
    EXPECT_EQ(upgradeTo(older, testutil::recordingPackage("demo", "1.0-0001")), 0);
    EXPECT_EQ(older.getResult(), PKG_ERR_DOWNGRADE);
    EXPECT_EQ(older.getMapParam("oldver"), "1.0-0001");
    EXPECT_EQ(older.getMapParam("curver"), "2.0-0001");
    EXPECT_TRUE(testutil::scriptsRan("demo").empty());
    EXPECT_EQ(older.getPkgStatus("demo"), 0);
}

TEST(Upgrade, RefusingPreupgradeLeavesTheOldVersionRunning) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo", "1.0-0001")), 1);
    TestPackage v2 = testutil::recordingPackage("demo", "2.0-0001");
    v2.scripts["preupgrade"] = "exit 1\n";
    testutil::clearRecords("demo");
    EXPECT_EQ(upgradeTo(pm, v2), 0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_SYSTEM);
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"demo stop", "demo start"}));
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
    PackageInfo info;
    ASSERT_TRUE(pm.getPackageInfo("demo", info, nullptr, PKG_INFO_MASK_ALL));
    EXPECT_EQ(info.version, "1.0-0001");
}

TEST(Upgrade, RunningDependentsRefuseOrAreStoppedAndStartedAgain) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("base", "1.0-0001")), 1);
    TestPackage app = testutil::recordingPackage("app");
    app.info["install_dep_packages"] = "base";
    ASSERT_EQ(testutil::installBuilt(pm, app), 1);

    PackageManager refused;
    EXPECT_EQ(upgradeTo(refused, testutil::recordingPackage("base", "2.0-0001")), 0);
    EXPECT_EQ(refused.getResult(), PKG_ERR_UPGRADE_BREAKS_DEPENDENT);
    EXPECT_EQ(refused.getMapParam("deppkg"), "Display app");

    testutil::clearRecords("base");
    PackageManager forced;
    EXPECT_EQ(upgradeTo(forced, testutil::recordingPackage("base", "2.0-0001"), true), 1);
    EXPECT_EQ(testutil::startStopActions(),
              (std::vector<std::string>{"app stop", "base stop", "base start", "app start"}));
    EXPECT_EQ(forced.getPkgStatus("app"), 0);
    EXPECT_EQ(forced.getPkgStatus("base"), 0);
    // The dependent was paused, not disabled: its intent stays.
    EXPECT_TRUE(testutil::exists("/var/packages/app/enabled"));
}

TEST(Upgrade, BrokenPackageIsRepaired) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo", "1.0-0001")), 1);
    testutil::writeFile("/var/packages/demo/installing", "");
    ASSERT_EQ(pm.getPkgStatus("demo"), 150);
    testutil::clearRecords("demo");
    PackageManager repair;
    EXPECT_EQ(upgradeTo(repair, testutil::recordingPackage("demo", "1.0-0001")), 1)
        << repair.getResult();
    EXPECT_EQ(repair.getPkgStatus("demo"), 0);
    EXPECT_FALSE(testutil::exists("/var/packages/demo/installing"));
}
