// The package author's kit from the command line: a new package is written, linted, built,
// installed and run; build refuses what lint finds; the examples lint without errors.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "corvpkg/json_util.h"
#include "support/files.h"
#include "support/run.h"

namespace {

testutil::RunResult corvpkg(const std::vector<std::string>& args) {
    return testutil::run(CORVPKG_CLI_PATH, args);
}

}  // namespace

TEST(CliKit, ANewPackageLintsBuildsInstallsAndRuns) {
    testutil::RunResult r = corvpkg({"new", "kitdemo", "/tmp/kitdemo"});
    ASSERT_EQ(r.status, 0) << r.err;
    r = corvpkg({"lint", "/tmp/kitdemo"});
    EXPECT_EQ(r.status, 0) << r.out;
    EXPECT_EQ(r.out, "/tmp/kitdemo: clean\n");
    r = corvpkg({"build", "/tmp/kitdemo", "-o", "/tmp/kitdemo.cpk"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.err, "") << "a clean package builds without findings";
    r = corvpkg({"install", "/tmp/kitdemo.cpk", "--no-verify"});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_EQ(corvpkg({"status", "kitdemo"}).status, 0) << "the skeleton's daemon runs";
    EXPECT_EQ(corvpkg({"stop", "kitdemo"}).status, 0);
    EXPECT_EQ(corvpkg({"status", "kitdemo"}).status, 1);
    EXPECT_EQ(corvpkg({"uninstall", "kitdemo"}).status, 0);

    // A postinst that would be skipped: build refuses, with the finding, unless forced.
    ASSERT_EQ(chmod("/tmp/kitdemo/scripts/postinst", 0644), 0);
    r = corvpkg({"build", "/tmp/kitdemo", "-o", "/tmp/broken.cpk", "--json"});
    EXPECT_EQ(r.status, 1);
    Json::Value out;
    ASSERT_TRUE(CORVPackageTool::fromString(r.out, out)) << r.out;
    EXPECT_EQ(out["data"][0]["file"].asString(), "scripts/postinst") << r.out;
    r = corvpkg({"build", "/tmp/kitdemo", "-o", "/tmp/broken.cpk", "--force"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_NE(r.err.find("error: scripts/postinst: lacks the execute bit"), std::string::npos)
        << r.err;
    r = corvpkg({"lint", "/tmp/broken.cpk", "--json"});
    EXPECT_EQ(r.status, 1);
    ASSERT_TRUE(CORVPackageTool::fromString(r.out, out)) << r.out;
    EXPECT_EQ(out.size(), 1u) << r.out;

    EXPECT_EQ(corvpkg({"new", "kitdemo", "/tmp/kitdemo"}).status, 1) << "the directory is used";
    EXPECT_EQ(corvpkg({"new", "a b", "/tmp/ab"}).status, 1) << "not a package name";
}

TEST(CliKit, TheExamplesLintWithoutErrors) {
    const std::string examples = std::string(CORVPKG_SOURCE_DIR) + "/examples/";
    for (const char* name : {"hello", "greeter"}) {
        testutil::RunResult r = corvpkg({"lint", examples + name});
        EXPECT_EQ(r.status, 0) << name << "\n" << r.out;
        EXPECT_EQ(r.out.find("error:"), std::string::npos) << r.out;
    }
}

// The example of docs/package-format.md: its code blocks tagged with a member's path are
// written over a new package's files, and the result must lint clean.
TEST(CliKit, TheFormatDocumentsExampleLintsClean) {
    const std::string doc =
        testutil::readFile(std::string(CORVPKG_SOURCE_DIR) + "/docs/package-format.md");
    ASSERT_EQ(corvpkg({"new", "memo", "/tmp/memo"}).status, 0);
    std::vector<std::string> written;
    for (size_t at = doc.find("\n```"); at != std::string::npos; at = doc.find("\n```", at + 1)) {
        const size_t tagEnd = doc.find('\n', at + 1);
        const std::string tag = doc.substr(at + 4, tagEnd - at - 4);
        const size_t end = doc.find("\n```", tagEnd);
        ASSERT_NE(end, std::string::npos) << "unclosed block " << tag;
        if (tag == "INFO" || tag.find('/') != std::string::npos) {
            const std::string path = "/tmp/memo/" + tag;
            testutil::writeFile(path, doc.substr(tagEnd + 1, end - tagEnd));
            if (tag.compare(0, 8, "scripts/") == 0) {
                chmod(path.c_str(), 0755);
            }
            written.push_back(tag);
        }
        at = end + 1;  // past the closing fence
    }
    EXPECT_EQ(written.size(), 5u) << testing::PrintToString(written);
    testutil::RunResult r = corvpkg({"lint", "/tmp/memo"});
    EXPECT_EQ(r.status, 0) << r.out;
    EXPECT_EQ(r.out, "/tmp/memo: clean\n");
}
