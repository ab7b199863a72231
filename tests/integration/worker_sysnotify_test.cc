// "sysnotify" with the platform's notification tools.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

const char kAggregate[] = "/var/cache/texts/enu/mails";
const char kCategories[] = "/var/cache/texts/enu/notification_category";
const char kSettings[] = "/usr/corv/etc/notification/setting.conf";
const char kLink[] = "/usr/local/share/notification/demo";

const char kDemoMails[] =
    "[DemoBackupDone]\nTitle=\"Backup done\"\nSubject=\"Backup of %NAME% done\"\n";

bool Has(const std::string& path, const std::string& text) {
    return testutil::readFile(path).find(text) != std::string::npos;
}

class SysnotifyWorker : public ::testing::Test {
  protected:
    void SetUp() override {
        pkg.conf["resource"] = R"({"sysnotify":{"texts_dir":"texts"}})";
        pkg.payload["texts/enu/mails"] = kDemoMails;
    }

    PackageInfo Install() {
        testutil::installFixture(pkg);
        PackageInfo info;
        EXPECT_TRUE(PMSLoadPKGInfoFile("/var/packages/demo", info, nullptr, PKG_INFO_MASK_ALL));
        return info;
    }

    testutil::TestPackage pkg{"demo"};
    CORV::PkgUtils::WorkerResp resp;
};

}  // namespace

TEST_F(SysnotifyWorker, TheTextsJoinTheAggregateUntilReleased) {
    const std::string system = testutil::readFile(kAggregate);
    ASSERT_NE(system.find("[PkgMgr_UpdateAvailable]"), std::string::npos);
    PackageInfo info = Install();
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_EQ(testutil::readFile(std::string(kLink) + "/enu/mails"), kDemoMails);
    EXPECT_TRUE(Has("/usr/local/share/notification/nos/enu/mails", "[PkgMgr_UpdateAvailable]"));
    EXPECT_EQ(testutil::readFile(kAggregate), system + kDemoMails);
    EXPECT_TRUE(Has(kCategories, "PkgMgr_UpdateAvailable=\"nos\"\n"));
    EXPECT_TRUE(Has(kCategories, "DemoBackupDone=\"demo\"\n"));
    EXPECT_TRUE(Has(kSettings, "DemoBackupDone=\"on\"\n"));

    ASSERT_TRUE(Resource::Release(Resource::TIMING_DISABLE, info, PKG_STOP, resp, nullptr, ""));
    EXPECT_FALSE(testutil::exists(kLink));
    EXPECT_EQ(testutil::readFile(kAggregate), system);
    EXPECT_FALSE(Has(kCategories, "DemoBackupDone"));
    EXPECT_FALSE(Has(kSettings, "DemoBackupDone"));
    EXPECT_TRUE(Has(kSettings, "PkgMgr_UpdateAvailable=\"on\"\n"));
}

TEST_F(SysnotifyWorker, APackageCannotReplaceTheSystemsTextsAndSettingsAreKept) {
    pkg.payload["texts/enu/mails"] =
        std::string(kDemoMails) + "[PkgMgr_UpdateAvailable]\nTitle=\"taken over\"\n";
    PackageInfo info = Install();
    testutil::writeFile(kSettings, "PkgMgr_UpdateAvailable=\"off\"\n");
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    EXPECT_FALSE(Has(kAggregate, "taken over"));
    EXPECT_TRUE(Has(kAggregate, "[DemoBackupDone]"));
    EXPECT_TRUE(Has(kCategories, "PkgMgr_UpdateAvailable=\"nos\"\n"));
    EXPECT_TRUE(Has(kSettings, "PkgMgr_UpdateAvailable=\"off\"\n"));
}

TEST_F(SysnotifyWorker, UpdateRerunsTheAcquire) {
    PackageInfo info = Install();
    ASSERT_TRUE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""));
    testutil::writeFile("/volume1/@appstore/demo/texts/enu/mails",
                        std::string(kDemoMails) + "[DemoRestoreDone]\nTitle=\"Restored\"\n");
    ASSERT_TRUE(Resource::Update(info, "sysnotify", Json::Value(Json::objectValue), resp));
    EXPECT_TRUE(Has(kAggregate, "[DemoRestoreDone]"));
    EXPECT_TRUE(Has(kSettings, "DemoRestoreDone=\"on\"\n"));
}

TEST_F(SysnotifyWorker, SectionsWithoutUsableTextsFail) {
    const struct {
        const char* section;
        int error;
    } kCases[] = {
        {"{}", 0x0600},
        {R"({"texts_dir":""})", 0x0600},
        {R"({"texts_dir":5})", 0x0600},
        {R"({"texts_dir":"nosuch"})", 0x0600},
        {R"({"texts_dir":"../../../../var/cache/texts"})", 0xBE00},
        {R"({"texts_dir":"/var/cache/texts"})", 0xBE00},
    };
    for (const auto& c : kCases) {
        pkg.conf["resource"] = std::string(R"({"sysnotify":)") + c.section + "}";
        PackageInfo info = Install();
        EXPECT_FALSE(Resource::Acquire(Resource::TIMING_ENABLE, info, PKG_START, resp, nullptr, ""))
            << c.section;
        EXPECT_EQ(VLIBCErrGet(), c.error) << c.section;
        EXPECT_FALSE(testutil::exists(kLink)) << c.section;
    }
}
