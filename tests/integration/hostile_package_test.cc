// Package files made to reach outside themselves: control members that are links or pipes,
// payloads with devices and set-id files. In the sandbox.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

const std::string kStage = "/tmp/hostile";
const std::string kOutside = "/tmp/outside";
const std::string kOutsideFile = kOutside + "/file";
const std::string kOutsideScript = kOutside + "/script";
const std::string kOutsideDir = kOutside + "/dir";
const std::string kOutsideWizard = kOutside + "/wizard";

// Files outside any package, which a hostile member points at.
void makeOutside() {
    testutil::writeFile(kOutsideFile, "outside\n");
    testutil::writeFile(kOutsideScript, "#!/bin/sh\ntouch " + kOutside + "/ran\n");
    testutil::writeFile(kOutsideWizard + "/install_uifile", R"([{"step_title":"outside"}])");
    chmod(kOutsideFile.c_str(), 0644);
    chmod(kOutsideScript.c_str(), 0644);
    ASSERT_EQ(mkdir(kOutsideDir.c_str(), 0755), 0);
}

void expectOutsideUntouched(const std::string& what) {
    EXPECT_EQ(testutil::readFile(kOutsideFile), "outside\n") << what;
    EXPECT_EQ(testutil::modeOf(kOutsideFile), 0644u) << what;
    EXPECT_EQ(testutil::modeOf(kOutsideScript), 0644u) << what;
    EXPECT_FALSE(testutil::exists(kOutside + "/ran")) << what;
    std::error_code ec;
    EXPECT_TRUE(std::filesystem::is_empty(kOutsideDir, ec)) << what;
}

using MakeEntry = std::function<void(const std::string& path)>;

MakeEntry linkTo(const std::string& target) {
    return
        [target](const std::string& path) { ASSERT_EQ(symlink(target.c_str(), path.c_str()), 0); };
}

void namedPipe(const std::string& path) {
    ASSERT_EQ(mkfifo(path.c_str(), 0644), 0);
}

// Replaces `member` of the package file, and all under it, by what `make` puts in its place.
void replaceMember(const std::string& file, const std::string& member, const MakeEntry& make) {
    // A member that the file lacks is only added.
    VLIBCExecl("/bin/tar", 0xbb, "--delete", "-f", file.c_str(), member.c_str(), nullptr);
    testutil::removeAll(kStage);
    const std::string path = kStage + "/" + member;
    testutil::writeFile(path, "");
    unlink(path.c_str());
    make(path);
    ASSERT_EQ(VLIBCExecl("/bin/tar", 0xbb, "-C", kStage.c_str(), "-rf", file.c_str(),
                         member.c_str(), nullptr),
              0);
}

int installDirect(PackageManager& pm, const std::string& file) {
    EXPECT_EQ(VLIBCExecl("/bin/mkdir", 0xbb, "-p", "/volume1/@appstore", "/volume1/@tmp", nullptr),
              0);
    int outcome = pm.install_package(file, "/volume1", "/volume1/@appstore", "/volume1/@tmp", true,
                                     nullptr, "enu", nullptr);
    PackageManager::UnLock();
    return outcome;
}

// Log lines of the library while alive.
class LogLines {
  public:
    LogLines() {
        CORVLogSetSink([this](int, const std::string& line) { lines.push_back(line); });
    }
    ~LogLines() { CORVLogSetSink(nullptr); }
    bool has(const std::string& text) const {
        for (const std::string& line : lines) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }
    std::vector<std::string> lines;
};

}  // namespace

TEST(HostilePackage, ControlMembersThatAreNoRegularFilesAreRefused) {
    // A pipe would block the first read for ever: a hang must fail the test, not stall it.
    alarm(90);
    makeOutside();
    struct Case {
        const char* member;
        MakeEntry make;
        PKG_ERRCODE dispatcherCode;  // what the look into the file before the install says
    } cases[] = {
        {"conf", linkTo(kOutsideDir), PKG_ERR_BROKEN},
        {"conf/resource", linkTo(kOutsideFile), PKG_ERR_BROKEN},
        {"scripts/preinst", linkTo(kOutsideScript), PKG_ERR_BROKEN},
        {"INFO", namedPipe, PKG_ERR_BROKEN},
        {"WIZARD_UIFILES", linkTo(kOutsideWizard), PKG_ERR_BAD_ARCHIVE},
        {"LICENSE", linkTo(kOutsideFile), PKG_ERR_BAD_ARCHIVE},
        {"package.tgz", linkTo(kOutsideFile), PKG_ERR_BAD_ARCHIVE},
    };
    for (const Case& c : cases) {
        TestPackage pkg = testutil::recordingPackage("demo");
        pkg.wizard["install_uifile"] = R"([{"step_title":"inside"}])";
        const std::string file = testutil::buildPackage(pkg);
        replaceMember(file, c.member, c.make);

        PackageManager pm;
        EXPECT_EQ(pm.install(nullptr, file, "/volume1", true, nullptr, "enu", false, false), 0)
            << c.member;
        EXPECT_EQ(pm.getResult(), c.dispatcherCode) << c.member;
        PackageManager direct;
        EXPECT_EQ(installDirect(direct, file), 0) << c.member;
        EXPECT_EQ(direct.getResult(), PKG_ERR_BAD_ARCHIVE) << c.member;
        PackageInfo info;
        direct.queryPackageFileInfoWithWizard(file, info, PKG_INSTALL, "enu");
        EXPECT_EQ(info.license.find("outside"), std::string::npos) << c.member;
        EXPECT_EQ(toString(info.wizard).find("outside"), std::string::npos) << c.member;

        EXPECT_FALSE(testutil::exists("/var/packages/demo")) << c.member;
        EXPECT_TRUE(testutil::scriptsRan("demo").empty()) << c.member;
        expectOutsideUntouched(c.member);
    }
    alarm(0);
}

