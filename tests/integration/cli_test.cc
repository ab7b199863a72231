// The corvpkg command line as a person and a script use it.
#include <gtest/gtest.h>

#include <string>

#include "corvpkg/json_util.h"
#include "support/files.h"
#include "support/run.h"

using testutil::run;

namespace {
const std::string kCli = CORVPKG_CLI_PATH;
const std::string kHello = std::string(CORVPKG_SOURCE_DIR) + "/examples/hello";
}  // namespace

TEST(Cli, HelpAndVersion) {
    auto help = run(kCli, {"--help"});
    EXPECT_EQ(help.status, 0);
    EXPECT_NE(help.out.find("info"), std::string::npos);
    EXPECT_NE(help.out.find("system"), std::string::npos);
    auto version = run(kCli, {"--version"});
    EXPECT_EQ(version.status, 0);
    EXPECT_NE(version.out.find("NOS 6.1-15101"), std::string::npos) << version.out;
    auto infoHelp = run(kCli, {"info", "--help"});
    EXPECT_EQ(infoHelp.status, 0);
    EXPECT_EQ(infoHelp.out.rfind("usage: corvpkg info", 0), 0u) << infoHelp.out;

    const struct {
        std::vector<std::string> args;
        const char* message;
    } usage[] = {
        {{}, "usage: corvpkg"},
        {{"frobnicate"}, "unknown command 'frobnicate'"},
        {{"info"}, "give exactly one package directory"},
        {{"info", "a", "b"}, "give exactly one package directory"},
        {{"info", "--bogus", "x"}, "unknown option --bogus"},
        {{"info", "x", "--lang"}, "--lang needs a value"},
        {{"system", "--size", "-5"}, "--size takes a number of bytes"},
        {{"system", "--json=1"}, "--json takes no value"},
    };
    for (const auto& c : usage) {
        auto r = run(kCli, c.args);
        EXPECT_EQ(r.status, 2) << testing::PrintToString(c.args);
        EXPECT_NE((r.out + r.err).find(c.message), std::string::npos)
            << testing::PrintToString(c.args) << "\n"
            << r.out << r.err;
    }
}

TEST(Cli, InfoOfTheExamplePackage) {
    auto text = run(kCli, {"info", kHello, "--lang", "ger"});
    ASSERT_EQ(text.status, 0) << text.err;
    EXPECT_NE(text.out.find("package:               hello"), std::string::npos) << text.out;
    EXPECT_NE(text.out.find("displayname:           Hallo"), std::string::npos) << text.out;

    auto json = run(kCli, {"info", kHello, "--json"});
    ASSERT_EQ(json.status, 0) << json.err;
    Json::Value record;
    ASSERT_TRUE(CORVPackageTool::fromString(json.out, record)) << json.out;
    EXPECT_EQ(record["package"].asString(), "hello");
    EXPECT_EQ(record["version"].asString(), "1.0.0-0001");
    EXPECT_EQ(record["adminport"].asInt(), 8765);
    EXPECT_EQ(record["os_min_ver"].asString(), "6.0-0");
    EXPECT_EQ(record["extractsize"].asInt(), 8192);
}

TEST(Cli, InfoFailuresNameTheCodeAndTheReason) {
    testutil::writeFile("/tmp/bad/INFO", "package=bad/name\nversion=1\n");
    testutil::writeFile("/tmp/port/INFO",
                        "package=p\nversion=1\nmaintainer=m\ndescription=d\nadminport=70000\n");
    const struct {
        std::string dir;
        const char* reason;
    } cases[] = {
        {"/tmp/missing", "is not a directory"},
        {"/tmp", "has no INFO file"},
        {"/tmp/bad", "key [package] bad/name is illegal"},
        {"/tmp/port", "key [adminport] 70000 is illegal"},
    };
    for (const auto& c : cases) {
        auto r = run(kCli, {"info", c.dir, "-v"});
        EXPECT_EQ(r.status, 1) << c.dir;
        EXPECT_NE(r.err.find("error: The directory " + c.dir + " is not a package"),
                  std::string::npos)
            << r.err;
        EXPECT_NE(r.err.find("result: PKG_ERR_BROKEN (150)"), std::string::npos) << r.err;
        EXPECT_NE(r.err.find(c.reason), std::string::npos) << c.dir << ": " << r.err;

        auto j = run(kCli, {"info", c.dir, "--json"});
        EXPECT_EQ(j.status, 1);
        Json::Value failure;
        ASSERT_TRUE(CORVPackageTool::fromString(j.out, failure)) << j.out;
        EXPECT_FALSE(failure["success"].asBool());
        EXPECT_EQ(failure["name"].asString(), "PKG_ERR_BROKEN");
    }
}

TEST(Cli, SystemShowsTheSandboxVolume) {
    auto r = run(kCli, {"system", "--json", "--size", "1048576"});
    ASSERT_EQ(r.status, 0) << r.err;
    Json::Value info;
    ASSERT_TRUE(CORVPackageTool::fromString(r.out, info)) << r.out;
    EXPECT_EQ(info["os_version"].asString(), "6.1-15101");
    EXPECT_FALSE(info["platform"].asString().empty());
    EXPECT_NE(info["arch"].asString(), "0x00000000");
    ASSERT_EQ(info["volumes"].size(), 1u) << r.out;
    EXPECT_EQ(info["volumes"][0]["path"].asString(), "/volume1");
    EXPECT_TRUE(info["volumes"][0]["ready"].asBool());
    EXPECT_EQ(info["temporary"]["dir"].asString(), "/volume1/@tmp");

    auto text = run(kCli, {"system"});
    ASSERT_EQ(text.status, 0);
    EXPECT_NE(text.out.find("/volume1"), std::string::npos) << text.out;
    EXPECT_NE(text.out.find("ready"), std::string::npos) << text.out;
}
