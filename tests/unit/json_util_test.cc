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

// The compact text is written without jsoncpp's stream writer; it must stay byte for byte
// what that writer gives, since caches and command output are compared as text.
TEST(JsonUtil, CompactTextIsJsoncppText) {
    const char* docs[] = {"null",
                          "true",
                          "0",
                          "-12",
                          "18446744073709551615",
                          "-9223372036854775808",
                          "1.5",
                          "0.1",
                          "1e300",
                          "-0.0",
                          "\"\"",
                          "\"plain / text\"",
                          "\"quote \\\" back \\\\ slash\"",
                          "\"\\b\\f\\n\\r\\t\\u0001\\u001f\\u007f\"",
                          "\"caf\\u00e9 \\ud83d\\ude00\"",
                          "[]",
                          "{}",
                          "[[],{},[null]]",
                          "{\"b\":1,\"a\":[1,\"x\",{\"\\n\":false}],\"\\u00e9\":2.25}",
                          "{\"ab\":1,\"a\":2,\"b\":3,\"\":4}"};
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    for (const char* doc : docs) {
        Json::Value value;
        ASSERT_TRUE(fromString(doc, value)) << doc;
        EXPECT_EQ(toString(value), Json::writeString(builder, value)) << doc;
    }
    Json::Value sparse(Json::arrayValue);
    sparse[3] = "last";
    EXPECT_EQ(toString(sparse), "[null,null,null,\"last\"]");
    Json::Value raw(std::string("nul\0byte \xff", 10));
    EXPECT_EQ(toString(raw), Json::writeString(builder, raw));
    Json::Value commented(Json::objectValue);
    commented["a"] = 1;
    commented["a"].setComment(std::string("// note"), Json::commentBefore);
    EXPECT_EQ(toString(commented), Json::writeString(builder, commented));
}
