// The file helpers of the resource framework on temporary directories.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;
using namespace CORVPackageTool::Resource;

using testutil::modeOf;

namespace {

class Logged {
  public:
    Logged() {
        CORVLogSetSink([this](int prio, const std::string& line) {
            lines.push_back(std::to_string(prio) + " " + line);
        });
    }
    ~Logged() { CORVLogSetSink(nullptr); }
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

TEST(ResourceFiles, PathsOfTheTwoFiles) {
    EXPECT_EQ(RequestFilePath("demo", ""), "/var/packages/demo/conf/resource");
    EXPECT_EQ(OwnFilePath("demo", ""), "/var/packages/demo/conf/resource.own");
    EXPECT_EQ(RequestFilePath("demo", "/tmp/x"), "/tmp/x/conf/resource");
    EXPECT_EQ(OwnFilePath("demo", "/tmp/x"), "/tmp/x/conf/resource.own");
}

TEST(ResourceFiles, ReadJsonFileTellsMissingFromUnreadable) {
    TempDir tmp;
    const std::string dir = tmp.path();
    testutil::writeFile(dir + "/good", R"({"a":[1]})");
    testutil::writeFile(dir + "/bad", R"({"a":)");
    testutil::writeFile(dir + "/empty", "");
    struct {
        std::string path;
        bool ok;
        int error;
    } const kCases[] = {
        {dir + "/good", true, 0},
        {dir + "/missing", false, ERR_NO_SUCH_FILE},
        {dir, false, ERR_NO_SUCH_FILE},
        {dir + "/bad", false, ERR_READ_FAILED},
        {dir + "/empty", false, ERR_READ_FAILED},
    };
    for (const auto& c : kCases) {
        Logged log;
        Json::Value value;
        VLIBCErrSet(0);
        EXPECT_EQ(ReadJsonFile(c.path, value), c.ok) << c.path;
        EXPECT_EQ(VLIBCErrGet(), c.error) << c.path;
        EXPECT_EQ(log.has("Failed to read " + c.path), c.error == ERR_READ_FAILED) << c.path;
        if (c.ok) {
            EXPECT_EQ(toString(value), R"({"a":[1]})");
        }
    }
}

TEST(ResourceFiles, WriteJsonFileLeavesAPrivateFile) {
    TempDir tmp;
    const std::string path = tmp.path() + "/own";
    Json::Value value(Json::objectValue);
    value["k"] = "v";
    ASSERT_TRUE(WriteJsonFile(path, value));
    EXPECT_EQ(modeOf(path), 0600u);
    Json::Value back;
    ASSERT_TRUE(ReadJsonFile(path, back));
    EXPECT_EQ(back, value);

    Logged log;
    VLIBCErrSet(0);
    EXPECT_FALSE(WriteJsonFile(tmp.path() + "/no/such/dir/own", value));
    EXPECT_EQ(VLIBCErrGet(), ERR_WRITE_FAILED);
    EXPECT_TRUE(log.has("Failed to write " + tmp.path() + "/no/such/dir/own"));
}

TEST(ResourceFiles, CreateFolderMakesTheConfDirectory) {
    TempDir tmp;
    const std::string dir = tmp.path() + "/pkginstall";
    ASSERT_EQ(mkdir(dir.c_str(), 0700), 0);
    EXPECT_TRUE(CreateFolder("demo", dir));
    EXPECT_EQ(modeOf(dir + "/conf"), 0755u);
    ASSERT_EQ(chmod((dir + "/conf").c_str(), 0700), 0);
    EXPECT_TRUE(CreateFolder("demo", dir)) << "an existing directory is fine";
    EXPECT_EQ(modeOf(dir + "/conf"), 0755u) << "and gets its mode back";

    Logged log;
    VLIBCErrSet(0);
    EXPECT_FALSE(CreateFolder("demo", tmp.path() + "/missing/parent"));
    EXPECT_EQ(VLIBCErrGet(), ERR_MKDIR_FAILED);
    EXPECT_TRUE(log.has("Failed to crate " + tmp.path() + "/missing/parent/conf"));
}

TEST(ResourceFiles, InitRequiredFieldsAddsServiceCfgOnlyWhenMissing) {
    struct {
        const char* before;  // null: no file
        bool ok;
        const char* after;  // null: the file is as before
    } const kCases[] = {
        {nullptr, true, R"({"service-cfg":{}})"},
        {R"({})", true, R"({"service-cfg":{}})"},
        {R"({"port-config":{"protocol-file":"x"}})", true,
         R"({"port-config":{"protocol-file":"x"},"service-cfg":{}})"},
        {R"({"service-cfg":{"jobs":1}})", true, nullptr},
        {R"({"service-cfg":"not an object"})", true, nullptr},
        {R"({"a":)", false, nullptr},
        {R"([1])", false, nullptr},
    };
    for (const auto& c : kCases) {
        TempDir tmp;
        const std::string dir = tmp.path();
        const std::string path = dir + "/conf/resource";
        if (c.before) {
            testutil::writeFile(path, c.before);
        }
        EXPECT_EQ(InitRequiredFields("demo", dir), c.ok) << (c.before ? c.before : "(none)");
        if (c.after) {
            Json::Value value;
            ASSERT_TRUE(ReadJsonFile(path, value)) << (c.before ? c.before : "(none)");
            EXPECT_EQ(toString(value), c.after) << (c.before ? c.before : "(none)");
        } else {
            EXPECT_EQ(testutil::readFile(path), c.before) << c.before;
        }
    }
}
