// Running programs: exit statuses, redirections, pipes, and the ProcessRunner's capture,
// environment, time-out and behaviour with children that outlive it.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdio.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <map>
#include <string>
#include <vector>

#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "support/files.h"
#include "support/temp_dir.h"

using CORVUtils::ProcessRunner;
using Clock = std::chrono::steady_clock;

namespace {

double secondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

std::string readAll(FILE* stream) {
    std::string text;
    char buf[4096];
    size_t n;
    while ((n = fread(buf, 1, sizeof(buf), stream)) > 0) {
        text.append(buf, n);
    }
    return text;
}

// Points one of this process's standard descriptors elsewhere for the life of the object.
class Redirect {
  public:
    Redirect(int target, int replacement) : target_(target), saved_(dup(target)) {
        fflush(nullptr);
        dup2(replacement, target);
    }
    ~Redirect() {
        fflush(nullptr);
        dup2(saved_, target_);
        close(saved_);
    }

  private:
    int target_;
    int saved_;
};

// Ignores a signal in this process for the life of the object.
class Ignore {
  public:
    explicit Ignore(int sig) : sig_(sig) {
        struct sigaction ign {};
        ign.sa_handler = SIG_IGN;
        sigaction(sig_, &ign, &old_);
    }
    ~Ignore() { sigaction(sig_, &old_, nullptr); }

  private:
    int sig_;
    struct sigaction old_ {};
};

// Processes of a group that still run; a killed one whose parent is gone may linger as a
// zombie until some init reaps it, and that one counts as ended.
int runningInGroup(pid_t group) {
    int running = 0;
    DIR* proc = opendir("/proc");
    while (proc != nullptr) {
        struct dirent* e = readdir(proc);
        if (e == nullptr) {
            break;
        }
        std::string stat = testutil::readFile(std::string("/proc/") + e->d_name + "/stat");
        size_t close = stat.rfind(')');
        if (close == std::string::npos) {
            continue;
        }
        char state = 0;
        int ppid = 0;
        int pgrp = 0;
        if (sscanf(stat.c_str() + close + 1, " %c %d %d", &state, &ppid, &pgrp) == 3 &&
            pgrp == group && state != 'Z') {
            ++running;
        }
    }
    if (proc != nullptr) {
        closedir(proc);
    }
    return running;
}

std::map<std::string, std::string> parseEnv(const std::string& text) {
    std::map<std::string, std::string> vars;
    size_t pos = 0;
    while (pos < text.size()) {
        size_t nl = text.find('\n', pos);
        std::string line = text.substr(pos, nl == std::string::npos ? nl : nl - pos);
        size_t eq = line.find('=');
        if (eq != std::string::npos) {
            vars[line.substr(0, eq)] = line.substr(eq + 1);
        }
        pos = nl == std::string::npos ? text.size() : nl + 1;
    }
    return vars;
}

}  // namespace

TEST(PlatformExec, ExitStatuses) {
    TempDir dir;
    const std::string plain = dir.path() + "/not-executable";
    testutil::writeFile(plain, "#!/bin/sh\nexit 0\n");
    chmod(plain.c_str(), 0644);
    const struct {
        std::vector<const char*> argv;
        int status;
    } cases[] = {
        {{"/bin/true"}, 0},
        {{"/bin/false"}, 1},
        {{"/bin/sh", "-c", "exit 7"}, 7},
        {{"/bin/sh", "-c", "kill -9 $$"}, 137},
        {{"/bin/sh", "-c", "kill -TERM $$"}, 128 + SIGTERM},
        {{"/nonexistent/program"}, -1},
        {{plain.c_str()}, -1},
    };
    for (const auto& c : cases) {
        std::vector<const char*> argv = c.argv;
        argv.push_back(nullptr);
        SCOPED_TRACE(c.argv.size() > 2 ? c.argv[2] : c.argv[0]);
        EXPECT_EQ(VLIBCExecv(argv[0], argv.data(), 1), c.status);
        switch (c.argv.size()) {
            case 1:
                EXPECT_EQ(VLIBCExec(argv[0], nullptr), c.status);
                EXPECT_EQ(VLIBCExecl(argv[0], 0xbb, nullptr), c.status);
                break;
            case 3:
                EXPECT_EQ(VLIBCExec(argv[0], argv[1], argv[2], nullptr), c.status);
                EXPECT_EQ(VLIBCExecl(argv[0], 0xbb, argv[1], argv[2], nullptr), c.status);
                break;
        }
        ProcessRunner runner(c.argv[0]);
        for (size_t i = 1; i < c.argv.size(); ++i) {
            runner.addArguments(c.argv[i]);
        }
        EXPECT_EQ(runner.run(true, true), c.status);
    }
}

