// "syslog-config" against the platform's running syslog-ng and logrotate.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::run;

namespace {

const char kPattern[] = "/usr/local/etc/syslog-ng/patterndb.d/demo.conf";
const char kRotate[] = "/usr/local/etc/logrotate.d/demo";
const char kSourceInclude[] = "/usr/local/etc/syslog-ng/patterndb.d/include/source/demo";

// The package's log path: its lines go to their own file and nowhere else.
const char kRoute[] =
    "filter f_demo { program(\"demo\"); };\n"
    "destination d_demo { file(\"/var/log/demo/demo.log\"); };\n"
    "log { source(src); filter(f_demo); destination(d_demo); flags(final); };\n";
const char kRotation[] =
    "/var/log/demo/demo.log {\n    rotate 2\n    missingok\n    notifempty\n}\n";

class SyslogConfigWorker : public ::testing::Test {
  protected:
    void SetUp() override {
        if (!testutil::exists("/usr/sbin/syslog-ng") || !testutil::exists("/usr/sbin/logrotate")) {
            GTEST_SKIP() << "syslog-ng or logrotate is not installed (scripts/setup-deps.sh)";
        }
        ASSERT_EQ(VLIBServiceStart("syslog-ng", 0), 0)
            << testutil::readFile("/var/log/corv-init/syslog-ng.log");
        pkg.conf["resource"] = R"({"syslog-config":{"patterndb-relpath":"syslog/demo.conf",)"
                               R"("logrotate-relpath":"syslog/rotate"}})";
        pkg.payload["syslog/demo.conf"] = kRoute;
        pkg.payload["syslog/rotate"] = kRotation;
    }

    PackageInfo Install() {
        testutil::installFixture(pkg);
        PackageInfo info;
        EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/demo", info, nullptr, PKG_INFO_MASK_ALL));
        return info;
    }

    testutil::TestPackage pkg{"demo"};
    CORV::PkgUtils::WorkerResp resp;
};

// Sends a line through /dev/log and waits until it stands in `file` (true) or 5 s passed.
bool Lands(const std::string& tag, const std::string& text, const std::string& file) {
    EXPECT_EQ(run("/usr/bin/logger", {"-t", tag, text}).status, 0);
    for (int i = 0; i < 50; ++i) {
        if (testutil::readFile(file).find(text) != std::string::npos) {
            return true;
        }
        usleep(100 * 1000);
    }
    return false;
}

}  // namespace

TEST_F(SyslogConfigWorker, TheLinesLandWhereTheFragmentSaysUntilItIsReleased) {
    PackageInfo info = Install();
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_EQ(testutil::readFile(kPattern), kRoute);
    EXPECT_EQ(testutil::modeOf(kPattern), 0644u);
    EXPECT_TRUE(Lands("demo", "first line of demo", "/var/log/demo/demo.log"));
    EXPECT_TRUE(Lands("other", "line of another program", "/var/log/messages"));
    EXPECT_EQ(testutil::readFile("/var/log/messages").find("first line of demo"),
              std::string::npos);

    // logrotate reads the fragment through the platform's configuration and rotates the file.
    auto check = run("/usr/sbin/logrotate", {"-d", "/usr/corv/etc/logrotate.conf"});
    EXPECT_EQ(check.status, 0) << check.err;
    EXPECT_NE((check.out + check.err).find("/var/log/demo/demo.log"), std::string::npos)
        << check.out << check.err;
    auto rotate = run("/usr/sbin/logrotate",
                      {"-f", "-s", "/tmp/logrotate.state", "/usr/corv/etc/logrotate.conf"});
    EXPECT_EQ(rotate.status, 0) << rotate.err;
    EXPECT_NE(testutil::readFile("/var/log/demo/demo.log.1").find("first line of demo"),
              std::string::npos);

    ASSERT_TRUE(Resource::Release(Resource::TIMING_DISABLE, info, PKG_STOP, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kPattern));
    EXPECT_FALSE(testutil::exists(kRotate));
    EXPECT_TRUE(Lands("demo", "line after the release", "/var/log/messages"));
    EXPECT_EQ(VLIBServiceIsRunning("syslog-ng"), 1);
}

