// The platform scheduler's store of a package's jobs.
//
// Each package has one file, /usr/corv/etc/corvcrond/pkg-<name>.json, holding the JSON
// object {"package": "<name>", "jobs": [<job>, ...]}. A job is an object with
//   "name"     string, not empty, unique within the package;
//   "schedule" string, the five time fields of a crontab line ("*/5 * * * *");
//   "command"  string, not empty, run by /bin/sh;
//   "user"     string, optional; the user the command runs as, root when absent.
// Save also renders the jobs as /etc/cron.d/corvcrond-<name> (the system cron daemon,
// the platform's "crond" service, reads that directory), so saved jobs really run.
#pragma once

#include <json/json.h>

#include <string>

namespace CORV {
namespace CORVCrond {

class ConfigManager {
  public:
    // `version` is the store format; 1 is the only one.
    ConfigManager(const std::string& pkgName, int version);

    // Checks every job, then replaces the package's store and cron file (each through a
    // temporary file and rename). False with 0x4000 for a malformed job (nothing written),
    // 0x0D00 for an empty package name, or the error of the write.
    bool Save(const Json::Value& jobs);
    // Removes the package's store and cron file; absent files are fine. False with 0x3900.
    bool Remove();
    // Sets "user" of every job object of the array `jobs` to `user`: a package's scheduled
    // work runs as the package's own user.
    static void ReplacePkgUserName(Json::Value& jobs, const std::string& user);

    std::string StorePath() const;
    std::string CronPath() const;

  private:
    std::string pkgName_;
    int version_;
};

}  // namespace CORVCrond
}  // namespace CORV
