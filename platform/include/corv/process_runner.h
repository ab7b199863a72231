// CORVUtils::ProcessRunner: runs one program, by path, with arguments, extra environment
// and an optional identity, and waits for it. Never through a shell.
#pragma once

#include <sys/types.h>

#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

namespace CORVUtils {

class ProcessRunner {
  public:
    // `program` is an absolute path; `args` are the arguments after argv[0].
    explicit ProcessRunner(std::string program, std::vector<std::string> args = {});
    ProcessRunner(std::string program, std::initializer_list<std::string> args);

    void addArguments(const std::string& arg);
    template <typename... More>
    void addArguments(const std::string& first, const More&... more) {
        addArguments(first);
        (addArguments(std::string(more)), ...);
    }
    // Sets NAME=value in the child's environment, on top of the caller's own environment
    // (a later addEnv of the same name wins).
    void addEnv(const std::string& name, const std::string& value);
    // The child gets only what addEnv sets, nothing of the caller's environment.
    void clearEnvironment();

    // Runs the child as `user`: its uid, and the group of that user (`ownGroup`) or the
    // system group "system" (gid 1 on the appliance; the reference platform uses the
    // group named "system" when it exists, else gid 1). False (ERR_NO_SUCH_USER, or
    // ERR_NO_SUCH_GROUP) when the identity cannot be resolved; the runner is unchanged.
    bool setRuntimeIdentity(const std::string& user, bool ownGroup);
    // Bounds the run: after `seconds` (0: no bound) the child's process group is killed
    // with SIGKILL and run() returns -1 with ERR_TIMEOUT.
    void setTimeout(int seconds);
    // The child's working directory (default: the caller's).
    void setWorkingDirectory(const std::string& dir);
    // The child's argv[0] (default: the program's path), e.g. the name of the script's role.
    void setArgZero(const std::string& name);

    // Starts the child and, with `wait`, waits and returns its exit status (128 + signal
    // for a killed child). "/bin/rm -rf" of paths none of which exists, and "/bin/mkdir -p"
    // of directories that all exist, would do nothing and exit 0: they are answered so
    // without starting a process. With `capture`, standard output and standard error are kept
    // for getCapturedOutput()/getCapturedOutputErr() (each kept up to kCaptureLimit bytes;
    // the rest is read and dropped, so a chatty child never blocks). Without `wait` the
    // child is left running and 0 is returned. -1 when the program cannot be started.
    int run(bool wait, bool capture);
    // The same, and every byte the child writes to standard output or error is also
    // appended to `fd` (when fd >= 0). `mode` is the appliance's ScriptRunMode (1 or
    // 0x90); the reference platform treats both alike.
    int run(int mode, bool wait, bool capture, int fd);

    // The command line as logged: program and arguments, blank-separated, an argument
    // with blanks or quotes shown in double quotes.
    std::string toString() const;
    const std::string& getCapturedOutput() const { return out_; }
    const std::string& getCapturedOutputErr() const { return err_; }
    pid_t getPid() const { return pid_; }

    static constexpr size_t kCaptureLimit = 4u << 20;

  private:
    std::string program_;
    std::vector<std::string> args_;
    std::vector<std::pair<std::string, std::string>> env_;
    bool clearEnv_ = false;
    std::string workdir_;
    std::string argZero_;
    bool hasIdentity_ = false;
    uid_t uid_ = 0;
    gid_t gid_ = 0;
    std::vector<gid_t> groups_;
    int timeout_ = 0;
    pid_t pid_ = -1;
    std::string out_;
    std::string err_;
};

}  // namespace CORVUtils
