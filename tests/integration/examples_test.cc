// The example packages of examples/: each builds with the command line and reads back as
// its source says; greeter is installable only beside a running hello of a fitting
// version; and, installed and upgraded by the engine, their scripts and daemons do what
// the demo relies on.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "corv/process_runner.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "support/files.h"
#include "support/http.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::run;

namespace {

const std::string kCli = CORVPKG_CLI_PATH;
const std::string kExamples = std::string(CORVPKG_SOURCE_DIR) + "/examples";
const std::string kOut = "/tmp/examples";
const int kHelloPort = 8765;
const int kGreeterPort = 9123;  // the test's wizard answer, not the default

// Unsigned packages pass the signature step only when the machine accepts any package.
void acceptUnsignedPackages() {
    testutil::writeFile("/etc/corvinfo.conf", testutil::readFile("/etc/corvinfo.conf") +
                                                  "pkg_source_trust_level=\"2\"\n");
}

std::string cpkOf(const std::string& name, const std::string& version) {
    return kOut + "/" + name + "-" + version + ".cpk";
}

void buildAllWithTheScript() {
    auto build = run("/bin/sh", {kExamples + "/build.sh", kCli, kOut});
    ASSERT_EQ(build.status, 0) << build.out << build.err;
}

Json::Value cliJson(const std::vector<std::string>& args, int expectedStatus) {
    auto r = run(kCli, args);
    EXPECT_EQ(r.status, expectedStatus) << testing::PrintToString(args) << "\n" << r.out << r.err;
    Json::Value out;
    EXPECT_TRUE(fromString(r.out, out)) << testing::PrintToString(args) << "\n" << r.out;
    return out;
}

PackageInfo infoOf(const std::string& dir) {
    PackageInfo info;
    EXPECT_TRUE(PMSLoadPKGInfoFile(dir, info, "enu", PKG_INFO_MASK_ALL)) << dir;
    return info;
}

// The control script of an installed package with one action, as its job runs it: with
// the environment and the identity that the engine gives it, behind the engine's back.
int control(const std::string& name, const std::string& action) {
    const std::string registry = "/var/packages/" + name;
    const std::string logFile = "/tmp/corvpkgmgr.log-" + name;
    CORVUtils::ProcessRunner runner(registry + "/scripts/start-stop-status", {action});
    runner.setTimeout(60);
    PMSPrepareScriptEnv(infoOf(registry), runner, "enu", &logFile,
                        action == "start" ? PKG_START : PKG_STOP, nullptr, nullptr, nullptr,
                        nullptr);
    EXPECT_TRUE(Privilege::SetIdentity(runner, name, action, "")) << name << " " << action;
    int status = runner.run(true, true);
    EXPECT_TRUE(status != 0 || runner.getCapturedOutputErr().empty())
        << "a good run is a quiet one: " << name << " " << action << ": "
        << runner.getCapturedOutputErr();
    CleanAllEnv();
    return status;
}

// Installs a package file through the engine; 1 on success.
int engineInstall(const std::string& cpk, bool start, const Json::Value* answers = nullptr) {
    PackageManager pm;
    int outcome = pm.install(nullptr, cpk, "/volume1", start, answers, "enu", true, false);
    EXPECT_TRUE(outcome == 1 || pm.getResult() != PKG_OK) << cpk;
    return outcome;
}

struct Answer {
    bool connected = false;
    std::string head;
    std::string body;
};

// GET / on 127.0.0.1:port, HTTP/1.0, five seconds at most.
Answer httpGet(int port) {
    Answer answer;
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        return answer;
    }
    struct FdCloser {
        int fd;
        ~FdCloser() { close(fd); }
    } closer{fd};
    struct timeval timeout = {5, 0};
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(static_cast<uint16_t>(port));
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    if (connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
        return answer;
    }
    answer.connected = true;
    const std::string request = "GET / HTTP/1.0\r\nHost: 127.0.0.1\r\n\r\n";
    if (write(fd, request.data(), request.size()) != static_cast<ssize_t>(request.size())) {
        return answer;
    }
    std::string reply;
    char buffer[4096];
    ssize_t n;
    while ((n = read(fd, buffer, sizeof buffer)) > 0) {
        reply.append(buffer, static_cast<size_t>(n));
    }
    const size_t split = reply.find("\r\n\r\n");
    answer.head = reply.substr(0, split);
    answer.body = split == std::string::npos ? "" : reply.substr(split + 4);
    return answer;
}

