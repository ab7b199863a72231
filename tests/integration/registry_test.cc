// Registration, listings and status of installed packages, on real registries in the
// sandbox.
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>
#include <stdlib.h>

#include <algorithm>
#include <chrono>
#include <string>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglimit.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::installFixture;
using testutil::TestPackage;

namespace {

std::vector<std::string> sorted(std::vector<std::string> v) {
    std::sort(v.begin(), v.end());
    return v;
}

void runningJob(const std::string& name) {
    ASSERT_TRUE(testutil::startPackageJob(name));
}

TestPackage withStatus(const std::string& name, int statusExit) {
    TestPackage pkg(name);
    pkg.scripts["start-stop-status"] = testutil::statusScript(statusExit, "line one\nline two");
    return pkg;
}

}  // namespace

TEST(Registry, RegisterMovesThePartsAndFlagsTheInstall) {
    TestPackage pkg = withStatus("demo", 0);
    pkg.conf["privilege"] = R"({"username":"nobody"})";
    testutil::writePackageDir("/volume1/@tmp/pkginstall", pkg);
    ASSERT_EQ(CORVFSMkdirP("/volume1/@appstore/demo", nullptr, 1, -1, -1, 0755), 0);
    PackageManager pm;
    PackageInfo info;
    info.package = "demo";
    ASSERT_TRUE(pm.registerPackage(PKG_INSTALL, info, "/volume1/@tmp/pkginstall",
                                   "/volume1/@appstore/demo"));
    EXPECT_TRUE(testutil::exists("/var/packages/demo/INFO"));
    EXPECT_TRUE(testutil::exists("/var/packages/demo/scripts/start-stop-status"));
    EXPECT_TRUE(testutil::exists("/var/packages/demo/conf/privilege"));
    EXPECT_FALSE(testutil::exists("/var/packages/demo/WIZARD_UIFILES"));
    EXPECT_TRUE(testutil::exists("/var/packages/demo/installing"));
    EXPECT_EQ(PMSReadLink("/var/packages/demo/target"), "/volume1/@appstore/demo");
    EXPECT_EQ(PMSReadLink("/var/packages/demo/etc"), "/usr/corv/etc/packages/demo");
    struct stat st {};
    ASSERT_EQ(stat("/usr/corv/etc/packages/demo", &st), 0);
    EXPECT_EQ(st.st_uid, 65534u) << "owned by the package's user";
    EXPECT_FALSE(testutil::exists("/volume1/@tmp/pkginstall/INFO"));

    // The flag makes it broken, whatever its script says.
    runningJob("demo");
    testutil::writeFile("/var/packages/demo/enabled", "");
    EXPECT_EQ(pm.getPkgStatus("demo"), 150);
    unlink("/var/packages/demo/installing");
    EXPECT_EQ(pm.getPkgStatus("demo"), 0);
}

TEST(Registry, RegisterRefusesABadInfoWithoutTouchingAnything) {
    testutil::writeFile("/tmp/work/INFO", "package=bad/name\nversion=1\n");
    PackageManager pm;
    PackageInfo info;
    info.package = "bad";
    EXPECT_FALSE(pm.registerPackage(PKG_INSTALL, info, "/tmp/work", "/volume1/@appstore/bad"));
    EXPECT_EQ(pm.getResult(), PKG_ERR_BAD_ARCHIVE);
    EXPECT_FALSE(testutil::exists("/var/packages/bad"));
    EXPECT_TRUE(testutil::exists("/tmp/work/INFO"));
}

TEST(Registry, ServiceScriptGate) {
    PackageManager pm;
    PackageInfo info;
    EXPECT_EQ(pm.getServiceScript("absent", info), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_NOT_INSTALLED);

    installFixture(withStatus("demo", 0));
    EXPECT_EQ(pm.getServiceScript("demo", info), "/var/packages/demo/scripts/start-stop-status");
    EXPECT_EQ(info.package, "demo");

    unlink("/var/packages/demo/target");
    EXPECT_EQ(pm.getServiceScript("demo", info), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_BROKEN) << "INFO but no target";

    installFixture(TestPackage("noscript"));
    EXPECT_EQ(pm.getServiceScript("noscript", info), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_NO_STATUS_SCRIPT);

    installFixture(withStatus("noexec", 0));
    chmod("/var/packages/noexec/scripts/start-stop-status", 0644);
    EXPECT_EQ(pm.getServiceScript("noexec", info), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_BROKEN);

    // A volume mounted read-only has failed: its packages are broken.
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", 0, "size=4m"), 0);
    installFixture(withStatus("onv2", 0), false, "/volume2");
    EXPECT_NE(pm.getServiceScript("onv2", info), "");
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", MS_REMOUNT | MS_RDONLY, "size=4m"), 0);
    EXPECT_EQ(pm.getServiceScript("onv2", info), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_BROKEN);
    EXPECT_FALSE(PMSCheckPackage("onv2"));
    EXPECT_TRUE(PMSCheckPackage("demo") == false) << "its target is gone";
}

