// The scheduler's store of package jobs, and its rendering for the system cron daemon.
#include "corv/corvcrond.h"

#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <set>
#include <sstream>
#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace CORV {
namespace CORVCrond {

namespace {

const char kStoreDir[] = "/usr/corv/etc/corvcrond";
const char kCronDir[] = "/etc/cron.d";

bool IsText(const Json::Value& job, const char* key, bool required) {
    if (!job.isMember(key)) {
        return !required;
    }
    const Json::Value& value = job[key];
    return value.isString() && !value.asString().empty() &&
           value.asString().find('\n') == std::string::npos;
}

bool ValidSchedule(const std::string& schedule) {
    std::istringstream in(schedule);
    std::string field;
    int count = 0;
    while (in >> field) {
        ++count;
    }
    return count == 5;
}

// Temporary file and rename: cron and readers of the store see whole files only.
bool WriteAtomically(const std::string& path, const std::string& text, mode_t mode) {
    if (CORVFSMkdirP(path.substr(0, path.rfind('/')).c_str(), nullptr, 1, -1, -1, 0755) != 0) {
        return false;
    }
    std::string tmp = path + ".XXXXXX";
    const int fd = mkstemp(&tmp[0]);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to create tmp file for %s (%m)", path.c_str());
        VLIBCErrSet(ERR_CREATE_FAILED);
        return false;
    }
    const bool ok = write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) &&
                    fchmod(fd, mode) == 0;
    close(fd);
    if (!ok || rename(tmp.c_str(), path.c_str()) != 0) {
        CORV_LOG_ERR("Failed to write %s (%m)", path.c_str());
        VLIBCErrSet(ok ? ERR_RENAME_FAILED : ERR_WRITE_FAILED);
        unlink(tmp.c_str());
        return false;
    }
    return true;
}

bool UnlinkIfThere(const std::string& path) {
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
        return false;
    }
    return true;
}

}  // namespace

ConfigManager::ConfigManager(const std::string& pkgName, int version)
    : pkgName_(pkgName), version_(version) {}

std::string ConfigManager::StorePath() const {
    return std::string(kStoreDir) + "/pkg-" + pkgName_ + ".json";
}

std::string ConfigManager::CronPath() const {
    return std::string(kCronDir) + "/corvcrond-" + pkgName_;
}

void ConfigManager::ReplacePkgUserName(Json::Value& jobs, const std::string& user) {
    if (!jobs.isArray()) {
        return;
    }
    for (Json::Value& job : jobs) {
        if (job.isObject()) {
            job["user"] = user;
        }
    }
}

bool ConfigManager::Save(const Json::Value& jobs) {
    if (pkgName_.empty() || version_ != 1) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (!jobs.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    std::set<std::string> names;
    std::string cron = "# Scheduled jobs of package " + pkgName_ + ". Written by corvcrond.\n";
    for (const Json::Value& job : jobs) {
        if (!job.isObject() || !IsText(job, "name", true) || !IsText(job, "schedule", true) ||
            !IsText(job, "command", true) || !IsText(job, "user", false) ||
            !ValidSchedule(job["schedule"].asString()) ||
            !names.insert(job["name"].asString()).second) {
            VLIBCErrSet(ERR_MALFORMED);
            return false;
        }
        const std::string user = job.isMember("user") ? job["user"].asString() : "root";
        cron += job["schedule"].asString() + " " + user + " " + job["command"].asString() + "\n";
    }
    Json::Value store(Json::objectValue);
    store["package"] = pkgName_;
    store["jobs"] = jobs;
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "\t";
    return WriteAtomically(StorePath(), Json::writeString(builder, store) + "\n", 0644) &&
           WriteAtomically(CronPath(), cron, 0644);
}

bool ConfigManager::Remove() {
    const bool store = UnlinkIfThere(StorePath());
    const bool cron = UnlinkIfThere(CronPath());
    return store && cron;
}

}  // namespace CORVCrond
}  // namespace CORV
