// The platform scheduler's store of jobs: a package's jobs, or one system job.
//
// Package jobs (version 1). Each package has one file, /usr/corv/etc/corvcrond/pkg-<name>.json,
// holding the JSON object {"package": "<name>", "jobs": [<job>, ...]}. A job is an object with
//   "name"     string, not empty, unique within the package;
//   "schedule" string, the five time fields of a crontab line ("*/5 * * * *");
//   "command"  string, not empty, run by /bin/sh;
//   "user"     string, optional; the user the command runs as, root when absent.
// Save also renders the jobs as /etc/cron.d/corvcrond-<name> (the system cron daemon,
// the platform's "crond" service, reads that directory), so saved jobs really run.
//
// System jobs (version 0). The manager's name is the job's name, and Save takes one job
// object, kept as given in /usr/corv/etc/corvcrond/sys-<name>.json and rendered as
// /etc/cron.d/corvcrond_sys_<name> (the "_" keeps system jobs apart from any package). Keys:
//   "name"     string, optional; when present it must be the manager's name;
//   "cmd"      string, not empty, run by /bin/sh;
//   "user"     string, optional; root when absent;
//   "period"   "crontab", the only period this scheduler renders;
//   "crontab"  the five time fields; the minute and the hour field may each be "~",
//              "the scheduler picks". The pick is fixed by the job's name: with h the
//              32-bit FNV-1a hash of the name, the minute is h % 60 and the hour
//              (h / 60) % 24, so a job keeps its time across saves and reboots and
//              different jobs spread over the day.
// Other keys ("expire", "expire_action", "assure_execute", ...) are kept in the store for
// the scheduler's readers; plain cron has no use for them and the rendering ignores them.
#pragma once

#include <json/json.h>

#include <string>

namespace CORV {
namespace CORVCrond {

class ConfigManager {
  public:
    // `version` selects the form: 1 a package's jobs (`name` is the package), 0 the system
    // job `name`. Other versions save nothing.
    ConfigManager(const std::string& name, int version);

    // Checks the job(s), then replaces the store and the cron file (each through a
    // temporary file and rename). Version 1 takes an array of jobs, version 0 one job
    // object. False with 0x4000 for a malformed job (nothing written), 0x0D00 for an empty
    // or unsafe name or an unknown version, or the error of the write.
    bool Save(const Json::Value& jobs);
    // Removes the store and cron file; absent files are fine. False with 0x3900, or 0x0D00
    // for a system job whose name Save would refuse.
    bool Remove();
    // True when the store file is there, that is, when a Save has succeeded and no Remove
    // has come since.
    bool Exist() const;
    // Sets "user" of every job object of the array `jobs` to `user`: a package's scheduled
    // work runs as the package's own user.
    static void ReplacePkgUserName(Json::Value& jobs, const std::string& user);

    std::string StorePath() const;
    std::string CronPath() const;

  private:
    bool SavePackageJobs(const Json::Value& jobs);
    bool SaveSystemJob(const Json::Value& job);

    std::string name_;
    int version_;
};

}  // namespace CORVCrond
}  // namespace CORV
