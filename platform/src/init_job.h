// The reference platform's init system, inside the platform library: job files, job
// state, processes and events. service.h is its public face; initctl and the tests use
// this header directly.
//
// Job files are /etc/init/<job>.conf in this subset of the upstart syntax:
//
//   # comment                         blank lines and comment lines anywhere
//   start on EVENT [and EVENT]...     when events start the job (see init_events.cc)
//   stop on EVENT [and EVENT]...      when events stop it; EVENT is `name [KEY=value]...`
//                                     or `started JOB` / `stopped JOB`; values may be
//                                     double-quoted
//   cgroup CONTROLLER ["NAME"]        accepted and ignored (no control groups here)
//   console log | none                script and process output to the job's log (the
//                                     default) or nowhere
//   env NAME="value"                  a variable of every script and process of the job
//   pre-start script ... end script   before the main process; failing stops the start
//   post-start script ... end script  after the main process is up (extension)
//   post-stop script ... end script   after the main process ended
//   exec COMMAND LINE | script ... end script
//                                     the main process, supervised; without one the job
//                                     is running from pre-start to stop
//   reload COMMAND LINE               how to make the main process reload (extension)
//   kill signal SIGNAL                the signal that ends the main process (extension;
//                                     TERM by default)
//
// Every section also takes `exec COMMAND LINE` in place of `script ... end script`.
// Anything else is refused with the line and the reason.
//
// <job>.override beside the file may hold `manual` (plus blank and comment lines): the
// job then ignores its events, which is how a job is disabled.
#pragma once

#include <string>
#include <utility>
#include <vector>

namespace CORVInit {

constexpr char kJobDir[] = "/etc/init";
constexpr char kStateDir[] = "/run/corv/service";
constexpr char kLogDir[] = "/var/log/corv-init";
constexpr char kInitctlPath[] = "/sbin/initctl";
// The jobs whose lock an ancestor process holds while it runs one of their scripts:
// what those scripts ask of these jobs must not wait for the lock.
constexpr char kHeldJobsVar[] = "CORV_INIT_JOBS";

// Seconds: one script or reload command; the end of a main process after its kill
// signal and again after SIGKILL; the wait for a job's lock, which covers a holder that
// runs its scripts to their time-outs.
constexpr int kScriptTimeout = 60;
constexpr int kStopTimeout = 10;
constexpr int kKillTimeout = 5;
constexpr int kLockTimeout = 150;

using Variables = std::vector<std::pair<std::string, std::string>>;

// An event as emitted: a name and NAME=value arguments.
struct Event {
    std::string name;
    Variables args;
};

// One term of a condition: the event's name, and arguments that the emitted event must
// carry with these values (others it may carry too). `started J` is the event "started"
// with JOB=J.
struct EventMatch {
    std::string name;
    Variables args;
};
// All of the terms ("and"), each met by an event of its own; empty: no condition.
using Condition = std::vector<EventMatch>;

// A process of the job: a shell script, or one command line.
struct Process {
    bool present = false;
    bool isScript = false;
    std::string text;
    int line = 0;  // where it was declared
};

struct Job {
    std::string name;
    Condition startOn;
    Condition stopOn;
    Variables env;
    bool consoleLog = true;
    int killSignal = 15;  // SIGTERM
    Process preStart;
    Process postStart;
    Process main;
    Process postStop;
    std::string reload;  // command line; empty: none
};

// ---------------------------------------------------------------------------------------
// Job files (init_job_parser.cc)

// Letters, digits and "-_.+@", not starting with a dot: a file name, and safe in paths.
bool IsValidJobName(const std::string& name);
// Event names: letters, digits and "-_."; argument names: shell variable names.
bool IsValidEventName(const std::string& name);
bool IsValidVariableName(const std::string& name);

// Parses a job's text. On failure `*error` is "line N: reason".
bool ParseJob(const std::string& text, Job* job, std::string* error);
// Parses an override's text; `*manual` tells whether it disables the job.
bool ParseOverride(const std::string& text, bool* manual, std::string* error);

std::string JobFilePath(const std::string& name);
std::string OverridePath(const std::string& name);

// Loads /etc/init/<name>.conf and its override. 0; -1 with ERR_NO_SUCH_FILE for an
// unknown job (or a bad name: ERR_BAD_PARAMETERS); -1 with ERR_MALFORMED when the file
// or its override does not parse. `*error` tells which ("<path>: line N: reason").
int LoadJob(const std::string& name, Job* job, bool* manual, std::string* error);
// Checks the job file at `path` (any name), as init-check.sh does. True when valid.
bool CheckJobFile(const std::string& path, std::string* error);
// The names of /etc/init/*.conf, sorted.
std::vector<std::string> ListJobs();

// Reads a whole (small) file; false when it cannot be read.
bool ReadTextFile(const std::string& path, std::string* text);

// ---------------------------------------------------------------------------------------
// Persistent state (init_job_state.cc): /run/corv/service/<job>.state, a key-value file
// replaced by rename, changed only under the job's lock /run/corv/service/<job>.lock.

enum class Phase { kStopped, kStarting, kRunning, kStopping };

struct JobState {
    bool goalStart = false;
    Phase phase = Phase::kStopped;
    int pid = 0;
    unsigned long long pidStart = 0;   // with the pid, names the main process for good
    bool paused = false;               // stopped by a pause: a resume starts it again
    unsigned long long startedAt = 0;  // when the last start began: tells runs apart
};

// Nanoseconds of the real-time clock.
unsigned long long NowNanoseconds();

// A job never started (no file) reads as the default state. False when the file exists
// but cannot be read.
bool ReadJobState(const std::string& name, JobState* state);
int WriteJobState(const std::string& name, const JobState& state);
// Creates the state directory when missing. 0 or -1.
int EnsureStateDir();
// Replaces `path` by `content` (mode `mode`) through a temporary file beside it and a
// rename: a reader sees the old text or the new, never a part. 0, or -1.
int ReplaceFileText(const std::string& path, const std::string& content, int mode);

// A lock on a file of the state directory, released when the object goes.
class StateLock {
  public:
    StateLock() = default;
    ~StateLock();
    StateLock(const StateLock&) = delete;
    StateLock& operator=(const StateLock&) = delete;
    // Waits up to `seconds` for the lock of `file` (e.g. "<job>.lock"). 0, or -1 with
    // ERR_TIMEOUT when another process kept it.
    int acquire(const std::string& file, bool exclusive, int seconds);
    bool held() const { return fd_ >= 0; }