TEST(PlatformExec, ExecvArgumentVector) {
    const char* argv[] = {"renamed", "-c", "test \"$0\" = renamed", nullptr};
    EXPECT_EQ(VLIBCExecv("/bin/sh", argv, 1), 0) << "argv[0] is the caller's";
    EXPECT_EQ(VLIBCExecv("/bin/true", nullptr, 1), 0) << "no vector: the path alone";
}

TEST(PlatformExec, ExeclRedirections) {
    TempDir dir;
    const std::string captured = dir.path() + "/captured";
    int out = open(captured.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    ASSERT_GE(out, 0);
    int in[2];
    ASSERT_EQ(pipe(in), 0);
    ASSERT_EQ(write(in[1], "typed\n", 6), 6);
    close(in[1]);
    {
        Redirect stdoutToFile(STDOUT_FILENO, out);
        Redirect stderrToFile(STDERR_FILENO, out);
        Redirect stdinFromPipe(STDIN_FILENO, in[0]);
        const char* script = "echo out-$1; echo err-$1 >&2";
        VLIBCExecl("/bin/sh", VLIBC_EXEC_WAIT, "-c", script, "sh", "none", nullptr);
        VLIBCExecl("/bin/sh", VLIBC_EXEC_WAIT | VLIBC_EXEC_NULL_STDOUT, "-c", script, "sh", "o",
                   nullptr);
        VLIBCExecl("/bin/sh", VLIBC_EXEC_WAIT | VLIBC_EXEC_NULL_STDERR, "-c", script, "sh", "e",
                   nullptr);
        VLIBCExecl("/bin/sh", 0xbb, "-c", script, "sh", "all", nullptr);
        const char* reader = "read x; echo \"in-$1[$x]\"";
        VLIBCExecl("/bin/sh", VLIBC_EXEC_WAIT | VLIBC_EXEC_NULL_STDIN, "-c", reader, "sh", "null",
                   nullptr);
        VLIBCExecl("/bin/sh", VLIBC_EXEC_WAIT, "-c", reader, "sh", "pipe", nullptr);
    }
    close(out);
    close(in[0]);
    EXPECT_EQ(testutil::readFile(captured),
              "out-none\nerr-none\nerr-o\nout-e\nin-null[]\nin-pipe[typed]\n");
}

TEST(PlatformExec, ExeclWithoutWaitReturnsAtOnce) {
    TempDir dir;
    const std::string marker = dir.path() + "/marker";
    const std::string script = "sleep 0.5; touch " + marker;
    auto start = Clock::now();
    EXPECT_EQ(VLIBCExecl("/bin/sh", 0, "-c", script.c_str(), nullptr), 0);
    EXPECT_LT(secondsSince(start), 0.4);
    EXPECT_FALSE(testutil::exists(marker));
    for (int i = 0; i < 100 && !testutil::exists(marker); ++i) {
        usleep(50 * 1000);
    }
    EXPECT_TRUE(testutil::exists(marker)) << "the child ran on its own";
    EXPECT_EQ(VLIBCExecv("/nonexistent", nullptr, 0), -1) << "a start failure still shows";
}

TEST(PlatformExec, ChildrenGetDefaultSignals) {
    Ignore pipes(SIGPIPE);
    // A shell keeps a signal ignored that was ignored when it started.
    EXPECT_EQ(VLIBCExec("/bin/sh", "-c", "kill -PIPE $$; exit 0", nullptr), 128 + SIGPIPE);
    ProcessRunner runner("/bin/sh", {"-c", "kill -PIPE $$; exit 0"});
    EXPECT_EQ(runner.run(true, true), 128 + SIGPIPE);
}

TEST(PlatformExec, PopenReadAndWrite) {
    FILE* in = VLIBCPopen("/bin/echo", "r", "hello", "world", nullptr);
    ASSERT_NE(in, nullptr);
    EXPECT_EQ(readAll(in), "hello world\n");
    EXPECT_EQ(VLIBCPclose(in), 0);

    TempDir dir;
    const std::string file = dir.path() + "/written";
    const std::string script = "cat > " + file + "; exit 5";
    const char* argv[] = {"/bin/sh", "-c", script.c_str(), nullptr};
    FILE* out = VLIBCPopenv("/bin/sh", "w", argv);
    ASSERT_NE(out, nullptr);
    fputs("piped text", out);
    EXPECT_EQ(VLIBCPclose(out), 5);
    EXPECT_EQ(testutil::readFile(file), "piped text");

    EXPECT_EQ(VLIBCPopen("/nonexistent", "r", nullptr), nullptr);
    EXPECT_EQ(VLIBCPopen("/bin/true", "x", nullptr), nullptr);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
    EXPECT_EQ(VLIBCPclose(stdin), -1) << "not a stream of VLIBCPopen";
}

TEST(PlatformExec, PipesDoNotLeakIntoOtherChildren) {
    // If the second child inherited the first pipe's write end, the first child would
    // see no end of input until the second one ends.
    FILE* writer = VLIBCPopen("/bin/sh", "w", "-c", "cat > /dev/null", nullptr);
    ASSERT_NE(writer, nullptr);
    FILE* sleeper = VLIBCPopen("/bin/sh", "r", "-c", "sleep 3", nullptr);
    ASSERT_NE(sleeper, nullptr);
    ProcessRunner another("/bin/sh", {"-c", "sleep 3"});
    ASSERT_EQ(another.run(false, false), 0);
    auto start = Clock::now();
    EXPECT_EQ(VLIBCPclose(writer), 0);
    EXPECT_LT(secondsSince(start), 1.5);
    kill(another.getPid(), SIGKILL);
    waitpid(another.getPid(), nullptr, 0);
    VLIBCPclose(sleeper);
}

TEST(PlatformExec, ProcAlive) {
    EXPECT_EQ(VLIBCProcAlive(getpid()), 1);
    EXPECT_EQ(VLIBCProcAlive(1), 1) << "somebody else's process exists too";
    EXPECT_EQ(VLIBCProcAlive(0), 0);
    pid_t pid = VLIBCProcFork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        _exit(0);
    }
    waitpid(pid, nullptr, 0);
    EXPECT_EQ(VLIBCProcAlive(pid), 0);
}

