// The workers that publish a package's fragments for system tools, each seen through the
// reference platform's tool that uses them: the self-check runner, the feasibility
// checker, the search and media index, and the directories of the user-data and backup
// tools.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

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

const PKG_INSTALLATION_TYPE kUserStop = static_cast<PKG_INSTALLATION_TYPE>(0x10);

testutil::TestPackage publishing(const std::string& name, const std::string& resources) {
    testutil::TestPackage pkg = testutil::recordingPackage(name);
    pkg.conf["resource"] = R"({"service-cfg":{},)" + resources + "}";
    return pkg;
}

int stop(const std::string& name) {
    PackageManager pm;
    return pm.serviceControl(kUserStop, name, false, nullptr, nullptr, nullptr, true, false);
}

int uninstall(const std::string& name) {
    PackageManager pm;
    return pm.uninstall(name, nullptr, "enu", PKG_UNINSTALL, false, nullptr);
}

bool isLink(const std::string& path) {
    struct stat st;
    return lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode);
}

}  // namespace

TEST(SelfCheckWorker, TheRunnerRunsTheLinkedTestsUntilUninstall) {
    testutil::TestPackage pkg = publishing("checked", R"("selfcheck":{"support":true})");
    pkg.payload["selfcheck/10-ok"] = "#!/bin/sh\nexit 0\n";
    pkg.payload["selfcheck/20-bad"] = "#!/bin/sh\nexit 3\n";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);
    ASSERT_EQ(chmod("/var/packages/checked/target/selfcheck/10-ok", 0755), 0);
    ASSERT_EQ(chmod("/var/packages/checked/target/selfcheck/20-bad", 0755), 0);
    EXPECT_TRUE(isLink("/usr/corv/selfcheck/packages/checked"));

    testutil::RunResult ran = testutil::run("/usr/corv/bin/corv-selfcheck", {"checked"});
    EXPECT_EQ(ran.status, 1);
    EXPECT_EQ(ran.out, "checked 10-ok pass 0\nchecked 20-bad fail 3\n1 passed, 1 failed\n");

    // The link exists: a second acquire fails at symlink, which postinst only records.
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile("/var/packages/checked", info, nullptr, PKG_INFO_MASK_ALL));
    CORV::PkgUtils::WorkerResp resp;
    EXPECT_FALSE(
        Resource::Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));

    ASSERT_EQ(uninstall("checked"), 1);
    EXPECT_FALSE(isLink("/usr/corv/selfcheck/packages/checked"));
    EXPECT_EQ(testutil::run("/usr/corv/bin/corv-selfcheck", {"checked"}).status, 2);
}