// The first line of a file: a pid file's pid.
std::string firstLine(const std::string& path) {
    const std::string text = testutil::readFile(path);
    return text.substr(0, text.find('\n'));
}

const char kHelloBody[] = "hello from a corvpkg package\n";

// hello from its package file, installed by the engine and started or not; `version`
// other than the file's is written into the registry's INFO, as an older or newer hello
// would have left it.
void installHello(const std::string& version, bool running) {
    ASSERT_EQ(engineInstall(cpkOf("hello", "1.0.0-0001"), running), 1);
    if (version != "1.0.0-0001") {
        std::string info = testutil::readFile("/var/packages/hello/INFO");
        info.replace(info.find("1.0.0-0001"), 10, version);
        testutil::writeFile("/var/packages/hello/INFO", info);
    }
}

void removeHello() {
    if (PMSCheckPackage("hello")) {
        PackageManager pm;
        EXPECT_EQ(pm.uninstall("hello", nullptr, "enu", PKG_UNINSTALL, true, nullptr), 1)
            << pm.getResult();
    }
}

std::vector<std::string> scriptsInRecord(const std::string& record) {
    std::vector<std::string> names;
    std::istringstream lines(record);
    std::string date, time, name;
    std::string rest;
    while (lines >> date >> time >> name && std::getline(lines, rest)) {
        names.push_back(name);
    }
    return names;
}

}  // namespace

TEST(Examples, EveryExampleBuildsAndReadsBackAsItsSourceSays) {
    const struct {
        std::string name;
        std::string version;
        std::vector<std::string> scripts;
        std::string depends;  // name and lower bound of the dependency, if any
    } examples[] = {
        {"hello", "1.0.0-0001", {"start-stop-status"}, ""},
        {"greeter",
         "1.0.0-0001",
         {"start-stop-status", "preinst", "postinst", "preuninst", "postuninst", "preupgrade",
          "postupgrade"},
         "hello>=1.0.0-0001"},
        {"photos", "1.0.0-0001", {"start-stop-status"}, ""},
        {"notes", "1.0.0-0001", {"start-stop-status", "preupgrade"}, ""},
    };
    std::set<std::string> inTree;
    for (const auto& entry : std::filesystem::directory_iterator(kExamples)) {
        if (entry.is_directory() && testutil::exists(entry.path().string() + "/INFO")) {
            inTree.insert(entry.path().filename().string());
        }
    }
    std::set<std::string> inTable;
    for (const auto& e : examples) {
        inTable.insert(e.name);
    }
    EXPECT_EQ(inTree, inTable) << "every example directory has its row here";

    acceptUnsignedPackages();
    ASSERT_EQ(VLIBCExec("/bin/mkdir", "-p", kOut.c_str(), nullptr), 0);
    for (const auto& e : examples) {
        SCOPED_TRACE(e.name);
        const std::string cpk = cpkOf(e.name, e.version);
        auto build = run(kCli, {"build", kExamples + "/" + e.name, "-o", cpk});
        ASSERT_EQ(build.status, 0) << build.out << build.err;

        Json::Value inspect = cliJson({"inspect", cpk, "--json"}, 0);
        EXPECT_EQ(inspect["package"].asString(), e.name);
        EXPECT_EQ(inspect["version"].asString(), e.version);
        EXPECT_TRUE(inspect["checksum_ok"].asBool());
        std::vector<std::string> scripts;
        for (const Json::Value& s : inspect["scripts"]) {
            scripts.push_back(s.asString());
        }
        EXPECT_EQ(scripts, e.scripts);

        PackageInfo source = infoOf(kExamples + "/" + e.name);
        std::string depends;
        for (const PackageBasicInfo& dep : source.dep_packages) {
            depends += dep.package + (dep.compop == 4 ? ">=" : "?") + dep.version;
        }
        EXPECT_EQ(depends, e.depends);
        EXPECT_TRUE(PMSCheckPackageArchModelMatched(source)) << "the arch list fits this machine";
    }
    // hello needs nothing; greeter's verdict depends on hello (the next test).
    Json::Value check = cliJson({"check", cpkOf("hello", "1.0.0-0001"), "--json"}, 0);
    EXPECT_TRUE(check["installable"].asBool()) << toString(check);
}

