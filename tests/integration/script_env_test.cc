// Package scripts: their identity, their exact environment, the operations log and the
// hook programs, with real processes and a real package user.
#include <pwd.h>
#include <stdlib.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <set>
#include <sstream>
#include <string>

#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/privilege.h"
#include "support/files.h"

using namespace CORVPackageTool;

namespace {

const char* kUser = "corvdemo";

// Lines of the script's output that name CORVPKG_ or EXTRA_ variables.
std::set<std::string> variables(const std::string& output) {
    std::set<std::string> found;
    std::istringstream lines(output);
    std::string line;
    while (std::getline(lines, line)) {
        if (line.rfind("CORVPKG_", 0) == 0 || line.rfind("EXTRA_", 0) == 0) {
            found.insert(line);
        }
    }
    return found;
}

class ScriptEnv : public ::testing::Test {
  protected:
    void SetUp() override {
        CleanAllEnv();
        testutil::writeFile("/var/packages/demo/INFO",
                            "package=demo\nversion=2.0-0002\nadminport=8080\n");
        ASSERT_EQ(symlink("/volume1/@appstore/demo", "/var/packages/demo/target"), 0);
        ASSERT_TRUE(PMSLoadPKGInfoFile("/var/packages/demo", info, "enu", 0x2000));
        testutil::writeFile("/tmp/env.sh", "#!/bin/sh\nenv\nexit ${EXIT_WITH:-0}\n");
        chmod("/tmp/env.sh", 0755);
    }
    void TearDown() override { CleanAllEnv(); }

    PackageInfo info;
};

}  // namespace

TEST_F(ScriptEnv, InstallScriptSeesExactlyItsVariables) {
    setenv("CORVPKG_TEMP_UPGRADE_FOLDER", "stale", 1);  // must not reach the child
    setenv("CORVPKG_USERNAME", "stale", 1);
    CORVUtils::ProcessRunner runner("/tmp/env.sh");
    const std::string logFile = "/tmp/corvpkgmgr.log-demo";
    Json::Value extra(Json::objectValue);
    extra["EXTRA_ANSWER"] = "yes";
    extra["EXTRA_COUNT"] = 3;
    PMSPrepareScriptEnv(info, runner, "ger", &logFile, PKG_INSTALL, &extra, nullptr,
                        "/tmp/demo.cpk", nullptr);
    ASSERT_EQ(runner.run(true, true), 0);
    const std::set<std::string> expected = {
        "CORVPKG_PKGNAME=demo",
        "CORVPKG_PKGVER=2.0-0002",
        "CORVPKG_PKG_PROGRESS_PATH=/tmp/install_progress_demo",
        "CORVPKG_PKG_STATUS=INSTALL",
        "CORVPKG_NOS_LANGUAGE=ger",
        "CORVPKG_NOS_VERSION_MAJOR=6",
        "CORVPKG_NOS_VERSION_MINOR=1",
        "CORVPKG_NOS_VERSION_BUILD=15101",
        "CORVPKG_NOS_ARCH=" + PMSGetSystemArchString(),
        "CORVPKG_PKGDEST=/volume1/@appstore/demo",
        "CORVPKG_PKGDEST_VOL=/volume1",
        "CORVPKG_PKGPORT=8080",
        "CORVPKG_TEMP_CPKFILE=/tmp/demo.cpk",
        "CORVPKG_TEMP_LOGFILE=/tmp/corvpkgmgr.log-demo",
        "EXTRA_ANSWER=yes",
        "EXTRA_COUNT=3",
    };
    EXPECT_EQ(variables(runner.getCapturedOutput()), expected);
}

TEST_F(ScriptEnv, UpgradeAndStatusVariants) {
    CORVUtils::ProcessRunner upgrade("/tmp/env.sh");
    PMSPrepareScriptEnv(info, upgrade, "enu", nullptr, PKG_UPGRADE, nullptr, "/volume1", nullptr,
                        "admin");
    ASSERT_EQ(upgrade.run(true, true), 0);
    std::set<std::string> vars = variables(upgrade.getCapturedOutput());
    EXPECT_TRUE(vars.count("CORVPKG_TEMP_UPGRADE_FOLDER=/volume1/@tmp/corvpkg.tmp/demo"));
    EXPECT_TRUE(vars.count("CORVPKG_PKG_STATUS=UPGRADE"));
    EXPECT_TRUE(vars.count("CORVPKG_USERNAME=admin"));

    // A status query of a package without target: no destination at all, and nothing of
    // the upgrade left behind.
    unlink("/var/packages/demo/target");
    info.adminport = 0;
    CORVUtils::ProcessRunner status("/tmp/env.sh");
    PMSPrepareScriptEnv(info, status, nullptr, nullptr, static_cast<PKG_INSTALLATION_TYPE>(0),
                        nullptr, nullptr, nullptr, nullptr);
    ASSERT_EQ(status.run(true, true), 0);
    for (const std::string& v : variables(status.getCapturedOutput())) {
        for (const char* gone : {"CORVPKG_PKGDEST", "CORVPKG_PKG_STATUS=", "CORVPKG_TEMP_UPGRADE",
                                 "CORVPKG_USERNAME", "CORVPKG_PKGPORT", "CORVPKG_PKG_PROGRESS"}) {
            EXPECT_NE(v.rfind(gone, 0), 0u) << v;
        }
    }
}

