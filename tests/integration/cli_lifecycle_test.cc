// The command line over the whole local life of a package, in the sandbox.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <filesystem>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgvolume.h"
#include "support/codesign_kit.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

testutil::RunResult corvpkg(const std::vector<std::string>& args) {
    return testutil::run(CORVPKG_CLI_PATH, args);
}

Json::Value json(const testutil::RunResult& r) {
    Json::Value out;
    EXPECT_TRUE(fromString(r.out, out)) << r.out << r.err;
    return out;
}

unsigned long long freeBytes(const char* path) {
    struct statvfs vfs {};
    return statvfs(path, &vfs) == 0 ? static_cast<unsigned long long>(vfs.f_bavail) * vfs.f_frsize
                                    : 0;
}

int status(const std::string& name) {
    return PackageManager().getPkgStatus(name);
}

// A copy of the package file `file` at `copy` whose INFO claims another payload checksum.
void withWrongChecksum(const std::string& file, const std::string& copy) {
    std::string info = testutil::tarMember(file, "INFO");
    const size_t at = info.find("checksum=\"");
    ASSERT_NE(at, std::string::npos) << info;
    info.replace(at + 10, 32, std::string(32, '0'));
    testutil::writeFile("/tmp/stage/INFO", info);
    ASSERT_EQ(VLIBCExec("/bin/cp", file.c_str(), copy.c_str(), nullptr), 0);
    ASSERT_EQ(VLIBCExec("/bin/tar", "--delete", "-f", copy.c_str(), "INFO", nullptr), 0);
    ASSERT_EQ(VLIBCExec("/bin/tar", "rf", copy.c_str(), "-C", "/tmp/stage", "INFO", nullptr), 0);
}

}  // namespace