TEST(Examples, GreeterIsInstallableOnlyBesideARunningHelloOfAFittingVersion) {
    acceptUnsignedPackages();
    ASSERT_NO_FATAL_FAILURE(buildAllWithTheScript());
    const struct {
        const char* hello;  // installed version of hello, "" for none
        bool running;
        int status;
        std::string report;
    } cases[] = {
        {"", false, 1, R"(["pkgmgr:depend_packages","hello"])"},
        {"0.9.0-0001", true, 1, R"(["pkgmgr:depend_packages","hello"])"},
        {"1.0.0-0001", false, 1, R"(["pkgmgr:depend_unstart","Hello"])"},
        {"1.0.0-0001", true, 0, "[]"},
        {"1.2.0-0001", true, 0, "[]"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string("hello ") + (c.hello[0] ? c.hello : "absent") +
                     (c.running ? ", running" : ", stopped"));
        removeHello();
        if (c.hello[0] != '\0') {
            ASSERT_NO_FATAL_FAILURE(installHello(c.hello, c.running));
        }
        Json::Value check = cliJson({"check", cpkOf("greeter", "1.0.0-0001"), "--json"}, c.status);
        EXPECT_EQ(toString(check["report"]), c.report) << toString(check);
        if (std::string(c.hello) == "0.9.0-0001") {
            EXPECT_EQ(check["data"]["packages"]["hello"][">="].asString(), "1.0.0-0001")
                << toString(check);
        }
    }
    removeHello();
}

TEST(Examples, HelloServesItsPageAndItsScriptReportsItsState) {
    ASSERT_NO_FATAL_FAILURE(buildAllWithTheScript());
    ASSERT_NO_FATAL_FAILURE(installHello("1.0.0-0001", false));
    const std::string status = "/var/packages/hello/scripts/start-stop-status";
    auto statusNow = [&] { return run(status, {"status"}).status; };

    EXPECT_EQ(statusNow(), 3) << "not started yet";
    EXPECT_FALSE(httpGet(kHelloPort).connected);
    ASSERT_EQ(control("hello", "start"), 0);
    EXPECT_EQ(statusNow(), 0);
    EXPECT_EQ(control("hello", "start"), 0) << "a second start leaves the daemon running";
    Answer answer = httpGet(kHelloPort);
    ASSERT_TRUE(answer.connected);
    EXPECT_EQ(answer.head.substr(0, 15), "HTTP/1.0 200 OK") << answer.head;
    EXPECT_EQ(answer.body, kHelloBody);
    auto log = run(status, {"log"});
    EXPECT_EQ(log.status, 0);
    EXPECT_NE(log.out.find("GET / HTTP/1.0"), std::string::npos) << log.out;

    ASSERT_EQ(control("hello", "stop"), 0);
    EXPECT_EQ(statusNow(), 3);
    EXPECT_FALSE(httpGet(kHelloPort).connected) << "the daemon is gone";
    EXPECT_EQ(control("hello", "stop"), 0) << "stopping a stopped package is fine";

    // A daemon killed behind the script's back leaves its pid file: "dead", not "stopped".
    ASSERT_EQ(control("hello", "start"), 0);
    const std::string pid = firstLine("/volume1/@appstore/hello/var/hello.pid");
    ASSERT_EQ(VLIBCExec("/bin/kill", "-KILL", pid.c_str(), nullptr), 0);
    for (int i = 0; i < 50 && statusNow() == 0; ++i) {
        usleep(100 * 1000);
    }
    EXPECT_EQ(statusNow(), 1);
    EXPECT_EQ(control("hello", "start"), 0) << "a start replaces the dead daemon";
    EXPECT_EQ(httpGet(kHelloPort).body, kHelloBody);

    // Without its program the package is broken.
    ASSERT_EQ(control("hello", "stop"), 0);
    ASSERT_EQ(unlink("/volume1/@appstore/hello/bin/hello-daemon"), 0);
    EXPECT_EQ(statusNow(), 150);
    EXPECT_NE(control("hello", "start"), 0);
}

