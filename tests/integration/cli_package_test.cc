// The command line over package files and the dependency engine, end to end in the sandbox.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "support/codesign_kit.h"
#include "support/files.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using testutil::run;
using testutil::TestPackage;

namespace {

const std::string kCli = CORVPKG_CLI_PATH;

TestPackage source(const std::string& name) {
    TestPackage pkg(name, "1.0-0001");
    pkg.scripts["start-stop-status"] = testutil::statusScript(0);
    pkg.payload["bin/run"] = "#!/bin/sh\n";
    return pkg;
}

}  // namespace

TEST(CliPackage, SignedBuildIsAcceptedAndATamperedOneRefused) {
    ASSERT_TRUE(testutil::installCodesignTool());
    testutil::SigningKey maker("maker");
    ASSERT_TRUE(testutil::trustAsMaker(maker));
    testutil::writePackageDir("/tmp/src/signed", source("signed"));

    // Trust level 0 (the key is absent): only the maker's packages.
    auto build = testutil::run("/usr/bin/env",
                               {"GNUPGHOME=" + maker.home(), kCli, "build", "/tmp/src/signed", "-o",
                                "/tmp/signed.cpk", "--sign", maker.fingerprint()});
    ASSERT_EQ(build.status, 0) << build.out << build.err;
    auto check = run(kCli, {"check", "/tmp/signed.cpk", "--json"});
    EXPECT_EQ(check.status, 0) << check.out << check.err;
    Json::Value verdict;
    ASSERT_TRUE(CORVPackageTool::fromString(check.out, verdict)) << check.out;
    EXPECT_TRUE(verdict["installable"].asBool());

    auto inspect = run(kCli, {"inspect", "/tmp/signed.cpk", "--json"});
    ASSERT_EQ(inspect.status, 0);
    ASSERT_TRUE(CORVPackageTool::fromString(inspect.out, verdict));
    EXPECT_EQ(verdict["signature"].asString(), "PKG_SIGNATURE_OK");
    EXPECT_TRUE(verdict["checksum_ok"].asBool());

    // A member changed after signing.
    testutil::writeFile("/tmp/stage/INFO",
                        testutil::tarMember("/tmp/signed.cpk", "INFO") + "extra=\"1\"\n");
    ASSERT_EQ(VLIBCExec("/bin/tar", "--delete", "-f", "/tmp/signed.cpk", "INFO", nullptr), 0);
    ASSERT_EQ(VLIBCExec("/bin/tar", "rf", "/tmp/signed.cpk", "-C", "/tmp/stage", "INFO", nullptr),
              0);
    check = run(kCli, {"check", "/tmp/signed.cpk"});
    EXPECT_EQ(check.status, 1);
    EXPECT_NE(check.out.find("pkgmgr:broken_package"), std::string::npos) << check.out;

    // Not signed at all.
    ASSERT_EQ(run(kCli, {"build", "/tmp/src/signed", "-o", "/tmp/unsigned.cpk"}).status, 0);
    check = run(kCli, {"check", "/tmp/unsigned.cpk"});
    EXPECT_EQ(check.status, 1);
    EXPECT_NE(check.out.find("pkgmgr:pkgmgr_no_signature"), std::string::npos) << check.out;
}

TEST(CliPackage, CheckAndInspectRefuseWhatIsNoPackageFile) {
    testutil::writeFile("/tmp/junk.cpk", "junk");
    const struct {
        std::vector<std::string> args;
        int status;
        const char* text;
    } cases[] = {
        {{"check", "/tmp/junk.cpk"}, 1, "pkgmgr:pkgmgr_file_not_package"},
        {{"check", "/tmp"}, 1, "PKG_ERR_FILE_ACCESS"},
        {{"inspect", "/tmp/missing.cpk"}, 1, "PKG_ERR_FILE_ACCESS"},
        {{"inspect", "/tmp/junk.cpk"}, 1, "PKG_ERR_BROKEN"},
        {{"build", "/tmp/nosource"}, 1, "PKG_ERR_BROKEN"},
    };
    for (const auto& c : cases) {
        std::vector<std::string> args = c.args;
        args.push_back("-v");  // the code's name as well as the words
        auto r = run(kCli, args);
        EXPECT_EQ(r.status, c.status) << testing::PrintToString(c.args);
        EXPECT_NE((r.out + r.err).find(c.text), std::string::npos)
            << testing::PrintToString(c.args) << "\n"
            << r.out << r.err;
    }
}