TEST(HostilePackage, DevicesAndPipesNeverReachThePayloadAndSetIdBitsGo) {
    for (const char* version : {"1.0-0001", "2.0-0001"}) {
        TestPackage pkg = testutil::recordingPackage("demo", version);
        const std::string file = testutil::buildPackage(pkg);
        // The payload archive again, with a device, a pipe and set-id programs beside it.
        const std::string payload = kStage + "-payload";
        testutil::removeAll(payload);
        testutil::writeFile(payload + "/bin/app", "#!/bin/sh\n");
        testutil::writeFile(payload + "/bin/su", "#!/bin/sh\n");
        testutil::writeFile(payload + "/bin/sg", "#!/bin/sh\n");
        ASSERT_EQ(chmod((payload + "/bin/su").c_str(), 04755), 0);
        ASSERT_EQ(chmod((payload + "/bin/sg").c_str(), 02755), 0);
        ASSERT_EQ(mkdir((payload + "/dev").c_str(), 0755), 0);
        ASSERT_EQ(mknod((payload + "/dev/node").c_str(), S_IFCHR | 0666, makedev(1, 3)), 0);
        ASSERT_EQ(mkfifo((payload + "/dev/pipe").c_str(), 0666), 0);
        const std::string tgz = "/tmp/hostile-package.tgz";
        ASSERT_EQ(
            VLIBCExecl("/bin/tar", 0xbb, "czf", tgz.c_str(), "-C", payload.c_str(), ".", nullptr),
            0);
        replaceMember(file, "package.tgz", [&](const std::string& path) {
            ASSERT_EQ(rename(tgz.c_str(), path.c_str()), 0);
        });

        LogLines log;
        PackageManager pm;
        ASSERT_EQ(pm.install(nullptr, file, "/volume1", true, nullptr, "enu", false, false), 1)
            << version << " " << pm.getResult();
        const std::string target = "/volume1/@appstore/demo";
        EXPECT_TRUE(testutil::exists(target + "/bin/app")) << version;
        EXPECT_FALSE(testutil::exists(target + "/dev/node")) << version;
        EXPECT_FALSE(testutil::exists(target + "/dev/pipe")) << version;
        EXPECT_EQ(testutil::modeOf(target + "/bin/su"), 0755u) << version;
        EXPECT_EQ(testutil::modeOf(target + "/bin/sg"), 0755u) << version;
        EXPECT_TRUE(log.has("dev/node from the payload: a device node is never installed"))
            << version;
        EXPECT_TRUE(log.has("dev/pipe from the payload: a named pipe is never installed"))
            << version;
    }
}

TEST(HostilePackage, NamedPipeInfoNeverBlocksTheCommandLine) {
    alarm(90);
    ASSERT_EQ(mkdir("/tmp/pipe-dir", 0755), 0);
    namedPipe("/tmp/pipe-dir/INFO");
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    replaceMember(file, "INFO", namedPipe);
    const std::vector<std::vector<std::string>> commands = {
        {"info", "/tmp/pipe-dir"},        {"inspect", file}, {"check", file},
        {"install", file, "--no-verify"}, {"wizard", file},
    };
    for (const auto& args : commands) {
        testutil::RunResult r = testutil::run(CORVPKG_CLI_PATH, args);
        EXPECT_EQ(r.status, 1) << args[0] << ": " << r.out << r.err;
    }
    alarm(0);
}

TEST(HostilePackage, PayloadArchiveThatIsNoRegularFileIsABadPackage) {
    alarm(90);
    const std::string file = testutil::buildPackage(testutil::recordingPackage("demo"));
    replaceMember(file, "package.tgz", namedPipe);
    const std::vector<std::vector<std::string>> commands = {{"check", file, "-v"},
                                                            {"install", file, "--no-verify", "-v"}};
    for (const auto& args : commands) {
        testutil::RunResult r = testutil::run(CORVPKG_CLI_PATH, args);
        EXPECT_EQ(r.status, 1) << args[0] << ": " << r.out << r.err;
        EXPECT_NE((r.out + r.err).find("PKG_ERR_BAD_ARCHIVE"), std::string::npos)
            << args[0] << ": " << r.out << r.err;
    }
    testutil::RunResult inspect = testutil::run(CORVPKG_CLI_PATH, {"inspect", file});
    EXPECT_NE(inspect.out.find("payload:       CHECKSUM WRONG"), std::string::npos)
        << inspect.out << inspect.err;
    EXPECT_FALSE(testutil::exists("/var/packages/demo"));
    alarm(0);
}
