// Dependency lists in their string and section-file forms.
#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <vector>

#include "corvpkg/pkgtool.h"
#include "support/dep_entries.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;
TEST(DepString, Grammar) {
    const struct {
        const char* text;
        std::vector<testutil::DepEntry> expected;
    } cases[] = {
        {"a>=1.0", {{"a", "1.0", 4}}},
        {"a>=", {}},
        {"a", {{"a", "0", 0}}},
        {"a<=1:b", {{"a", "1", 5}, {"b", "0", 0}}},
        {"::a::", {{"a", "0", 0}}},
        {"a=b<1", {{"a=b", "1", 3}}},
        {"a>2", {{"a", "2", 2}}},
        {"a=2", {{"a", "2", 1}}},
        {"a<2", {{"a", "2", 3}}},
        {"Python>=2.7:a", {{"a", "0", 0}}},
        {"pkgA>=1.0:pkgB:pkgC<2.0", {{"pkgA", "1.0", 4}, {"pkgB", "0", 0}, {"pkgC", "2.0", 3}}},
        {"a b>=1 2", {{"a b", "1 2", 4}}},
        {"a<=1>=2", {{"a", "1>=2", 5}}},
        {"", {}},
        {":::", {}},
        {"a=", {}},
    };
    for (const auto& c : cases) {
        DepPkgVector deps;
        PMSExplodeDepPKGString(c.text, deps);
        EXPECT_EQ(testutil::depEntries(deps), c.expected) << "input: [" << c.text << "]";
    }
    DepPkgVector none;
    PMSExplodeDepPKGString(nullptr, none);
    EXPECT_TRUE(none.empty());
}

TEST(DepString, ExplodeStringCollapsesSeparators) {
    EXPECT_EQ(PMSExplodeString("", ":"), std::vector<std::string>{});
    EXPECT_EQ(PMSExplodeString("::", ":"), std::vector<std::string>{});
    EXPECT_EQ(PMSExplodeString(" a  b\tc ", " \t"), (std::vector<std::string>{"a", "b", "c"}));
    EXPECT_EQ(PMSExplodeString("a:b;c", ":;"), (std::vector<std::string>{"a", "b", "c"}));
}

TEST(DepConfFile, SectionsAndOSRanges) {
    const struct {
        const char* what;
        std::string file;
        std::vector<testutil::DepEntry> expected;
    } cases[] = {
        {"lower bound", "[a]\npkg_min_ver=1.0\n", {{"a", "1.0", 4}}},
        {"range", "[a]\npkg_min_ver=1\npkg_max_ver=2\n", {{"a", "1", 4}, {"a", "2", 5}}},
        {"unbounded", "[a]\n", {{"a", "0", 0}}},
        {"OS new enough: unbounded entry", "[a]\nnos_min_ver=6.1-15000\n", {{"a", "0", 0}}},
        {"OS exactly the minimum", "[a]\nnos_min_ver=6.1-15101\n", {{"a", "0", 0}}},
        {"OS too old for the section", "[a]\nnos_min_ver=6.1-15102\n", {}},
        {"OS too new for the section", "[a]\nnos_max_ver=6.0-0\n", {}},
        {"OS exactly the maximum", "[a]\nnos_max_ver=6.1-15101\npkg_max_ver=3\n", {{"a", "3", 5}}},
        {"Python is never a dependency", "[Python]\npkg_min_ver=2\n[b]\n", {{"b", "0", 0}}},
        {"sections in file order", "[z]\n[a]\npkg_min_ver=1\n", {{"z", "0", 0}, {"a", "1", 4}}},
        {"empty file", "", {}},
    };
    for (const auto& c : cases) {
        TempDir dir;
        std::string path = dir.path() + "/PKG_DEPS";
        testutil::writeFile(path, c.file);
        DepPkgVector deps;
        EXPECT_GE(PMSLoadDepConfFile(path.c_str(), deps), 0) << c.what;
        EXPECT_EQ(testutil::depEntries(deps), c.expected) << c.what << "\n" << c.file;
    }
}

TEST(DepConfFile, Failures) {
    DepPkgVector deps;
    EXPECT_LT(PMSLoadDepConfFile(nullptr, deps), 0);
    EXPECT_LT(PMSLoadDepConfFile("/nonexistent/PKG_DEPS", deps), 0);
    EXPECT_TRUE(deps.empty());
}

TEST(OSVersion, CompareWithThisOS) {
    const struct {
        int v[3];
        int expected;
    } cases[] = {
        {{0, 0, 0}, 0},     {{0, 1, 0}, 1},      {{0, 0, 1}, 1},  {{5, 9, 99999}, 1},
        {{7, 0, 0}, -1},    {{6, 0, 99999}, 1},  {{6, 2, 0}, -1}, {{6, 1, 15100}, 1},
        {{6, 1, 15101}, 0}, {{6, 1, 15102}, -1}, {{-1, 0, 0}, 1},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(PMSCompareOSVersion(c.v), c.expected) << c.v[0] << "." << c.v[1] << "-" << c.v[2];
    }
}
