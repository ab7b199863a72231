// Job control: start, stop, pause, resume and reload of one job, each a transition done
// under the job's lock so that two processes driving the same job take turns, and the
// second finds what the first left (two starts at once make one start).
#include <stdlib.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "init_job.h"

namespace CORVInit {

namespace {

// What the recorded state means now. The main process may have ended by itself, and a
// transition may have been cut short by the end of the process that did it.
enum class Standing { kAtRest, kRunning, kStale };

bool mainAlive(const JobState& state) {
    return state.pid > 0 && state.pidStart != 0 && ProcessStartTime(state.pid) == state.pidStart;
}

// Only meaningful under the lock, or with the lock found free: a transition in progress
// looks stale too.
Standing assess(const JobState& state) {
    if (state.phase == Phase::kStopped) {
        return Standing::kAtRest;
    }
    if (state.phase == Phase::kRunning && (state.pid == 0 || mainAlive(state))) {
        return Standing::kRunning;
    }
    return Standing::kStale;
}

int load(const std::string& name, Job* job) {
    bool manual = false;
    std::string error;
    if (LoadJob(name, job, &manual, &error) != 0) {
        CORV_LOG_ERR("%s", error.c_str());
        return -1;
    }
    return 0;
}

// The script of a job runs while this process holds the job's lock: whatever it asks of
// the job must not wait for that lock (see init_events.cc).
Variables scriptVariables(const Job& job, const JobState& state) {
    const char* held = getenv(kHeldJobsVar);
    Variables vars{
        {kHeldJobsVar, (held != nullptr && *held ? std::string(held) + " " : "") + job.name}};
    if (state.pid > 0) {
        vars.emplace_back("MAIN_PID", std::to_string(state.pid));
    }
    return vars;
}

// Runs a script of the job; 0, or -1 with the cause in the slot and the log.
int runScript(const Job& job, const Process& process, const char* what, const JobState& state) {
    if (!process.present) {
        return 0;
    }
    int rc = RunJobProcess(job, process, what, scriptVariables(job, state));
    if (rc == 0) {
        return 0;
    }
    if (rc > 0) {
        CORV_LOG_ERR("%s of %s failed with exit status %d; see %s/%s.log", what, job.name.c_str(),
                     rc, kLogDir, job.name.c_str());
        VLIBCErrSet(ERR_NOT_APPLICABLE);
    }
    return -1;
}

// The transitions, for a caller that holds the job's lock and has read its state.
class Transition {
  public:
    Transition(const Job& job, JobState* state) : job_(job), state_(*state) {}

    // From at rest to running. On failure the job is at rest with the goal "stop", and
    // the cause is in the slot.
    int start() {
        state_ = JobState();
        state_.goalStart = true;
        state_.phase = Phase::kStarting;
        state_.startedAt = NowNanoseconds();
        if (save() != 0) {
            return -1;
        }
        if (runScript(job_, job_.preStart, "pre-start", state_) != 0) {
            return fail();
        }
        if (job_.main.present) {
            state_.pid = SpawnMainProcess(job_);
            if (state_.pid < 0) {
                state_.pid = 0;
                return fail();
            }
            state_.pidStart = ProcessStartTime(state_.pid);
            if (state_.pidStart == 0) {
                CORV_LOG_ERR("The main process of %s ended at once; see %s/%s.log",
                             job_.name.c_str(), kLogDir, job_.name.c_str());
                VLIBCErrSet(ERR_NOT_APPLICABLE);
                return fail();
            }
            if (save() != 0 || runScript(job_, job_.postStart, "post-start", state_) != 0) {
                return fail();
            }
        }
        state_.phase = Phase::kRunning;
        return save();
    }

    // To at rest: the main process ended, then post-stop. With `keepGoal` the goal stays
    // "start" and the job is marked paused. -1 only when the main process would not end;
    // a failing post-stop is logged, the job is stopped all the same.
    int stop(bool keepGoal) {
        state_.goalStart = keepGoal;
        state_.paused = keepGoal;
        state_.phase = Phase::kStopping;
        if (save() != 0) {
            return -1;
        }
        if (state_.pid > 0 && EndProcess(state_.pid, state_.pidStart, job_.killSignal) != 0) {
            state_.phase = Phase::kRunning;
            save();
            VLIBCErrSet(ERR_TIMEOUT);
            return -1;
        }
        state_.pid = 0;
        state_.pidStart = 0;
        runScript(job_, job_.postStop, "post-stop", state_);
        state_.phase = Phase::kStopped;
        return save();
    }

    // A stale state (a dead main process, or a transition whose process ended) is
    // cleaned up as a stop would, leaving the job at rest.
    void cleanUp() {
        CORV_LOG(LOG_NOTICE, "Cleaning up %s, left in a transition or without its process",
                 job_.name.c_str());
        stop(false);
    }

    const std::string& name() const { return job_.name; }

  private:
    int save() { return WriteJobState(job_.name, state_); }

