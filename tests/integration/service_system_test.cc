// Services of the reference platform: the service files and their checks, run keys,
// required jobs, and the system services that drive real daemons.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "../../platform/src/init_job.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "support/files.h"
#include "support/run.h"

namespace {

struct List {
    PVLIBSZLIST p = VLIBCSzListAlloc(8);
    ~List() { VLIBCSzListFree(p); }
    std::vector<std::string> items() const { return p->items; }
};

void writeService(const std::string& name, const std::string& json) {
    testutil::writeFile(std::string(VLIB_SERVICE_CFG_DIR) + "/" + name + ".cfg", json);
}

void writeJob(const std::string& name, const std::string& text) {
    testutil::writeFile("/etc/init/" + name + ".conf", text);
}

std::string jobsJson(const std::string& jobs, const std::string& more = "") {
    return "{\"init_job_map\":{\"upstart\":[" + jobs + "]}" + more + "}";
}

int state(const char* name) {
    int value = -7;
    return VLIBServiceStatusGet(name, &value) == 0 ? value : -1;
}

bool waitFor(const std::function<bool()>& condition, double seconds) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::duration<double>(seconds);
    while (!condition()) {
        if (std::chrono::steady_clock::now() >= deadline) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return true;
}

int mainPid(const std::string& job) {
    CORVInit::JobStatus status;
    return CORVInit::JobStatusGet(job, &status) == 0 ? status.pid : -1;
}

// The first line of what a local HTTP server answers, or "" when nobody listens.
std::string httpStatusLine() {
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(80);
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    std::string reply;
    if (fd >= 0 && connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) == 0) {
        const char request[] = "GET / HTTP/1.0\r\nHost: localhost\r\n\r\n";
        if (write(fd, request, sizeof request - 1) == sizeof request - 1) {
            char buffer[256];
            ssize_t n = read(fd, buffer, sizeof buffer);
            reply.assign(buffer, n > 0 ? static_cast<size_t>(n) : 0);
        }
    }
    if (fd >= 0) {
        close(fd);
    }
    return reply.substr(0, reply.find('\r'));
}

}  // namespace

TEST(ServiceSystem, ServiceFilesAreChecked) {
    const struct {
        const char* text;
        bool valid;
    } cases[] = {
        {R"({"init_job_map":{"upstart":["pkgctl-a"]}})", true},
        {R"({"init_job_map":{"upstart":["pkgctl-a"]},"required_corvservice":["pgsql",)"
         R"("pkgctl-b"],"auto_start":"no","is_package":"yes"})",
         true},
        {R"({"init_job_map":{"upstart":["a","b"]},"display_name":"A and B"})", true},
        {"", false},
        {"[]", false},
        {"{\"init_job_map\":{\"upstart\":[\"a\"]}} trailing", false},
        {R"({"init_job_map":{"upstart":[]}})", false},
        {R"({"init_job_map":{"upstart":"a"}})", false},
        {R"({"init_job_map":{"systemd":["a"]}})", false},
        {R"({"init_job_map":["a"]})", false},
        {R"({"init_job_map":{"upstart":["../a"]}})", false},
        {R"({"init_job_map":{"upstart":[1]}})", false},
        {R"({"init_job_map":{"upstart":["a"]},"required_corvservice":"pgsql"})", false},
        {R"({"init_job_map":{"upstart":["a"]},"required_corvservice":[true]})", false},
        {R"({"init_job_map":{"upstart":["a"]},"display_name":7})", false},
    };
    for (const auto& c : cases) {
        testutil::writeFile("/tmp/check.cfg", c.text);
        EXPECT_EQ(VLIBServicecfgValidate("/tmp/check.cfg"), c.valid ? 0 : -1) << c.text;
        if (!c.valid) {
            EXPECT_EQ(VLIBCErrGet(), ERR_MALFORMED) << c.text;
        }
    }
    EXPECT_EQ(VLIBServicecfgValidate("/tmp/missing.cfg"), -1);
    EXPECT_EQ(VLIBServicecfgValidate(nullptr), -1);
}

