// Uninstallation through the library, in the sandbox.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

const PKG_INSTALLATION_TYPE kUninstall = static_cast<PKG_INSTALLATION_TYPE>(4);
const PKG_INSTALLATION_TYPE kUpgrade = static_cast<PKG_INSTALLATION_TYPE>(2);

}  // namespace

TEST(Uninstall, RemovesPayloadAndRegistryButKeepsTheSettings) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo")), 1);
    testutil::writeFile("/usr/corv/etc/packages/demo/settings", "kept");
    testutil::clearRecords("demo");
    EXPECT_EQ(pm.uninstall("demo", nullptr, "enu", kUninstall, false, nullptr), 1);
    EXPECT_FALSE(testutil::exists("/var/packages/demo"));
    EXPECT_FALSE(testutil::exists("/volume1/@appstore/demo"));
    EXPECT_FALSE(testutil::exists("/etc/init/pkgctl-demo.conf"));
    EXPECT_EQ(testutil::readFile("/usr/corv/etc/packages/demo/settings"), "kept");
    EXPECT_EQ(testutil::scriptsRan("demo"), (std::vector<std::string>{"preuninst", "postuninst"}));
    EXPECT_EQ(testutil::startStopActions(), std::vector<std::string>{"demo stop"});
    EXPECT_EQ(pm.getPkgStatus("demo"), 255);
    EXPECT_NE(testutil::readFile("/var/log/corvevents.log").find("demo"), std::string::npos);
}

TEST(Uninstall, DependentsRefuseUnlessForced) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("base")), 1);
    TestPackage app = testutil::recordingPackage("app");
    app.info["install_dep_packages"] = "base";
    ASSERT_EQ(testutil::installBuilt(pm, app), 1);
    EXPECT_EQ(pm.uninstall("base", nullptr, "enu", kUninstall, false, nullptr), 0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_DEPENDENCY);
    EXPECT_EQ(pm.getMapParam("deppkg"), "Display app");
    EXPECT_EQ(pm.getPkgStatus("base"), 0);
    PackageManager forced;
    EXPECT_EQ(forced.uninstall("base", nullptr, "enu", kUninstall, true, nullptr), 1);
    EXPECT_FALSE(testutil::exists("/var/packages/base"));
}

TEST(Uninstall, RefusingPreuninstBringsThePackageBack) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo")), 1);
    testutil::writeFile("/tmp/demo.fail-preuninst", "");
    testutil::clearRecords("demo");
    EXPECT_EQ(pm.uninstall("demo", nullptr, "enu", kUninstall, false, nullptr), 0);
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"demo stop", "demo start"}));
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
    EXPECT_TRUE(testutil::exists("/var/packages/demo/enabled"));
    EXPECT_TRUE(testutil::exists("/volume1/@appstore/demo/bin/app"));

    // Stopped, the refusal does not start it.
    ASSERT_EQ(pm.serviceControl("demo", false, nullptr), 1);
    testutil::clearRecords("demo");
    EXPECT_EQ(pm.uninstall("demo", nullptr, "enu", kUninstall, false, nullptr), 0);
    EXPECT_TRUE(testutil::startStopActions().empty());
    EXPECT_EQ(pm.getPkgStatus("demo"), 3);
}

TEST(Uninstall, WrongArchitectureGoesDespiteItsPreuninst) {
    TestPackage pkg = testutil::recordingPackage("demo");
    pkg.info["arch"] = "armv5";
    testutil::installFixture(pkg, false);
    testutil::writeFile("/tmp/demo.fail-preuninst", "");
    PackageManager pm;
    EXPECT_EQ(pm.uninstall("demo", nullptr, "enu", kUninstall, false, nullptr), 1);
    EXPECT_FALSE(testutil::exists("/var/packages/demo"));
    EXPECT_EQ(testutil::scriptsRan("demo"), (std::vector<std::string>{"preuninst", "postuninst"}));
}

TEST(Uninstall, ForwardRoadDespiteMissingTargetAndFailingPostuninst) {
    TestPackage pkg = testutil::recordingPackage("demo");
    testutil::installFixture(pkg, false);
    unlink("/var/packages/demo/target");
    testutil::writeFile("/tmp/demo.fail-postuninst", "");
    PackageManager pm;
    EXPECT_EQ(pm.uninstall("demo", nullptr, "enu", kUninstall, false, nullptr), 1);
    EXPECT_FALSE(testutil::exists("/var/packages/demo"));
}

TEST(Uninstall, UpgradeTypeKeepsAnEmptyRegistry) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo")), 1);
    ASSERT_EQ(pm.serviceControl("demo", false, nullptr), 1);
    PackageInfo info;
    ASSERT_TRUE(pm.getPackageInfo("demo", info, nullptr, PKG_INFO_MASK_ALL));
    EXPECT_EQ(pm.uninstall(info, nullptr, "enu", kUpgrade, nullptr), 1);
    PackageManager::UnLock();
    EXPECT_TRUE(testutil::exists("/var/packages/demo"));
    EXPECT_TRUE(testutil::exists("/var/packages/demo/."));
    EXPECT_FALSE(testutil::exists("/var/packages/demo/INFO"));
    EXPECT_FALSE(testutil::exists("/var/packages/demo/enabled"));
    EXPECT_FALSE(testutil::exists("/volume1/@appstore/demo"));
}

TEST(Uninstall, SeveralGoDependentsFirst) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("base")), 1);
    TestPackage app = testutil::recordingPackage("app");
    app.info["install_dep_packages"] = "base";
    ASSERT_EQ(testutil::installBuilt(pm, app), 1);
    EXPECT_EQ(pm.uninstallPKGs({"base", "app"}, false), 1);
    EXPECT_FALSE(testutil::exists("/var/packages/base"));
    EXPECT_FALSE(testutil::exists("/var/packages/app"));
}