TEST(FeasibilityWorkers, TheCheckerRunsInstalledChecksAndPowerOffChecksOnlyWhileRunning) {
    testutil::TestPackage pkg = publishing("guard", R"(
        "feasibility-config":{"configs":[
            {"check-type":"upgrade","name":"busy","task":"copying","task_i18n":"guard:copying",
             "type":"block","version":1,"plugin-relpath":"bin/busy"},
            {"check-type":"upgrade","name":"again","task":"t","type":"block","version":1,
             "plugin-relpath":"bin/busy"},
            {"check-type":"nonsense","name":"x","task":"t","type":"block","version":1,
             "plugin-relpath":"bin/busy"},
            {"check-type":"upgrade","name":"x","task":"t","type":"block","version":"1",
             "plugin-relpath":"bin/busy"}]},
        "poweroff-config":{"configs":[{"relpath":"conf/off.cfg"},{"relpath":"conf/check.conf"},
            {"relpath":"conf/outside.cfg"},{"relpath":"conf/broken.cfg"}]})");
    pkg.payload["bin/busy"] = "#!/bin/sh\necho \"still copying ($1)\"\nexit 1\n";
    pkg.payload["bin/idle"] = "#!/bin/sh\necho idle\nexit 0\n";
    pkg.payload["conf/off.cfg"] = R"({"plugin":"/var/packages/guard/target/bin/idle"})";
    pkg.payload["conf/check.conf"] = R"({"plugin":"/var/packages/guard/target/bin/idle"})";
    pkg.payload["conf/outside.cfg"] = R"({"plugin":"/bin/true"})";
    pkg.payload["conf/broken.cfg"] = "{";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);
    ASSERT_EQ(chmod("/var/packages/guard/target/bin/idle", 0755), 0);

    const std::string upgradeDir = "/usr/local/share/feasibilitycheck/upgrade.d/";
    Json::Value cfg;
    ASSERT_TRUE(fromFile(upgradeDir + "guard-busy.cfg", cfg));
    EXPECT_EQ(cfg["plugin"].asString(), "/usr/local/bin/feasibilitycheck/upgrade.d/guard-busy");
    EXPECT_EQ(cfg["task_i18n"].asString(), "guard:copying");
    EXPECT_EQ(testutil::modeOf(upgradeDir + "guard-busy.cfg"), 0644u);
    EXPECT_TRUE(testutil::exists(upgradeDir + "guard-again.cfg"));
    EXPECT_FALSE(testutil::exists(upgradeDir + "guard-x.cfg"));

    testutil::RunResult upgrade =
        testutil::run("/usr/corv/bin/corv-feasibility-check", {"upgrade"});
    EXPECT_EQ(upgrade.status, 1);
    EXPECT_NE(
        upgrade.out.find(
            R"x("feasible":false,"plugin":"/usr/local/bin/feasibilitycheck/upgrade.d/guard-busy","reason":"still copying (upgrade)")x"),
        std::string::npos)
        << upgrade.out;

    const std::string offDir = "/usr/local/share/feasibilitycheck/poweroff.d/";
    EXPECT_TRUE(testutil::exists(offDir + "guard-off.cfg"));
    for (const char* refused : {"guard-check.conf", "guard-outside.cfg", "guard-broken.cfg"}) {
        EXPECT_FALSE(testutil::exists(offDir + refused)) << refused;
    }
    testutil::RunResult off = testutil::run("/usr/corv/bin/corv-feasibility-check", {"poweroff"});
    EXPECT_EQ(off.status, 0) << off.out;
    EXPECT_NE(off.out.find(R"("reason":"idle")"), std::string::npos) << off.out;

    ASSERT_EQ(stop("guard"), 1);
    EXPECT_FALSE(testutil::exists(offDir + "guard-off.cfg"));
    EXPECT_TRUE(testutil::exists(upgradeDir + "guard-busy.cfg"));
    ASSERT_EQ(uninstall("guard"), 1);
    EXPECT_FALSE(testutil::exists(upgradeDir + "guard-busy.cfg"));
    EXPECT_FALSE(testutil::exists("/usr/local/bin/feasibilitycheck/upgrade.d/guard-busy"));
    EXPECT_EQ(testutil::run("/usr/corv/bin/corv-feasibility-check", {"upgrade"}).status, 0);
    EXPECT_EQ(testutil::run("/usr/corv/bin/corv-feasibility-check", {"../etc"}).status, 2);
}

