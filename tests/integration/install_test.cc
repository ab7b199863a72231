// Fresh installation through the library, in the sandbox: the whole road with real package
// files, and what each failure leaves behind.
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <random>
#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgbuild.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

using testutil::modeOf;
using testutil::ownerOf;

namespace {

const std::vector<std::string> kInstallScripts = {"preinst", "postinst"};

// The scripted plug-in twice: as worker "early" of the phase before preinst, and as
// "late" of the phase after registration.
void registerInstallWorkers() {
    const std::string plugin =
        std::string(R"("major":1,"minor":0,"path":")") + CORVPKG_TEST_PLUGIN_PATH + "\"}";
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        R"({"workers":[{"id":"early","interval":"0x0001",)" + plugin +
                            R"(,{"id":"late","interval":"0x0002",)" + plugin + "]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
}

// install_package as the dispatcher calls it, with the store and temporary roots of
// `volume` made first (the dispatcher makes them), and the manager lock released after.
int installAt(PackageManager& pm, const std::string& file, const std::string& volume = "/volume1") {
    const std::string store = volume + "/@appstore";
    const std::string tmp = volume + "/@tmp";
    EXPECT_EQ(VLIBCExecl("/bin/mkdir", 0xbb, "-p", store.c_str(), tmp.c_str(), nullptr), 0);
    int outcome = pm.install_package(file, volume, store, tmp, true, nullptr, "enu", nullptr);
    PackageManager::UnLock();
    return outcome;
}

}  // namespace

TEST(Install, WholeRoadLeavesARunningRegisteredPackage) {
    TestPackage pkg = testutil::recordingPackage("demo");
    pkg.conf["privilege"] = R"({"defaults":{"run-as":"package"},)"
                            R"("tool":[{"relpath":"bin/tool","user":"root","group":"package",)"
                            R"("permission":"4750"}]})";
    pkg.payload["bin/tool"] = "#!/bin/sh\n";
    pkg.wizard["install_uifile"] = R"([{"items":[{"key":"answer","defaultValue":"42"}]}])";
    const std::string file = testutil::buildPackage(pkg);
    // A set-user-id control script must not survive: the builder keeps modes.
    PackageManager pm;
    Json::Value answers(Json::objectValue);
    answers["answer"] = "yes";
    ASSERT_EQ(pm.install(nullptr, file, "/volume1", true, &answers, "enu", false, false), 1)
        << pm.getResult();

    const std::string registry = "/var/packages/demo";
    EXPECT_EQ(PMSReadLink(registry + "/target"), "/volume1/@appstore/demo");
    EXPECT_EQ(PMSReadLink(registry + "/etc"), "/usr/corv/etc/packages/demo");
    EXPECT_TRUE(testutil::exists("/volume1/@appstore/demo/bin/app"));
    EXPECT_FALSE(testutil::exists(registry + "/installing"));
    EXPECT_TRUE(testutil::exists(registry + "/enabled"));
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
    EXPECT_EQ(testutil::scriptsRan("demo"), kInstallScripts);
    // Scripts run as the package's own user, which the install made, with the answers.
    EXPECT_EQ(testutil::scriptField("demo", "preinst", "user"), "demo");
    EXPECT_EQ(testutil::scriptField("demo", "postinst", "answer"), "yes");
    EXPECT_EQ(testutil::scriptField("demo", "postinst", "ver"), "1.0-0001");
    struct passwd* user = getpwnam("demo");
    ASSERT_NE(user, nullptr);
    EXPECT_STREQ(user->pw_dir, "/var/packages/demo/target");
    // The payload belongs to the package; the tool override is applied.
    EXPECT_EQ(ownerOf("/volume1/@appstore/demo/bin/app"),
              std::to_string(user->pw_uid) + ":" + std::to_string(user->pw_gid));
    EXPECT_EQ(modeOf("/volume1/@appstore/demo/bin/tool"), 04750u);
    EXPECT_EQ(ownerOf("/volume1/@appstore/demo/bin/tool"), "0:" + std::to_string(user->pw_gid));
    // The work area is gone, and the operations log has the outcome.
    EXPECT_NE(testutil::readFile("/var/log/corvpkg.log").find("install demo 1.0-0001 successfully"),
              std::string::npos);
}

TEST(Install, SetUserIdScriptsAreCleared) {
    TestPackage pkg = testutil::recordingPackage("demo");
    testutil::removeAll("/tmp/kit-src/demo");
    testutil::writePackageDir("/tmp/kit-src/demo", pkg);
    ASSERT_EQ(chmod("/tmp/kit-src/demo/scripts/postinst", 06755), 0);
    std::string error;
    ASSERT_TRUE(PMSBuildPackageFile("/tmp/kit-src/demo", "/tmp/demo.cpk", "", error)) << error;
    PackageManager pm;
    ASSERT_EQ(pm.install(nullptr, "/tmp/demo.cpk", "/volume1", false, nullptr, "enu", false, false),
              1);
    EXPECT_EQ(modeOf("/var/packages/demo/scripts/postinst"), 0755u);
}

