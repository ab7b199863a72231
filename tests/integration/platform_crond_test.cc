// The platform scheduler's system jobs, next to the package jobs it already kept.
#include <gtest/gtest.h>

#include <regex>
#include <set>
#include <string>

#include "corv/corvcrond.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "support/files.h"

using CORV::CORVCrond::ConfigManager;
using CORVPackageTool::fromFile;
using CORVPackageTool::fromString;

namespace {

Json::Value SystemJob(const std::string& name, const std::string& crontab) {
    Json::Value job(Json::objectValue);
    job["name"] = name;
    job["cmd"] = "/bin/true --flag";
    job["user"] = "root";
    job["period"] = "crontab";
    job["crontab"] = crontab;
    job["expire"] = 24;
    return job;
}

// The time fields and the rest of the one job line of a system job's cron file.
struct CronLine {
    int minute = -1;
    int hour = -1;
    std::string rest;
};

CronLine ReadCronLine(const std::string& path) {
    std::smatch m;
    const std::string text = testutil::readFile(path);
    CronLine line;
    if (std::regex_search(text, m, std::regex("\n([0-9]+) ([0-9]+) ([^\n]*)\n$"))) {
        line.minute = std::stoi(m[1]);
        line.hour = std::stoi(m[2]);
        line.rest = m[3];
    }
    return line;
}

}  // namespace

TEST(PlatformCrond, ASystemJobIsStoredAndRendered) {
    ConfigManager manager("nightly", 0);
    EXPECT_FALSE(manager.Exist());
    ASSERT_TRUE(manager.Save(SystemJob("nightly", "~ ~ * * 1,3")));
    EXPECT_TRUE(manager.Exist());
    EXPECT_EQ(manager.StorePath(), "/usr/corv/etc/corvcrond/sys-nightly.json");
    EXPECT_EQ(manager.CronPath(), "/etc/cron.d/corvcrond_sys_nightly");

    Json::Value stored;
    ASSERT_TRUE(fromFile(manager.StorePath(), stored));
    EXPECT_EQ(stored, SystemJob("nightly", "~ ~ * * 1,3")) << "kept as given, extra keys too";

    const CronLine line = ReadCronLine(manager.CronPath());
    EXPECT_GE(line.minute, 0);
    EXPECT_LT(line.minute, 60);
    EXPECT_GE(line.hour, 0);
    EXPECT_LT(line.hour, 24);
    EXPECT_EQ(line.rest, "* * 1,3 root /bin/true --flag");

    // The picked time belongs to the name: it survives a remove and a new save.
    ASSERT_TRUE(manager.Remove());
    EXPECT_FALSE(manager.Exist());
    EXPECT_FALSE(testutil::exists(manager.CronPath()));
    ASSERT_TRUE(manager.Save(SystemJob("nightly", "~ ~ * * 5")));
    const CronLine again = ReadCronLine(manager.CronPath());
    EXPECT_EQ(again.minute, line.minute);
    EXPECT_EQ(again.hour, line.hour);
}

TEST(PlatformCrond, FixedFieldsStayAndPickedTimesSpread) {
    Json::Value job = SystemJob("fixed", "30 ~ * * *");
    job.removeMember("name");
    job.removeMember("user");
    ConfigManager fixed("fixed", 0);
    ASSERT_TRUE(fixed.Save(job)) << "name and user may be left out";
    const CronLine line = ReadCronLine(fixed.CronPath());
    EXPECT_EQ(line.minute, 30);
    EXPECT_EQ(line.rest, "* * * root /bin/true --flag");

    std::set<int> times;
    for (int i = 0; i < 20; ++i) {
        const std::string name = "job" + std::to_string(i);
        ConfigManager manager(name, 0);
        ASSERT_TRUE(manager.Save(SystemJob(name, "~ ~ * * *"))) << name;
        const CronLine picked = ReadCronLine(manager.CronPath());
        times.insert(picked.hour * 60 + picked.minute);
    }
    EXPECT_GE(times.size(), 15u) << "different names get different times";
}

TEST(PlatformCrond, MalformedSystemJobsAreRefused) {
    const struct {
        const char* what;
        const char* key;  // null: the whole job is `value`
        const char* value;
    } cases[] = {
        {"not an object", nullptr, "[]"},
        {"other name", "name", "\"someone\""},
        {"no command", "cmd", "null"},
        {"empty command", "cmd", "\"\""},
        {"command of two lines", "cmd", "\"/bin/true\\n* * * * * root /bin/sh\""},
        {"no period", "period", "null"},
        {"other period", "period", "\"daily\""},
        {"four fields", "crontab", "\"~ ~ * *\""},
        {"six fields", "crontab", "\"~ ~ * * * *\""},
        {"picked day", "crontab", "\"~ ~ * * ~\""},
        {"partly picked minute", "crontab", "\"~5 ~ * * *\""},
        {"user not text", "user", "0"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        Json::Value job = SystemJob("broken", "~ ~ * * *");
        Json::Value value;
        ASSERT_TRUE(fromString(c.value, value));
        if (c.key == nullptr) {
            job = value;
        } else if (value.isNull()) {
            job.removeMember(c.key);
        } else {
            job[c.key] = value;
        }
        ConfigManager manager("broken", 0);
        EXPECT_FALSE(manager.Save(job));
        EXPECT_EQ(VLIBCErrGet(), 0x4000);
        EXPECT_FALSE(manager.Exist());
        EXPECT_FALSE(testutil::exists(manager.CronPath()));
    }
}

TEST(PlatformCrond, UnsafeNamesAndUnknownVersionsAreRefused) {
    for (const char* name : {"", "../escape", ".hidden", "a/b"}) {
        SCOPED_TRACE(name);
        ConfigManager manager(name, 0);
        EXPECT_FALSE(manager.Save(SystemJob(name, "~ ~ * * *")));
        EXPECT_EQ(VLIBCErrGet(), 0xd00);
        EXPECT_FALSE(manager.Exist());
        EXPECT_FALSE(manager.Remove());
        EXPECT_EQ(VLIBCErrGet(), 0xd00);
    }
    Json::Value jobs(Json::arrayValue);
    jobs.append(Json::Value(Json::objectValue));
    jobs[0]["name"] = "a";
    jobs[0]["schedule"] = "* * * * *";
    jobs[0]["command"] = "/bin/true";
    EXPECT_FALSE(ConfigManager("demo", 2).Save(jobs));
    EXPECT_EQ(VLIBCErrGet(), 0xd00);
}

TEST(PlatformCrond, SystemAndPackageJobsOfOneNameAreApart) {
    Json::Value jobs(Json::arrayValue);
    jobs.append(Json::Value(Json::objectValue));
    jobs[0]["name"] = "a";
    jobs[0]["schedule"] = "*/5 * * * *";
    jobs[0]["command"] = "/bin/true";
    ConfigManager package("same", 1);
    ConfigManager system("same", 0);
    ASSERT_TRUE(package.Save(jobs));
    EXPECT_TRUE(package.Exist());
    EXPECT_FALSE(system.Exist());
    ASSERT_TRUE(system.Save(SystemJob("same", "~ ~ * * 0")));
    EXPECT_NE(package.CronPath(), system.CronPath());

    ASSERT_TRUE(system.Remove());
    EXPECT_TRUE(package.Exist());
    EXPECT_NE(testutil::readFile(package.CronPath()).find("*/5 * * * * root /bin/true\n"),
              std::string::npos);
    ASSERT_TRUE(package.Remove());
    EXPECT_FALSE(package.Exist());
}
