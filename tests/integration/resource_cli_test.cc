// corvpkg resource: a package's substituted request, its own-file and the workers of each
// phase, as the command line shows them.
#include <gtest/gtest.h>

#include <string>

#include "corvpkg/json_util.h"
#include "support/files.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using testutil::run;

namespace {

const std::string kCli = CORVPKG_CLI_PATH;
const char kPlugin[] = CORVPKG_TEST_PLUGIN_PATH;

class ResourceCli : public ::testing::Test {
  protected:
    void SetUp() override {
        auto help = run(kCli, {"--help"});
        if (help.out.find("  resource ") == std::string::npos) {
            GTEST_SKIP() << "the resource command is not in the command table";
        }
        testutil::TestPackage pkg("demo");
        pkg.conf["resource"] =
            R"({"port-like":{"file":"{{wizard_dir}}/p.sc","on":"{{enabled}}"},)"
            R"("plain":{"name":"demo-share"},"list":["{{a}}","b"],"text":"{{t}}"})";
        pkg.conf["resource.own"] = R"({"plain":{"made":true}})";
        testutil::installFixture(pkg);
        // One plug-in serves "plain" from postinst to postuninst.
        testutil::writeFile("/usr/local/share/corvpkg/global", R"({"providers":["prov"]})");
        testutil::writeFile("/usr/local/share/corvpkg/prov",
                            std::string(R"({"workers":[{"id":"plain","interval":"0x0022",)") +
                                R"("major":1,"minor":0,"path":")" + kPlugin + R"("}]})");
    }
};

}  // namespace

TEST_F(ResourceCli, JsonShowsTheSubstitutedRequestTheOwnFileAndThePhases) {
    auto result = run(kCli, {"resource", "demo", "--json"});
    ASSERT_EQ(result.status, 0) << result.err;
    Json::Value out;
    ASSERT_TRUE(CORVPackageTool::fromString(result.out, out)) << result.out;
    // Without wizard answers every placeholder goes, and the nulls with it.
    EXPECT_EQ(CORVPackageTool::toString(out["request"]),
              R"({"list":["b"],"plain":{"name":"demo-share"},"port-like":{}})");
    EXPECT_EQ(CORVPackageTool::toString(out["own"]), R"({"plain":{"made":true}})");
    EXPECT_EQ(out["request_path"].asString(), "/var/packages/demo/conf/resource");
    ASSERT_EQ(out["phases"].size(), 8u);
    const char* kWords[] = {"preinst",   "postinst",   "enable",  "startup",
                            "preuninst", "postuninst", "disable", "halt"};
    for (unsigned int i = 0; i < 8; ++i) {
        const Json::Value& phase = out["phases"][i];
        EXPECT_EQ(phase["phase"].asString(), kWords[i]);
        EXPECT_EQ(phase["timing"].asUInt(), 1u << i);
        EXPECT_EQ(phase["call"].asString(), i < 4 ? "acquire" : "release");
        const bool runs = (1u << i) == 0x02 || (1u << i) == 0x20;
        EXPECT_EQ(phase["workers"].size(), runs ? 1u : 0u) << kWords[i];
    }
    EXPECT_EQ(CORVPackageTool::toString(out["phases"][1]["workers"]),
              R"([{"id":"plain","interval":"0x0022","provider":"prov"}])");
}

TEST_F(ResourceCli, TextNamesTheWorkersByPhase) {
    auto result = run(kCli, {"resource", "demo"});
    ASSERT_EQ(result.status, 0) << result.err;
    EXPECT_NE(result.out.find("\"name\" : \"demo-share\""), std::string::npos) << result.out;
    EXPECT_EQ(result.out.find("{{"), std::string::npos) << result.out;
    EXPECT_NE(result.out.find("postinst    acquire  plain (prov, 0x0022)"), std::string::npos)
        << result.out;
    EXPECT_NE(result.out.find("enable      acquire  -"), std::string::npos) << result.out;
}