TEST(Install, StartableNoStartsEvenWithoutTheStart) {
    TestPackage pkg = testutil::recordingPackage("demo");
    pkg.info["startable"] = "no";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg, false), 1);
    EXPECT_TRUE(testutil::exists("/var/packages/demo/enabled"));
    TestPackage quiet = testutil::recordingPackage("quiet");
    ASSERT_EQ(testutil::installBuilt(pm, quiet, false), 1);
    EXPECT_FALSE(testutil::exists("/var/packages/quiet/enabled"));
    EXPECT_EQ(pm.getPkgStatus("quiet"), 3);
}

// What each failure of the road leaves: the result, the registry, the payload.
TEST(Install, FailuresLeaveWhatTheirStepLeaves) {
    struct Case {
        const char* what;
        void (*prepare)(TestPackage&);
        PKG_ERRCODE result;
        bool registry;  // /var/packages/demo exists
        bool payload;   // the target has the payload
        std::vector<std::string> scripts;
    };
    const Case cases[] = {
        {"preinst fails",
         [](TestPackage&) { testutil::writeFile("/tmp/demo.fail-preinst", ""); },
         PKG_ERR_SYSTEM,
         false,
         false,
         {"preinst"}},
        {"postinst fails",
         [](TestPackage&) { testutil::writeFile("/tmp/demo.fail-postinst", ""); },
         PKG_ERR_SYSTEM,
         true,
         true,
         {"preinst", "postinst"}},
        {"reserved user",
         [](TestPackage& p) { p.conf["privilege"] = R"({"username":"root"})"; },
         PKG_ERR_NOT_INSTALLED,
         false,
         false,
         {}},
        {"tool outside the package",
         [](TestPackage& p) {
             p.conf["privilege"] = R"({"tool":[{"relpath":"../../etc/passwd","user":"root",)"
                                   R"("group":"root","permission":"0644"}]})";
         },
         PKG_ERR_NOT_INSTALLED,
         false,
         false,
         {}},
        {"resource refused before preinst",
         [](TestPackage& p) {
             registerInstallWorkers();
             p.conf["resource"] = R"({"service-cfg":{},"early":{"tag":"e","fail":["acquire"]}})";
         },
         PKG_ERR_INSTALL_FAILED,
         false,
         false,
         {}},
        {"wrong architecture",
         [](TestPackage& p) { p.info["arch"] = "armv5"; },
         PKG_ERR_ARCH_MISMATCH,
         false,
         false,
         {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        TestPackage pkg = testutil::recordingPackage("demo");
        testutil::clearRecords("demo");
        c.prepare(pkg);
        const std::string file = testutil::buildPackage(pkg);
        PackageManager pm;
        EXPECT_EQ(installAt(pm, file), 0);
        EXPECT_EQ(pm.getResult(), c.result);
        EXPECT_EQ(testutil::exists("/var/packages/demo"), c.registry);
        EXPECT_EQ(testutil::exists("/volume1/@appstore/demo/bin/app"), c.payload);
        EXPECT_EQ(testutil::scriptsRan("demo"), c.scripts);
        EXPECT_FALSE(testutil::exists("/volume1/@tmp/pkginstall"));
        // From registration on the package is broken, for the next install to repair.
        EXPECT_EQ(PackageManager().getPkgStatus("demo"), c.registry ? 150 : 255);
        testutil::removeAll("/var/packages/demo");
        testutil::removeAll("/volume1/@appstore/demo");
        unlink("/tmp/demo.fail-preinst");
        unlink("/tmp/demo.fail-postinst");
        testutil::removeAll(Resource::kProviderDir);
    }
}

TEST(Install, FailedResourceAfterRegistrationStillRunsPostinst) {
    registerInstallWorkers();
    TestPackage pkg = testutil::recordingPackage("demo");
    pkg.conf["resource"] =
        R"({"service-cfg":{},"late":{"tag":"l","fail":["acquire"],"message":"pkgmgr:nope"}})";
    const std::string file = testutil::buildPackage(pkg);
    PackageManager pm;
    EXPECT_EQ(installAt(pm, file), 0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_INSTALL_FAILED);
    EXPECT_EQ(testutil::scriptsRan("demo"), kInstallScripts);
    EXPECT_TRUE(testutil::exists("/var/packages/demo/installing"));
    const Json::Value msg = pm.getJsonParam("worker_msg");
    ASSERT_TRUE(msg.isArray() && msg.size() == 1u) << toString(msg);
    EXPECT_EQ(msg[0]["sec"].asString() + ":" + msg[0]["key"].asString(), "pkgmgr:nope");
    EXPECT_EQ(pm.getPkgStatus("demo"), 150);
}

TEST(Install, AlreadyInstalledTouchesNothing) {
    TestPackage pkg = testutil::recordingPackage("demo");
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);
    testutil::clearRecords("demo");
    const std::string file = testutil::buildPackage(pkg);
    EXPECT_EQ(installAt(pm, file), 0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_ALREADY_INSTALLED);
    EXPECT_TRUE(testutil::scriptsRan("demo").empty());
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
    EXPECT_FALSE(testutil::exists("/volume1/@tmp/pkginstall"));
}

TEST(Install, VanishedInfoIsExtractedAgain) {
    TestPackage pkg = testutil::recordingPackage("demo");
    pkg.scripts["preinst"] = "rm -f \"$CORVPKG_PKGINST_TEMP_DIR/../INFO\"\n";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1) << pm.getResult();
    PackageInfo info;
    ASSERT_TRUE(pm.getPackageInfo("demo", info, nullptr, PKG_INFO_MASK_ALL));
    EXPECT_EQ(info.version, "1.0-0001");
}

