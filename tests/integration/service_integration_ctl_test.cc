// A package runs through its generated job and the package control tool, in the sandbox.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "corvpkg/service.h"
#include "corvpkg/worker.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

const char kCtl[] = "/usr/corv/sbin/corvpkgctl";

// Until the platform set-up installs the tool, the test puts the built one in place.
void InstallCtl() {
    if (!testutil::exists(kCtl)) {
        ASSERT_EQ(VLIBCExecl("/bin/mkdir", 0xbb, "-p", "/usr/corv/sbin", nullptr), 0);
        ASSERT_EQ(VLIBCExecl("/bin/cp", 0xbb, CORVPKGCTL_PATH, kCtl, nullptr), 0);
    }
}

// The scripted test plug-in as the worker "boot" of the start and halt phases.
void RegisterBootWorker() {
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        std::string(R"({"workers":[{"id":"boot","interval":"0x0088","major":1,)") +
                            R"("minor":0,"path":")" + CORVPKG_TEST_PLUGIN_PATH + "\"}]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
}

PackageInfo Installed(const testutil::TestPackage& pkg) {
    testutil::installFixture(pkg, true);
    PackageInfo info;
    EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    return info;
}

}  // namespace

TEST(ServiceIntegrationCtl, GeneratedJobStartsAndStopsThePackage) {
    InstallCtl();
    testutil::TestPackage demo("demo");
    demo.conf["resource"] = R"({"service-cfg":{}})";
    demo.scripts["start-stop-status"] = testutil::statusScript(0);
    PackageInfo info = Installed(demo);
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    ASSERT_TRUE(testutil::exists("/etc/init/pkgctl-demo.conf"));
    ASSERT_TRUE(testutil::exists("/usr/corv/etc/corvservice.d/pkgctl-demo.cfg"));

    ASSERT_TRUE(Service::DumpExtraEnv("demo", PKG_START, "enu", nullptr));
    ASSERT_EQ(VLIBCExecl("/sbin/initctl", 0xbb, "start", "pkgctl-demo", nullptr), 0);
    EXPECT_EQ(testutil::readFile("/tmp/demo.calls").find("start"), 0u);
    EXPECT_FALSE(testutil::exists("/tmp/corvpkgctl.tmp-demo"));
    ASSERT_EQ(VLIBCExecl("/sbin/initctl", 0xbb, "stop", "pkgctl-demo", nullptr), 0);
    EXPECT_NE(testutil::readFile("/tmp/demo.calls").find("stop"), std::string::npos);

    ASSERT_TRUE(
        Resource::Release(Resource::TIMING_PREUNINST, info, PKG_UNINSTALL, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists("/etc/init/pkgctl-demo.conf"));
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/corvservice.d/pkgctl-demo.cfg"));
}

TEST(ServiceIntegrationCtl, FailingScriptFailsTheStart) {
    InstallCtl();
    testutil::TestPackage demo("demo");
    demo.conf["resource"] = R"({"service-cfg":{}})";
    demo.scripts["start-stop-status"] = "exit 1\n";
    PackageInfo info = Installed(demo);
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_NE(VLIBCExecl("/sbin/initctl", 0xbb, "start", "pkgctl-demo", nullptr), 0);
    EXPECT_NE(VLIBCExecl(kCtl, 0xbb, "start", "demo", nullptr), 0);
    EXPECT_EQ(VLIBCExecl(kCtl, 0xbb, "setup", "demo", nullptr), 0);
    EXPECT_EQ(VLIBCExecl(kCtl, 0xbb, "swap-on", nullptr), 0);
    EXPECT_NE(VLIBCExecl(kCtl, 0xbb, "start", "absent", nullptr), 0);
}

TEST(ServiceIntegrationCtl, FailingWorkersLeaveTheirMessages) {
    InstallCtl();
    RegisterBootWorker();
    testutil::TestPackage demo("demo");
    demo.conf["resource"] = R"({"boot":{"tag":"b","fail":["acquire"],"message":"pkgmgr:boom"}})";
    demo.scripts["start-stop-status"] = testutil::statusScript(0);
    Installed(demo);
    EXPECT_NE(VLIBCExecl(kCtl, 0xbb, "start", "demo", nullptr), 0);
    EXPECT_TRUE(testutil::exists("/tmp/workermsg-acquire-demo"));
    EXPECT_FALSE(testutil::exists("/tmp/demo.calls")) << "no start after a failed worker";

    testutil::writeFile("/var/packages/demo/conf/resource",
                        R"({"boot":{"tag":"b","fail":["release"]}})");
    EXPECT_EQ(VLIBCExecl(kCtl, 0xbb, "start", "demo", nullptr), 0);
    EXPECT_NE(VLIBCExecl(kCtl, 0xbb, "stop", "demo", nullptr), 0);
    EXPECT_TRUE(testutil::exists("/tmp/workermsg-release-demo"));
    EXPECT_EQ(testutil::readFile("/tmp/demo.calls"), "start\nstop\n");
}