TEST(IndexWorkers, SearchIndexFollowsTheRunningStateAndMediaRegistrationTheInstall) {
    testutil::TestPackage pkg = publishing("library", R"(
        "indexdb":{"app-index":{"conf-relpath":"index/app.conf","db-relpath":"index/app.db"}},
        "media-index":{"info-relpath":"media/INFO"})");
    pkg.payload["index/app.conf"] = "title=\"Library\"\n";
    pkg.payload["index/app.db"] = "Borrowing books\t/library/borrow\thow to borrow a book\n";
    pkg.payload["media/INFO"] = "name=\"library\"\n";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);

    testutil::RunResult found =
        testutil::run("/usr/corv/bin/corvindex_mgr", {"--search", "borrow"});
    EXPECT_EQ(found.out, "Borrowing books\t/library/borrow\n");
    EXPECT_EQ(testutil::run("/usr/corv/bin/corvindex_mgr", {"--query"}).out, "library yes \n");
    EXPECT_EQ(VLIBServiceIsRunning("corvindexd"), 1);
    EXPECT_EQ(VLIBServiceIsRunning("corvmkflvd"), 1);

    ASSERT_EQ(stop("library"), 1);
    EXPECT_EQ(testutil::run("/usr/corv/bin/corvindex_mgr", {"--search", "borrow"}).out, "");
    EXPECT_EQ(testutil::run("/usr/corv/bin/corvindex_mgr", {"--query"}).out, "library no \n");

    ASSERT_EQ(uninstall("library"), 1);
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/corvindex/packages/library"));
    EXPECT_EQ(testutil::run("/usr/corv/bin/corvindex_mgr", {"--query"}).out, "");
    EXPECT_EQ(VLIBServiceIsRunning("corvindexd"), 0);
    EXPECT_EQ(VLIBServiceIsRunning("corvmkthumbd"), 0);
}

TEST(IndexWorkers, AMissingIndexFileFailsTheStart) {
    testutil::TestPackage pkg = publishing("broken", R"(
        "indexdb":{"help-index":{"conf-relpath":"index/none.conf","db-relpath":"index/app.db"}})");
    pkg.payload["index/app.db"] = "x\ty\tz\n";
    PackageManager pm;
    testutil::installBuilt(pm, pkg);
    EXPECT_FALSE(testutil::exists("/var/packages/broken/enabled"));
    EXPECT_EQ(testutil::run("/usr/corv/bin/corvindex_mgr", {"--search", "x"}).out, "");
}

TEST(UserDataAndBackupWorkers, FragmentsArePublishedUnderPackageNamesAndTakenBack) {
    testutil::TestPackage pkg = publishing("keeper", R"(
        "userdata-collector":{"configs":[{"relpath":"ud/collect.json"},{"relpath":"../../x"}],
                              "dir":"ud","conf":"collect.json","bin":"collect"},
        "backup-backend":{"configs":[{"relpath":"backup/app.conf"},{"relpath":"backup/app.cfg"}]})");
    pkg.payload["ud/collect.json"] = "{}";
    pkg.payload["ud/collect"] = "#!/bin/sh\n";
    pkg.payload["backup/app.conf"] = "name=keeper\n";
    pkg.payload["backup/app.cfg"] = "name=keeper\n";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);
    // Both forms given: the configs form wins.
    EXPECT_TRUE(testutil::exists("/usr/corv/etc/user.data.conf/keeper-collect.json"));
    EXPECT_FALSE(testutil::exists("/usr/corv/bin/user.data.collector/collect"));
    EXPECT_EQ(testutil::readFile("/usr/local/share/corvbackup/keeper-app.conf"), "name=keeper\n");
    EXPECT_FALSE(testutil::exists("/usr/local/share/corvbackup/keeper-app.cfg"));

    ASSERT_EQ(stop("keeper"), 1);
    EXPECT_FALSE(testutil::exists("/usr/local/share/corvbackup/keeper-app.conf"));
    EXPECT_TRUE(testutil::exists("/usr/corv/etc/user.data.conf/keeper-collect.json"));
    ASSERT_EQ(uninstall("keeper"), 1);
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/user.data.conf/keeper-collect.json"));

    // The older form: one configuration file and one program.
    testutil::TestPackage old = publishing("oldkeeper", R"(
        "userdata-collector":{"dir":"ud","conf":"collect.json","bin":"collect"})");
    old.payload = pkg.payload;
    ASSERT_EQ(testutil::installBuilt(pm, old), 1);
    EXPECT_TRUE(testutil::exists("/usr/corv/etc/user.data.conf/collect.json"));
    EXPECT_EQ(testutil::modeOf("/usr/corv/bin/user.data.collector/collect"), 0755u);
    ASSERT_EQ(uninstall("oldkeeper"), 1);
    EXPECT_FALSE(testutil::exists("/usr/corv/bin/user.data.collector/collect"));
}