TEST_F(ResourceCli, FailuresSayWhy) {
    const struct {
        std::vector<std::string> args;
        int status;
        const char* text;
    } kCases[] = {
        {{"resource"}, 2, "give exactly one package name"},
        {{"resource", "nosuch", "--json"}, 1, "nosuch is not installed"},
        {{"resource", "../etc"}, 1, "is not installed"},
    };
    for (const auto& c : kCases) {
        auto result = run(kCli, c.args);
        EXPECT_EQ(result.status, c.status) << c.args.back();
        EXPECT_NE((result.out + result.err).find(c.text), std::string::npos)
            << c.args.back() << ": " << result.out << result.err;
    }
    testutil::writeFile("/var/packages/demo/conf/resource", "{ not json");
    auto bad = run(kCli, {"resource", "demo"});
    EXPECT_EQ(bad.status, 1);
    EXPECT_NE(bad.err.find("/var/packages/demo/conf/resource is not valid JSON"), std::string::npos)
        << bad.err;
    testutil::writeFile("/var/packages/demo/conf/resource", "{}");
    testutil::writeFile("/usr/local/share/corvpkg/global", "[]");
    auto providers = run(kCli, {"resource", "demo", "--json"});
    EXPECT_EQ(providers.status, 1);
    EXPECT_NE(providers.out.find("plug-in providers can't be read"), std::string::npos)
        << providers.out;
}

TEST_F(ResourceCli, SectionsNameTheirWorkersAndWarnAboutTheOthers) {
    auto result = run(kCli, {"resource", "demo", "--json"});
    ASSERT_EQ(result.status, 0) << result.err;
    Json::Value out;
    ASSERT_TRUE(CORVPackageTool::fromString(result.out, out)) << result.out;
    EXPECT_EQ(CORVPackageTool::toString(out["sections"]),
              R"([{"id":"list","workers":[]},{"id":"plain","workers":[{"interval":"0x0022",)"
              R"("phases":["postinst","postuninst"],"provider":"prov"}]},)"
              R"({"id":"port-like","workers":[]}])");
    EXPECT_EQ(CORVPackageTool::toString(out["warnings"]),
              R"(["the section \"list\" is not a JSON object: no worker runs for it",)"
              R"("no worker handles the section \"port-like\": it is passed over"])");

    auto text = run(kCli, {"resource", "demo"});
    ASSERT_EQ(text.status, 0) << text.err;
    EXPECT_NE(text.out.find("  plain                prov 0x0022 (postinst, postuninst)\n"),
              std::string::npos)
        << text.out;
    EXPECT_NE(text.out.find("  port-like            no worker\n"), std::string::npos) << text.out;
    EXPECT_NE(text.err.find("warning: no worker handles the section \"port-like\""),
              std::string::npos)
        << text.err;
}

TEST_F(ResourceCli, UpdateRunsTheWorkerOfTheSection) {
    // sysnotify updates by acquiring again; syslog-config can't update.
    testutil::writeFile("/var/packages/demo/conf/resource",
                        R"({"sysnotify":{"texts_dir":"texts"},"syslog-config":{}})");
    testutil::writeFile("/volume1/@appstore/demo/texts/enu/mails", "[DemoCliTag]\nTitle=\"t\"\n");
    auto updated = run(kCli, {"resource", "update", "demo", "sysnotify", "--json"});
    ASSERT_EQ(updated.status, 0) << updated.out << updated.err;
    EXPECT_EQ(updated.out,
              R"({"package":"demo","section":"sysnotify","success":true,"worker_msg":[]})"
              "\n");
    EXPECT_NE(testutil::readFile("/var/cache/texts/enu/mails").find("[DemoCliTag]"),
              std::string::npos);

    const struct {
        std::vector<std::string> args;
        int status;
        const char* text;
    } kCases[] = {
        {{"resource", "update", "demo", "syslog-config"},
         1,
         "the worker of \"syslog-config\" does not update"},
        {{"resource", "update", "demo", "nosuch-id"}, 1, "the update of \"nosuch-id\" failed"},
        {{"resource", "update", "nosuch", "sysnotify"}, 1, "nosuch is not installed"},
        {{"resource", "update", "demo"}, 2, "give a package name and a section to update"},
        {{"resource", "update", "demo", "sysnotify", "--args", "[1]"},
         2,
         "--args must be a JSON object"},
    };
    for (const auto& c : kCases) {
        auto result = run(kCli, c.args);
        EXPECT_EQ(result.status, c.status) << c.args[2] << " " << c.args.back();
        EXPECT_NE((result.out + result.err).find(c.text), std::string::npos)
            << c.args.back() << ": " << result.out << result.err;
    }
}