TEST(CliLifecycle, InstallReinstallDowngradeUninstall) {
    TestPackage pkg = testutil::recordingPackage("demo", "2.0-0001");
    pkg.scripts["postinst"] =
        "echo 'Ready on port 9.' > \"$CORVPKG_TEMP_LOGFILE\"\n" + pkg.scripts["postinst"];
    const std::string v2 = testutil::buildPackage(pkg);
    testutil::RunResult r = corvpkg({"install", v2, "--no-verify"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "installed demo\n");
    EXPECT_NE(r.err.find("postinst"), std::string::npos) << "progress shows the steps: " << r.err;
    EXPECT_NE(r.err.find("message from the package: Ready on port 9."), std::string::npos) << r.err;
    EXPECT_EQ(status("demo"), 0);

    // The same version again is an upgrade of the package onto itself.
    testutil::clearRecords("demo");
    r = corvpkg({"upgrade", v2, "--no-verify"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "upgraded demo\n");
    EXPECT_EQ(testutil::scriptsRan("demo").front(), "preupgrade");

    // A damaged payload is refused before the installed package is stopped.
    testutil::clearRecords("demo");
    withWrongChecksum(v2, "/tmp/damaged-v2.cpk");
    r = corvpkg({"upgrade", "/tmp/damaged-v2.cpk", "--no-verify", "--json"});
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(json(r)["name"].asString(), "PKG_ERR_BAD_ARCHIVE");
    EXPECT_TRUE(testutil::scriptsRan("demo").empty());
    EXPECT_EQ(status("demo"), 0);

    const std::string v1 = testutil::buildPackage(testutil::recordingPackage("demo", "1.0-0001"));
    r = corvpkg({"install", v1, "--no-verify", "--json"});
    EXPECT_EQ(r.status, 1);
    Json::Value out = json(r);
    EXPECT_FALSE(out["success"].asBool());
    EXPECT_EQ(out["name"].asString(), "PKG_ERR_DOWNGRADE");
    EXPECT_EQ(out["message_key"].asString(), "pkgmgr:downgrade_version");
    EXPECT_EQ(out["data"]["oldver"].asString(), "1.0-0001");
    EXPECT_EQ(out["data"]["curver"].asString(), "2.0-0001");
    EXPECT_EQ(status("demo"), 0);
    // The message of the earlier install is not this refusal's.
    r = corvpkg({"install", v1, "--no-verify"});
    EXPECT_EQ(r.err.find("message from the package"), std::string::npos) << r.err;

    r = corvpkg({"uninstall", "demo"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "uninstalled demo\n");
    EXPECT_EQ(status("demo"), 255);
}

TEST(CliLifecycle, InterruptedInstallIsRepaired) {
    TestPackage pkg = testutil::recordingPackage("demo");
    // The installer dies after registration, in postinst, as on a power cut.
    pkg.scripts["postinst"] = "[ -f /tmp/demo.die ] && kill -KILL $PPID\nexit 0\n";
    const std::string file = testutil::buildPackage(pkg);
    testutil::writeFile("/tmp/demo.die", "");
    testutil::RunResult r = corvpkg({"install", file, "--no-verify"});
    EXPECT_EQ(r.status, 128 + 9);
    EXPECT_EQ(status("demo"), 150);
    r = corvpkg({"status", "demo", "--json"});
    EXPECT_TRUE(json(r)["broken"].asBool());

    unlink("/tmp/demo.die");
    r = corvpkg({"repair", file, "--no-verify"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(status("demo"), 0);
    EXPECT_FALSE(testutil::exists("/var/packages/demo/installing"));
}

TEST(CliLifecycle, PackageWhoseTargetIsGoneIsRepaired) {
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    ASSERT_EQ(corvpkg({"install", file, "--no-verify"}).status, 0);
    testutil::removeAll("/volume1/@appstore/demo");
    ASSERT_EQ(status("demo"), 150);
    testutil::RunResult r = corvpkg({"install", file, "--no-verify"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(status("demo"), 0);
    EXPECT_TRUE(testutil::exists("/volume1/@appstore/demo/bin/app"));
}

TEST(CliLifecycle, WizardDefaultsReachTheScripts) {
    TestPackage pkg = testutil::recordingPackage("demo");
    pkg.wizard["install_uifile"] =
        R"([{"step_title":"Setup","items":[{"type":"textfield","subitems":[)"
        R"({"key":"answer","desc":"The answer","defaultValue":"forty-two"}]}]}])";
    const std::string file = testutil::buildPackage(pkg);
    testutil::RunResult r = corvpkg({"install", file, "--no-verify"});
    EXPECT_EQ(r.status, 2);
    EXPECT_NE(r.err.find("answer - The answer (default: forty-two)"), std::string::npos) << r.err;
    EXPECT_EQ(status("demo"), 255);

    r = corvpkg({"install", file, "--no-verify", "--defaults"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(testutil::scriptField("demo", "postinst", "answer"), "forty-two");
}

TEST(CliLifecycle, BadInputIsRefusedClearly) {
    testutil::writeFile("/tmp/answers.txt", "not json");
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    TestPackage arm = testutil::recordingPackage("arm");
    arm.info["arch"] = "armv5";
    const std::string armFile = testutil::buildPackage(arm);
    ASSERT_EQ(mkdir("/tmp/a-dir", 0755), 0);
    // A damaged payload is named first, before what else is wrong with the file, and
    // whether the install or its check finds it.
    withWrongChecksum(file, "/tmp/damaged.cpk");
    withWrongChecksum(armFile, "/tmp/damaged-arm.cpk");
    struct Case {
        std::vector<std::string> args;
        const char* name;
    };
    const Case cases[] = {
        {{"install", "/tmp/no-such.cpk"}, "PKG_ERR_FILE_ACCESS"},
        {{"install", "/tmp/a-dir"}, "PKG_ERR_FILE_ACCESS"},
        {{"install", file, "--answers", "/tmp/answers.txt"}, "PKG_ERR_BAD_ANSWERS"},
        {{"install", armFile, "--no-verify"}, "PKG_ERR_PLATFORM"},
        {{"install", "/tmp/damaged.cpk", "--no-verify"}, "PKG_ERR_BAD_ARCHIVE"},
        {{"install", "/tmp/damaged-arm.cpk", "--no-verify"}, "PKG_ERR_BAD_ARCHIVE"},
        {{"check", "/tmp/damaged-arm.cpk"}, "PKG_ERR_BAD_ARCHIVE"},
        {{"uninstall", "nosuch"}, "PKG_ERR_NOT_INSTALLED"},
    };
    for (const Case& c : cases) {
        std::vector<std::string> args = c.args;
        args.push_back("--json");
        testutil::RunResult r = corvpkg(args);
        SCOPED_TRACE(c.args[0] + " " + c.args[1]);
        EXPECT_EQ(r.status, 1) << r.out << r.err;
        EXPECT_EQ(json(r)["name"].asString(), c.name) << r.out;
    }
    EXPECT_EQ(PackageManager().enumPackages(nullptr, PKG_INFO_MASK_ALL).size(), 0u);
    EXPECT_FALSE(std::filesystem::exists("/volume1/@appstore/demo"));
    EXPECT_FALSE(std::filesystem::exists("/tmp/demo.scripts")) << "a script ran";
}

TEST(CliLifecycle, NameThatLooksLikeAnOptionIsReachedAfterTheDoubleDash) {
    // The name rules allow a leading "-"; "--" must then still reach the package.
    const std::string file = testutil::buildPackage(testutil::recordingPackage("-rf"));
    ASSERT_EQ(corvpkg({"install", "--no-verify", "--", file}).status, 0);
    EXPECT_EQ(corvpkg({"status", "-rf"}).status, 2) << "an unknown option, as before";
    const std::vector<std::vector<std::string>> steps = {
        {"status", "--", "-rf"},    {"stop", "--", "-rf"},     {"start", "--", "-rf"},
        {"restart", "--", "-rf"},   {"resource", "--", "-rf"}, {"log", "--", "-rf"},
        {"uninstall", "--", "-rf"},
    };
    for (const auto& args : steps) {
        testutil::RunResult r = corvpkg(args);
        EXPECT_EQ(r.status, 0) << args[0] << ": " << r.out << r.err;
    }
    EXPECT_FALSE(testutil::exists("/var/packages/-rf"));
}

TEST(CliLifecycle, CommandsLeaveNoTemporaryFilesBehind) {
    const std::string v1 = testutil::buildPackage(testutil::recordingPackage("demo", "1.0-0001"));
    const std::string v2 = testutil::buildPackage(testutil::recordingPackage("demo", "2.0-0001"));
    TestPackage failing = testutil::recordingPackage("other");
    failing.scripts["preinst"] = "exit 1\n";
    const std::string bad = testutil::buildPackage(failing);
    const std::vector<std::vector<std::string>> commands = {
        {"check", v1},
        {"inspect", v1},
        {"install", v1, "--no-verify"},
        {"upgrade", v2, "--no-verify"},
        {"install", bad, "--no-verify"},
    };
    auto temporaryEntries = [] {
        std::set<std::string> entries;
        for (const char* dir : {"/volume1/@tmp", "/var/tmp"}) {
            std::error_code ec;
            for (const auto& entry : std::filesystem::directory_iterator(dir, ec)) {
                entries.insert(entry.path().string());
            }
        }
        return entries;
    };
    const std::set<std::string> before = temporaryEntries();
    for (const auto& args : commands) {
        corvpkg(args);
        EXPECT_EQ(temporaryEntries(), before) << args[0] << " " << args[1];
    }
    EXPECT_EQ(status("demo"), 0);
}

TEST(CliLifecycle, FullVolumeIsSaidInWords) {
    // Random bytes do not compress: the payload needs its 12 MiB wherever it is unpacked.
    TestPackage big = testutil::recordingPackage("big");
    std::mt19937 random(7);
    std::string noise(12 << 20, '\0');
    for (char& c : noise) {
        c = static_cast<char>(random());
    }
    big.payload["data.bin"] = noise;
    const std::string file = testutil::buildPackage(big);
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", 0, "size=8m"), 0);
    struct Case {
        std::vector<std::string> args;
        const char* volume;
        const char* words;  // what the code alone would not say
    } cases[] = {
        {{"install", file, "--no-verify"}, "/volume1", "not enough free space on /volume1: "},
        {{"install", file, "--no-verify", "--volume", "/volume2"},
         "/volume2",
         "not enough free space on /volume2: "},
    };
    for (const Case& c : cases) {
        // The check unpacks the payload on the first volume with 10 MiB free: leave 11 there,
        // or fill nothing when the volume asked for is the one too small.
        if (std::string(c.volume) == "/volume1") {
            const int fill = open("/volume1/fill", O_CREAT | O_WRONLY, 0600);
            ASSERT_GE(fill, 0);
            ASSERT_EQ(posix_fallocate(fill, 0, freeBytes("/volume1") - (11 << 20)), 0);
            close(fill);
        }
        testutil::RunResult r = corvpkg(c.args);
        unlink("/volume1/fill");
        EXPECT_EQ(r.status, 1) << c.args[0];
        EXPECT_NE((r.out + r.err).find(c.words), std::string::npos) << r.out << r.err;
    }
    EXPECT_FALSE(testutil::exists("/var/packages/big"));
    umount2("/volume2", MNT_DETACH);
}

TEST(CliLifecycle, SavedDefaultVolumeWinsOverTheOption) {
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    // A default volume must offer 200 MiB to be taken.
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", 0, "size=256m"), 0);
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    testutil::writeFile("/etc/corvinfo.conf", testutil::readFile("/etc/corvinfo.conf") +
                                                  "pkg_def_intall_vol=\"/volume2\"\n");
    testutil::RunResult r = corvpkg({"install", file, "--no-verify", "--volume", "/volume1"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(PMSReadLink("/var/packages/demo/target"), "/volume2/@appstore/demo");
    umount2("/volume2", MNT_DETACH);
}

TEST(CliLifecycle, RepairAfterItsVolumeIsGoneMovesToAnother) {
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", 0, "size=64m"), 0);
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    ASSERT_EQ(corvpkg({"install", file, "--no-verify", "--volume", "/volume2"}).status, 0);
    ASSERT_EQ(PMSReadLink("/var/packages/demo/target"), "/volume2/@appstore/demo");
    ASSERT_EQ(umount2("/volume2", MNT_DETACH), 0);
    EXPECT_EQ(status("demo"), 150);

    testutil::RunResult r = corvpkg({"repair", file, "--no-verify", "--volume", "/volume1"});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_EQ(PMSReadLink("/var/packages/demo/target"), "/volume1/@appstore/demo");
    EXPECT_EQ(status("demo"), 0);
}

TEST(CliLifecycle, StopNamesTheDependentsItTookAlong) {
    TestPackage base = testutil::recordingPackage("base");
    TestPackage app = testutil::recordingPackage("app");
    app.info["install_dep_packages"] = "base";
    ASSERT_EQ(corvpkg({"install", testutil::buildPackage(base), "--no-verify"}).status, 0);
    ASSERT_EQ(corvpkg({"install", testutil::buildPackage(app), "--no-verify"}).status, 0);
    testutil::RunResult r = corvpkg({"stop", "base"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "stopped base\nwith the dependents that ran, stopped before it: app\n");
    EXPECT_EQ(status("app"), 3);
    r = corvpkg({"uninstall", "base", "--json"});
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(json(r)["name"].asString(), "PKG_ERR_DEPENDENCY");
    EXPECT_FALSE(json(r)["reason"].asString().empty());
}

TEST(CliLifecycle, StartStopRestartThroughTheCommandLine) {
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    ASSERT_EQ(corvpkg({"install", file, "--no-verify", "--no-start"}).status, 0);
    EXPECT_EQ(status("demo"), 3);
    EXPECT_EQ(corvpkg({"start", "demo"}).out, "started demo\n");
    EXPECT_EQ(status("demo"), 0);
    testutil::clearRecords("demo");
    EXPECT_EQ(corvpkg({"restart", "demo"}).out, "restarted demo\n");
    EXPECT_EQ(testutil::startStopActions(), (std::vector<std::string>{"demo stop", "demo start"}));
    EXPECT_EQ(corvpkg({"stop", "demo"}).out, "stopped demo\n");
    EXPECT_EQ(status("demo"), 3);
}