TEST(Install, MissingPayloadArchiveFailsBeforeAnyScript) {
    TestPackage pkg = testutil::recordingPackage("demo");
    const std::string file = testutil::buildPackage(pkg);
    ASSERT_EQ(VLIBCExecl("/bin/tar", 0xbb, "--delete", "-f", file.c_str(), "package.tgz", nullptr),
              0);
    PackageManager pm;
    EXPECT_EQ(installAt(pm, file), 0);
    EXPECT_EQ(pm.getResult(), PKG_ERR_BAD_ARCHIVE);
    EXPECT_TRUE(testutil::scriptsRan("demo").empty());
}

TEST(Install, FullVolumeDuringUnpackLeavesNothing) {
    TestPackage pkg = testutil::recordingPackage("demo");
    // Random bytes do not compress: the payload needs its full 3 MiB when unpacked.
    std::mt19937 random(42);
    std::string noise(3 << 20, '\0');
    for (char& c : noise) {
        c = static_cast<char>(random());
    }
    pkg.payload["data.bin"] = noise;
    const std::string file = testutil::buildPackage(pkg);
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    // Too small for the package file's members; then room for those but not the payload too.
    for (const char* size : {"size=1m", "size=5m"}) {
        ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", 0, size), 0);
        PackageManager pm;
        EXPECT_EQ(installAt(pm, file, "/volume2"), 0) << size;
        EXPECT_EQ(pm.getResult(), PKG_ERR_BAD_ARCHIVE) << size;
        // The code stays that of a failed unpack; the words say what really went wrong.
        const Json::Value space = pm.getJsonParam("no_space");
        EXPECT_EQ(space["volume"].asString(), "/volume2") << size << toString(space);
        EXPECT_GE(space["needed"].asUInt64(), 3u << 20) << size << toString(space);
        EXPECT_LT(space["free"].asUInt64(), space["needed"].asUInt64()) << size << toString(space);
        EXPECT_FALSE(testutil::exists("/var/packages/demo")) << size;
        EXPECT_FALSE(testutil::exists("/volume2/@tmp/pkginstall")) << size;
        EXPECT_TRUE(testutil::scriptsRan("demo").empty()) << size;
        ASSERT_EQ(umount("/volume2"), 0);
    }
}

TEST(Install, PayloadThatCannotBeMovedLeavesNoRegistry) {
    TestPackage pkg = testutil::recordingPackage("demo");
    const std::string file = testutil::buildPackage(pkg);
    // A file where the store should be: the payload has nowhere to go.
    ASSERT_EQ(VLIBCExecl("/bin/mkdir", 0xbb, "-p", "/volume1/@tmp", nullptr), 0);
    testutil::writeFile("/volume1/@appstore", "");
    PackageManager pm;
    EXPECT_EQ(pm.install_package(file, "/volume1", "/volume1/@appstore", "/volume1/@tmp", true,
                                 nullptr, "enu", nullptr),
              0);
    PackageManager::UnLock();
    EXPECT_EQ(pm.getResult(), PKG_ERR_SYSTEM);
    EXPECT_EQ(testutil::scriptsRan("demo"), std::vector<std::string>{"preinst"});
    EXPECT_FALSE(testutil::exists("/var/packages/demo"));
    EXPECT_FALSE(testutil::exists("/volume1/@tmp/pkginstall"));
    EXPECT_EQ(testutil::readFile("/volume1/@appstore"), "");
    EXPECT_EQ(pm.getPkgStatus("demo"), 255);
}