    int fail() {
        const int code = VLIBCErrGet();
        CORV_LOG_ERR("Failed to start %s [0x%04X %s:%d]", job_.name.c_str(), code,
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        // A failed start goes the way of a stop, so post-stop undoes what got done.
        state_.goalStart = false;
        state_.phase = Phase::kStopping;
        save();
        if (state_.pid > 0) {
            EndProcess(state_.pid, state_.pidStart, job_.killSignal);
            state_.pid = 0;
            state_.pidStart = 0;
        }
        runScript(job_, job_.postStop, "post-stop", state_);
        state_ = JobState();
        save();
        VLIBCErrSet(code);
        return -1;
    }

    const Job& job_;
    JobState& state_;
};

// What each operation does under the lock. `changed` tells which event to emit after it.
enum class Change { kNone, kStarted, kStopped, kRestarted };

// Takes the lock and the state, runs `body`, and emits the events of what changed once
// the lock is released, as other jobs may wait for them and take this job's lock.
template <typename Body>
int underLock(const std::string& name, const char* what, Body&& body) {
    if (IsHeldByAncestor(name)) {
        CORV_LOG_ERR("Cannot %s %s from its own scripts", what, name.c_str());
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    Job job;
    if (load(name, &job) != 0) {
        return -1;
    }
    Change change = Change::kNone;
    int rc;
    {
        StateLock lock;
        if (lock.acquire(name + ".lock", true, kLockTimeout) != 0) {
            CORV_LOG_ERR("Failed to take the lock of %s to %s it [0x%04X %s:%d]", name.c_str(),
                         what, VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return -1;
        }
        JobState state;
        if (!ReadJobState(name, &state)) {
            return -1;
        }
        Transition transition(job, &state);
        rc = body(job, state, transition, &change);
    }
    const int code = VLIBCErrGet();
    if (change == Change::kStopped || change == Change::kRestarted) {
        EmitEvent(Event{"stopped", {{"JOB", name}}}, true);
    }
    if (change == Change::kStarted || change == Change::kRestarted) {
        EmitEvent(Event{"started", {{"JOB", name}}}, true);
    }
    if (rc != 0) {
        VLIBCErrSet(code);
    }
    return rc;
}

}  // namespace

int JobStart(const std::string& name) {
    return underLock(name, "start", [](const Job&, JobState& state, Transition& t, Change* c) {
        Standing standing = assess(state);
        if (standing == Standing::kRunning) {
            return 0;
        }
        if (standing == Standing::kStale) {
            t.cleanUp();
        }
        if (t.start() != 0) {
            return -1;
        }
        *c = Change::kStarted;
        return 0;
    });
}

int JobStop(const std::string& name) {
    return underLock(name, "stop", [](const Job&, JobState& state, Transition& t, Change* c) {
        Standing standing = assess(state);
        if (standing == Standing::kAtRest) {
            if (state.goalStart || state.paused) {
                // A paused job forgets that it is to run again.
                state = JobState();
                return WriteJobState(t.name(), state);
            }
            return 0;
        }
        if (t.stop(false) != 0) {
            return -1;
        }
        *c = Change::kStopped;
        return 0;
    });
}

int JobPause(const std::string& name) {
    return underLock(name, "pause", [](const Job&, JobState& state, Transition& t, Change* c) {
        Standing standing = assess(state);
        if (standing == Standing::kStale) {
            t.cleanUp();
            return 0;
        }
        if (standing == Standing::kAtRest) {
            return 0;
        }
        if (t.stop(true) != 0) {
            return -1;
        }
        *c = Change::kStopped;
        return 0;
    });
}

int JobResume(const std::string& name) {
    return underLock(name, "resume", [](const Job&, JobState& state, Transition& t, Change* c) {
        Standing standing = assess(state);
        if (!state.paused || standing == Standing::kRunning) {
            if (state.paused) {
                state.paused = false;  // started meanwhile: nothing left to resume
                return WriteJobState(t.name(), state);
            }
            return 0;
        }
        if (standing == Standing::kStale) {
            t.cleanUp();
        }
        if (t.start() != 0) {
            return -1;
        }
        *c = Change::kStarted;
        return 0;
    });
}

int JobReload(const std::string& name) {
    return underLock(name, "reload", [](const Job& job, JobState& state, Transition& t, Change* c) {
        if (assess(state) != Standing::kRunning) {
            return 0;  // nothing runs that could reload
        }
        if (!job.reload.empty()) {
            Process reload;
            reload.present = true;
            reload.text = job.reload;
            return runScript(job, reload, "reload", state);
        }
        if (t.stop(false) != 0) {
            return -1;
        }
        *c = Change::kStopped;
        if (t.start() != 0) {
            return -1;
        }
        *c = Change::kRestarted;
        return 0;
    });
}

int JobStatusGet(const std::string& name, JobStatus* status) {
    *status = JobStatus();
    Job job;
    if (load(name, &job) != 0) {
        return -1;
    }
    JobState state;
    if (!ReadJobState(name, &state)) {
        return -1;
    }
    status->goalStart = state.goalStart;
    status->paused = state.paused;
    status->phase = state.phase;
    const bool inTransition = state.phase == Phase::kStarting || state.phase == Phase::kStopping;
    StateLock probe;
    const bool busy = inTransition && probe.acquire(name + ".lock", false, 0) != 0;
    if (busy) {
        status->pid = mainAlive(state) ? state.pid : 0;
        return 0;
    }
    // Nobody carries a transition on: what is not running is at rest.
    status->running = assess(state) == Standing::kRunning;
    if (status->running) {
        status->pid = state.pid;
    } else {
        status->phase = Phase::kStopped;
        status->goalStart = false;
    }
    return 0;
}

std::string DescribeStatus(const JobStatus& status) {
    const char* state = "waiting";
    switch (status.phase) {
        case Phase::kStarting:
            state = status.pid > 0 ? "post-start" : "pre-start";
            break;
        case Phase::kRunning:
            state = "running";
            break;
        case Phase::kStopping:
            state = status.pid > 0 ? "killed" : "post-stop";
            break;
        case Phase::kStopped:
            break;
    }
    std::string text = std::string(status.goalStart ? "start/" : "stop/") + state;
    if (status.pid > 0) {
        text += ", process " + std::to_string(status.pid);
    }
    return text;
}

}  // namespace CORVInit
