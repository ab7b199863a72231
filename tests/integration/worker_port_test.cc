// "port-config": the package's protocol file under /usr/local/etc/services.d, and the
// installability check that refuses a second package for a port the first declared.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

const char kDir[] = "/usr/local/etc/services.d/";
const char kPorts[] = "[web]\ntitle=\"Web\"\ndst.ports=\"18080,18100:18110/tcp\"\n";

testutil::TestPackage withPorts(const std::string& name, const std::string& relpath,
                                const std::string& content) {
    testutil::TestPackage pkg = testutil::recordingPackage(name);
    pkg.conf["resource"] =
        R"({"service-cfg":{},"port-config":{"protocol-file":")" + relpath + "\"}}";
    pkg.payload[relpath] = content;
    return pkg;
}

PackageInfo infoOf(const std::string& name) {
    PackageInfo info;
    PMSLoadPKGInfoFile("/var/packages/" + name, info, nullptr, PKG_INFO_MASK_ALL);
    return info;
}

}  // namespace

TEST(PortConfigWorker, InstallPublishesTheFileAndASecondPackageForItsPortIsRefused) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, withPorts("web", "conf/web-ports.sc", kPorts)), 1);
    EXPECT_EQ(testutil::readFile(std::string(kDir) + "web.sc"), kPorts);
    EXPECT_FALSE(testutil::exists(std::string(kDir) + "web-ports.sc"));

    // Ports inside a declared range are taken; one beside them is free. The check of an
    // unsigned file passes only with the trust level that accepts any package.
    testutil::writeFile("/etc/corvinfo.conf", testutil::readFile("/etc/corvinfo.conf") +
                                                  "pkg_source_trust_level=\"2\"\n");
    struct Case {
        const char* port;
        bool refused;
    };
    for (const Case& c : {Case{"18080", true}, Case{"18105", true}, Case{"18111", false}}) {
        testutil::TestPackage second = testutil::recordingPackage(std::string("second") + c.port);
        second.info["adminport"] = c.port;
        second.info["adminprotocol"] = "http";
        testutil::RunResult check =
            testutil::run(CORVPKG_CLI_PATH, {"check", testutil::buildPackage(second)});
        EXPECT_EQ(check.status, c.refused ? 1 : 0) << c.port << check.out << check.err;
        EXPECT_EQ(check.out.find("port_conflict") != std::string::npos, c.refused)
            << c.port << check.out;
    }

    ASSERT_EQ(pm.uninstall("web", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    EXPECT_FALSE(testutil::exists(std::string(kDir) + "web.sc"));
}

TEST(PortConfigWorker, UpgradeRenamesAnOldBaseNameAndKeepsTheContent) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, withPorts("web", "conf/web.sc", kPorts)), 1);
    // An earlier version's file under the base name that the new version ships.
    unlink((std::string(kDir) + "web.sc").c_str());
    testutil::writeFile(std::string(kDir) + "ports-v2.sc", "[old]\ndst.ports=\"18500/tcp\"\n");
    testutil::TestPackage next =
        withPorts("web", "conf/ports-v2.sc", "[new]\ndst.ports=\"1/tcp\"\n");
    next.version = "2.0-0001";
    ASSERT_EQ(testutil::installBuilt(pm, next), 1);
    EXPECT_FALSE(testutil::exists(std::string(kDir) + "ports-v2.sc"));
    EXPECT_EQ(testutil::readFile(std::string(kDir) + "web.sc"), "[old]\ndst.ports=\"18500/tcp\"\n");
}

TEST(PortConfigWorker, UserEditsSurviveAcquireAndUpdateReplacesTheFile) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, withPorts("web", "conf/web.sc", kPorts)), 1);
    const std::string installed = std::string(kDir) + "web.sc";
    testutil::writeFile(installed, "[edited]\ndst.ports=\"18200/tcp\"\n");
    CORV::PkgUtils::WorkerResp resp;
    EXPECT_TRUE(Resource::Acquire(Resource::TIMING_POSTINST, infoOf("web"), PKG_INSTALL, resp,
                                  nullptr, ""));
    EXPECT_EQ(testutil::readFile(installed), "[edited]\ndst.ports=\"18200/tcp\"\n");
    EXPECT_TRUE(Resource::Update(infoOf("web"), "port-config", Json::Value(), resp));
    EXPECT_EQ(testutil::readFile(installed), kPorts);
}

TEST(PortConfigWorker, MissingOrMalformedProtocolFilesPublishNothing) {
    // A file that is missing or outside the package fails the worker; one that the
    // platform refuses is not published, and the worker does not look at that.
    struct Case {
        const char* what;
        std::string section;
        std::string payload;
        int outcome;
    };
    const Case cases[] = {
        {"missing file", R"({"protocol-file":"conf/none.sc"})", "", 0},
        {"outside the package", R"({"protocol-file":"../../../etc/passwd"})", "", 0},
        {"not a string", R"({"protocol-file":7})", "", 0},
        {"no ports", R"({"protocol-file":"conf/p.sc"})", "[web]\ntitle=\"x\"\n", 1},
        {"port 0", R"({"protocol-file":"conf/p.sc"})", "[web]\ndst.ports=\"0/tcp\"\n", 1},
        {"bad protocol", R"({"protocol-file":"conf/p.sc"})", "[web]\ndst.ports=\"80/sctp\"\n", 1},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        const std::string name = "p" + std::to_string(&c - cases);
        testutil::TestPackage pkg = testutil::recordingPackage(name);
        pkg.conf["resource"] = R"({"service-cfg":{},"port-config":)" + c.section + "}";
        if (!c.payload.empty()) {
            pkg.payload["conf/p.sc"] = c.payload;
        }
        PackageManager pm;
        EXPECT_EQ(testutil::installBuilt(pm, pkg), c.outcome);
        EXPECT_EQ(pm.getResult(), c.outcome ? PKG_OK : PKG_ERR_INSTALL_FAILED);
        EXPECT_FALSE(testutil::exists(std::string(kDir) + name + ".sc"));
    }
}