  private:
    int fd_ = -1;
};

// ---------------------------------------------------------------------------------------
// Job control (init_job_control.cc). Each takes the job's lock for its whole transition;
// all return 0 or -1 with the cause in the error slot.

struct JobStatus {
    bool goalStart = false;
    Phase phase = Phase::kStopped;
    int pid = 0;  // the main process while it lives, else 0
    bool paused = false;
    bool running = false;  // running, and its main process (if it has one) alive
};

int JobStart(const std::string& name);
int JobStop(const std::string& name);
int JobPause(const std::string& name);
int JobResume(const std::string& name);
int JobReload(const std::string& name);
// No lock: what the state says, with a dead main process or a transition that nobody
// carries on any more shown as stopped. -1 for an unknown or invalid job.
int JobStatusGet(const std::string& name, JobStatus* status);
// "start/running, process N", "stop/waiting" ...
std::string DescribeStatus(const JobStatus& status);

// ---------------------------------------------------------------------------------------
// Events (init_events.cc)

// Parses `name [NAME=value]...` as given to `initctl emit`.
bool ParseEventWords(const std::vector<std::string>& words, Event* event, std::string* error);
bool EventMatches(const EventMatch& term, const Event& event);
// Records the event and starts and stops the jobs whose conditions it completes. With
// `wait` those transitions are done before it returns (except for jobs whose scripts are
// running in an ancestor process, see kHeldJobsVar); without, they are handed to
// detached processes. 0, or -1 when a job it acted on failed.
int EmitEvent(const Event& event, bool wait);

// ---------------------------------------------------------------------------------------
// Processes (init_job_process.cc)

// The environment of every script and process of a job: a fixed PATH, UPSTART_JOB and
// the job's env stanzas, then `extra`.
std::vector<std::string> JobEnvironment(const Job& job, const Variables& extra);
// Runs one of the job's processes to its end, bounded by kScriptTimeout, output to the
// job's log. Its exit status, or -1 (ERR_TIMEOUT when it ran too long).
int RunJobProcess(const Job& job, const Process& process, const char* what, const Variables& extra);
// Starts the main process detached (own session, not a child of the caller). Its pid,
// or -1.
int SpawnMainProcess(const Job& job);
// Starts `program args...` detached, output discarded, without the held-jobs variable:
// for work that must wait for locks this process's ancestors hold.
int SpawnDetached(const std::vector<std::string>& argv);
// The process's start time (clock ticks since boot), or 0 when there is no such living
// process (zombies included): together with the pid it names one process for good.
unsigned long long ProcessStartTime(int pid);
// Sends `signal` to the process group of `pid` (and `pid` itself), waits up to
// kStopTimeout for `pid` to end, then SIGKILL and up to kKillTimeout. 0 when it ended.
int EndProcess(int pid, unsigned long long startTime, int signal);
// The descriptor of the job's log, opened for appending, or -1 (`console none`: /dev/null).
int OpenJobLog(const Job& job);
// Whether `name` is in kHeldJobsVar of this process.
bool IsHeldByAncestor(const std::string& name);

}  // namespace CORVInit
