// "pam-config" with Linux-PAM: pamtester signs users in through the package's PAM
// service, with the platform's own modules that the generated file names.
#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <thread>

#include "corv/app_priv.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::run;

namespace {

const char kService[] = "/etc/pam.d/demo-login";
const char kLoginConfig[] =
    R"({"filename":"demo-login","auth-types":["local"],)"
    R"("autoblock":{"service-name":"demo","log-failure":true,"log-success":true}})";

// Exit status of pamtester for `user` with `password` on stdin, doing `operations`.
int Pamtester(const std::string& service, const std::string& user, const std::string& password,
              const std::string& operations = "authenticate") {
    const std::string line = "printf '%s\\n' '" + password + "' | /usr/bin/pamtester " + service +
                             " " + user + " " + operations;
    return run("/bin/sh", {"-c", line}).status;
}

Json::Value Own(const std::string& pkg) {
    Json::Value own;
    Resource::GetOwnObject(pkg, "pam-config", own);
    return own;
}

class PamConfigWorker : public ::testing::Test {
  protected:
    void SetUp() override {
        if (!testutil::exists("/usr/bin/pamtester")) {
            GTEST_SKIP() << "pamtester is not installed (scripts/setup-deps.sh)";
        }
        for (const char* user : {"alice", "bob"}) {
            ASSERT_EQ(VLIBCExec("/usr/sbin/useradd", "-M", user, nullptr), 0);
            const std::string line = std::string(user) + ":secret-" + user;
            ASSERT_EQ(run("/bin/sh", {"-c", "echo '" + line + "' | /usr/sbin/chpasswd"}).status, 0);
        }
    }

    PackageInfo Install(const std::string& name, const std::string& configs) {
        testutil::TestPackage pkg(name);
        pkg.conf["resource"] = R"({"pam-config":{"configs":)" + configs + "}}";
        testutil::installFixture(pkg);
        PackageInfo info;
        EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/" + name, info, nullptr, PKG_INFO_MASK_ALL));
        return info;
    }

    bool Startup(const PackageInfo& info) {
        return Resource::Acquire(Resource::TIMING_STARTUP, info, PKG_START, resp, nullptr, "");
    }
    bool Halt(const PackageInfo& info) {
        return Resource::Release(Resource::TIMING_HALT, info, PKG_STOP, resp, nullptr, "");
    }

    CORV::PkgUtils::WorkerResp resp;
};

}  // namespace

TEST_F(PamConfigWorker, UsersSignInThroughThePackagesServiceUntilHalt) {
    PackageInfo info = Install("demo", std::string("[") + kLoginConfig + "]");
    ASSERT_TRUE(Startup(info));
    EXPECT_EQ(testutil::readFile(kService).substr(0, 37),
              "auth\trequisite\tpam_corv_autoblock.so\n");
    EXPECT_EQ(testutil::modeOf(kService), 0644u);
    EXPECT_EQ(toString(Own("demo")), R"({"config-ids":[],"configs":["demo-login"]})");

    EXPECT_EQ(Pamtester("demo-login", "alice", "secret-alice", "authenticate acct_mgmt"), 0);
    EXPECT_NE(Pamtester("demo-login", "alice", "wrong"), 0);
    EXPECT_NE(Pamtester("demo-login", "nosuchuser", "secret-alice"), 0);

    ASSERT_TRUE(Halt(info));
    EXPECT_FALSE(testutil::exists(kService));
    EXPECT_EQ(toString(Own("demo")), R"({"config-ids":[]})");
}

