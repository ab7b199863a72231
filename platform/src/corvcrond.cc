// The scheduler's store of package jobs and system jobs, and its rendering for the system
// cron daemon.
#include "corv/corvcrond.h"

#include <errno.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "io_util.h"

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

std::vector<std::string> Fields(const std::string& schedule) {
    std::istringstream in(schedule);
    std::vector<std::string> fields;
    std::string field;
    while (in >> field) {
        fields.push_back(field);
    }
    return fields;
}

bool ValidSchedule(const std::string& schedule) {
    return Fields(schedule).size() == 5;
}

// FNV-1a: stable across builds and platforms, unlike std::hash, so a job's picked time
// never moves.
uint32_t NameHash(const std::string& name) {
    uint32_t hash = 2166136261u;
    for (unsigned char c : name) {
        hash = (hash ^ c) * 16777619u;
    }
    return hash;
}

// The crontab time fields of a system job with its "~" fields filled in; empty when the
// fields are malformed ("~" is only the whole minute or hour field).
std::string RenderSystemSchedule(const std::string& name, const std::string& crontab) {
    std::vector<std::string> fields = Fields(crontab);
    if (fields.size() != 5) {
        return std::string();
    }
    const uint32_t hash = NameHash(name);
    const std::string picked[2] = {std::to_string(hash % 60), std::to_string((hash / 60) % 24)};
    std::string line;
    for (size_t i = 0; i < fields.size(); ++i) {
        if (fields[i] == "~" && i < 2) {
            fields[i] = picked[i];
        } else if (fields[i].find('~') != std::string::npos) {
            return std::string();
        }
        line += (i ? " " : "") + fields[i];
    }
    return line;
}

// A system job's name becomes part of two file names.
bool SafeName(const std::string& name) {
    return !name.empty() && name[0] != '.' && name.find('/') == std::string::npos;
}

// Temporary file and rename: cron and readers of the store see whole files only.
bool WriteAtomically(const std::string& path, const std::string& text, mode_t mode) {
    if (CORVFSMkdirP(path.substr(0, path.rfind('/')).c_str(), nullptr, 1, -1, -1, 0755) != 0) {
        return false;
    }
    return corvplat::replaceWhole(path, text, mode, nullptr);
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

ConfigManager::ConfigManager(const std::string& name, int version)
    : name_(name), version_(version) {}

std::string ConfigManager::StorePath() const {
    return std::string(kStoreDir) + (version_ == 0 ? "/sys-" : "/pkg-") + name_ + ".json";
}

std::string ConfigManager::CronPath() const {
    return std::string(kCronDir) + (version_ == 0 ? "/corvcrond_sys_" : "/corvcrond-") + name_;
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
    if (version_ == 0) {
        return SaveSystemJob(jobs);
    }
    return SavePackageJobs(jobs);
}

bool ConfigManager::SavePackageJobs(const Json::Value& jobs) {
    if (name_.empty() || version_ != 1) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (!jobs.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    std::set<std::string> names;
    std::string cron = "# Scheduled jobs of package " + name_ + ". Written by corvcrond.\n";
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
    store["package"] = name_;
    store["jobs"] = jobs;
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "\t";
    return WriteAtomically(StorePath(), Json::writeString(builder, store) + "\n", 0644) &&
           WriteAtomically(CronPath(), cron, 0644);
}

bool ConfigManager::SaveSystemJob(const Json::Value& job) {
    if (!SafeName(name_)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const bool wellFormed = job.isObject() && IsText(job, "name", false) &&
                            (!job.isMember("name") || job["name"].asString() == name_) &&
                            IsText(job, "cmd", true) && IsText(job, "user", false) &&
                            job["period"].isString() && job["period"].asString() == "crontab" &&
                            IsText(job, "crontab", true);
    const std::string schedule =
        wellFormed ? RenderSystemSchedule(name_, job["crontab"].asString()) : std::string();
    if (schedule.empty()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    const std::string user = job.isMember("user") ? job["user"].asString() : "root";
    const std::string cron = "# System job " + name_ + ". Written by corvcrond.\n" + schedule +
                             " " + user + " " + job["cmd"].asString() + "\n";
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "\t";
    return WriteAtomically(StorePath(), Json::writeString(builder, job) + "\n", 0644) &&
           WriteAtomically(CronPath(), cron, 0644);
}

bool ConfigManager::Exist() const {
    if (version_ == 0 && !SafeName(name_)) {
        return false;
    }
    struct stat st;
    return stat(StorePath().c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

bool ConfigManager::Remove() {
    if (version_ == 0 && !SafeName(name_)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const bool store = UnlinkIfThere(StorePath());
    const bool cron = UnlinkIfThere(CronPath());
    return store && cron;
}

}  // namespace CORVCrond
}  // namespace CORV
