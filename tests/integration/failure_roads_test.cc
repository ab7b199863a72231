// The rarer ways out of the install dispatcher and the upgrade: no room, no store, failed
// resources, the repair's fallback, a payload that only copies, and the first boot after an
// OS upgrade. In the sandbox.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

int installFile(PackageManager& pm, const std::string& file, const std::string& volume) {
    return pm.install(nullptr, file, volume, true, nullptr, "enu", false, false);
}

int upgradeTo(PackageManager& pm, const TestPackage& pkg) {
    return installFile(pm, testutil::buildPackage(pkg), "/volume1");
}

// The scripted plug-in twice: as worker "early" of the phase before preinst, and as "late"
// of the phase after registration.
void registerScriptedWorkers() {
    const std::string plugin =
        std::string(R"("major":1,"minor":0,"path":")") + CORVPKG_TEST_PLUGIN_PATH + "\"}";
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        R"({"workers":[{"id":"early","interval":"0x0001",)" + plugin +
                            R"(,{"id":"late","interval":"0x0002",)" + plugin + "]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
}

}  // namespace

TEST(FailureRoads, NoRoomOrNoStoreOnTheVolumeChangesNothing) {
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", 0, "size=16m"), 0);
    struct Case {
        const char* what;
        const char* extractsize;  // KiB, as INFO says it
        bool storeIsAFile;
        PKG_ERRCODE code;
    } cases[] = {
        {"payload larger than the volume", "40960", false, PKG_ERR_NO_SPACE},
        {"store root that cannot be made", "1", true, PKG_ERR_VOLUME_CHECK},
    };
    for (const Case& c : cases) {
        testutil::removeAll("/volume2/@appstore");
        if (c.storeIsAFile) {
            testutil::writeFile("/volume2/@appstore", "");
        }
        TestPackage pkg = testutil::recordingPackage("demo");
        pkg.info["extractsize"] = c.extractsize;
        PackageManager pm;
        EXPECT_EQ(installFile(pm, testutil::buildPackage(pkg), "/volume2"), 0) << c.what;
        EXPECT_EQ(pm.getResult(), c.code) << c.what;
        const Json::Value space = pm.getJsonParam("no_space");
        if (c.code == PKG_ERR_NO_SPACE) {
            EXPECT_EQ(space["volume"].asString(), "/volume2") << c.what;
            EXPECT_EQ(space["needed"].asUInt64(), (40960ull << 10) + (10ull << 20)) << c.what;
            EXPECT_LE(space["free"].asUInt64(), 16ull << 20) << c.what;
        } else {
            EXPECT_FALSE(space.isObject()) << c.what;
        }
        EXPECT_TRUE(testutil::scriptsRan("demo").empty()) << c.what;
        EXPECT_FALSE(testutil::exists("/var/packages/demo")) << c.what;
        EXPECT_FALSE(testutil::exists("/volume2/@tmp/pkginstall")) << c.what;
    }
    umount("/volume2");
}

TEST(FailureRoads, FailedResourcesFailTheUpgradeAtTheirPhase) {
    registerScriptedWorkers();
    struct Case {
        const char* name;
        const char* failingWorker;
        std::vector<std::string> scripts;
        bool installingStays;
    } cases[] = {
        {"before", "early", {"preupgrade", "preuninst", "postuninst"}, false},
        {"after",
         "late",
         {"preupgrade", "preuninst", "postuninst", "preinst", "postinst", "postupgrade"},
         true},
    };
    for (const Case& c : cases) {
        PackageManager pm;
        ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage(c.name, "1.0-0001")), 1);
        testutil::clearRecords(c.name);
        TestPackage v2 = testutil::recordingPackage(c.name, "2.0-0001");
        v2.conf["resource"] = std::string(R"({"service-cfg":{},")") + c.failingWorker +
                              R"(":{"tag":"t","fail":["acquire"]}})";
        PackageManager upgrade;
        EXPECT_EQ(upgradeTo(upgrade, v2), 0) << c.name;
        EXPECT_EQ(upgrade.getResult(), PKG_ERR_UPGRADE_FAILED) << c.name;
        EXPECT_EQ(testutil::scriptsRan(c.name), c.scripts) << c.name;
        const std::string registry = std::string("/var/packages/") + c.name;
        EXPECT_EQ(testutil::exists(registry + "/installing"), c.installingStays) << c.name;
        // Either way the next install of a good file brings the package back.
        PackageManager again;
        EXPECT_EQ(upgradeTo(again, testutil::recordingPackage(c.name, "2.0-0001")), 1)
            << c.name << " " << again.getResult();
        EXPECT_EQ(again.getPkgStatus(c.name), 0) << c.name;
    }
}

