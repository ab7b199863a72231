// The update check's scheduler job and the settings that decide whether it exists.
#include <gtest/gtest.h>
#include <string.h>

#include <regex>
#include <string>
#include <vector>

#include "corv/corvcrond.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgschedule.h"
#include "support/files.h"

using namespace CORVPackageTool;

namespace {

const char kStore[] = "/usr/corv/etc/corvcrond/sys-autopkgupgrade.json";
const char kCron[] = "/etc/cron.d/corvcrond_sys_autopkgupgrade";
const char kCommand[] = "/usr/corv/bin/corvpkg chkupgradepkg";
const char kWeekA[] = "~ ~ * * 1,2,3,4,6";
const char kWeekB[] = "~ ~ * * 0,1,2,3,5";

// The platform setup writes these three keys and nothing else into a fresh device's file.
const char kFreshInfo[] =
    "language=\"enu\"\ntimezone=\"UTC\"\npackage_update_channel=\"stable\"\n";

class Schedule : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(testutil::readFile(VLIBC_INFO_PATH), kFreshInfo);
        CORVLogSetSink([this](int, const std::string& line) { log.push_back(line); });
    }
    void TearDown() override { CORVLogSetSink(nullptr); }

    // Back to a fresh device between the rows of a table.
    void fresh(const std::string& extraInfo = "") {
        testutil::writeFile(VLIBC_INFO_PATH, kFreshInfo + extraInfo);
        testutil::removeAll(kStore);
        testutil::removeAll(kCron);
        log.clear();
    }

    static bool jobExists() { return CORV::CORVCrond::ConfigManager("autopkgupgrade", 0).Exist(); }
    static Json::Value savedJob() {
        Json::Value job;
        EXPECT_TRUE(fromFile(kStore, job)) << kStore;
        return job;
    }
    static std::string setting(const char* key) {
        char value[64] = {0};
        return VLIBCFileGetKeyValue(VLIBC_INFO_PATH, key, value, sizeof value, 0) > 0 ? value : "";
    }
    // A job of our own days, as a device that drew its pattern earlier has it.
    static void existingJob(int week) {
        CORVSCHEDULE schedule;
        memset(&schedule, 0, sizeof schedule);
        schedule.week = week;
        strcpy(schedule.cmd, kCommand);
        ASSERT_TRUE(PMSCORVCrondSet(&schedule));
    }
    bool logged(const std::string& pattern) const {
        for (const std::string& line : log) {
            if (std::regex_search(line, std::regex(pattern))) {
                return true;
            }
        }
        return false;
    }

    std::vector<std::string> log;
};

bool OneOfThePatterns(const std::string& crontab) {
    return crontab == kWeekA || crontab == kWeekB;
}

}  // namespace

TEST_F(Schedule, DefaultsOnAFreshDevice) {
    PMSSavaDefNotify();
    EXPECT_EQ(setting("upgrade_pkg_nos_notification"), "yes");
    EXPECT_EQ(setting("upgrade_pkg_email_notification"), "no");
    EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH).find("enable_pkg_autoupdate_all"),
              std::string::npos)
        << "automatic update is left as it was";

    ASSERT_TRUE(jobExists());
    Json::Value job = savedJob();
    EXPECT_EQ(job["name"].asString(), "autopkgupgrade");
    EXPECT_EQ(job["cmd"].asString(), kCommand);
    EXPECT_EQ(job["user"].asString(), "root");
    EXPECT_EQ(job["period"].asString(), "crontab");
    EXPECT_TRUE(OneOfThePatterns(job["crontab"].asString())) << job["crontab"].asString();
    EXPECT_EQ(job["expire"], Json::Value(24));
    EXPECT_EQ(job["expire_action"].asString(), "skip");
    EXPECT_EQ(job["assure_execute"], Json::Value(168));
    EXPECT_EQ(job.size(), 8u) << toString(job);

    // The scheduler really runs it: a cron line at a fixed time on the job's days.
    const std::string days = job["crontab"].asString().substr(8);
    EXPECT_TRUE(std::regex_search(
        testutil::readFile(kCron),
        std::regex("\n[0-9]+ [0-9]+ \\* \\* " + days + " root " + kCommand + "\n")))
        << testutil::readFile(kCron);
}

TEST_F(Schedule, DefaultsLeaveAConfiguredDeviceAlone) {
    const char* configured[] = {
        "upgrade_pkg_nos_notification=\"no\"\n",
        "upgrade_pkg_email_notification=\"no\"\n",
        "upgrade_pkg_email_notification=\"yes\"\n",
        "upgrade_pkg_nos_notification=\"yes\"\nupgrade_pkg_email_notification=\"yes\"\n",
    };
    for (const char* extra : configured) {
        SCOPED_TRACE(extra);
        fresh(extra);
        PMSSavaDefNotify();
        EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH), kFreshInfo + std::string(extra));
        EXPECT_FALSE(jobExists());
    }
}

