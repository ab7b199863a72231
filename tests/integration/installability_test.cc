// The installability report of real package files, one row of the report table at a time.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgverify.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

// Listens on a loopback TCP port for as long as it lives.
class Listener {
  public:
    explicit Listener(int port) : fd_(socket(AF_INET, SOCK_STREAM, 0)) {
        int one = 1;
        setsockopt(fd_, SOL_SOCKET, SO_REUSEADDR, &one, sizeof(one));
        sockaddr_in addr{};
        addr.sin_family = AF_INET;
        addr.sin_port = htons(static_cast<uint16_t>(port));
        addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        ok_ =
            bind(fd_, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) == 0 && listen(fd_, 1) == 0;
    }
    ~Listener() { close(fd_); }
    bool ok() const { return ok_; }

  private:
    int fd_;
    bool ok_ = false;
};

TestPackage candidate(const std::string& name = "cand") {
    TestPackage pkg(name, "2.0-0001");
    pkg.info["displayname"] = "Candidate";
    pkg.scripts["start-stop-status"] = testutil::statusScript(0);
    pkg.scripts["postupgrade"] = "exit 0\n";
    return pkg;
}

std::string report(const std::string& file) {
    std::string displayName;
    Json::Value out;
    CheckPackageFileInfo("enu", file.c_str(), displayName, out);
    return toString(out);
}

class Installability : public ::testing::Test {
  protected:
    void SetUp() override {
        // Signatures have their own tests; here every source is trusted.
        ASSERT_EQ(VLIBCINFOSetKeyValue("pkg_source_trust_level", "2"), 0);
        ASSERT_EQ(VLIBCFileSetKeyValue(VLIBC_INFO_DEFAULTS_PATH, "product", "VS1000", nullptr), 0);
    }
};

}  // namespace