TEST(Examples, GreeterKeepsTheWizardAnswersThroughAnUpgrade) {
    acceptUnsignedPackages();
    ASSERT_NO_FATAL_FAILURE(buildAllWithTheScript());
    ASSERT_NO_FATAL_FAILURE(installHello("1.0.0-0001", true));
    const std::string v1 = cpkOf("greeter", "1.0.0-0001");

    // The wizard asks for the two answers that the scripts read.
    PackageManager pm;
    PackageInfo withWizard;
    ASSERT_TRUE(pm.queryPackageFileInfoWithWizard(v1, withWizard, PKG_INSTALL, "enu"));
    Json::Value defaults(Json::objectValue);
    getUIDefaultValues(withWizard.wizard, defaults);
    EXPECT_EQ(toString(defaults),
              R"({"GREETER_GREETING":"Good day from the greeter","GREETER_PORT":"8766"})");

    // preinst refuses bad answers with a message, and nothing stays installed.
    const struct {
        const char* greeting;
        const char* port;
        const char* message;
    } refused[] = {
        {"Hi", "80", "The port must be a number from 1024 to 65535, not '80'."},
        {"Hi", "65536", "The port must be a number from 1024 to 65535, not '65536'."},
        {"Hi", "12ab", "The port must be a number from 1024 to 65535, not '12ab'."},
        {"Hi", "8765", "Port 8765 is taken by another program; choose another one."},
        {"Hi\nthere", "9000", "The greeting must be one line."},
    };
    for (const auto& r : refused) {
        SCOPED_TRACE(std::string(r.greeting) + " / " + r.port);
        unlink("/tmp/corvpkgmgr.log-greeter");
        Json::Value answers(Json::objectValue);
        answers["GREETER_GREETING"] = r.greeting;
        answers["GREETER_PORT"] = r.port;
        EXPECT_EQ(engineInstall(v1, true, &answers), 0);
        EXPECT_EQ(testutil::readFile("/tmp/corvpkgmgr.log-greeter"), std::string(r.message) + "\n");
        EXPECT_FALSE(PMSCheckPackage("greeter"));
    }
    Json::Value answers(Json::objectValue);
    answers["GREETER_GREETING"] = "Hi from the test";
    answers["GREETER_PORT"] = std::to_string(kGreeterPort);
    ASSERT_EQ(engineInstall(v1, true, &answers), 1);
    const std::string conf = "/volume1/@appstore/greeter/var/greeter.conf";
    EXPECT_NE(testutil::readFile(conf).find("\ngreeting=Hi from the test\nport=9123\n"),
              std::string::npos)
        << testutil::readFile(conf);

    Answer answer = httpGet(kGreeterPort);
    EXPECT_EQ(answer.body,
              "Hi from the test\n"
              "greeter 1.0.0-0001; hello on port 8765 says: hello from a corvpkg package\n");
    EXPECT_FALSE(httpGet(8766).connected) << "the default port is not used";
    auto ps = run("/bin/ps",
                  {"-o", "user=", "-p", firstLine("/volume1/@appstore/greeter/var/greeter.pid")});
    EXPECT_EQ(ps.out, "greeter\n") << "the daemon runs as the package user";

    // Enabled, the package has its crontab; its one job, run as the package user, leaves
    // the greeter's answer in var/heartbeat.
    const std::string crontab = testutil::readFile("/var/spool/cron/crontabs/greeter");
    EXPECT_EQ(crontab, testutil::readFile("/volume1/@appstore/greeter/etc/greeter.crontab"));
    std::istringstream lines(crontab);
    std::string line, job;
    while (std::getline(lines, line)) {
        if (!line.empty() && line[0] != '#') {
            std::istringstream fields(line);
            for (int i = 0; i < 6; ++i) {
                fields >> job;  // five time fields, then the command
            }
        }
    }
    CORVUtils::ProcessRunner heartbeat(job);
    ASSERT_TRUE(heartbeat.setRuntimeIdentity("greeter", true));
    EXPECT_EQ(heartbeat.run(true, true), 0) << job << ": " << heartbeat.getCapturedOutputErr();
    const std::string beat = testutil::readFile("/volume1/@appstore/greeter/var/heartbeat");
    EXPECT_NE(beat.find(" ok: Hi from the test\n"), std::string::npos) << beat;
    ASSERT_EQ(pm.serviceControl("greeter", false, nullptr), 1);
    EXPECT_FALSE(testutil::exists("/var/spool/cron/crontabs/greeter"));

    // The upgrade file passes the checks over the installed 1.0.0-0001: it has upgrade
    // scripts, and the port that it declares is the installed version's own.
    Json::Value check = cliJson({"check", cpkOf("greeter", "1.1.0-0001"), "--json"}, 0);
    EXPECT_TRUE(check["installable"].asBool()) << toString(check);
    ASSERT_EQ(engineInstall(cpkOf("greeter", "1.1.0-0001"), true), 1);
    EXPECT_FALSE(testutil::exists(Privilege::GetTmpFolderPath("greeter", "/volume1")));
    EXPECT_FALSE(httpGet(kGreeterPort).connected) << "stopped before the upgrade, stopped after";
    ASSERT_EQ(pm.serviceControl("greeter", true, nullptr), 1);
    EXPECT_EQ(httpGet(kGreeterPort).body,
              "Hi from the test\n"
              "greeter 1.1.0-0001; hello on port 8765 says: hello from a corvpkg package\n")
        << "the new version answers with the greeting chosen at install";

    // Without hello the greeter still answers, and says so.
    ASSERT_EQ(control("hello", "stop"), 0);
    EXPECT_EQ(httpGet(kGreeterPort).body,
              "Hi from the test\n"
              "greeter 1.1.0-0001; hello on port 8765 does not answer (Connection refused)\n");
    ASSERT_EQ(control("greeter", "stop"), 0);

    // The record in the etc dir, which outlives the payload, tells the order of the scripts.
    const std::string record = testutil::readFile("/usr/corv/etc/packages/greeter/scripts.log");
    EXPECT_EQ(scriptsInRecord(record),
              (std::vector<std::string>{"preinst", "postinst", "preupgrade", "preuninst",
                                        "postuninst", "preinst", "postinst", "postupgrade"}))
        << record;
    EXPECT_NE(record.find("preupgrade UPGRADE version=1.0.0-0001 old=1.0.0-0001 "
                          "script-of=1.1.0-0001 as=root"),
              std::string::npos)
        << "preupgrade comes from the new package and runs as root, which its conf/privilege "
           "asks for\n"
        << record;
    EXPECT_NE(record.find("preuninst UPGRADE version=1.0.0-0001 script-of=1.0.0-0001 as=greeter"),
              std::string::npos)
        << "the old package's preuninst runs as the package user\n"
        << record;
}