TEST_F(Schedule, UnchangedArgumentsFollowTheStoredSettings) {
    const struct {
        const char* stored;
        bool job;
    } cases[] = {
        {"enable_pkg_autoupdate_all=\"yes\"\n", true},
        {"enable_pkg_autoupdate_all=\"YES\"\n", true},
        {"upgrade_pkg_nos_notification=\"yes\"\n", true},
        {"upgrade_pkg_email_notification=\"Yes\"\n", true},
        {"", false},
        {"enable_pkg_autoupdate_all=\"no\"\nupgrade_pkg_nos_notification=\"no\"\n", false},
        {"enable_pkg_autoupdate_all=\"1\"\nupgrade_pkg_nos_notification=\"on\"\n", false},
    };
    for (const auto& c : cases) {
        for (bool jobBefore : {false, true}) {
            SCOPED_TRACE(std::string(c.stored) + (jobBefore ? "(job there)" : "(no job)"));
            fresh(c.stored);
            if (jobBefore) {
                existingJob(0x01);
            }
            EXPECT_TRUE(PMSSavaSchedule(-1, -1, -1));
            EXPECT_EQ(jobExists(), c.job);
            if (c.job) {
                const std::string crontab = savedJob()["crontab"].asString();
                EXPECT_TRUE(jobBefore ? crontab == "~ ~ * * 0" : OneOfThePatterns(crontab))
                    << crontab;
            }
            EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH), kFreshInfo + std::string(c.stored))
                << "nothing is written";
        }
    }
}

TEST_F(Schedule, GivenSettingsAreWrittenAndTheJobFollowsThem) {
    const struct {
        int nos, email, autoUpdate;
        const char* stored;
        bool job;
        const char* nosAfter;
        const char* emailAfter;
        const char* autoAfter;
    } cases[] = {
        {0, 0, 0, "", false, "no", "no", "no"},
        {1, 0, 0, "", true, "yes", "no", "no"},
        {0, 1, 0, "", true, "no", "yes", "no"},
        {0, 0, 1, "", true, "no", "no", "yes"},
        // Only exactly 1 is on.
        {2, -2, 0, "", false, "no", "no", "no"},
        // A given 0 for automatic update overrides the stored "yes".
        {-1, -1, 0, "enable_pkg_autoupdate_all=\"yes\"\n", false, "", "", "no"},
        // A stored notification keeps the job although the others are turned off.
        {0, -1, 0, "upgrade_pkg_email_notification=\"yes\"\n", true, "no", "yes", "no"},
        {-1, 0, -1, "upgrade_pkg_nos_notification=\"yes\"\n", true, "yes", "no", ""},
    };
    for (const auto& c : cases) {
        for (bool jobBefore : {false, true}) {
            SCOPED_TRACE(testing::Message()
                         << c.nos << "," << c.email << "," << c.autoUpdate << " stored " << c.stored
                         << (jobBefore ? "(job there)" : "(no job)"));
            fresh(c.stored);
            if (jobBefore) {
                existingJob(0x01);
            }
            EXPECT_TRUE(PMSSavaSchedule(c.nos, c.email, c.autoUpdate));
            EXPECT_EQ(jobExists(), c.job);
            EXPECT_EQ(testutil::exists(kCron), c.job);
            if (c.job && jobBefore) {
                EXPECT_EQ(savedJob()["crontab"].asString(), "~ ~ * * 0") << "kept, not redrawn";
            }
            EXPECT_EQ(setting("upgrade_pkg_nos_notification"), c.nosAfter);
            EXPECT_EQ(setting("upgrade_pkg_email_notification"), c.emailAfter);
            EXPECT_EQ(setting("enable_pkg_autoupdate_all"), c.autoAfter);
        }
    }
}

TEST_F(Schedule, AnExistingJobKeepsItsPattern) {
    ASSERT_TRUE(PMSSavaSchedule(1, 0, 0));
    const std::string first = testutil::readFile(kStore);
    const std::string cron = testutil::readFile(kCron);
    ASSERT_TRUE(OneOfThePatterns(savedJob()["crontab"].asString()));
    for (int round = 0; round < 8; ++round) {
        ASSERT_TRUE(PMSSavaSchedule(1, 1, 1));
    }
    EXPECT_EQ(testutil::readFile(kStore), first);
    EXPECT_EQ(testutil::readFile(kCron), cron);

    CORVSCHEDULE other;
    memset(&other, 0, sizeof other);
    other.week = 0x7f;
    strcpy(other.cmd, "/bin/false");
    EXPECT_TRUE(PMSCORVCrondSet(&other)) << "an existing job is success";
    other.week = -1;
    EXPECT_TRUE(PMSCORVCrondSet(&other)) << "the job is there before the flag is looked at";
    EXPECT_EQ(testutil::readFile(kStore), first);
    EXPECT_EQ(testutil::readFile(kCron), cron);
}

