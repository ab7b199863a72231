// Version comparison and the OS limits of packages.
#include <gtest/gtest.h>

#include <string>

#include "corvpkg/pkgtool.h"

using namespace CORVPackageTool;

namespace {

// -1, 0 or 1 as the relation of `self` to `other`, read through the operators.
int relation(const char* self, const char* other) {
    PackageBasicInfo a("p", self);
    PackageBasicInfo b("p", other);
    bool eq = a.compare(b, PKG_COMPOP_EQ);
    bool gt = a.compare(b, PKG_COMPOP_GT);
    bool lt = a.compare(b, PKG_COMPOP_LT);
    EXPECT_EQ(eq + gt + lt, 1) << self << " vs " << other;
    EXPECT_EQ(a.compare(b, PKG_COMPOP_GE), eq || gt) << self << " vs " << other;
    EXPECT_EQ(a.compare(b, PKG_COMPOP_LE), eq || lt) << self << " vs " << other;
    return gt ? 1 : (lt ? -1 : 0);
}

}  // namespace

TEST(Version, CompareTable) {
    const struct {
        const char* self;
        const char* other;
        int r;
    } cases[] = {
        {"1.2", "1.2.0", 0},
        {"1.2-3", "1.2.0-3", 0},
        {"1.2-0045", "1.2-45", 0},
        {"1.2", "1.2-5", -1},
        {"1.2-5", "1.2", 1},
        {"1.2-0", "1.2", 0},
        {"1.10", "1.9", 1},
        {"2.0", "1.9.9", 1},
        {"1.2-3-9", "1.2-3-1", 0},
        {"1.2b", "1.2a", 0},
        {"1.0.0-0001", "1.0.0-0002", -1},
        {"1.", "1", 0},
        {"1.2.", "1.2.1", -1},
        {"10", "9", 1},
        {"1.0", "1.0.1", -1},
        {"1.0.1", "1.0", 1},
        {"0.9-1", "0.9", 1},
        {"1.0-0", "1.0-1", -1},
        {"1.2.3-4", "1.2.3-4", 0},
        {"1.2.3", "1.2.3.0.0", 0},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(relation(c.self, c.other), c.r) << c.self << " vs " << c.other;
    }
}

TEST(Version, NamesAndOperators) {
    PackageBasicInfo a("a", "1.0");
    PackageBasicInfo b("b", "1.0");
    EXPECT_FALSE(a.compare(b, PKG_COMPOP_NONE));
    EXPECT_FALSE(a.compare(b, PKG_COMPOP_EQ));
    EXPECT_TRUE(a.compare(a, PKG_COMPOP_NONE));
    EXPECT_TRUE(a.compare(PackageBasicInfo("a", "9"), static_cast<PKG_VERSION_COMPOP>(6)));
    PackageBasicInfo ab("ab", "1.0");
    EXPECT_FALSE(a.compare(ab, PKG_COMPOP_NONE));
}

TEST(Version, BadTextsNeverMatch) {
    const char* bad[] = {"", "-", "--", "---"};
    for (const char* text : bad) {
        PackageBasicInfo a("p", text);
        PackageBasicInfo b("p", "1.0");
        EXPECT_FALSE(a.compare(b, PKG_COMPOP_NONE)) << "[" << text << "]";
        EXPECT_FALSE(b.compare(a, PKG_COMPOP_GE)) << "[" << text << "]";
    }
    // Long texts do not overflow anything.
    std::string longVersion;
    for (int i = 0; i < 300; ++i) {
        longVersion += "1.";
    }
    longVersion += "2";
    PackageBasicInfo a("p", longVersion);
    PackageBasicInfo b("p", "1");
    EXPECT_TRUE(a.compare(b, PKG_COMPOP_GT));
    EXPECT_TRUE(b.compare(a, PKG_COMPOP_LT));
    EXPECT_TRUE(a.compare(a, PKG_COMPOP_EQ));
}

TEST(Version, NormalForm) {
    const struct {
        const char* version;
        const char* reference;
        const char* normal;
    } cases[] = {
        {"1.2", "1.2.3-4", "1.2.0"}, {"1.2-5", "1", "1.2-5"}, {"1-2-3", "1.1.1", "1.0.0-2"},
        {"1", "1.2.3", "1.0.0"},     {"1.2.3", "1", "1.2.3"},
    };
    for (const auto& c : cases) {
        std::string normal;
        ASSERT_TRUE(NormalizeVersion(c.version, c.reference, normal)) << c.version;
        EXPECT_EQ(normal, c.normal) << c.version << " against " << c.reference;
    }
    std::string normal = "untouched";
    EXPECT_FALSE(NormalizeVersion("", "1", normal));
    EXPECT_EQ(normal, "untouched");
}

TEST(Version, OSLimitsOfAPackage) {
    const struct {
        int min[3];
        int max[3];
        int expected;
    } cases[] = {
        {{0, 0, 0}, {6, 1, 15101}, 0}, {{0, 0, 0}, {6, 1, 15100}, 1},
        {{0, 0, 0}, {6, 0, 9999}, 1},  {{6, 1, 15102}, {0, 0, 0}, -1},
        {{7, 0, 0}, {0, 0, 0}, -1},    {{0, 0, 0}, {0, 1, 0}, 1},
        {{0, 0, 0}, {0, 0, 0}, 0},     {{6, 1, 15101}, {6, 1, 15101}, 0},
        {{7, 0, 0}, {6, 0, 0}, -1},
    };
    for (const auto& c : cases) {
        PackageInfo info;
        for (int i = 0; i < 3; ++i) {
            PMSGetOSMinVer(info)[i] = c.min[i];
            PMSGetOSMaxVer(info)[i] = c.max[i];
        }
        EXPECT_EQ(PMSComparePackageAndOSVersion(info), c.expected)
            << c.min[0] << "." << c.min[1] << "-" << c.min[2] << " .. " << c.max[0] << "."
            << c.max[1] << "-" << c.max[2];
        EXPECT_EQ(PMSCheckPackageVersionVaild(info), c.expected == 0);
    }
}