TEST(Registry, ListingsByVolume) {
    ASSERT_EQ(mkdir("/volume11", 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/volume11", "tmpfs", 0, "size=4m"), 0);
    installFixture(TestPackage("on1"));
    installFixture(TestPackage("on11"), false, "/volume11");
    installFixture(TestPackage("gone"));
    unlink("/var/packages/gone/target");
    testutil::writeFile("/var/packages/sys/INFO", "package=sys\nversion=1\n");
    ASSERT_EQ(symlink("/usr/local/packages/sys", "/var/packages/sys/target"), 0);
    ASSERT_EQ(CORVFSMkdirP("/var/packages/noinfo", nullptr, 1, -1, -1, 0755), 0);
    testutil::writeFile("/var/packages/damaged/INFO", "version=1\n");
    ASSERT_EQ(symlink("/var/packages/on1", "/var/packages/alias"), 0);

    PackageManager pm;
    EXPECT_EQ(sorted(pm.enumPackages("/volume1", 0)), (std::vector<std::string>{"gone", "on1"}));
    EXPECT_EQ(sorted(pm.enumPackages(std::set<std::string>{"/volume11/"}, 0)),
              (std::vector<std::string>{"gone", "on11"}));
    EXPECT_EQ(sorted(pm.enumPackages(nullptr, 0)),
              (std::vector<std::string>{"gone", "on1", "on11", "sys"}));

    PackageBasicInfoMap map = pm.enumPackageMap(0);
    EXPECT_EQ(map.size(), 4u);
    EXPECT_EQ(map["on1"].version, "1.0-0001");

    std::vector<PackageInfo> infos;
    std::vector<std::string> failed;
    EXPECT_FALSE(pm.enumPackageInfoByPath("/var/packages", infos, failed, "enu", 0));
    EXPECT_EQ(pm.getResult(), PKG_ERR_ENUMERATION);
    EXPECT_EQ(failed, std::vector<std::string>{"damaged"});
    EXPECT_EQ(infos.size(), 4u) << "the readable ones are still there";
    infos.clear();
    failed.clear();
    EXPECT_FALSE(pm.enumPackageInfoByPath("/nonexistent", infos, failed, "enu", 0));
    EXPECT_EQ(pm.getResult(), PKG_ERR_ENUMERATION);

    std::vector<std::string> names{"on1", "absent", "on11"};
    std::vector<PackageInfo> out;
    EXPECT_FALSE(pm.getPackageInfo(names, out, "enu", 0));
    ASSERT_EQ(out.size(), 3u);
    EXPECT_EQ(out[0].package, "on1");
    EXPECT_EQ(out[2].package, "on11");
}

TEST(Registry, SingleReadsFillScriptMaskAndWizardFlag) {
    TestPackage pkg = withStatus("demo", 0);
    pkg.scripts["preinst"] = "exit 0\n";
    pkg.scripts["postupgrade"] = "exit 0\n";
    pkg.wizard["uninstall_uifile_ger"] = "[]";
    installFixture(pkg);
    chmod("/var/packages/demo/scripts/preinst", 0644);
    PackageManager pm;
    PackageInfo info;
    ASSERT_TRUE(pm.getPackageInfo("demo", info, "ger", PKG_INFO_MASK_ALL));
    EXPECT_EQ(pm.getResult(), PKG_OK);
    EXPECT_EQ(info.script_mask, 0x01u | 0x02u | 0x40u);
    EXPECT_TRUE(PMSCheckIsExec("/var/packages/demo/scripts/preinst")) << "made runnable";
    EXPECT_TRUE(info.has_uninstall_wizard);
    ASSERT_TRUE(pm.getPackageInfo("demo", info, "enu", PKG_INFO_MASK_ALL));
    EXPECT_FALSE(info.has_uninstall_wizard);
    EXPECT_FALSE(pm.getPackageInfo("absent", info, "enu", 0));
    EXPECT_EQ(pm.getResult(), PKG_ERR_NOT_INSTALLED);
}

TEST(Registry, StatusTable) {
    const struct {
        const char* name;
        int scriptExit;  // -1: no status script
        bool enabled;
        bool job;
        int status;
        int rough;  // -1: getPkgRoughStatus fails
        bool started;
    } cases[] = {
        {"running", 0, true, true, 0, 3, true},     {"noflag", 0, false, true, 3, 1, false},
        {"nojob", 0, true, false, 3, 1, false},     {"exit1", 1, true, true, 1, 1, false},
        {"exit2", 2, true, true, 2, 1, false},      {"exit3", 3, true, true, 3, 1, false},
        {"broken", 150, true, true, 150, 5, false}, {"noscript", -1, true, true, 4, -1, true},
    };
    for (const auto& c : cases) {
        TestPackage pkg(c.name);
        if (c.scriptExit >= 0) {
            pkg.scripts["start-stop-status"] = testutil::statusScript(c.scriptExit);
        }
        installFixture(pkg, c.enabled);
        if (c.job) {
            runningJob(c.name);
        }
    }
    PackageManager pm;
    for (const auto& c : cases) {
        EXPECT_EQ(pm.getPkgStatus(c.name), c.status) << c.name;
        int rough = -7;
        bool ok = pm.getPkgRoughStatus(c.name, rough);
        EXPECT_EQ(ok ? rough : -1, c.rough) << c.name;
        EXPECT_EQ(pm.isStarted(c.name), c.started) << c.name;
    }
    EXPECT_EQ(pm.getPkgStatus("absent"), 255);
    int rough = -1;
    EXPECT_TRUE(pm.getPkgRoughStatus("absent", rough));
    EXPECT_EQ(rough, 0);
}

TEST(Registry, StatusOfArchMismatchAndVersionLimits) {
    TestPackage other = withStatus("armonly", 0);
    other.info["arch"] = "armv7";
    installFixture(other, true);
    runningJob("armonly");
    testutil::writeFile(PKG_LIMIT_CONF, "limited=\"2.0\"\nbanned=\"non\"\nsysonly=\"system\"\n");
    for (const char* name : {"limited", "banned", "sysonly"}) {
        installFixture(withStatus(name, 0), true);
        runningJob(name);
    }
    PackageManager pm;
    EXPECT_EQ(pm.getPkgStatus("armonly"), 150);
    int rough = 0;
    EXPECT_TRUE(pm.getPkgRoughStatus("armonly", rough));
    EXPECT_EQ(rough, 5);
    EXPECT_EQ(pm.getPkgStatus("limited"), 256);
    EXPECT_EQ(pm.getMapParam("oldver"), "2.0");
    EXPECT_EQ(pm.getMapParam("curver"), "1.0-0001");
    EXPECT_EQ(pm.getPkgStatus("banned"), 258);
    EXPECT_EQ(pm.getPkgStatus("sysonly"), 257);
    EXPECT_TRUE(pm.isStarted("limited") == false);
}

TEST(Registry, PackageLogThroughItsScript) {
    installFixture(withStatus("demo", 0));
    TestPackage failing("failing");
    failing.scripts["start-stop-status"] = "exit 1\n";
    installFixture(failing);
    PackageManager pm;
    EXPECT_EQ(pm.getPackageLog("demo"), "line one\nline two");
    EXPECT_EQ(pm.getResult(), PKG_OK);
    EXPECT_EQ(pm.getPackageLog("failing"), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_SYSTEM);
    EXPECT_EQ(pm.getPackageLog("failing", true), "");
    EXPECT_EQ(pm.getResult(), PKG_OK);
    EXPECT_EQ(pm.getPackageLog("absent"), "");
    EXPECT_EQ(pm.getResult(), PKG_ERR_NOT_INSTALLED);
}

TEST(Registry, HangingStatusScriptIsBounded) {
    TestPackage pkg("hang");
    pkg.scripts["start-stop-status"] = "exec sleep 600\n";
    installFixture(pkg, true);
    PackageManager pm;
    // The bound is a minute, cut to two seconds here; the caller gets a clear answer
    // instead of waiting forever.
    setenv("CORVPKG_FAULT_SECONDS", "status-script=2", 1);
    EXPECT_EQ(pm.getPkgStatus("hang"), 259);
    unsetenv("CORVPKG_FAULT_SECONDS");
}

TEST(Registry, TargetLinkThatAppearsOnlyAfterSomeTries) {
    TestPackage pkg = withStatus("late", 0);
    pkg.wizard["install_uifile"] = "[]";
    testutil::writePackageDir("/tmp/work-late", pkg);
    // A mount point where the link must go: neither removable nor replaceable until a
    // helper process unmounts it two seconds later.
    ASSERT_EQ(CORVFSMkdirP("/var/packages/late/target", nullptr, 1, -1, -1, 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/var/packages/late/target", "tmpfs", 0, "size=1m"), 0);
    pid_t helper = fork();
    if (helper == 0) {
        sleep(2);
        _exit(umount("/var/packages/late/target") == 0 ? 0 : 1);
    }
    PackageManager pm;
    PackageInfo info;
    info.package = "late";
    auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(pm.registerPackage(PKG_INSTALL, info, "/tmp/work-late", "/volume1/@appstore/late"));
    double waited = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    int status = 0;
    waitpid(helper, &status, 0);
    EXPECT_GE(waited, 1.5) << "the first tries failed";
    EXPECT_LT(waited, 30.0);
    EXPECT_EQ(PMSReadLink("/var/packages/late/target"), "/volume1/@appstore/late");
    EXPECT_TRUE(testutil::exists("/var/packages/late/WIZARD_UIFILES/install_uifile"));
}
