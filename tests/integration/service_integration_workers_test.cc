// The service-cfg, crontab-job and corvcrond workers through the resource phases.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "corvpkg/service.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

PackageInfo Installed(const testutil::TestPackage& pkg, bool enabled = false) {
    testutil::installFixture(pkg, enabled);
    PackageInfo info;
    EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + pkg.name, info, nullptr, PKG_INFO_MASK_ALL));
    return info;
}

}  // namespace

TEST(ServiceIntegrationWorkers, ServiceCfgPublishesAtPostinstAndReleaseRemoves) {
    testutil::TestPackage demo("demo");
    demo.conf["resource"] = R"({"service-cfg":{"start-on":"nos-start"}})";
    demo.conf["upstart/pkg-demo-helper.conf"] = "exec /bin/sleep 100\n";
    PackageInfo info = Installed(demo);
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_POSTINST, info, PKG_INSTALL, resp, nullptr, ""));
    EXPECT_TRUE(testutil::exists("/etc/init/pkgctl-demo.conf"));
    EXPECT_TRUE(testutil::exists("/etc/init/pkg-demo-helper.conf"));
    EXPECT_TRUE(testutil::exists("/usr/corv/etc/corvservice.d/pkgctl-demo.cfg"));
    Json::Value own;
    ASSERT_TRUE(Resource::GetOwnObject("demo", "service-cfg", own));
    EXPECT_EQ(toString(own), "{\"jobs\":[\"pkg-demo-helper\"]}");

    ASSERT_TRUE(
        Resource::Release(Resource::TIMING_PREUNINST, info, PKG_UNINSTALL, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists("/etc/init/pkgctl-demo.conf"));
    EXPECT_FALSE(testutil::exists("/etc/init/pkg-demo-helper.conf"));
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/corvservice.d/pkgctl-demo.cfg"));
}

TEST(ServiceIntegrationWorkers, RestoreWithoutRequestFile) {
    testutil::TestPackage demo("demo");
    testutil::installFixture(demo);
    ASSERT_TRUE(Resource::RestoreServiceCfg("demo"));
    EXPECT_TRUE(testutil::exists("/etc/init/pkgctl-demo.conf"));
    EXPECT_TRUE(testutil::exists("/usr/corv/etc/corvservice.d/pkgctl-demo.cfg"));
    Json::Value own;
    ASSERT_TRUE(Resource::GetOwnObject("demo", "service-cfg", own));
    EXPECT_EQ(toString(own), "{\"jobs\":[]}");
    EXPECT_FALSE(Resource::RestoreServiceCfg(""));
    EXPECT_EQ(VLIBCErrGet(), 0xd00);
}

TEST(ServiceIntegrationWorkers, CrontabNeedsAPackageUser) {
    testutil::TestPackage demo("demo");
    demo.conf["resource"] = R"({"crontab-job":{"relpath":"conf/cron"}})";
    demo.conf["cron"] = "* * * * * /bin/true\n";
    PackageInfo info = Installed(demo);
    CORV::PkgUtils::WorkerResp resp;
    EXPECT_FALSE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_EQ(VLIBCErrGet(), 0xd900);
}

TEST(ServiceIntegrationWorkers, InstallConfigFileRefusesUnlessReplacing) {
    testutil::writeFile("/tmp/src.txt", "new\n");
    testutil::writeFile("/tmp/dst.txt", "old\n");
    EXPECT_FALSE(CORV::PkgUtils::InstallConfigFile("/tmp/src.txt", "/tmp/dst.txt", 0644, false));
    EXPECT_EQ(VLIBCErrGet(), 0x800);
    EXPECT_EQ(testutil::readFile("/tmp/dst.txt"), "old\n");
    EXPECT_TRUE(CORV::PkgUtils::InstallConfigFile("/tmp/src.txt", "/tmp/dst.txt", 0644, true));
    EXPECT_EQ(testutil::readFile("/tmp/dst.txt"), "new\n");
}

TEST(ServiceIntegrationWorkers, CorvCrondSavesAndRemovesTheJobs) {
    testutil::TestPackage demo("demo");
    demo.conf["resource"] = R"({"corvcrond":{"conf":"jobs.json"}})";
    demo.payload["jobs.json"] = R"([{"name":"tick","schedule":"*/5 * * * *","command":"/bin/true"}])";
    PackageInfo info = Installed(demo);
    CORV::PkgUtils::WorkerResp resp;
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    Json::Value store;
    ASSERT_TRUE(fromFile("/usr/corv/etc/corvcrond/pkg-demo.json", store));
    EXPECT_EQ(store["jobs"][0]["name"].asString(), "tick");
    EXPECT_EQ(
        testutil::readFile("/etc/cron.d/corvcrond-demo").find("*/5 * * * * root /bin/true\n") !=
            std::string::npos,
        true);
    ASSERT_TRUE(Resource::Release(Resource::TIMING_DISABLE, info, PKG_STOP, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists("/usr/corv/etc/corvcrond/pkg-demo.json"));
    EXPECT_FALSE(testutil::exists("/etc/cron.d/corvcrond-demo"));
}