TEST_F(Schedule, TheWeekFlagBecomesTheDayList) {
    const struct {
        int week;
        const char* crontab;  // null: refused
    } cases[] = {
        {0x5e, kWeekA},       {0x2f, kWeekB},      {0x7f, "~ ~ * * 0,1,2,3,4,5,6"},
        {0x01, "~ ~ * * 0"},  {0x40, "~ ~ * * 6"}, {0x41, "~ ~ * * 0,6"},
        {0x182, "~ ~ * * 1"},  // bits above day 6 are not days
        {0, nullptr},          // no day at all is no schedule
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "week 0x" << std::hex << c.week);
        fresh();
        CORVSCHEDULE schedule;
        memset(&schedule, 0, sizeof schedule);
        schedule.week = c.week;
        strcpy(schedule.cmd, "/bin/echo scheduled");
        EXPECT_EQ(PMSCORVCrondSet(&schedule), c.crontab != nullptr);
        if (c.crontab) {
            EXPECT_EQ(savedJob()["crontab"].asString(), c.crontab);
            EXPECT_EQ(savedJob()["cmd"].asString(), "/bin/echo scheduled");
        } else {
            EXPECT_FALSE(jobExists());
            EXPECT_TRUE(logged("^pkgschedule\\.cc:[0-9]+ Failed to write config: autopkgupgrade$"));
        }
    }
}

TEST_F(Schedule, ACommandFillingTheWholeFieldIsCutAtTheField) {
    CORVSCHEDULE schedule;
    memset(&schedule, 0, sizeof schedule);
    schedule.week = 0x01;
    memset(schedule.cmd, 'x', sizeof schedule.cmd);  // no terminating NUL
    ASSERT_TRUE(PMSCORVCrondSet(&schedule));
    EXPECT_EQ(savedJob()["cmd"].asString(), std::string(sizeof schedule.cmd, 'x'));
}

TEST_F(Schedule, ANegativeWeekFlagIsRefused) {
    EXPECT_FALSE(PMSCORVCrondSet(nullptr));
    const int flags[] = {-1, -2, INT32_MIN};
    for (int week : flags) {
        SCOPED_TRACE(week);
        log.clear();
        CORVSCHEDULE schedule;
        memset(&schedule, 0, sizeof schedule);
        schedule.week = week;
        strcpy(schedule.cmd, kCommand);
        EXPECT_FALSE(PMSCORVCrondSet(&schedule));
        EXPECT_FALSE(jobExists());
        char hex[16];
        snprintf(hex, sizeof hex, "%x", static_cast<unsigned>(week));
        EXPECT_TRUE(
            logged(std::string("^pkgschedule\\.cc:[0-9]+ week flag is not valid, ") + hex + "$"));
    }
}

TEST_F(Schedule, RemoveTakesTheJobAway) {
    EXPECT_TRUE(PMSCORVCrondRemove()) << "no job is fine";
    existingJob(0x5e);
    ASSERT_TRUE(testutil::exists(kCron));
    EXPECT_TRUE(PMSCORVCrondRemove());
    EXPECT_FALSE(testutil::exists(kStore));
    EXPECT_FALSE(testutil::exists(kCron));
}

TEST_F(Schedule, ASchedulerFailureWritesNoSetting) {
    // A store the scheduler cannot unlink, and a cron directory it cannot write into.
    testutil::writeFile(std::string(kStore) + "/stuck", "");
    EXPECT_FALSE(PMSSavaSchedule(0, 0, 0));
    EXPECT_TRUE(logged("^pkgschedule\\.cc:[0-9]+ Failed to remove auto update schedule\\.$"));
    EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH), kFreshInfo);

    fresh();
    testutil::removeAll("/etc/cron.d");
    testutil::writeFile("/etc/cron.d", "not a directory\n");
    EXPECT_FALSE(PMSSavaSchedule(1, 0, 0));
    EXPECT_TRUE(logged("^pkgschedule\\.cc:[0-9]+ Failed to write config: autopkgupgrade$"));
    EXPECT_TRUE(logged("^pkgschedule\\.cc:[0-9]+ Failed to set auto update schedule\\.$"));
    EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH), kFreshInfo);
}

TEST_F(Schedule, ASettingThatCannotBeWrittenIsReported) {
    // A directory in place of the file: it cannot be read (all off) nor replaced.
    testutil::removeAll(VLIBC_INFO_PATH);
    testutil::writeFile(std::string(VLIBC_INFO_PATH) + "/stuck", "");
    EXPECT_FALSE(PMSSavaSchedule(1, 0, 0));
    EXPECT_TRUE(
        logged("^pkgschedule\\.cc:[0-9]+ Failed to set upgrade_pkg_nos_notification in "
               "corvinfo\\.conf\\.$"));
    EXPECT_TRUE(jobExists()) << "the job is set before the settings";
    EXPECT_FALSE(PMSSavaSchedule(-1, 0, -1));
    EXPECT_TRUE(
        logged("^pkgschedule\\.cc:[0-9]+ Failed to set upgrade_pkg_email_notification "
               "in corvinfo\\.conf\\.$"));
    EXPECT_FALSE(jobExists()) << "nothing stored is on, so the job went";
    EXPECT_FALSE(PMSSavaSchedule(-1, -1, 1));
    EXPECT_TRUE(
        logged("^pkgschedule\\.cc:[0-9]+ Failed to set enable_pkg_autoupdate_all in "
               "corvinfo\\.conf\\.$"));
}
