// The maker's version limits for third-party packages.
#include <gtest/gtest.h>

#include <string>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglimit.h"
#include "support/files.h"

using namespace CORVPackageTool;

TEST(Limits, Forms) {
    // JSON values stand unquoted: the key-value format strips only surrounding double quotes.
    testutil::writeFile(PKG_LIMIT_CONF,
                        "range=[\"1.0\", \"2.0\"]\n"
                        "mixed=[[\"1.0\"], [\"2.0\", \"3.0\"]]\n"
                        "single=[[\"1.0\"]]\n"
                        "plain=\"1.5-0010\"\n"
                        "sys=\"system\"\n"
                        "non=\"non\"\n"
                        "broken=[[\"1.0\"], 5]\n");
    const struct {
        const char* name;
        const char* version;
        int result;
        const char* limit;  // expected `limit` afterwards; null: untouched
    } cases[] = {
        {"nolimit", "1.0", 0, nullptr},       {"range", "1.5", -2, "2.0"},
        {"range", "1.0", 0, nullptr},         {"range", "2.0", 0, nullptr},
        {"mixed", "0.9", -2, "3.0"},          {"mixed", "2.5", -2, "3.0"},
        {"mixed", "1.5", 0, "1.5"},           {"single", "1.2", 0, "1.2"},
        {"plain", "1.5-0010", 0, "1.5-0010"}, {"plain", "1.5-0009", -2, "1.5-0010"},
        {"plain", "1.10", 0, "1.5-0010"},     {"sys", "1.0", -3, nullptr},
        {"non", "1.0", -4, nullptr},          {"broken", "2.0", -1, nullptr},
        {"broken", "0.5", -2, nullptr},
    };
    for (const auto& c : cases) {
        std::string limit = "untouched";
        EXPECT_EQ(PMSThirdPartyCheckLimit(c.name, c.version, limit), c.result)
            << c.name << " " << c.version;
        if (c.limit) {
            EXPECT_EQ(limit, c.limit) << c.name << " " << c.version;
        }
    }
    EXPECT_EQ(PMSThirdPartyCheckLimit(nullptr, "1"), -1);
    EXPECT_EQ(PMSThirdPartyCheckLimit("x", nullptr), -1);
}

TEST(Limits, StartDecision) {
    testutil::writeFile(PKG_LIMIT_CONF, "old=\"2.0\"\nnon=\"non\"\nsys=\"system\"\n");
    const struct {
        const char* name;
        bool ok;
        PKG_ERRCODE result;
    } cases[] = {
        {"free", true, PKG_OK},
        {"old", false, PKG_ERR_BELOW_VERSION_LIMIT},
        {"non", false, PKG_ERR_LIMIT_BLOCKED},
        {"sys", false, PKG_ERR_LIMIT_PROHIBITED},
    };
    for (const auto& c : cases) {
        PackageManager pm;
        PackageInfo info;
        info.package = c.name;
        info.version = "1.0";
        EXPECT_EQ(pm.CanPackageStartInThisFirmware(info), c.ok) << c.name;
        EXPECT_EQ(pm.getResult(), c.result) << c.name;
    }
    PackageManager pm;
    PackageInfo info;
    info.package = "old";
    info.version = "1.0";
    pm.CanPackageStartInThisFirmware(info);
    EXPECT_EQ(pm.getMapParam("oldver"), "2.0");
    EXPECT_EQ(pm.getMapParam("curver"), "1.0");

    testutil::removeAll(PKG_LIMIT_CONF);
    PackageManager without;
    EXPECT_FALSE(without.CanPackageStartInThisFirmware(info)) << "an unreadable policy refuses";
    EXPECT_EQ(without.getResult(), PKG_ERR_LIMIT_OTHER);
}
