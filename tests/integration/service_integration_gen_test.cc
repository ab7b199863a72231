// Generated jobs, service files, package jobs and the extra-environment hand-over, in the
// sandbox with the reference platform's service manager.
#include <gtest/gtest.h>
#include <unistd.h>

#include <set>
#include <string>
#include <vector>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/service.h"
#include "support/files.h"
#include "support/pkg_kit.h"

namespace Svc = CORVPackageTool::Service;
using CORVPackageTool::PKG_INSTALLATION_TYPE;
using CORVPackageTool::PKG_START;
using CORVPackageTool::PKG_STOP;

namespace {

const char kJob[] = "/etc/init/pkgctl-demo.conf";
const char kCfg[] = "/usr/corv/etc/corvservice.d/pkgctl-demo.cfg";

}  // namespace

TEST(ServiceIntegrationGen, JobAdapterForAPackageWithDependencies) {
    testutil::TestPackage lib("lib");
    testutil::installFixture(lib);
    testutil::TestPackage demo("demo");
    demo.info["install_dep_packages"] = "lib";
    testutil::installFixture(demo, true);
    ASSERT_TRUE(Svc::GenJobAdapter("demo", Json::Value(Json::objectValue), false));
    const std::string text = testutil::readFile(kJob);
    EXPECT_NE(text.find("start on corv.pkgctl.pkgstart and corv.pkgctl.started NAME=\"lib\"\n"),
              std::string::npos)
        << text;
    EXPECT_NE(text.find("stop on corv.pkgctl.shutdown and corv.pkgctl.stopping NAME=\"lib\"\n"),
              std::string::npos);
    EXPECT_EQ(VLIBCExecl("/usr/bin/init-check.sh", 0xbb, kJob, nullptr), 0);
    EXPECT_EQ(VLIBCExecl("/sbin/initctl", 0xbb, "status", "pkgctl-demo", nullptr), 0);
}

TEST(ServiceIntegrationGen, JobAdapterKeepsAValidFileUnlessForced) {
    testutil::TestPackage demo("demo");
    testutil::installFixture(demo);
    Json::Value conf;
    conf["start-on"] = "nos-start";
    ASSERT_TRUE(Svc::GenJobAdapter("demo", conf, false));
    EXPECT_EQ(testutil::readFile(kJob).find("start on corv.pkgctl.nosstart\n"), 43u);
    ASSERT_TRUE(Svc::GenJobAdapter("demo", Json::Value(Json::objectValue), false));
    EXPECT_NE(testutil::readFile(kJob).find("corv.pkgctl.nosstart"), std::string::npos);
    ASSERT_TRUE(Svc::GenJobAdapter("demo", Json::Value(Json::objectValue), true));
    EXPECT_NE(testutil::readFile(kJob).find("start on corv.pkgctl.pkgstart\n"), std::string::npos);
}

TEST(ServiceIntegrationGen, JobAdapterRefusesANumericStartOn) {
    testutil::TestPackage demo("demo");
    testutil::installFixture(demo);
    Json::Value conf;
    conf["start-on"] = 3;
    EXPECT_FALSE(Svc::GenJobAdapter("demo", conf, false));
    EXPECT_EQ(VLIBCErrGet(), 0x4000);
    EXPECT_FALSE(testutil::exists(kJob));
    EXPECT_FALSE(Svc::GenJobAdapter("", conf, false));
    EXPECT_EQ(VLIBCErrGet(), 0xd00);
}

TEST(ServiceIntegrationGen, ServiceCfgWithoutDependencies) {
    testutil::TestPackage demo("demo");
    testutil::installFixture(demo);
    ASSERT_TRUE(Svc::GenServiceCfg("demo", Json::Value(), false));
    Json::Value cfg;
    ASSERT_TRUE(CORVPackageTool::fromFile(kCfg, cfg));
    EXPECT_EQ(CORVPackageTool::toString(cfg),
              "{\"auto_start\":\"no\",\"init_job_map\":{\"upstart\":[\"pkgctl-demo\"]},"
              "\"is_package\":\"yes\"}");
    EXPECT_EQ(VLIBServicecfgValidate(kCfg), 0);
}

TEST(ServiceIntegrationGen, ServiceCfgWithRequiredServices) {
    testutil::TestPackage lib("lib");
    testutil::installFixture(lib);
    testutil::TestPackage demo("demo");
    demo.info["install_dep_packages"] = "lib";
    demo.info["start_dep_services"] = "pgsql";
    testutil::installFixture(demo);
    ASSERT_TRUE(Svc::GenServiceCfg("demo", Json::Value(), false));
    Json::Value cfg;
    ASSERT_TRUE(CORVPackageTool::fromFile(kCfg, cfg));
    EXPECT_EQ(CORVPackageTool::toString(cfg["required_corvservice"]), "[\"pgsql\",\"pkgctl-lib\"]");
    // An existing file is not rewritten without force.
    testutil::writeFile(kCfg, "{\"init_job_map\":{\"upstart\":[\"pkgctl-demo\"]}}");
    ASSERT_TRUE(Svc::GenServiceCfg("demo", Json::Value(), false));
    EXPECT_EQ(testutil::readFile(kCfg), "{\"init_job_map\":{\"upstart\":[\"pkgctl-demo\"]}}");
    ASSERT_TRUE(Svc::GenServiceCfg("demo", Json::Value(), true));
    EXPECT_NE(testutil::readFile(kCfg).find("required_corvservice"), std::string::npos);
}