TEST(PlatformRunner, CapturesBothStreams) {
    ProcessRunner runner("/bin/sh", {"-c", "echo out; echo err >&2; printf partial; exit 3"});
    EXPECT_EQ(runner.run(true, true), 3);
    EXPECT_EQ(runner.getCapturedOutput(), "out\npartial");
    EXPECT_EQ(runner.getCapturedOutputErr(), "err\n");
    EXPECT_GT(runner.getPid(), 0);

    int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
    {
        Redirect quietOut(STDOUT_FILENO, null);
        Redirect quietErr(STDERR_FILENO, null);
        EXPECT_EQ(runner.run(true, false), 3) << "runs again";
    }
    close(null);
    EXPECT_EQ(runner.getCapturedOutput(), "") << "nothing kept without capture";
}

TEST(PlatformRunner, CopiesEveryByteToTheDescriptor) {
    TempDir dir;
    const std::string log = dir.path() + "/log";
    testutil::writeFile(log, "before\n");
    int fd = open(log.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC);
    ASSERT_GE(fd, 0);
    ProcessRunner runner("/bin/sh", {"-c", "echo out; sleep 0.2; echo err >&2"});
    EXPECT_EQ(runner.run(0x90, true, true, fd), 0);
    EXPECT_EQ(runner.getCapturedOutput(), "out\n");
    EXPECT_EQ(testutil::readFile(log), "before\nout\nerr\n");

    ProcessRunner direct("/bin/sh", {"-c", "echo plain; echo oops >&2"});
    EXPECT_EQ(direct.run(1, true, false, fd), 0);
    EXPECT_EQ(direct.getCapturedOutput(), "");
    EXPECT_EQ(testutil::readFile(log), "before\nout\nerr\nplain\noops\n");
    close(fd);
}