TEST(CliPackage, DependencyOrdersFromTheCommandLine) {
    TestPackage app = source("app");
    app.info["install_dep_packages"] = "lib>=1.0";
    ASSERT_TRUE(testutil::installRunning(app));
    ASSERT_TRUE(testutil::installRunning(source("lib")));
    testutil::installFixture(source("idle"));

    auto deps = run(kCli, {"deps", "lib", "--json"});
    ASSERT_EQ(deps.status, 0) << deps.err;
    Json::Value out;
    ASSERT_TRUE(CORVPackageTool::fromString(deps.out, out)) << deps.out;
    EXPECT_EQ(CORVPackageTool::toString(out["stop_order"]), R"(["app","lib"])");
    EXPECT_EQ(CORVPackageTool::toString(out["needed_by"]), R"(["app"])");

    auto appDeps = run(kCli, {"deps", "app"});
    EXPECT_NE(appDeps.out.find("lib >= 1.0"), std::string::npos) << appDeps.out;

    auto order = run(kCli, {"order", "--json"});
    ASSERT_EQ(order.status, 0);
    ASSERT_TRUE(CORVPackageTool::fromString(order.out, out));
    std::string text = CORVPackageTool::toString(out);
    EXPECT_LT(text.find("\"lib\""), text.find("\"app\"")) << "installing goes lib first: " << text;

    EXPECT_EQ(run(kCli, {"deps", "absent"}).status, 1);

    const struct {
        const char* a;
        const char* op;
        const char* b;
        int status;
    } compares[] = {
        {"1.10", ">", "1.9", 0},     {"1.2", "=", "1.2.0", 0}, {"1.2", "<", "1.2-5", 0},
        {"2.0", "<=", "1.9.9", 1},   {"1.0", "~", "1.0", 2},   {"abc", "<", "1.0", 2},
        {"1.0", "=", "1.0-beta", 2},
    };
    for (const auto& c : compares) {
        EXPECT_EQ(run(kCli, {"version-compare", c.a, c.op, c.b}).status, c.status)
            << c.a << " " << c.op << " " << c.b;
    }
}

TEST(CliPackage, ListAndStatusOfInstalledPackages) {
    ASSERT_TRUE(testutil::installRunning(source("up")));
    testutil::installFixture(source("down"));
    auto list = run(kCli, {"list", "--json"});
    ASSERT_EQ(list.status, 0);
    Json::Value rows;
    ASSERT_TRUE(CORVPackageTool::fromString(list.out, rows)) << list.out;
    ASSERT_EQ(rows.size(), 2u);
    EXPECT_EQ(rows[0]["package"].asString(), "down") << "sorted by name: " << list.out;
    for (const Json::Value& row : rows) {
        ASSERT_NE(row["package"].asString(), "half");
        EXPECT_EQ(row["volume"].asString(), "/volume1");
        EXPECT_EQ(row["status_word"].asString(),
                  row["package"].asString() == "up" ? "running" : "stopped");
    }
    TestPackage half = source("half");
    testutil::installFixture(half);
    testutil::writeFile("/var/packages/half/installing", "");
    auto broken = run(kCli, {"status", "half"});
    EXPECT_EQ(broken.status, 2) << "an interrupted install is broken";
    EXPECT_NE(broken.out.find("broken"), std::string::npos) << broken.out;
    EXPECT_EQ(run(kCli, {"status", "up"}).status, 0);
    EXPECT_EQ(run(kCli, {"status", "down"}).status, 1);
    EXPECT_EQ(run(kCli, {"status", "absent"}).status, 3);
    auto log = run(kCli, {"log", "up"});
    EXPECT_EQ(log.status, 0);
    EXPECT_EQ(log.out, "log of the package\n");
}