TEST_F(ScriptEnv, ExtraVariablesOfARunDoNotOutliveIt) {
    Json::Value first(Json::objectValue);
    first["EXTRA_FIRST"] = "1";
    CORVUtils::ProcessRunner one("/tmp/env.sh");
    PMSPrepareScriptEnv(info, one, "enu", nullptr, PKG_START, &first, nullptr, nullptr, nullptr);
    setenv("EXTRA_FIRST", "leaked", 1);  // as a caller of the previous run might have

    Json::Value second(Json::objectValue);
    second["EXTRA_SECOND"] = "2";
    CORVUtils::ProcessRunner two("/tmp/env.sh");
    PMSPrepareScriptEnv(info, two, "enu", nullptr, PKG_START, &second, nullptr, nullptr, nullptr);
    ASSERT_EQ(two.run(true, true), 0);
    std::set<std::string> vars = variables(two.getCapturedOutput());
    EXPECT_TRUE(vars.count("EXTRA_SECOND=2"));
    EXPECT_FALSE(vars.count("EXTRA_FIRST=1"));
    EXPECT_FALSE(vars.count("EXTRA_FIRST=leaked"));
    EXPECT_EQ(getenv("EXTRA_FIRST"), nullptr);

    setenv("EXTRA_SECOND", "x", 1);
    CleanAllEnv();
    EXPECT_EQ(getenv("EXTRA_SECOND"), nullptr);
}

TEST_F(ScriptEnv, ScriptRunsAsThePackageUser) {
    ASSERT_EQ(VLIBCExec("/usr/sbin/useradd", "--system", "--no-create-home", "--user-group",
                        "--shell", "/usr/sbin/nologin", kUser, nullptr),
              0);
    struct passwd* pw = getpwnam(kUser);
    ASSERT_NE(pw, nullptr);
    testutil::writeFile("/var/packages/demo/conf/privilege",
                        std::string(R"({"username":")") + kUser +
                            R"(","defaults":{"run-as":"package"},
                               "ctrl-script":[{"action":"postinst","run-as":"system"},
                                              {"action":"preuninst","run-as":"root"}]})");
    testutil::writeFile("/tmp/id.sh", "#!/bin/sh\n/usr/bin/id -u\n/usr/bin/id -g\n");
    chmod("/tmp/id.sh", 0755);

    const struct {
        const char* action;
        std::string expected;
    } cases[] = {
        {"preinst", std::to_string(pw->pw_uid) + "\n" + std::to_string(pw->pw_gid) + "\n"},
        {"postinst", std::to_string(pw->pw_uid) + "\n1\n"},
        {"preuninst", "0\n0\n"},
    };
    for (const auto& c : cases) {
        CORVUtils::ProcessRunner runner("/tmp/id.sh");
        ASSERT_TRUE(Privilege::SetIdentity(runner, "demo", c.action, "")) << c.action;
        ASSERT_EQ(runner.run(true, true), 0) << c.action;
        EXPECT_EQ(runner.getCapturedOutput(), c.expected) << c.action;
    }

    testutil::writeFile("/var/packages/demo/conf/privilege", "{not json");
    CORVUtils::ProcessRunner runner("/tmp/id.sh");
    EXPECT_FALSE(Privilege::SetIdentity(runner, "demo", "preinst", ""));
    EXPECT_EQ(Privilege::GetUserName("demo", ""), "");
    EXPECT_EQ(VLIBCErrGet(), 0x0A00);
}

TEST_F(ScriptEnv, UpgradeFolderBelongsToThePackageUser) {
    ASSERT_EQ(VLIBCExec("/usr/sbin/useradd", "--system", "--no-create-home", "--user-group", kUser,
                        nullptr),
              0);
    struct passwd* pw = getpwnam(kUser);
    ASSERT_NE(pw, nullptr);
    const std::string folder = Privilege::GetTmpFolderPath("demo", nullptr);
    EXPECT_EQ(folder, "/volume1/@tmp/corvpkg.tmp/demo");
    // No privilege file: root's.
    ASSERT_TRUE(Privilege::CreateTmpFolder("demo", folder));
    struct stat st {};
    ASSERT_EQ(stat(folder.c_str(), &st), 0);
    EXPECT_EQ(st.st_uid, 0u);
    EXPECT_EQ(st.st_mode & 0777, 0700u);

    testutil::writeFile("/var/packages/demo/conf/privilege",
                        std::string(R"({"username":")") + kUser + "\"}");
    ASSERT_TRUE(Privilege::CreateTmpFolder("demo", folder));
    ASSERT_EQ(stat(folder.c_str(), &st), 0);
    EXPECT_EQ(st.st_uid, pw->pw_uid);

    testutil::writeFile("/var/packages/demo/conf/privilege", R"({"username":"nosuchuser"})");
    EXPECT_FALSE(Privilege::CreateTmpFolder("demo", folder));
    EXPECT_EQ(VLIBCErrGet(), 0x1D00);
}