TEST_F(Installability, ReportTable) {
    const struct {
        const char* what;
        std::function<std::string()> make;  // returns the file to check
        const char* report;
    } cases[] = {
        {"installable", [] { return testutil::buildPackage(candidate()); }, "[]"},
        {"not a package",
         [] {
             testutil::writeFile("/tmp/junk.cpk", "junk");
             return std::string("/tmp/junk.cpk");
         },
         R"(["pkgmgr:pkgmgr_file_not_package"])"},
        {"payload changed after building",
         [] {
             std::string file = testutil::buildPackage(candidate());
             testutil::writeFile("/tmp/kit-src/cand/package/extra", "tampered");
             CORVFSMkdirP("/tmp/kit-src/stage", nullptr, 1, -1, -1, 0755);
             VLIBCExec("/bin/tar", "czf", "/tmp/kit-src/stage/package.tgz", "-C",
                       "/tmp/kit-src/cand/package", ".", nullptr);
             VLIBCExec("/bin/tar", "--delete", "-f", file.c_str(), "package.tgz", nullptr);
             VLIBCExec("/bin/tar", "rf", file.c_str(), "-C", "/tmp/kit-src/stage", "package.tgz",
                       nullptr);
             return file;
         },
         R"(["pkgmgr:broken_package"])"},
        {"OS too new for the package",
         [] {
             TestPackage pkg = candidate();
             pkg.info["os_max_ver"] = "6.0-0001";
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:pkgmgr_pkg_required_older_version","6.0-0001"])"},
        {"OS too old: the report shows the upper limit",
         [] {
             TestPackage pkg = candidate();
             pkg.info["os_min_ver"] = "7.0-0001";
             pkg.info["os_max_ver"] = "8.0-12";
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:pkgmgr_pkg_required_newer_version","8.0-0012"])"},
        {"conflicting installed package",
         [] {
             TestPackage other("other");
             other.info["displayname"] = "Other One";
             testutil::installFixture(other);
             TestPackage pkg = candidate();
             pkg.info["install_conflict_packages"] = "other";
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:conflict_packages","Other One"])"},
        {"missing dependencies",
         [] {
             TestPackage pkg = candidate();
             pkg.info["install_dep_packages"] = "libfoo>=1.0:libbar";
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:depend_packages","libbar, libfoo"])"},
        {"dependency installed but not started",
         [] {
             TestPackage lib("lib");
             lib.info["displayname"] = "The Library";
             lib.scripts["start-stop-status"] = testutil::statusScript(3);
             testutil::installFixture(lib);
             TestPackage pkg = candidate();
             pkg.info["install_dep_packages"] = "lib";
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:depend_unstart","The Library"])"},
        {"platform mismatch",
         [] {
             TestPackage pkg = candidate();
             pkg.info["arch"] = "armv7";
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:pkgmgr_pkg_not_support_platform","VS1000"])"},
        {"cannot upgrade without upgrade scripts",
         [] {
             TestPackage pkg = candidate();
             pkg.scripts.erase("postupgrade");
             testutil::installFixture(pkg);
             return testutil::buildPackage(pkg);
         },
         R"(["pkgmgr:pkgmgr_pkg_cannot_upgrade"])"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_EQ(report(c.make()), c.report) << c.what;
        testutil::removeAll("/var/packages");
        testutil::removeAll("/volume1/@appstore");
    }
}

TEST_F(Installability, PortConflicts) {
    Listener busy(18765);
    ASSERT_TRUE(busy.ok());
    TestPackage pkg = candidate();
    pkg.info["adminport"] = "18765";
    const std::string file = testutil::buildPackage(pkg);
    EXPECT_EQ(report(file), R"(["pkgmgr:port_conflict","18765"])");

    pkg.info["checkport"] = "no";
    EXPECT_EQ(report(testutil::buildPackage(pkg)), "[]") << "checkport=no switches it off";

    // The system web server's port, and an upgrade keeping its own port, never conflict.
    Listener web(5000);
    ASSERT_TRUE(web.ok());
    pkg.info.erase("checkport");
    pkg.info["adminport"] = "5000";
    EXPECT_EQ(report(testutil::buildPackage(pkg)), "[]");
    pkg.info["adminport"] = "18765";
    testutil::installFixture(pkg);
    EXPECT_EQ(report(testutil::buildPackage(pkg)), "[]") << "the old version holds the port";
}

TEST_F(Installability, TheRecordCheck) {
    PackageManager pm;
    PackageInfo info;
    info.package = "cand";
    info.version = "1.0";
    PMSGetOSMaxVer(info)[0] = 6;
    PMSGetOSMaxVer(info)[2] = 1;
    EXPECT_FALSE(pm.checkPkgInfoCanInstallEx(info, "enu"));
    Json::Value data;
    EXPECT_EQ(pm.getResult(data), PKG_ERR_OS_TOO_NEW);
    EXPECT_EQ(data.asString(), "6.0-0001");
    EXPECT_FALSE(pm.checkPkgInfoCanInstall(info, "enu"));
    EXPECT_EQ(pm.getResult(data), PKG_ERR_OS_VERSION);
    EXPECT_EQ(data.asString(), "6.0-0001");

    PMSGetOSMaxVer(info)[0] = 0;
    PMSGetOSMaxVer(info)[2] = 0;
    testutil::installFixture(TestPackage("cand", "2.0"));
    EXPECT_FALSE(pm.checkPkgInfoCanInstallEx(info, "enu"));
    EXPECT_EQ(pm.getResult(), PKG_ERR_DOWNGRADE);
    EXPECT_EQ(pm.compareWithInstallPkgInfo(info), 2);
    info.version = "2.0";
    EXPECT_EQ(pm.compareWithInstallPkgInfo(info), 0);
    info.version = "2.0.1";
    EXPECT_EQ(pm.compareWithInstallPkgInfo(info), 1);
    EXPECT_TRUE(pm.checkPkgInfoCanInstallEx(info, "enu"));

    info.install_reboot = true;
    EXPECT_FALSE(pm.canPackageRunAfterInstall(info));
}

TEST_F(Installability, SignatureByTrustLevel) {
    const std::string file = testutil::buildPackage(candidate());
    EXPECT_EQ(PackageManager::verifyPackageSignature(file.c_str()), PKG_SIGNATURE_OK)
        << "level 2 does not ask the tool";
    ASSERT_EQ(VLIBCINFORemoveKey("pkg_source_trust_level"), 0);
    // Without a working tool every verdict is a system error, and the report says so.
    testutil::removeAll("/usr/corv/bin/corv-codesign");
    EXPECT_EQ(PackageManager::verifyPackageSignature(file.c_str()), PKG_ERR_SIGNATURE_SYSTEM);
    EXPECT_EQ(report(file), R"(["error:error_error_system"])");
    EXPECT_EQ(PackageManager::verifyPackageSignature(nullptr), PKG_ERR_SIGNATURE_SYSTEM);
}
