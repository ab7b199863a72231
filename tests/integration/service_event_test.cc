// Events of the platform's init system: which jobs an emitted event starts and stops, and
// that the scripts' own emits never wait for the lock their job's transition holds.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <functional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "corv/service.h"
#include "corv/vlibc.h"
#include "support/files.h"
#include "support/run.h"

namespace {

using Clock = std::chrono::steady_clock;

void writeJob(const std::string& name, const std::string& text) {
    testutil::writeFile("/etc/init/" + name + ".conf", text);
}

// A job that notes each of its starts in /tmp/<name>.starts and runs until stopped.
void countingJob(const std::string& name, const std::string& stanzas) {
    writeJob(name, stanzas + "pre-start exec /bin/sh -c 'echo x >>/tmp/" + name + ".starts'\n");
}

size_t starts(const std::string& name) {
    const std::string path = "/tmp/" + name + ".starts";
    if (!testutil::exists(path)) {
        return 0;
    }
    std::string text = testutil::readFile(path);
    return static_cast<size_t>(std::count(text.begin(), text.end(), '\n'));
}

bool running(const std::string& name) {
    return VLIBServiceIsRunning(name.c_str()) == 1;
}

int emit(const std::vector<std::string>& args) {
    std::vector<std::string> all{"emit"};
    all.insert(all.end(), args.begin(), args.end());
    testutil::RunResult r = testutil::run("/sbin/initctl", all);
    EXPECT_TRUE(r.err.empty()) << r.err;
    return r.status;
}

bool waitFor(const std::function<bool()>& condition, double seconds) {
    const auto deadline = Clock::now() + std::chrono::duration<double>(seconds);
    while (!condition()) {
        if (Clock::now() >= deadline) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return true;
}

double secondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

}  // namespace

TEST(ServiceEvent, EmitStartsTheJobsWhoseConditionNamesIt) {
    countingJob("web", "start on corv.test.up NAME=\"web\"\n");
    countingJob("other", "start on corv.test.other\n");
    countingJob("idle", "");

    EXPECT_EQ(emit({"corv.test.up", "NAME=db"}), 0);
    EXPECT_FALSE(running("web")) << "the argument must match";
    EXPECT_EQ(emit({"corv.test.up", "NAME=web", "EXTRA=1"}), 0);
    EXPECT_TRUE(running("web")) << "emit waits for the start";
    EXPECT_FALSE(running("other"));
    EXPECT_FALSE(running("idle"));
    EXPECT_EQ(emit({"corv.test.up", "NAME=web"}), 0);
    EXPECT_EQ(starts("web"), 1u) << "a running job is not started again";

    const std::string log = testutil::readFile("/var/log/corv-init/events.log");
    EXPECT_NE(log.find("Z corv.test.up NAME=db\n"), std::string::npos) << log;
    EXPECT_NE(log.find("Z corv.test.up NAME=web EXTRA=1\n"), std::string::npos) << log;

    EXPECT_EQ(testutil::run("/sbin/initctl", {"emit", "bad event"}).status, 2);
    EXPECT_EQ(testutil::run("/sbin/initctl", {"emit", "e", "positional"}).status, 2);
}

TEST(ServiceEvent, EveryTermOfAnAndIsNeeded) {
    countingJob("app",
                "start on corv.pkgctl.pkgstart and corv.pkgctl.started NAME=\"db\" "
                "and started cache\n");
    countingJob("cache", "");
    // The database announces itself from its pre-start, as a generated adapter does.
    writeJob("db",
             "env SELF=\"db\"\npre-start script\n"
             "\t/sbin/initctl emit --no-wait corv.pkgctl.started NAME=\"$SELF\"\n"
             "end script\n");

    EXPECT_EQ(emit({"corv.pkgctl.pkgstart"}), 0);
    EXPECT_FALSE(running("app"));
    ASSERT_EQ(VLIBServiceStart("db", 0), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    EXPECT_FALSE(running("app")) << "'started cache' is still missing";
    ASSERT_EQ(VLIBServiceStart("cache", 0), 0);
    EXPECT_TRUE(running("app")) << "the start of cache completed the condition";
    EXPECT_EQ(starts("app"), 1u);

    // Met once, the condition is forgotten: it takes all of its events again.
    ASSERT_EQ(VLIBServiceStop("app", 0), 0);
    ASSERT_EQ(VLIBServiceStop("cache", 0), 0);
    ASSERT_EQ(VLIBServiceStart("cache", 0), 0);
    EXPECT_EQ(emit({"corv.pkgctl.started", "NAME=db"}), 0);
    EXPECT_FALSE(running("app"));
    EXPECT_EQ(emit({"corv.pkgctl.pkgstart"}), 0);
    EXPECT_TRUE(running("app"));
    EXPECT_EQ(starts("app"), 2u);
}

TEST(ServiceEvent, NoWaitLeavesTheStartToAProcessOfItsOwn) {
    writeJob("slow", "start on corv.test.slow\npre-start exec /bin/sleep 0.5\n");
    auto start = Clock::now();
    EXPECT_EQ(emit({"--no-wait", "corv.test.slow"}), 0);
    EXPECT_LT(secondsSince(start), 0.4) << "it did not wait for the pre-start";
    EXPECT_TRUE(waitFor([] { return running("slow"); }, 5));
}

TEST(ServiceEvent, StopOnCountsOnlyTheCurrentRun) {
    countingJob("svc", "stop on corv.test.a and corv.test.b\n");
    EXPECT_EQ(emit({"corv.test.a"}), 0) << "while it is stopped: not counted";
    ASSERT_EQ(VLIBServiceStart("svc", 0), 0);
    EXPECT_EQ(emit({"corv.test.b"}), 0);
    EXPECT_TRUE(running("svc"));
    EXPECT_EQ(VLIBServiceRestart("svc"), 0);
    EXPECT_EQ(emit({"corv.test.a"}), 0);
    EXPECT_TRUE(running("svc")) << "b was met in the previous run";
    EXPECT_EQ(emit({"corv.test.b"}), 0);
    EXPECT_FALSE(running("svc"));

    countingJob("plain", "stop on corv.pkgctl.shutdown\n");
    ASSERT_EQ(VLIBServiceStart("plain", 0), 0);
    EXPECT_EQ(emit({"corv.pkgctl.shutdown"}), 0);
    EXPECT_FALSE(running("plain"));
}

TEST(ServiceEvent, DisabledJobsIgnoreEvents) {
    countingJob("pkgctl-off", "start on corv.pkgctl.pkgstart\n");
    EXPECT_EQ(VLIBServicectlJobDisable("pkgctl-off"), 0);
    EXPECT_EQ(testutil::readFile("/etc/init/pkgctl-off.override"), "manual\n");
    EXPECT_EQ(emit({"corv.pkgctl.pkgstart"}), 0);
    EXPECT_FALSE(running("pkgctl-off"));
    EXPECT_EQ(VLIBServiceStart("pkgctl-off", 0), 0) << "asked by name it starts all the same";
    EXPECT_EQ(VLIBServiceStop("pkgctl-off", 0), 0);

    EXPECT_EQ(VLIBServicectlJobEnable("pkgctl-off"), 0);
    EXPECT_FALSE(testutil::exists("/etc/init/pkgctl-off.override"));
    EXPECT_EQ(VLIBServicectlJobEnable("pkgctl-off"), 0) << "enabling twice is fine";
    EXPECT_EQ(emit({"corv.pkgctl.pkgstart"}), 0);
    EXPECT_TRUE(running("pkgctl-off"));

    EXPECT_EQ(VLIBServicectlJobDisable("no-such-job"), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
    EXPECT_EQ(VLIBServicectlJobEnable("../x"), -1);
}

TEST(ServiceEvent, ScriptsThatEmitAboutTheirOwnJobDoNotDeadlock) {
    // Its post-stop emits, waiting, an event that starts it: the start can only come
    // after the stop, so it is handed on instead of waiting for the job's own lock.
    countingJob("phoenix",
                "start on corv.test.again\n"
                "post-stop exec /sbin/initctl emit corv.test.again\n");
    // Its pre-start emits, waiting, the event that starts it: already starting.
    countingJob("eager",
                "start on corv.test.eager\n"
                "post-start exec /sbin/initctl emit corv.test.eager\n"
                "exec /bin/sleep 60\n");

    auto start = Clock::now();
    ASSERT_EQ(VLIBServiceStart("phoenix", 0), 0);
    EXPECT_EQ(VLIBServiceStop("phoenix", 0), 0);
    EXPECT_LT(secondsSince(start), 5.0);
    EXPECT_TRUE(waitFor([] { return starts("phoenix") == 2 && running("phoenix"); }, 10))
        << "the event of its post-stop started it again afterwards";

    start = Clock::now();
    ASSERT_EQ(VLIBServiceStart("eager", 0), 0);
    EXPECT_LT(secondsSince(start), 5.0);
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_TRUE(running("eager"));
    EXPECT_EQ(starts("eager"), 1u);

    // Asking for its own job by name from a script is refused rather than left to hang.
    writeJob("selfish", "pre-start exec /sbin/initctl stop selfish\n");
    start = Clock::now();
    EXPECT_LT(VLIBServiceStart("selfish", 0), 0);
    EXPECT_LT(secondsSince(start), 5.0);
}
