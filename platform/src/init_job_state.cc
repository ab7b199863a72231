// The persistent state of jobs: one key-value file per job under /run, so that what one
// process started another can see and stop, and a lock file per job beside it.
#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "init_job.h"
#include "io_util.h"

namespace CORVInit {

namespace {

const struct {
    Phase phase;
    const char* name;
} kPhases[] = {
    {Phase::kStopped, "stopped"},
    {Phase::kStarting, "starting"},
    {Phase::kRunning, "running"},
    {Phase::kStopping, "stopping"},
};

std::string statePath(const std::string& name) {
    return std::string(kStateDir) + "/" + name + ".state";
}

class Hash {
  public:
    Hash() : p_(VLIBCSzHashAlloc(8)) {}
    ~Hash() { VLIBCSzHashFree(p_); }
    Hash(const Hash&) = delete;
    Hash& operator=(const Hash&) = delete;
    PVLIBSZHASH* addr() { return &p_; }
    PVLIBSZHASH get() const { return p_; }
    std::string value(const char* key) const {
        const char* v = VLIBCSzHashGetValue(p_, key);
        return v != nullptr ? v : "";
    }

  private:
    PVLIBSZHASH p_;
};

}  // namespace

unsigned long long NowNanoseconds() {
    struct timespec ts {};
    clock_gettime(CLOCK_REALTIME, &ts);
    return static_cast<unsigned long long>(ts.tv_sec) * 1000000000ull +
           static_cast<unsigned long long>(ts.tv_nsec);
}

int EnsureStateDir() {
    if (CORVFSMkdirP(kStateDir, nullptr, 1, -1, -1, 0755) != 0) {
        CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", kStateDir, VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    return 0;
}

bool ReadJobState(const std::string& name, JobState* state) {
    *state = JobState();
    const std::string path = statePath(name);
    if (!VLIBCFileExist(path.c_str())) {
        return true;
    }
    Hash hash;
    if (hash.get() == nullptr || VLIBCFileGetPair(path.c_str(), hash.addr()) < 0) {
        CORV_LOG_ERR("Failed to read the state of %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    state->goalStart = hash.value("goal") == "start";
    const std::string phase = hash.value("phase");
    for (const auto& entry : kPhases) {
        if (phase == entry.name) {
            state->phase = entry.phase;
        }
    }
    state->pid = atoi(hash.value("pid").c_str());
    state->pidStart = strtoull(hash.value("pid_start").c_str(), nullptr, 10);
    state->paused = hash.value("paused") == "1";
    state->startedAt = strtoull(hash.value("started_at").c_str(), nullptr, 10);
    return true;
}

int WriteJobState(const std::string& name, const JobState& state) {
    if (EnsureStateDir() != 0) {
        return -1;
    }
    Hash hash;
    const char* phase = "stopped";
    for (const auto& entry : kPhases) {
        if (state.phase == entry.phase) {
            phase = entry.name;
        }
    }
    const std::string pid = std::to_string(state.pid);
    const std::string pidStart = std::to_string(state.pidStart);
    const std::string startedAt = std::to_string(state.startedAt);
    if (hash.get() == nullptr ||
        VLIBCSzHashSetValue(hash.addr(), "goal", state.goalStart ? "start" : "stop") != 0 ||
        VLIBCSzHashSetValue(hash.addr(), "phase", phase) != 0 ||
        VLIBCSzHashSetValue(hash.addr(), "pid", pid.c_str()) != 0 ||
        VLIBCSzHashSetValue(hash.addr(), "pid_start", pidStart.c_str()) != 0 ||
        VLIBCSzHashSetValue(hash.addr(), "paused", state.paused ? "1" : "0") != 0 ||
        VLIBCSzHashSetValue(hash.addr(), "started_at", startedAt.c_str()) != 0) {
        VLIBCErrSet(ERR_OUT_OF_MEMORY);
        return -1;
    }
    if (VLIBCFileSetPair(statePath(name).c_str(), hash.get(), 0) != 0) {
        CORV_LOG_ERR("Failed to write the state of %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    return 0;
}

int ReplaceFileText(const std::string& path, const std::string& content, int mode) {
    return corvplat::replaceWhole(path, content, static_cast<mode_t>(mode), nullptr) ? 0 : -1;
}

StateLock::~StateLock() {
    VLIBCFileUnlockByFile(fd_);
}

int StateLock::acquire(const std::string& file, bool exclusive, int seconds) {
    if (fd_ >= 0 || EnsureStateDir() != 0) {
        VLIBCErrSet(fd_ >= 0 ? ERR_BAD_PARAMETERS : VLIBCErrGet());
        return -1;
    }
    const std::string path = std::string(kStateDir) + "/" + file;
    if (VLIBCFileLockTimeByFile(path.c_str(), exclusive ? 1 : 0, seconds, &fd_) != 0) {
        fd_ = -1;
        return -1;
    }
    return 0;
}

}  // namespace CORVInit