TEST(ServiceSystem, TheSystemServicesAreThere) {
    List list;
    EXPECT_EQ(VLIBServiceEnum(&list.p), 8);
    EXPECT_EQ(list.items(),
              (std::vector<std::string>{"corvindexd", "corvmkflvd", "corvmkthumbd", "crond",
                                        "nginx", "pgsql", "ssh-shell", "syslog-ng"}));
    for (const std::string& name : list.items()) {
        EXPECT_EQ(VLIBServicecfgValidate((VLIB_SERVICE_CFG_DIR "/" + name + ".cfg").c_str()), 0)
            << name;
        testutil::RunResult r = testutil::run("/sbin/initctl", {"status", name});
        EXPECT_EQ(r.status, 0) << name << ": " << r.err;
        EXPECT_EQ(r.out, name + " stop/waiting\n");
    }
    char buffer[0x200];
    EXPECT_EQ(VLIBServicecfgDisplayNameGet("pgsql", buffer, sizeof buffer), 10);
    EXPECT_STREQ(buffer, "PostgreSQL");
}

TEST(ServiceSystem, RequiredJobsAndDisplayNames) {
    writeService("front", jobsJson("\"front-web\",\"front-api\"",
                                   ",\"required_corvservice\":[\"middle\",\"base\"],"
                                   "\"display_name\":\"Front end\""));
    writeService("middle",
                 jobsJson("\"middle\"", ",\"required_corvservice\":[\"base\",\"front\"]"));
    writeService("base", jobsJson("\"base\",\"front-api\""));
    writeService("broken", jobsJson("\"x\"", ",\"required_corvservice\":[\"nowhere\"]"));
    writeJob("loose", "");

    List list;
    VLIBCSzListPush(&list.p, "middle");
    EXPECT_EQ(VLIBServicecfgInfoGet("front", 4, &list.p), 3) << "a cycle, and doubles";
    EXPECT_EQ(list.items(), (std::vector<std::string>{"middle", "front-web", "front-api", "base"}));
    List job;
    EXPECT_EQ(VLIBServicecfgInfoGet("loose", 4, &job.p), 1) << "a job is its own service";
    EXPECT_EQ(job.items(), (std::vector<std::string>{"loose"}));
    List none;
    EXPECT_EQ(VLIBServicecfgInfoGet("broken", 4, &none.p), -1);
    EXPECT_EQ(VLIBServicecfgInfoGet("front", 1, &none.p), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);

    char buffer[64];
    EXPECT_EQ(VLIBServicecfgDisplayNameGet("front", buffer, sizeof buffer), 9);
    EXPECT_STREQ(buffer, "Front end");
    EXPECT_EQ(VLIBServicecfgDisplayNameGet("middle", buffer, sizeof buffer), 6);
    EXPECT_STREQ(buffer, "middle");
    EXPECT_EQ(VLIBServicecfgDisplayNameGet("front", buffer, 9), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BUF_TOO_SMALL);
    EXPECT_EQ(VLIBServicecfgDisplayNameGet("nowhere", buffer, sizeof buffer), -1);
}