TEST(PlatformRunner, EnvironmentOnTopOfTheCallers) {
    setenv("CORV_TEST_INHERITED", "from-parent", 1);
    setenv("CORV_TEST_REPLACED", "old", 1);
    ProcessRunner runner("/usr/bin/env");
    runner.addEnv("CORV_TEST_REPLACED", "new");
    runner.addEnv("CORV_TEST_ADDED", "first");
    runner.addEnv("CORV_TEST_ADDED", "second = with blanks");
    ASSERT_EQ(runner.run(true, true), 0);
    std::map<std::string, std::string> vars = parseEnv(runner.getCapturedOutput());
    EXPECT_EQ(vars["CORV_TEST_INHERITED"], "from-parent");
    EXPECT_EQ(vars["CORV_TEST_REPLACED"], "new");
    EXPECT_EQ(vars["CORV_TEST_ADDED"], "second = with blanks");
    EXPECT_EQ(runner.getCapturedOutput().find("CORV_TEST_ADDED=first"), std::string::npos)
        << "one entry per name";
    EXPECT_STREQ(getenv("CORV_TEST_REPLACED"), "old") << "the caller's environment is untouched";
    unsetenv("CORV_TEST_INHERITED");
    unsetenv("CORV_TEST_REPLACED");
}

TEST(PlatformRunner, ToString) {
    const struct {
        std::vector<std::string> args;
        const char* line;
    } cases[] = {
        {{}, "/bin/echo"},
        {{"a", "-b"}, "/bin/echo a -b"},
        {{"a b"}, "/bin/echo \"a b\""},
        {{""}, "/bin/echo \"\""},
        {{"say \"hi\""}, "/bin/echo \"say \\\"hi\\\"\""},
        {{"it's", "tab\there"}, "/bin/echo \"it's\" \"tab\there\""},
    };
    for (const auto& c : cases) {
        ProcessRunner runner("/bin/echo", c.args);
        EXPECT_EQ(runner.toString(), c.line);
    }
    ProcessRunner built("/bin/echo", {"one"});
    built.addArguments("two", std::string("three four"));
    EXPECT_EQ(built.toString(), "/bin/echo one two \"three four\"");
}