TEST_F(SyslogConfigWorker, AnIncludeAddsASourceAndBadElementsArePassedOver) {
    pkg.conf["resource"] =
        R"({"syslog-config":{"patterndb-relpath":"syslog/demo.conf","patterninc":[)"
        R"({"target-dir":"source","conf-relpath":"syslog/source"},)"
        R"({"target-dir":"../../../../../etc","conf-relpath":"syslog/source"},)"
        R"({"target-dir":"nosuch","conf-relpath":"syslog/source"},)"
        R"({"target-dir":"source","conf-relpath":"../../../../etc/passwd"},)"
        R"("not an object",{"target-dir":7}]}})";
    pkg.payload["syslog/source"] = "unix-dgram(\"/run/demo-log.sock\");\n";
    PackageInfo info = Install();
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_TRUE(testutil::exists(kSourceInclude));
    EXPECT_FALSE(testutil::exists("/etc/demo"));
    EXPECT_FALSE(testutil::exists("/usr/local/etc/syslog-ng/patterndb.d/include/nosuch/demo"));

    // A line sent to the package's own socket comes through the system source.
    EXPECT_EQ(
        run("/usr/bin/logger", {"-u", "/run/demo-log.sock", "-t", "demo", "via socket"}).status, 0);
    bool landed = false;
    for (int i = 0; i < 50 && !landed; ++i) {
        landed =
            testutil::readFile("/var/log/demo/demo.log").find("via socket") != std::string::npos;
        usleep(100 * 1000);
    }
    EXPECT_TRUE(landed);

    ASSERT_TRUE(Resource::Release(Resource::TIMING_DISABLE, info, PKG_STOP, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kSourceInclude));
    // syslog-ng leaves the socket file behind, but nothing listens on it any more.
    EXPECT_NE(run("/usr/bin/logger",
                  {"--socket-errors=on", "-u", "/run/demo-log.sock", "-t", "demo", "gone"})
                  .status,
              0);
}

TEST_F(SyslogConfigWorker, AFragmentSyslogRefusesIsRolledBackAndTheDaemonKeepsRunning) {
    pkg.payload["syslog/demo.conf"] = "log { source(nosuch); destination(d_messages); };\n";
    PackageInfo info = Install();
    EXPECT_FALSE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kPattern));
    EXPECT_FALSE(testutil::exists(kRotate));
    EXPECT_EQ(VLIBServiceIsRunning("syslog-ng"), 1);
    EXPECT_TRUE(Lands("demo", "still logged", "/var/log/messages"));
}

TEST_F(SyslogConfigWorker, ALaterFailingWorkerRollsTheFragmentsBack) {
    // crontab-job runs after syslog-config and fails: the package has no user.
    pkg.conf["resource"] = R"({"syslog-config":{"patterndb-relpath":"syslog/demo.conf"},)"
                           R"("crontab-job":{"relpath":"conf/cron"}})";
    pkg.conf["cron"] = "* * * * * /bin/true\n";
    PackageInfo info = Install();
    EXPECT_FALSE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kPattern));
    EXPECT_TRUE(Lands("demo", "not routed after the rollback", "/var/log/messages"));
}

TEST_F(SyslogConfigWorker, ARotationFragmentAloneDoesNotReloadSyslog) {
    // A refused fragment that is already in place fails any reload; without a pattern
    // file the worker has nothing to reload for.
    testutil::writeFile("/usr/local/etc/syslog-ng/patterndb.d/broken.conf", "log { junk");
    pkg.conf["resource"] = R"({"syslog-config":{"logrotate-relpath":"syslog/rotate"}})";
    PackageInfo info = Install();
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_EQ(testutil::readFile(kRotate), kRotation);
    ASSERT_TRUE(Resource::Release(Resource::TIMING_DISABLE, info, PKG_STOP, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kRotate));

    pkg.conf["resource"] = R"({"syslog-config":{"patterndb-relpath":"syslog/demo.conf"}})";
    info = Install();
    EXPECT_FALSE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kPattern));
}

TEST_F(SyslogConfigWorker, MalformedSectionsInstallNothing) {
    const struct {
        const char* section;
        int error;
    } kCases[] = {
        {R"({"patterndb-relpath":5})", 0x4000},
        {R"({"patterninc":{"target-dir":"source"}})", 0x4000},
        {R"({"logrotate-relpath":["syslog/rotate"]})", 0x4000},
        {R"({"patterndb-relpath":"../../../../etc/passwd"})", 0xBE00},
        {R"({"patterndb-relpath":"/etc/passwd"})", 0xBE00},
        {R"({"logrotate-relpath":"syslog/missing"})", 0x0700},
        {R"({"patterndb-relpath":"syslog/demo.conf","logrotate-relpath":"../../../etc/shadow"})",
         0xBE00},
    };
    for (const auto& c : kCases) {
        pkg.conf["resource"] = std::string(R"({"syslog-config":)") + c.section + "}";
        PackageInfo info = Install();
        EXPECT_FALSE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""))
            << c.section;
        EXPECT_EQ(VLIBCErrGet(), c.error) << c.section;
        EXPECT_FALSE(testutil::exists(kPattern)) << c.section;
        EXPECT_FALSE(testutil::exists(kRotate)) << c.section;
    }
}