TEST_F(PamConfigWorker, AnAutoblockedUserIsRefusedEvenWithTheRightPassword) {
    if (testutil::exists("/usr/sbin/syslog-ng")) {
        ASSERT_EQ(VLIBServiceStart("syslog-ng", 0), 0);
    }
    testutil::writeFile("/usr/corv/etc/autoblock.conf", "attempts=\"2\"\nwithin_mins=\"10\"\n");
    PackageInfo info = Install("demo", std::string("[") + kLoginConfig + "]");
    ASSERT_TRUE(Startup(info));

    // A sign-in forgets the failure before it: one and one never make two.
    EXPECT_NE(Pamtester("demo-login", "alice", "wrong"), 0);
    EXPECT_EQ(Pamtester("demo-login", "alice", "secret-alice"), 0);
    EXPECT_NE(Pamtester("demo-login", "alice", "wrong"), 0);
    EXPECT_EQ(Pamtester("demo-login", "alice", "secret-alice"), 0);

    EXPECT_NE(Pamtester("demo-login", "alice", "wrong"), 0);
    EXPECT_NE(Pamtester("demo-login", "alice", "wrong"), 0);
    EXPECT_NE(Pamtester("demo-login", "alice", "secret-alice"), 0);
    EXPECT_EQ(Pamtester("demo-login", "bob", "secret-bob"), 0);

    if (testutil::exists("/usr/sbin/syslog-ng")) {
        // syslog-ng writes asynchronously: wait for bob's line, the last one sent.
        std::string auth;
        for (int i = 0; i < 100; ++i) {
            auth = testutil::readFile("/var/log/auth.log");
            if (auth.find("User [bob]") != std::string::npos) break;
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
        EXPECT_NE(auth.find("User [alice] from [localhost] failed to sign in to [demo]"),
                  std::string::npos)
            << auth;
        EXPECT_NE(auth.find("User [bob] from [localhost] signed in to [demo]"), std::string::npos)
            << auth;
        EXPECT_NE(auth.find("User [alice] from [localhost] is blocked"), std::string::npos) << auth;
    }
}

TEST_F(PamConfigWorker, ThePrivilegeRuleWantsTheApplication) {
    PackageInfo info = Install("demo", R"([{"filename":"demo-login","auth-types":["local"],)"
                                       R"("app-privilege":{"app-id":"Corv.Demo"}}])");
    ASSERT_TRUE(Startup(info));
    EXPECT_EQ(Pamtester("demo-login", "alice", "secret-alice", "authenticate"), 0);
    EXPECT_NE(Pamtester("demo-login", "alice", "secret-alice", "authenticate acct_mgmt"), 0);
    ASSERT_EQ(VLIBAppPrivUserAddOne("alice", "Corv.Demo"), 0);
    EXPECT_EQ(Pamtester("demo-login", "alice", "secret-alice", "authenticate acct_mgmt"), 0);
    EXPECT_NE(Pamtester("demo-login", "bob", "secret-bob", "authenticate acct_mgmt"), 0);
}

TEST_F(PamConfigWorker, AFileThatIsNotThePackagesIsNeitherTakenNorRemoved) {
    PackageInfo first = Install("first", std::string("[") + kLoginConfig + "]");
    ASSERT_TRUE(Startup(first));
    const std::string firstText = testutil::readFile(kService);
    const std::string systemLogin = testutil::readFile("/etc/pam.d/login");
    ASSERT_FALSE(systemLogin.empty());

    PackageInfo second =
        Install("second", R"([{"filename":"demo-login","auth-types":["local","ldap"]},)"
                          R"({"filename":"login","auth-types":["local"]}])");
    ASSERT_TRUE(Startup(second));
    EXPECT_EQ(toString(Own("second")), R"({"config-ids":[],"configs":[]})");
    ASSERT_TRUE(Halt(second));
    EXPECT_EQ(testutil::readFile(kService), firstText);
    EXPECT_EQ(testutil::readFile("/etc/pam.d/login"), systemLogin);

    // Its own file from an earlier start (no halt in between) is the package's again.
    ASSERT_TRUE(Startup(first));
    EXPECT_EQ(toString(Own("first")), R"({"config-ids":[],"configs":["demo-login"]})");
    ASSERT_TRUE(Halt(first));
    EXPECT_FALSE(testutil::exists(kService));
}

TEST_F(PamConfigWorker, InstalledIdsOutliveAReleaseWhateverTheDefaultsSay) {
    const std::string configs = R"([{"filename":"demo-a","auth-types":["local"],"id":"a"},)"
                                R"({"filename":"demo-b","auth-types":["local"],"id":"b"},)"
                                R"({"filename":"demo-any","auth-types":["local"]}])";
    testutil::TestPackage pkg("demo");
    pkg.conf["resource"] = R"({"pam-config":{"defaults":["a"],"configs":)" + configs + "}}";
    testutil::installFixture(pkg);
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile("/var/packages/demo", info, nullptr, PKG_INFO_MASK_ALL));
    ASSERT_TRUE(Startup(info));
    EXPECT_TRUE(testutil::exists("/etc/pam.d/demo-a"));
    EXPECT_FALSE(testutil::exists("/etc/pam.d/demo-b"));
    EXPECT_TRUE(testutil::exists("/etc/pam.d/demo-any"));
    ASSERT_TRUE(Halt(info));
    EXPECT_EQ(toString(Own("demo")), R"({"config-ids":["a"]})");

    testutil::writeFile("/var/packages/demo/conf/resource",
                        R"({"pam-config":{"defaults":["b"],"configs":)" + configs + "}}");
    ASSERT_TRUE(Startup(info));
    EXPECT_TRUE(testutil::exists("/etc/pam.d/demo-a"));
    EXPECT_FALSE(testutil::exists("/etc/pam.d/demo-b"));

    // Update is not one of this worker's: the files stay as they are.
    EXPECT_FALSE(Resource::Update(info, "pam-config", Json::Value(Json::objectValue), resp));
    EXPECT_TRUE(testutil::exists("/etc/pam.d/demo-a"));
}