TEST(ServiceSystem, RunKeysEnableAndDisable) {
    EXPECT_EQ(VLIBServiceIsEnabled("ssh-shell"), 0) << "no run key, not running";
    ASSERT_EQ(VLIBServiceStart("ssh-shell", 0), 0);
    EXPECT_EQ(VLIBServiceIsEnabled("ssh-shell"), 1) << "no run key: running counts";
    EXPECT_EQ(VLIBServicecfgRunKeySet("ssh-shell", 2), 0);
    EXPECT_EQ(VLIBServiceIsEnabled("ssh-shell"), 0);
    EXPECT_EQ(VLIBServiceStop("ssh-shell", 0), 0);
    EXPECT_EQ(VLIBServicecfgRunKeySet("ssh-shell", 1), 0);
    EXPECT_EQ(VLIBServiceIsEnabled("ssh-shell"), 1);
    EXPECT_EQ(testutil::readFile("/usr/corv/etc/corvservice.override/ssh-shell.cfg"),
              "{\"runkey\":1}\n");

    EXPECT_EQ(VLIBServicecfgRunKeySet("ssh-shell", 3), -1);
    EXPECT_EQ(VLIBServicecfgRunKeySet("no-such-service", 1), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
    EXPECT_EQ(VLIBServiceIsEnabled("no-such-service"), 0);
}

TEST(ServiceSystem, AServiceStartsWholeOrNotAtAll) {
    writeService("pair", jobsJson("\"pair-one\",\"pair-two\",\"pair-three\""));
    writeJob("pair-one", "post-stop exec /bin/touch /tmp/one-stopped\n");
    writeJob("pair-two", "post-stop exec /bin/touch /tmp/two-stopped\n");
    writeJob("pair-three", "pre-start exec /bin/false\n");

    ASSERT_EQ(VLIBServiceStart("pair-two", 0), 0) << "already running before";
    EXPECT_LT(VLIBServiceStart("pair", 0), 0);
    EXPECT_EQ(state("pair-one"), VLIB_SERVICE_STATE_STOPPED) << "what this start started";
    EXPECT_TRUE(testutil::exists("/tmp/one-stopped"));
    EXPECT_EQ(state("pair-two"), VLIB_SERVICE_STATE_RUNNING) << "what ran before stays";
    EXPECT_FALSE(testutil::exists("/tmp/two-stopped"));
    EXPECT_EQ(state("pair"), VLIB_SERVICE_STATE_STOPPED) << "running means all of it runs";
    EXPECT_EQ(VLIBServicectlIsJobRunning("pair", 0), 1) << "one of its jobs runs";

    writeJob("pair-three", "");
    ASSERT_EQ(VLIBServiceStart("pair", 0), 0);
    EXPECT_EQ(state("pair"), VLIB_SERVICE_STATE_RUNNING);
    EXPECT_EQ(VLIBServicePause("pair"), 0);
    EXPECT_EQ(VLIBServicectlIsJobRunning("pair", 0), 0);
    EXPECT_EQ(VLIBServiceResume("pair"), 0);
    EXPECT_EQ(state("pair"), VLIB_SERVICE_STATE_RUNNING);
    EXPECT_EQ(VLIBServiceStop("pair", 0), 0);
    EXPECT_EQ(VLIBServicectlIsJobRunning("pair", 0), 0);
    EXPECT_EQ(VLIBServicectlIsJobRunning("nowhere", 0), -1);
}

TEST(ServiceSystem, PgsqlRunsARealPostgres) {
    if (!testutil::exists("/usr/bin/psql")) {
        GTEST_SKIP() << "PostgreSQL is not installed (scripts/setup-deps.sh installs it)";
    }
    EXPECT_EQ(VLIBServiceIsRunning("pgsql"), 0);
    ASSERT_EQ(VLIBServiceStart("pgsql", 0), 0)
        << testutil::readFile("/var/log/corv-init/pgsql.log");
    EXPECT_EQ(VLIBServiceIsRunning("pgsql"), 1);
    EXPECT_EQ(VLIBServicectlIsJobRunning("pgsql", 0), 1);
    testutil::RunResult r = testutil::run("/usr/bin/psql", {"-U", "postgres", "-c", "select 1"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_NE(r.out.find("(1 row)"), std::string::npos) << r.out;
    r = testutil::run("/usr/bin/psql",
                      {"-U", "postgres", "-tAc", "select usename from pg_user where usesuper"});
    EXPECT_EQ(r.out, "postgres\n");
    r = testutil::run("/bin/ps", {"-o", "user=", "-p", std::to_string(mainPid("pgsql"))});
    EXPECT_EQ(r.out, "postgres\n") << "the server runs as the system user postgres";

    EXPECT_EQ(VLIBServiceStop("pgsql", 0), 0);
    EXPECT_EQ(VLIBServiceIsRunning("pgsql"), 0);
    EXPECT_NE(testutil::run("/usr/bin/psql", {"-U", "postgres", "-c", "select 1"}).status, 0);

    // The cluster stays: a second start finds the data of the first.
    ASSERT_EQ(VLIBServiceStart("pgsql", 0), 0);
    EXPECT_EQ(
        testutil::run("/usr/bin/psql", {"-U", "postgres", "-c", "create table t (x int)"}).status,
        0);
    EXPECT_EQ(VLIBServiceRestart("pgsql"), 0);
    r = testutil::run("/usr/bin/psql", {"-U", "postgres", "-tAc", "select count(*) from t"});
    EXPECT_EQ(r.out, "0\n") << r.err;
    EXPECT_EQ(VLIBServiceStop("pgsql", 0), 0);
}

TEST(ServiceSystem, NginxAndCronRun) {
    if (!testutil::exists("/usr/sbin/nginx") || !testutil::exists("/usr/sbin/cron")) {
        GTEST_SKIP() << "nginx or cron is not installed (scripts/setup-deps.sh installs them)";
    }
    ASSERT_EQ(VLIBServiceStart("nginx", 0), 0)
        << testutil::readFile("/var/log/corv-init/nginx.log");
    EXPECT_EQ(httpStatusLine().rfind("HTTP/1.1 ", 0), 0u) << "nginx answers on port 80";
    const int pid = mainPid("nginx");
    EXPECT_EQ(VLIBServiceReload("nginx"), 0);
    EXPECT_EQ(mainPid("nginx"), pid) << "a reload keeps the master process";
    EXPECT_EQ(VLIBServiceStop("nginx", 0), 0);
    EXPECT_EQ(httpStatusLine(), "") << "nobody listens any more";

    ASSERT_EQ(VLIBServiceStart("crond", 0), 0);
    EXPECT_EQ(VLIBServiceIsRunning("crond"), 1);
    const int cron = mainPid("crond");
    const std::string comm = "/proc/" + std::to_string(cron) + "/comm";
    EXPECT_TRUE(waitFor([&] { return testutil::readFile(comm) == "cron\n"; }, 5))
        << "the main process is the daemon itself, not a shell around it";
    EXPECT_EQ(VLIBServiceReload("crond"), 0) << "no reload command: a restart";
    EXPECT_NE(mainPid("crond"), cron);
    EXPECT_EQ(VLIBServiceIsRunning("crond"), 1);
    EXPECT_EQ(VLIBServiceStop("crond", 0), 0);
    EXPECT_EQ(VLIBServiceIsRunning("crond"), 0);
}

TEST(ServiceSystem, AMissingDaemonIsNotRunningAndDoesNotStart) {
    // As the platform writes its services: the job checks for its daemon first.
    writeService("ghost", jobsJson("\"ghost\""));
    writeJob("ghost",
             "pre-start script\n"
             "\tif [ ! -x /usr/sbin/ghostd ]; then\n"
             "\t\techo \"ghost: ghostd is not installed\"\n\t\texit 1\n\tfi\n"
             "end script\nexec /usr/sbin/ghostd\n");
    EXPECT_EQ(VLIBServiceIsRunning("ghost"), 0);
    EXPECT_LT(VLIBServiceStart("ghost", 0), 0);
    EXPECT_EQ(VLIBServiceIsRunning("ghost"), 0);
    EXPECT_EQ(state("ghost"), VLIB_SERVICE_STATE_STOPPED);
    EXPECT_EQ(VLIBServiceReload("ghost"), 0) << "nothing runs, nothing to reload";
    EXPECT_EQ(testutil::readFile("/var/log/corv-init/ghost.log"),
              "ghost: ghostd is not installed\n");

    if (!testutil::exists("/usr/sbin/syslog-ng")) {
        EXPECT_LT(VLIBServiceStart("syslog-ng", 0), 0);
        EXPECT_EQ(VLIBServiceIsRunning("syslog-ng"), 0);
        EXPECT_NE(testutil::readFile("/var/log/corv-init/syslog-ng.log").find("not installed"),
                  std::string::npos);
    }
}
