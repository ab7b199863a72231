// Events: what `initctl emit` and the job transitions announce, and the jobs they start
// and stop.
//
// A condition is a list of terms joined with "and". As in upstart, each term is met by an
// event of its own, emitted at any time: the job remembers which terms were met (in
// /run/corv/service/<job>.events), and when the last one is, the condition holds, the
// memory is cleared and the job is started (start on) or stopped (stop on). Starting a
// running job or stopping a stopped one does nothing. Details:
//   * a term matches an event of its name that carries each of the term's NAME=value
//     arguments with that value (other arguments of the event do not matter);
//   * `started J` and `stopped J` are met by the events that the manager emits when job J
//     has started (reached running) and has stopped;
//   * jobs disabled by `manual` in their override ignore events altogether;
//   * a stop condition only counts what happens while the job runs: its memory belongs
//     to one run of the job and is forgotten when the job starts again.
//
// No deadlock: matching happens under one short lock (events.lock) that is never held
// while a job's lock is waited for. The jobs an event completes are then started or
// stopped by the emitter itself (wait) or by detached `initctl start|stop` processes
// (no wait). A script runs while its process holds the job's lock; the scripts' processes
// carry the names of such jobs in CORV_INIT_JOBS, and work on those is always handed to
// a detached process, which waits for the lock once the transition is over.
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <set>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "init_job.h"

namespace CORVInit {

namespace {

constexpr char kEventsLock[] = "events.lock";
constexpr char kEventLog[] = "events.log";

using Terms = std::set<size_t>;

std::string memoryPath(const std::string& job) {
    return std::string(kStateDir) + "/" + job + ".events";
}

std::string joinTerms(const Terms& terms) {
    std::string out;
    for (size_t term : terms) {
        out += (out.empty() ? "" : ",") + std::to_string(term);
    }
    return out;
}

Terms splitTerms(const char* text) {
    Terms terms;
    for (const char* p = text; p != nullptr && *p != '\0';) {
        terms.insert(strtoul(p, nullptr, 10));
        p = strchr(p, ',');
        p = p != nullptr ? p + 1 : nullptr;
    }
    return terms;
}

// What a job remembers of the terms met so far.
struct Memory {
    Terms start;
    Terms stop;
    unsigned long long stopRun = 0;  // the run (JobState::startedAt) `stop` belongs to
};

Memory readMemory(const std::string& job) {
    Memory memory;
    const std::string path = memoryPath(job);
    if (!VLIBCFileExist(path.c_str())) {
        return memory;
    }
    PVLIBSZHASH hash = VLIBCSzHashAlloc(4);
    if (hash != nullptr && VLIBCFileGetPair(path.c_str(), &hash) >= 0) {
        memory.start = splitTerms(VLIBCSzHashGetValue(hash, "start"));
        memory.stop = splitTerms(VLIBCSzHashGetValue(hash, "stop"));
        const char* run = VLIBCSzHashGetValue(hash, "stop_run");
        memory.stopRun = run != nullptr ? strtoull(run, nullptr, 10) : 0;
    }
    VLIBCSzHashFree(hash);
    return memory;
}

void writeMemory(const std::string& job, const Memory& memory) {
    PVLIBSZHASH hash = VLIBCSzHashAlloc(4);
    const std::string run = std::to_string(memory.stopRun);
    if (hash == nullptr || VLIBCSzHashSetValue(&hash, "start", joinTerms(memory.start).c_str()) ||
        VLIBCSzHashSetValue(&hash, "stop", joinTerms(memory.stop).c_str()) ||
        VLIBCSzHashSetValue(&hash, "stop_run", run.c_str()) ||
        VLIBCFileSetPair(memoryPath(job).c_str(), hash, 0) != 0) {
        CORV_LOG_ERR("Failed to record the events of %s", job.c_str());
    }
    VLIBCSzHashFree(hash);
}

// Marks the terms that `event` meets; true when that completes the condition, which is
// then forgotten.
bool advance(const Condition& condition, const Event& event, Terms* met, bool* changed) {
    for (size_t i = 0; i < condition.size(); ++i) {
        if (EventMatches(condition[i], event) && met->insert(i).second) {
            *changed = true;
        }
    }
    if (condition.empty() || met->size() < condition.size()) {
        return false;
    }
    met->clear();
    *changed = true;
    return true;
}

std::string describe(const Event& event) {
    std::string text = event.name;
    for (const auto& [name, value] : event.args) {
        text += " " + name + "=" + value;
    }
    return text;
}

void logEvent(const Event& event) {
    if (CORVFSMkdirP(kLogDir, nullptr, 1, -1, -1, 0755) != 0) {
        return;
    }
    const std::string path = std::string(kLogDir) + "/" + kEventLog;
    int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0640);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to open %s, %m", path.c_str());
        return;
    }
    time_t now = time(nullptr);
    struct tm utc {};
    char stamp[32] = "";
    gmtime_r(&now, &utc);
    strftime(stamp, sizeof stamp, "%Y-%m-%dT%H:%M:%SZ", &utc);
    // One write with O_APPEND: lines of concurrent emitters do not mix.
    const std::string line = std::string(stamp) + " " + describe(event) + "\n";
    if (write(fd, line.data(), line.size()) != static_cast<ssize_t>(line.size())) {
        CORV_LOG_ERR("Failed to write to %s, %m", path.c_str());
    }
    close(fd);
}