TEST(FailureRoads, RepairThatCannotUpgradeUninstallsAndInstallsAfresh) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo", "1.0-0001")), 1);
    testutil::writeFile("/var/packages/demo/installing", "");
    testutil::clearRecords("demo");
    // The repair's upgrade is refused by the new file's preupgrade: the package stays broken,
    // so the dispatcher removes it and installs the file as new.
    TestPackage fixed = testutil::recordingPackage("demo", "1.0-0001");
    fixed.scripts["preupgrade"] = "exit 1\n";
    PackageManager repair;
    EXPECT_EQ(upgradeTo(repair, fixed), 1) << repair.getResult();
    EXPECT_EQ(testutil::scriptsRan("demo"),
              (std::vector<std::string>{"preuninst", "postuninst", "preinst", "postinst"}));
    EXPECT_EQ(repair.getPkgStatus("demo"), 0);
    EXPECT_FALSE(testutil::exists("/var/packages/demo/installing"));

    // An older file repairs nothing: the downgrade is refused, and there is no fallback.
    testutil::writeFile("/var/packages/demo/installing", "");
    testutil::clearRecords("demo");
    PackageManager older;
    EXPECT_EQ(upgradeTo(older, testutil::recordingPackage("demo", "0.9-0001")), 0);
    EXPECT_EQ(older.getResult(), PKG_ERR_DOWNGRADE);
    EXPECT_TRUE(testutil::scriptsRan("demo").empty());
    EXPECT_TRUE(testutil::exists("/volume1/@appstore/demo/bin/app"));
}

TEST(FailureRoads, PayloadThatDoesNotMoveIsCopiedOnTheThirtiethTry) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("demo", "1.0-0001")), 1);
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo", "2.0-0001"));
    // The payload's mv fails, and its cp works from the 30th call on. The sandbox's root is
    // a copy: the real tools stay beside the stand-ins for everything else.
    ASSERT_EQ(rename("/usr/bin/mv", "/usr/bin/mv.real"), 0);
    ASSERT_EQ(rename("/usr/bin/cp", "/usr/bin/cp.real"), 0);
    testutil::writeFile("/usr/bin/mv", R"(#!/bin/sh
case "$*" in */pkginstall/package/*) exit 1;; esac
exec /usr/bin/mv.real "$@"
)");
    testutil::writeFile("/usr/bin/cp", R"(#!/bin/sh
if [ "$1" = -arf ]; then
  echo >> /tmp/cp.calls
  [ $(wc -l < /tmp/cp.calls) -ge 30 ] || exit 1
fi
exec /usr/bin/cp.real "$@"
)");
    chmod("/usr/bin/mv", 0755);
    chmod("/usr/bin/cp", 0755);
    PackageManager upgrade;
    // The tries are a second apart; here they follow each other at once.
    setenv("CORVPKG_FAULT_SECONDS", "copy-pause=0", 1);
    EXPECT_EQ(installFile(upgrade, file, "/volume1"), 1) << upgrade.getResult();
    unsetenv("CORVPKG_FAULT_SECONDS");
    EXPECT_EQ(testutil::readFile("/tmp/cp.calls"), std::string(30, '\n'));
    EXPECT_EQ(testutil::readFile("/volume1/@appstore/demo/bin/app"),
              "#!/bin/sh\necho app 2.0-0001\n");
    EXPECT_EQ(upgrade.getPkgStatus("demo"), 0);
}

TEST(FailureRoads, FirstBootAfterAnOsUpgradeLeavesTheDependentsAlone) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, testutil::recordingPackage("base", "1.0-0001")), 1);
    TestPackage app = testutil::recordingPackage("app");
    app.info["install_dep_packages"] = "base";
    ASSERT_EQ(testutil::installBuilt(pm, app), 1);
    testutil::writeFile("/var/.UpgradeBootup", "");
    testutil::clearRecords("base");
    testutil::removeAll(testutil::kStartStopLog);
    // Without the marker the running dependent refuses this upgrade (it is not ignored).
    PackageManager boot;
    EXPECT_EQ(upgradeTo(boot, testutil::recordingPackage("base", "2.0-0001")), 1)
        << boot.getResult();
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"base stop", "base start"}));
    EXPECT_EQ(boot.getPkgStatus("app"), 0);
    EXPECT_EQ(boot.getPkgStatus("base"), 0);
}