TEST_F(PamConfigWorker, ALaterFailingWorkerRemovesTheFiles) {
    // A plug-in that runs after the built-in workers at startup and fails.
    testutil::writeFile(std::string(Resource::kProviderDir) + "/p",
                        std::string(R"({"workers":[{"id":"late","interval":"0x0088",)") +
                            R"("major":1,"minor":0,"path":")" + CORVPKG_TEST_PLUGIN_PATH + "\"}]}");
    testutil::writeFile(std::string(Resource::kProviderDir) + "/global", R"({"providers":["p"]})");
    testutil::TestPackage pkg("demo");
    pkg.conf["resource"] = std::string(R"({"pam-config":{"configs":[)") + kLoginConfig +
                           R"(]},"late":{"tag":"l","fail":["acquire"]}})";
    testutil::installFixture(pkg);
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile("/var/packages/demo", info, nullptr, PKG_INFO_MASK_ALL));
    EXPECT_FALSE(Startup(info));
    EXPECT_FALSE(testutil::exists(kService));
    EXPECT_EQ(toString(Own("demo")), R"({"config-ids":[]})");
}

TEST_F(PamConfigWorker, BadDescriptionsArePassedOverAndABadSectionFails) {
    PackageInfo info =
        Install("demo", R"([{"filename":"demo-ok","auth-types":["local"]},)"
                        R"({"filename":"demo-krb","auth-types":["kerberos"]},)"
                        R"({"filename":"../demo-up","auth-types":["local"]},)"
                        R"({"filename":"demo-inject","auth-types":["local"],)"
                        R"("autoblock":{"service-name":"x]\nauth sufficient pam_permit.so"}}])");
    ASSERT_TRUE(Startup(info));
    EXPECT_EQ(toString(Own("demo")), R"({"config-ids":[],"configs":["demo-ok"]})");
    EXPECT_FALSE(testutil::exists("/etc/pam.d/demo-krb"));
    EXPECT_FALSE(testutil::exists("/etc/demo-up"));
    EXPECT_FALSE(testutil::exists("/etc/pam.d/demo-inject"));
    ASSERT_TRUE(Halt(info));

    for (const char* configs : {R"({"filename":"demo-ok"})", R"("demo-ok")", "7"}) {
        PackageInfo bad = Install("bad", configs);
        EXPECT_FALSE(Startup(bad)) << configs;
        EXPECT_EQ(VLIBCErrGet(), 0x4000) << configs;
    }
}
