// Dependency lists in JSON, and back.
#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <vector>

#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "support/dep_entries.h"

using namespace CORVPackageTool;
TEST(DepJson, Parse) {
    const struct {
        const char* json;
        int count;
        std::vector<testutil::DepEntry> expected;
    } cases[] = {
        {R"({"a": {">=": "1.0", "<=": "2.0"}})", 1, {{"a", "1.0", 4}, {"a", "2.0", 5}}},
        {R"({"a": {"pkg_min_ver": "1.0", ">=": "2.0"}})", 1, {{"a", "1.0", 4}}},
        {R"({"a": {"pkg_min_ver": "", ">=": "2.0"}})", 1, {{"a", "2.0", 4}}},
        {R"({"a": {"nos_min_ver": "99.0-0"}})", 0, {}},
        {R"({"a": {"nos_max_ver": "7.0-0"}})", 1, {{"a", "0", 0}}},
        {R"({"a": {"nos_max_ver": "6.0-0"}})", 0, {}},
        {R"({"Python": {}, "b": 1})", 2, {{"b", "0", 0}}},
        {R"({"a": {"<": "3", ">": "1", "=": "2"}})",
         1,
         {{"a", "3", 3}, {"a", "1", 2}, {"a", "2", 1}}},
        {R"({"a": {"=": "2"}})", 1, {{"a", "2", 1}}},
        {R"({"a": {"unknown": "2"}})", 1, {{"a", "0", 0}}},
        {R"({"a": {">=": 5}})", 1, {{"a", "0", 0}}},
        {R"({"a": {"nos_min_ver": 5}})", 1, {{"a", "0", 0}}},
        {R"([1, 2])", 0, {}},
        {R"("text")", 0, {}},
        {R"({})", 0, {}},
    };
    for (const auto& c : cases) {
        DepPkgVector deps;
        EXPECT_EQ(PMSParseDepJSONString(c.json, deps), c.count) << c.json;
        EXPECT_EQ(testutil::depEntries(deps), c.expected) << c.json;
    }
    DepPkgVector deps;
    EXPECT_EQ(PMSParseDepJSONString("", deps), 0);
    EXPECT_EQ(PMSParseDepJSONString("{\"a\":", deps), -1);
    EXPECT_TRUE(deps.empty());
}

TEST(DepJson, RoundTrip) {
    DepPkgVector deps;
    ASSERT_EQ(PMSParseDepJSONString(R"({"a": {">=": "1.0", "<=": "2.0"}, "b": {}})", deps), 2);
    Json::Value out;
    deps.toJSON(out);
    EXPECT_EQ(toString(out), R"({"a":{"<=":"2.0",">=":"1.0"},"b":""})");

    DepPkgVector none;
    none.toJSON(out);
    EXPECT_TRUE(out.isNull());

    PackageBasicInfoMap map;
    map.insertPackagae("x", "1", true, PKG_COMPOP_GE);
    map.insertPackagae("x", "2", false, PKG_COMPOP_LE);
    ASSERT_EQ(map.size(), 1u);
    EXPECT_EQ(map["x"].version, "1");
    EXPECT_TRUE(map["x"].beta);
}