TEST_F(ScriptEnv, OperationsLogHasBeginAndEndLines) {
    unlink(PKG_OPERATIONS_LOG);
    CORVUtils::ProcessRunner runner("/tmp/env.sh");
    runner.addEnv("EXIT_WITH", "3");
    runner.addArguments("arg one");
    PMSPrepareScriptEnv(info, runner, "enu", nullptr, PKG_INSTALL, nullptr, nullptr, nullptr,
                        nullptr);
    EXPECT_EQ(PMSRunAndWriteScriptLog(info, PKG_INSTALL, runner, -1), 3);
    const std::string log = testutil::readFile(PKG_OPERATIONS_LOG);
    const std::string command = runner.toString();
    size_t begin = log.find("\tinstall demo 2.0-0002 Begin " + command + "\n");
    size_t output = log.find("CORVPKG_PKGNAME=demo");
    size_t end = log.find("\tinstall demo 2.0-0002 End " + command + " ret=[3]\n");
    ASSERT_NE(begin, std::string::npos) << log;
    ASSERT_NE(output, std::string::npos) << log;
    ASSERT_NE(end, std::string::npos) << log;
    EXPECT_LT(begin, output);
    EXPECT_LT(output, end);

    PMSWriteSysLog("");
    PMSWriteSysLog(nullptr);
    EXPECT_EQ(testutil::readFile(PKG_OPERATIONS_LOG), log) << "empty messages write nothing";

    // A log that cannot be opened does not stop the script.
    unlink(PKG_OPERATIONS_LOG);
    ASSERT_EQ(mkdir(PKG_OPERATIONS_LOG, 0755), 0);
    CORVUtils::ProcessRunner again("/tmp/env.sh");
    EXPECT_EQ(PMSRunAndWriteScriptLog(info, PKG_INSTALL, again, 0x90), 0);
}

TEST_F(ScriptEnv, HookProgramsRunWithTheirVariables) {
    testutil::writeFile("/usr/corv/corvpkg/record",
                        "#!/bin/sh\nenv | grep ^CORVPKG_ | sort > /tmp/hook-record.out\n");
    chmod("/usr/corv/corvpkg/record", 0755);
    testutil::writeFile("/opt/hooks/linked", "#!/bin/sh\necho ran > /tmp/hook-linked.out\n");
    chmod("/opt/hooks/linked", 0755);
    ASSERT_EQ(symlink("/opt/hooks/linked", "/usr/corv/corvpkg/linked"), 0);
    ASSERT_EQ(symlink("/opt/hooks", "/usr/corv/corvpkg/dirlink"), 0);

    PackageInfo old;
    old.version = "1.0";
    EXPECT_EQ(PMSCheckServiesStatus(info, &old, PKG_RESTART, 1), 1);
    EXPECT_EQ(testutil::readFile("/tmp/hook-record.out"),
              "CORVPKG_OLD_PKGVER=1.0\nCORVPKG_PKGNAME=demo\nCORVPKG_PKGVER=2.0-0002\n"
              "CORVPKG_PKG_STATUS=START\n");
    EXPECT_EQ(testutil::readFile("/tmp/hook-linked.out"), "ran\n");
    EXPECT_EQ(getenv("CORVPKG_PKGNAME"), nullptr) << "the hook variables are gone afterwards";

    EXPECT_EQ(PMSCheckServiesStatus(info, nullptr, static_cast<PKG_INSTALLATION_TYPE>(0), 0), 1);
    EXPECT_EQ(testutil::readFile("/tmp/hook-record.out"),
              "CORVPKG_BOOT_STATUS=SHUTDOWN\nCORVPKG_PKGNAME=demo\nCORVPKG_PKGVER=2.0-0002\n"
              "CORVPKG_PKG_STATUS=STOP\n");
    EXPECT_EQ(PMSCheckServiesStatus(info, nullptr, PKG_UNINSTALL, -1), 1);
    EXPECT_NE(testutil::readFile("/tmp/hook-record.out").find("CORVPKG_PKG_STATUS=UNINSTALL"),
              std::string::npos);
}

TEST_F(ScriptEnv, ProgressFile) {
    EXPECT_EQ(PMSGetProgress("demo"), -1.0);
    testutil::writeFile(PMSGetProgressPath("demo"), "42.5\n");
    EXPECT_DOUBLE_EQ(PMSGetProgress("demo"), 42.5);
    testutil::writeFile(PMSGetProgressPath("demo"), "");
    EXPECT_DOUBLE_EQ(PMSGetProgress("demo"), 0.0);
}