TEST(ServiceIntegrationGen, PackageJobsAreListedInstalledAndUndone) {
    testutil::TestPackage demo("demo");
    demo.conf["upstart/foo.conf"] = "exec /bin/sleep 100\n";
    demo.conf["upstart/pkg-.conf"] = "exec /bin/sleep 100\n";
    demo.conf["upstart/pkg-good.conf"] = "exec /bin/sleep 100\n";
    demo.conf["upstart/pkg-bad.conf"] = "this is no job stanza at all\n";
    testutil::installFixture(demo);
    std::vector<std::string> jobs;
    ASSERT_TRUE(Svc::EnumAvailableJobs("demo", jobs));
    EXPECT_EQ(jobs, (std::vector<std::string>{"pkg-bad", "pkg-good"}));

    ASSERT_TRUE(Svc::InstallJobs("demo", {"pkg-good"}, false));
    EXPECT_NE(testutil::readFile("/etc/init/pkg-good.conf")
                  .find("cgroup cpuacct \"pkgctl-demo\"\ncgroup memory \"pkgctl-demo\"\n"),
              std::string::npos);
    // Already there and not forced: left alone.
    testutil::writeFile("/etc/init/pkg-good.conf", "exec /bin/sleep 5\n");
    ASSERT_TRUE(Svc::InstallJobs("demo", {"pkg-good"}, false));
    EXPECT_EQ(testutil::readFile("/etc/init/pkg-good.conf"), "exec /bin/sleep 5\n");

    // A failing job takes the ones of its call with it.
    EXPECT_FALSE(Svc::InstallJobs("demo", {"pkg-good", "pkg-bad"}, true));
    EXPECT_FALSE(testutil::exists("/etc/init/pkg-good.conf"));
    EXPECT_FALSE(testutil::exists("/etc/init/pkg-bad.conf"));
}

TEST(ServiceIntegrationGen, UnlinkingAbsentFilesIsSilent) {
    testutil::writeFile("/etc/init/pkg-x.conf", "exec /bin/true\n");
    testutil::writeFile("/etc/init/pkg-x.override", "manual\n");
    VLIBCErrSetEx(0, "", 0);
    Svc::UnlinkAllJobs("demo", {"pkg-x", "pkg-absent", "other"});
    Svc::UnlinkServiceCfg("demo");
    EXPECT_EQ(VLIBCErrGet(), 0);
    EXPECT_FALSE(testutil::exists("/etc/init/pkg-x.conf"));
    EXPECT_FALSE(testutil::exists("/etc/init/pkg-x.override"));
}

TEST(ServiceIntegrationGen, ExtraEnvironmentIsHandedOverOnce) {
    ASSERT_TRUE(Svc::DumpExtraEnv("demo", PKG_START, "enu", "admin"));
    PKG_INSTALLATION_TYPE type = PKG_STOP;
    char* language = nullptr;
    char* user = nullptr;
    ASSERT_TRUE(Svc::LoadExtraEnv("demo", &type, &language, &user));
    EXPECT_EQ(type, PKG_START);
    ASSERT_NE(language, nullptr);
    ASSERT_NE(user, nullptr);
    EXPECT_STREQ(language, "enu");
    EXPECT_STREQ(user, "admin");
    free(language);
    free(user);
    EXPECT_FALSE(testutil::exists("/tmp/corvpkgctl.tmp-demo"));
    ASSERT_TRUE(Svc::LoadExtraEnv("demo", &type, nullptr, nullptr));
    EXPECT_EQ(static_cast<int>(type), 0);
}

TEST(ServiceIntegrationGen, ExtraEnvironmentWithoutLanguageOrUser) {
    ASSERT_TRUE(Svc::DumpExtraEnv("demo", PKG_STOP, nullptr, nullptr));
    EXPECT_EQ(testutil::readFile("/tmp/corvpkgctl.tmp-demo"), "action=\"0x0010\"\n");
    char set[] = "x";
    char* language = set;
    PKG_INSTALLATION_TYPE type;
    EXPECT_FALSE(Svc::LoadExtraEnv("demo", &type, &language, nullptr));
    EXPECT_EQ(VLIBCErrGet(), 0xd00);
    EXPECT_TRUE(testutil::exists("/tmp/corvpkgctl.tmp-demo"));
}
