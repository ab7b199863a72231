// The scheduler job of the update check and the settings behind it.
#include "corvpkg/pkgschedule.h"

#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>
#include <time.h>

#include <string>

#include <json/json.h>

#include "corv/corvcrond.h"
#include "corv/log.h"
#include "corv/vlibc.h"

namespace CORVPackageTool {

namespace {

const char kJobName[] = "autopkgupgrade";
const char kJobCommand[] = "/usr/corv/bin/corvpkg chkupgradepkg";
const char kKeyNosNotify[] = "upgrade_pkg_nos_notification";
const char kKeyEmailNotify[] = "upgrade_pkg_email_notification";
const char kKeyAutoUpdate[] = "enable_pkg_autoupdate_all";

// The stored value of `key`, empty when the key is missing or the file unreadable.
std::string InfoValue(const char* key) {
    char value[256] = {0};
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, key, value, sizeof value, 0) <= 0) {
        return std::string();
    }
    return value;
}

bool InfoIsYes(const char* key) {
    return strcasecmp(InfoValue(key).c_str(), "yes") == 0;
}

// An argument of -1 stands for the stored setting; otherwise only exactly 1 is on.
bool ResolveSetting(int given, const char* key) {
    return given == -1 ? InfoIsYes(key) : given == 1;
}

// "0,2,5" for days 0, 2 and 5.
std::string DayList(int week) {
    std::string days;
    for (int day = 0; day <= 6; ++day) {
        if (week & (1 << day)) {
            days += std::to_string(day) + ",";
        }
    }
    if (!days.empty()) {
        days.pop_back();
    }
    return days;
}

}  // namespace

bool PMSCORVCrondSet(CORVSCHEDULE* schedule) {
    if (schedule == nullptr) {
        return false;
    }
    CORV::CORVCrond::ConfigManager manager(kJobName, 0);
    // A job that is there keeps its days: rewriting it would move every device to the
    // pattern drawn last.
    if (manager.Exist()) {
        return true;
    }
    if (schedule->week < 0) {
        CORV_LOG_ERR("week flag is not valid, %x", schedule->week);
        return false;
    }

    // The days of the week flag.
    const std::string days = DayList(schedule->week);

    // The job, with hour and minute left to the scheduler.
    Json::Value job(Json::objectValue);
    job["name"] = kJobName;
    job["cmd"] = std::string(schedule->cmd, strnlen(schedule->cmd, sizeof schedule->cmd));
    job["user"] = "root";
    job["period"] = "crontab";
    job["crontab"] = "~ ~ * * " + days;
    job["expire"] = 24;
    job["expire_action"] = "skip";
    job["assure_execute"] = 168;

    // Hand it to the scheduler.
    if (!manager.Save(job)) {
        CORV_LOG_ERR("Failed to write config: autopkgupgrade");
        return false;
    }
    return true;
}

bool PMSCORVCrondRemove() {
    return CORV::CORVCrond::ConfigManager(kJobName, 0).Remove();
}

bool PMSSavaSchedule(int nosNotify, int emailNotify, int autoUpdate) {
    // The notifications in effect.
    const bool nosOn = ResolveSetting(nosNotify, kKeyNosNotify);
    const bool emailOn = ResolveSetting(emailNotify, kKeyEmailNotify);

    // Whether anything needs the job.
    const bool wanted =
        (autoUpdate == -1 && InfoIsYes(kKeyAutoUpdate)) || nosOn || emailOn || autoUpdate == 1;

    // No job without a use for it.
    if (!wanted && !PMSCORVCrondRemove()) {
        CORV_LOG_ERR("Failed to remove auto update schedule.");
        return false;
    }

    // One of two weekly patterns, so that devices spread over the days.
    if (wanted) {
        srandom(time(nullptr));
        CORVSCHEDULE schedule;
        memset(&schedule, 0, sizeof schedule);
        schedule.week = (random() & 1) ? PKG_SCHEDULE_WEEK_B : PKG_SCHEDULE_WEEK_A;
        snprintf(schedule.cmd, sizeof schedule.cmd, "%s", kJobCommand);
        if (!PMSCORVCrondSet(&schedule)) {
            CORV_LOG_ERR("Failed to set auto update schedule.");
            return false;
        }
    }

    // The settings that were given.
    if (nosNotify != -1 &&
        VLIBCINFOSetKeyValue(kKeyNosNotify, nosNotify == 1 ? "yes" : "no") != 0) {
        CORV_LOG_ERR("Failed to set upgrade_pkg_nos_notification in corvinfo.conf.");
        return false;
    }
    if (emailNotify != -1 &&
        VLIBCINFOSetKeyValue(kKeyEmailNotify, emailNotify == 1 ? "yes" : "no") != 0) {
        CORV_LOG_ERR("Failed to set upgrade_pkg_email_notification in corvinfo.conf.");
        return false;
    }
    if (autoUpdate != -1 &&
        VLIBCINFOSetKeyValue(kKeyAutoUpdate, autoUpdate == 1 ? "yes" : "no") != 0) {
        CORV_LOG_ERR("Failed to set enable_pkg_autoupdate_all in corvinfo.conf.");
        return false;
    }
    return true;
}

void PMSSavaDefNotify() {
    if (!InfoValue(kKeyNosNotify).empty() || !InfoValue(kKeyEmailNotify).empty()) {
        return;
    }
    PMSSavaSchedule(1, 0, -1);
}

}  // namespace CORVPackageTool