struct Actions {
    std::vector<std::string> stop;
    std::vector<std::string> start;
};

// Under the events lock: which jobs the event completes.
int match(const Event& event, Actions* actions) {
    StateLock lock;
    if (lock.acquire(kEventsLock, true, kLockTimeout) != 0) {
        CORV_LOG_ERR("Failed to take the events lock for %s [0x%04X %s:%d]", event.name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    for (const std::string& name : ListJobs()) {
        Job job;
        bool manual = false;
        std::string error;
        if (LoadJob(name, &job, &manual, &error) != 0 || manual) {
            continue;  // a broken job is refused where it is asked for by name
        }
        Memory memory = readMemory(name);
        bool changed = false;
        if (advance(job.startOn, event, &memory.start, &changed)) {
            actions->start.push_back(name);
        }
        JobState state;
        const bool runs = ReadJobState(name, &state) && state.goalStart &&
                          state.phase != Phase::kStopped && !job.stopOn.empty();
        if (runs) {
            if (memory.stopRun != state.startedAt) {
                memory.stop.clear();
                memory.stopRun = state.startedAt;
                changed = true;
            }
            if (advance(job.stopOn, event, &memory.stop, &changed)) {
                actions->stop.push_back(name);
            }
        }
        if (changed) {
            writeMemory(name, memory);
        }
    }
    return 0;
}

int act(const std::string& job, bool start, bool wait) {
    const char* verb = start ? "start" : "stop";
    if (!wait || IsHeldByAncestor(job)) {
        return SpawnDetached({kInitctlPath, verb, job}) < 0 ? -1 : 0;
    }
    return start ? JobStart(job) : JobStop(job);
}

}  // namespace

bool ParseEventWords(const std::vector<std::string>& words, Event* event, std::string* error) {
    *event = Event();
    if (words.empty() || !IsValidEventName(words[0])) {
        *error = words.empty() ? "no event name" : "bad event name '" + words[0] + "'";
        return false;
    }
    event->name = words[0];
    for (size_t i = 1; i < words.size(); ++i) {
        size_t eq = words[i].find('=');
        std::string name = words[i].substr(0, eq);
        if (eq == std::string::npos || !IsValidVariableName(name)) {
            *error = "expected NAME=value, found '" + words[i] + "'";
            return false;
        }
        event->args.emplace_back(std::move(name), words[i].substr(eq + 1));
    }
    return true;
}

bool EventMatches(const EventMatch& term, const Event& event) {
    if (term.name != event.name) {
        return false;
    }
    return std::all_of(term.args.begin(), term.args.end(), [&](const auto& wanted) {
        return std::any_of(event.args.begin(), event.args.end(),
                           [&](const auto& arg) { return arg == wanted; });
    });
}

int EmitEvent(const Event& event, bool wait) {
    if (!IsValidEventName(event.name)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    logEvent(event);
    Actions actions;
    if (match(event, &actions) != 0) {
        return -1;
    }
    int rc = 0;
    int code = 0;
    for (const std::string& job : actions.stop) {
        if (act(job, false, wait) != 0) {
            rc = -1;
            code = VLIBCErrGet();
        }
    }
    for (const std::string& job : actions.start) {
        if (act(job, true, wait) != 0) {
            rc = -1;
            code = VLIBCErrGet();
        }
    }
    if (rc != 0) {
        CORV_LOG_ERR("A job of event %s failed", describe(event).c_str());
        VLIBCErrSet(code);
    }
    return rc;
}

}  // namespace CORVInit
