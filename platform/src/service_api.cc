// The service functions of service.h over the init jobs: a service is driven through the
// jobs of its file, in their order to start and in reverse to stop.
#include <errno.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "init_job.h"
#include "service_cfg.h"

using CORVService::ServiceJobs;

namespace {

bool jobsOf(const char* name, std::vector<std::string>* jobs) {
    if (name == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (ServiceJobs(name, jobs) != 0) {
        CORV_LOG_ERR("Unknown service or job [%s] [0x%04X %s:%d]", name, VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    return true;
}

// 1 running, 0 not, -1 unknown or invalid job.
int jobRunning(const std::string& job) {
    CORVInit::JobStatus status;
    if (CORVInit::JobStatusGet(job, &status) != 0) {
        return -1;
    }
    return status.running ? 1 : 0;
}

// Runs `op` on every job in the given order; all are tried. 0, or -1 with the first
// failure's cause.
template <typename Op>
int forEachJob(const std::vector<std::string>& jobs, bool reverse, const char* what, Op op) {
    int rc = 0;
    int code = 0;
    for (size_t i = 0; i < jobs.size(); ++i) {
        const std::string& job = jobs[reverse ? jobs.size() - 1 - i : i];
        if (op(job) != 0) {
            CORV_LOG_ERR("Failed to %s %s [0x%04X %s:%d]", what, job.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            if (rc == 0) {
                code = VLIBCErrGet();
            }
            rc = -1;
        }
    }
    if (rc != 0) {
        VLIBCErrSet(code);
    }
    return rc;
}

int overrideChange(const char* job, bool disable) {
    if (job == nullptr || !CORVInit::IsValidJobName(job)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (!VLIBCFileExist(CORVInit::JobFilePath(job).c_str())) {
        CORV_LOG_ERR("No job [%s] to %s", job, disable ? "disable" : "enable");
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return -1;
    }
    const std::string path = CORVInit::OverridePath(job);
    if (disable) {
        return CORVInit::ReplaceFileText(path, "manual\n", 0644);
    }
    // An override holds nothing but `manual`: without it, there is no override.
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        CORV_LOG_ERR("Failed to unlink %s, %m", path.c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
        return -1;
    }
    return 0;
}

}  // namespace

int VLIBServiceStart(const char* name, int) {
    std::vector<std::string> jobs;
    if (!jobsOf(name, &jobs)) {
        return -1;
    }
    // A service starts whole or not at all: what this call started goes down again.
    std::vector<std::string> started;
    for (const std::string& job : jobs) {
        const int before = jobRunning(job);
        if (CORVInit::JobStart(job) != 0) {
            const int code = VLIBCErrGet();
            CORV_LOG_ERR("Failed to start %s of %s [0x%04X %s:%d]", job.c_str(), name, code,
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            forEachJob(started, true, "stop", CORVInit::JobStop);
            VLIBCErrSet(code);
            return -1;
        }
        if (before == 0) {
            started.push_back(job);
        }
    }
    return 0;
}

int VLIBServiceStop(const char* name, int) {
    std::vector<std::string> jobs;
    return jobsOf(name, &jobs) ? forEachJob(jobs, true, "stop", CORVInit::JobStop) : -1;
}

int VLIBServicePause(const char* name) {
    std::vector<std::string> jobs;
    return jobsOf(name, &jobs) ? forEachJob(jobs, true, "pause", CORVInit::JobPause) : -1;
}

int VLIBServiceResume(const char* name) {
    std::vector<std::string> jobs;
    return jobsOf(name, &jobs) ? forEachJob(jobs, false, "resume", CORVInit::JobResume) : -1;
}

int VLIBServiceRestart(const char* name) {
    if (VLIBServiceStop(name, 0) != 0) {
        return -1;
    }
    return VLIBServiceStart(name, 0);
}

int VLIBServiceReload(const char* name) {
    std::vector<std::string> jobs;
    if (!jobsOf(name, &jobs)) {
        return -1;
    }
    return forEachJob(jobs, false, "reload", CORVInit::JobReload);
}

int VLIBServiceStatusGet(const char* name, int* state) {
    std::vector<std::string> jobs;
    if (state == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    if (!jobsOf(name, &jobs)) {
        return -1;
    }
    // Running means all of it runs; anything less is at rest as far as callers go.
    bool all = true;
    for (const std::string& job : jobs) {
        int running = jobRunning(job);
        if (running < 0) {
            CORV_LOG_ERR("Failed to get the status of %s [0x%04X %s:%d]", job.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return -1;
        }
        all = all && running == 1;
    }
    *state = all ? VLIB_SERVICE_STATE_RUNNING : VLIB_SERVICE_STATE_STOPPED;
    return 0;
}

int VLIBServiceIsRunning(const char* name) {
    int state = VLIB_SERVICE_STATE_UNKNOWN;
    return VLIBServiceStatusGet(name, &state) == 0 && state == VLIB_SERVICE_STATE_RUNNING ? 1 : 0;
}

int VLIBServiceIsPaused(const char* name) {
    CORVInit::JobState state;
    if (name == nullptr || !CORVInit::ReadJobState(name, &state)) {
        return -1;
    }
    return state.paused ? 1 : 0;
}

int VLIBServiceIsEnabled(const char* name) {
    if (name == nullptr) {
        return 0;
    }
    switch (CORVService::RunKeyGet(name)) {
        case 1:
            return 1;
        case 2:
            return 0;
        default:
            return VLIBServiceIsRunning(name);
    }
}

int VLIBServicectlJobEnable(const char* job) {
    return overrideChange(job, false);
}

int VLIBServicectlJobDisable(const char* job) {
    return overrideChange(job, true);
}

int VLIBServicectlIsJobRunning(const char* name, int) {
    std::vector<std::string> jobs;
    if (!jobsOf(name, &jobs)) {
        return -1;
    }
    for (const std::string& job : jobs) {
        int running = jobRunning(job);
        if (running != 0) {
            return running;  // 1, or -1 for a job that cannot be read
        }
    }
    return 0;
}