TEST(Examples, NotesKeepsItsNotesInItsOwnDatabaseBehindTheWebServer) {
    if (!testutil::exists("/usr/bin/psql") || !testutil::exists("/usr/sbin/nginx")) {
        GTEST_SKIP() << "PostgreSQL or nginx is not installed (scripts/setup-deps.sh)";
    }
    ASSERT_EQ(VLIBServiceStart("pgsql", 0), 0);
    ASSERT_EQ(VLIBServiceStart("nginx", 0), 0);
    acceptUnsignedPackages();
    ASSERT_NO_FATAL_FAILURE(buildAllWithTheScript());
    ASSERT_EQ(engineInstall(cpkOf("notes", "1.0.0-0001"), true), 1);
    auto served = [](const std::string& text) {
        return
            [text](const testutil::HttpReply& r) { return r.body.find(text) != std::string::npos; };
    };
    testutil::HttpReply page = testutil::httpGetUntil(5000, "/notes/", served("notes 1.0.0"));
    EXPECT_EQ(page.body, "notes 1.0.0-0001\n");
    EXPECT_EQ(page.headers["content-security-policy"],
              "default-src 'self'; frame-ancestors 'none'; img-src 'self' data:");
    EXPECT_EQ(testutil::httpGet(5000, "/notes/add?text=it%27s+here").body, "added: it's here\n");

    ASSERT_EQ(engineInstall(cpkOf("notes", "1.1.0-0001"), true), 1) << "the upgrade";
    EXPECT_EQ(testutil::httpGetUntil(5000, "/notes/", served("1.1.0")).body,
              "notes 1.1.0-0001\nit's here\n");

    PackageManager pm;
    ASSERT_EQ(pm.uninstall("notes", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    auto r = run("/usr/bin/psql", {"-X", "-U", "postgres", "-tAc",
                                   "SELECT count(*) FROM pg_database WHERE datname = 'notes'"});
    EXPECT_EQ(r.out, "0\n") << "its database went with it";
    EXPECT_EQ(
        testutil::httpGetUntil(5000, "/notes/",
                               [](const testutil::HttpReply& reply) { return reply.status == 0; })
            .status,
        0);
}
