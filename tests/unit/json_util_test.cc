#include "corvpkg/json_util.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "support/temp_dir.h"

using namespace CORVPackageTool;

TEST(JsonUtil, RoundTripThroughTextAndFile) {
    Json::Value v(Json::objectValue);
    v["name"] = "hello";
    v["list"].append(1);
    v["list"].append("two");
    EXPECT_EQ(toString(v), R"({"list":[1,"two"],"name":"hello"})");

    Json::Value back;
    ASSERT_TRUE(fromString(toString(v), back));
    EXPECT_EQ(back, v);

    TempDir dir;
    std::string path = dir.path() + "/x.json";
    ASSERT_TRUE(toFile(v, path));
    Json::Value fromDisk;
    ASSERT_TRUE(fromFile(path, fromDisk));
    EXPECT_EQ(fromDisk, v);
}

TEST(JsonUtil, RefusesWhatIsNotJson) {
    const char* bad[] = {"", "{", "[1,", "{\"a\":}", "nul"};
    for (const char* text : bad) {
        Json::Value v(5);
        EXPECT_FALSE(fromString(text, v)) << "input: [" << text << "]";
        EXPECT_TRUE(v.isNull()) << "input: [" << text << "]";
    }
    Json::Value v;
    EXPECT_FALSE(fromFile("/nonexistent/file.json", v));
    EXPECT_FALSE(toFile(v, "/nonexistent/dir/file.json"));
}