TEST(PlatformRunner, ChattyChildIsCappedNotBlocked) {
    TempDir dir;
    const std::string log = dir.path() + "/log";
    int fd = open(log.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    ASSERT_GE(fd, 0);
    const size_t size = 20u << 20;
    ProcessRunner runner("/bin/sh", {"-c", "head -c " + std::to_string(size) +
                                               " /dev/zero; head -c 1000 /dev/zero >&2"});
    runner.setTimeout(60);
    auto start = Clock::now();
    EXPECT_EQ(runner.run(1, true, true, fd), 0);
    EXPECT_LT(secondsSince(start), 30.0);
    EXPECT_EQ(runner.getCapturedOutput().size(), ProcessRunner::kCaptureLimit);
    EXPECT_EQ(runner.getCapturedOutputErr().size(), 1000u);
    struct stat st {};
    fstat(fd, &st);
    EXPECT_EQ(static_cast<size_t>(st.st_size), size + 1000) << "the copy has every byte";
    close(fd);
}

TEST(PlatformRunner, ABackgroundChildDoesNotHoldTheCaller) {
    ProcessRunner runner("/bin/sh", {"-c", "sleep 30 & echo started"});
    auto start = Clock::now();
    EXPECT_EQ(runner.run(true, true), 0);
    EXPECT_LT(secondsSince(start), 3.0);
    EXPECT_EQ(runner.getCapturedOutput(), "started\n");
    kill(-runner.getPid(), SIGKILL);  // the sleep is still in the child's group
}

TEST(PlatformRunner, TimeoutKillsTheGroup) {
    ProcessRunner runner("/bin/sh", {"-c", "sleep 30 & sleep 30"});
    runner.setTimeout(1);
    auto start = Clock::now();
    EXPECT_EQ(runner.run(true, true), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_TIMEOUT);
    double waited = secondsSince(start);
    EXPECT_GE(waited, 0.9);
    EXPECT_LT(waited, 3.0);
    usleep(100 * 1000);
    EXPECT_EQ(runningInGroup(runner.getPid()), 0) << "nothing of the group is left";

    ProcessRunner quiet("/bin/sh", {"-c", "sleep 30"});
    quiet.setTimeout(1);
    start = Clock::now();
    EXPECT_EQ(quiet.run(true, false), -1) << "also without capture";
    EXPECT_LT(secondsSince(start), 3.0);

    ProcessRunner quick("/bin/sh", {"-c", "exit 4"});
    quick.setTimeout(5);
    EXPECT_EQ(quick.run(true, false), 4);
}

TEST(PlatformRunner, StartFailures) {
    TempDir dir;
    const std::string plain = dir.path() + "/plain";
    testutil::writeFile(plain, "echo hi\n");
    chmod(plain.c_str(), 0644);
    for (const std::string& program : {std::string("/nonexistent"), plain, dir.path()}) {
        ProcessRunner runner(program);
        EXPECT_EQ(runner.run(true, true), -1) << program;
        ProcessRunner detached(program);
        EXPECT_EQ(detached.run(false, false), -1) << program;
    }
    ProcessRunner badDir("/bin/true");
    badDir.setWorkingDirectory(dir.path() + "/missing");
    EXPECT_EQ(badDir.run(true, false), -1);
}

TEST(PlatformRunner, WorkingDirectoryAndNoWait) {
    TempDir dir;
    ProcessRunner pwd("/bin/pwd");
    pwd.setWorkingDirectory(dir.path());
    ASSERT_EQ(pwd.run(true, true), 0);
    EXPECT_EQ(pwd.getCapturedOutput(), dir.path() + "\n");

    ProcessRunner detached("/bin/sh", {"-c", "exit 9"});
    EXPECT_EQ(detached.run(false, true), 0);
    int status = 0;
    ASSERT_EQ(waitpid(detached.getPid(), &status, 0), detached.getPid());
    EXPECT_EQ(WEXITSTATUS(status), 9);
}

TEST(PlatformRunner, IdentityOfAnUnknownUser) {
    ProcessRunner runner("/usr/bin/id", {"-u"});
    EXPECT_FALSE(runner.setRuntimeIdentity("corv-no-such-user", true));
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_USER);
    EXPECT_FALSE(runner.setRuntimeIdentity("corv-no-such-user", false));
    ASSERT_EQ(runner.run(true, true), 0) << "the runner is unchanged";
    EXPECT_EQ(runner.getCapturedOutput(), std::to_string(geteuid()) + "\n");
}

TEST(PlatformRunner, IdentityPathBehavesLikeThePlainOne) {
    if (geteuid() != 0) {
        GTEST_SKIP() << "changing identity needs root";
    }
    // root as root goes the way of any identity, without needing a user of its own.
    ProcessRunner runner("/bin/sh", {"-c", "id -u; id -g; echo err >&2; exit 6"});
    ASSERT_TRUE(runner.setRuntimeIdentity("root", true));
    runner.addEnv("CORV_TEST_IDENTITY", "set");
    EXPECT_EQ(runner.run(true, true), 6);
    EXPECT_EQ(runner.getCapturedOutput(), "0\n0\n");
    EXPECT_EQ(runner.getCapturedOutputErr(), "err\n");

    ProcessRunner env("/usr/bin/env");
    ASSERT_TRUE(env.setRuntimeIdentity("root", true));
    env.addEnv("CORV_TEST_IDENTITY", "set");
    ASSERT_EQ(env.run(true, true), 0);
    EXPECT_EQ(parseEnv(env.getCapturedOutput())["CORV_TEST_IDENTITY"], "set");

    ProcessRunner missing("/nonexistent");
    ASSERT_TRUE(missing.setRuntimeIdentity("root", true));
    EXPECT_EQ(missing.run(true, true), -1);

    ProcessRunner slow("/bin/sh", {"-c", "sleep 30 & sleep 30"});
    ASSERT_TRUE(slow.setRuntimeIdentity("root", true));
    slow.setTimeout(1);
    auto start = Clock::now();
    EXPECT_EQ(slow.run(true, true), -1);
    EXPECT_LT(secondsSince(start), 3.0);
    usleep(100 * 1000);
    EXPECT_EQ(runningInGroup(slow.getPid()), 0) << "the child had its own group";
}
