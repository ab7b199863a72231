// From a real corv-store on loopback to a running package: downloads under their task
// records, installs by name, the update check through the scheduler's job, and what the
// faults of the store (its fault file) and of the user (cancel, kill) leave behind.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "corv/mail.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgimagetool.h"
#include "corvpkg/pkgschedule.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/run.h"
#include "support/store_kit.h"

using namespace CORVPackageTool;
using testutil::StoreServer;

namespace {

const char kStoreDir[] = "/tmp/task-store";
const char kNotes[] = "/var/log/corvnosnotify.log";
const char kBadge[] = "/var/cache/corv/badge/CORV.NDS.PkgManApp.Instance";

testutil::RunResult corvpkg(const std::vector<std::string>& args) {
    return testutil::run(CORVPKG_CLI_PATH, args);
}

bool waitFor(const std::function<bool()>& done, int seconds) {
    for (int i = 0; i < seconds * 20; ++i) {
        if (done()) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    return done();
}

std::vector<std::string> taskIds() {
    return NOS::TaskMgr(PKG_TASK_OWNER).list();
}

std::string taskId(const std::string& name) {
    return PKG_DOWNLOAD_TASK_PREFIX + name;
}

Json::Value taskRecord(const std::string& name) {
    std::unique_ptr<NOS::Task> task(NOS::TaskMgr(PKG_TASK_OWNER).getTask(taskId(name)));
    Json::Value record(Json::objectValue);
    if (task) {
        record["progress"] = task->getProperty("progress");
        record["data"] = task->getProperty("data");
    }
    return record;
}

// The download folders that are left: <volume>/@tmp/@corvpkg/@download/<name>.
std::string downloadFolder(const std::string& name) {
    std::string dir;
    return PMSGetTmpDir(0, dir) ? dir + "/@corvpkg/@download/" + name : "";
}

// Starts `corvpkg args...` in the background; its pid.
pid_t spawnCorvpkg(const std::vector<std::string>& args) {
    pid_t pid = fork();
    if (pid == 0) {
        std::vector<std::string> argv = {CORVPKG_CLI_PATH};
        argv.insert(argv.end(), args.begin(), args.end());
        std::vector<char*> raw;
        for (std::string& arg : argv) {
            raw.push_back(arg.data());
        }
        raw.push_back(nullptr);
        freopen("/dev/null", "w", stdout);
        freopen("/dev/null", "w", stderr);
        execv(raw[0], raw.data());
        _exit(127);
    }
    return pid;
}

int waitExit(pid_t pid, int seconds) {
    int status = 0;
    for (int i = 0; i < seconds * 20; ++i) {
        if (waitpid(pid, &status, WNOHANG) == pid) {
            return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    kill(pid, SIGKILL);
    waitpid(pid, &status, 0);
    return -1;
}

testutil::TestPackage storePackage(const std::string& name, const std::string& version) {
    testutil::TestPackage pkg = testutil::recordingPackage(name, version);
    pkg.info["displayname"] = name + " display";
    return pkg;
}

class StoreTask : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(server_.running());
        testutil::setDefaultsKey("package_server", server_.base() + "/");
        VLIBCFileSetKeyValue(VLIBC_INFO_PATH, "pkg_source_trust_level", "2", nullptr);
        unlink(kNotes);
    }
    // Publishes hello 1.0 and greeter 1.0, which needs hello.
    void publishPair() {
        ASSERT_TRUE(server_.publish(testutil::buildPackage(storePackage("hello", "1.0-0001"))));
        testutil::TestPackage greeter = storePackage("greeter", "1.0-0001");
        greeter.info["install_dep_packages"] = "hello";
        greeter.info["silent_upgrade"] = "yes";
        ASSERT_TRUE(server_.publish(testutil::buildPackage(greeter)));
    }
    std::string link(const std::string& file) { return server_.base() + "/" + file; }
    std::string installedVersion(const std::string& name) {
        PackageManager pm;
        PackageInfo info;
        return pm.getInstallPackageInfo(name, info, nullptr, PKG_INFO_MASK_ALL) ? info.version : "";
    }
    StoreServer server_{kStoreDir};
};

TEST_F(StoreTask, InstallByNameBringsTheDependencyAndTheScheduledCheckUpgrades) {
    ASSERT_NO_FATAL_FAILURE(publishPair());
    testutil::RunResult r = corvpkg({"install", "greeter", "--json"});
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    Json::Value out;
    ASSERT_TRUE(fromString(r.out, out)) << r.out;
    ASSERT_EQ(out["installed"].size(), 2u) << r.out;
    EXPECT_EQ(out["installed"][0]["package"].asString(), "hello") << "the dependency first";
    EXPECT_EQ(out["installed"][1]["package"].asString(), "greeter");
    EXPECT_EQ(installedVersion("hello"), "1.0-0001");
    EXPECT_EQ(installedVersion("greeter"), "1.0-0001");
    EXPECT_TRUE(taskIds().empty()) << "no task record outlives the command";
    EXPECT_FALSE(testutil::exists(downloadFolder("greeter")));
    EXPECT_EQ(corvpkg({"install", "greeter"}).out, "greeter is installed and up to date\n");

    // greeter 1.1 allows a silent upgrade and is chosen; hello 1.1 does not and is reported.
    testutil::TestPackage greeter = storePackage("greeter", "1.1-0001");
    greeter.info["install_dep_packages"] = "hello";
    greeter.info["silent_upgrade"] = "yes";
    ASSERT_TRUE(server_.publish(testutil::buildPackage(greeter)));
    ASSERT_TRUE(server_.publish(testutil::buildPackage(storePackage("hello", "1.1-0001"))));
    r = corvpkg({"updates", "--refresh", "--json"});
    ASSERT_EQ(r.status, 0) << r.err;
    ASSERT_TRUE(fromString(r.out, out)) << r.out;
    EXPECT_EQ(out["updates"].size(), 2u) << r.out;

    ASSERT_EQ(corvpkg({"autoupdate", "set", "greeter"}).status, 0);
    VLIBCFileSetKeyValue(VLIBC_INFO_PATH, "upgrade_pkg_email_notification", "yes", nullptr);
    VLIBCFileSetKeyValue(VLIBC_INFO_PATH, "enable_pkg_autoupdate_all", "yes", nullptr);
    ASSERT_TRUE(PMSSavaSchedule(1, 1, 1));
    // The scheduler's own rendering of the job: run its command as cron would.
    const std::string cron = testutil::readFile("/etc/cron.d/corvcrond_sys_autopkgupgrade");
    const size_t at = cron.find("/usr/corv/bin/corvpkg chkupgradepkg");
    ASSERT_NE(at, std::string::npos) << cron;
    ASSERT_EQ(
        VLIBCExec("/bin/sh", "-c", cron.substr(at, cron.find('\n', at) - at).c_str(), nullptr), 0);
    EXPECT_EQ(installedVersion("greeter"), "1.1-0001") << "upgraded silently";
    EXPECT_EQ(installedVersion("hello"), "1.0-0001") << "not chosen: only reported";
    const std::string notes = testutil::readFile(kNotes);
    EXPECT_NE(notes.find("pkgmgr:upgrade_start_pkg_completed\tgreeter display"), std::string::npos)
        << notes;
    EXPECT_NE(notes.find("pkgmgr:upgrade_one_package\thello display"), std::string::npos) << notes;
    EXPECT_NE(testutil::readFile(CORV_MAIL_SPOOL).find("packages can be installed: hello display"),
              std::string::npos);
    EXPECT_EQ(testutil::readFile(kBadge), "1\n");
    EXPECT_TRUE(taskIds().empty());
}

TEST_F(StoreTask, DownloadFaultsEndAsFailuresWithNothingLeft) {
    const std::string cpk = testutil::buildPackage(storePackage("hello", "1.0-0001"));
    ASSERT_TRUE(server_.publish(cpk));
    const std::string name = cpk.substr(cpk.rfind('/') + 1);
    Json::Value entry;
    ASSERT_TRUE(CORVPackageServer::GetPackageInfoFromServer("hello", entry, true, "enu"));
    const std::string md5 = entry["md5"].asString();
    struct Case {
        const char* what;
        const char* rule;  // the fault of the package file's path
        const char* md5;   // null: the right one
        bool ok;
        const char* key;
    };
    const Case cases[] = {
        {"checksum that does not match", "{}", "0123456789abcdef0123456789abcdef", true,
         "pkgmgr_pkg_broken"},
        {"server error", R"({"status": 500, "body": "down"})", nullptr, false, ""},
        {"cut mid-download", R"({"cut_after": 4096})", nullptr, false, ""},
        {"good checksum, not a package", R"({"body": "not a package"})",
         "c4d3ebc1b0c8f7435d89e6371e79873d", false, "pkgmgr_pkg_broken"},
        {"full volume", R"({"fill": 83886080})", nullptr, false, ""},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        Json::Value rule = StoreServer::rulesFromText(c.rule);
        rule["path"] = "/" + name;
        Json::Value rules(Json::arrayValue);
        rules.append(rule);
        server_.setFaults(rules);
        std::string folder;
        ASSERT_TRUE(PMSCreateDownloadTmpDir("/volume1", "hello", 10, folder));
        NOS::Task task(PKG_TASK_OWNER, taskId("hello"));
        ASSERT_TRUE(CORVPackageServer::InitDownload(&task, "hello", 10, link(name).c_str(),
                                                    folder.c_str(), false, getpid()));
        std::string path;
        const bool ok = CORVPackageServer::DownloadPackage(
            &task, nullptr, "hello", link(name).c_str(), c.md5 ? c.md5 : md5.c_str(), false,
            folder.c_str(), "enu", path);
        PackageManager::UnLock();
        EXPECT_EQ(ok, c.ok);
        const Json::Value record = taskRecord("hello");
        EXPECT_EQ(record["progress"].asDouble(), ok ? 1.0 : -1.0) << record;
        EXPECT_EQ(record["data"]["success"].asBool(), ok) << record;
        EXPECT_EQ(record["data"].get("key", "").asString(), c.key) << record;
        EXPECT_EQ(testutil::exists(folder), ok) << "a failure removes its folder";
        if (!ok) {
            EXPECT_NE(testutil::readFile(kNotes).find("pkgmgr:download_pkg_fail\thello"),
                      std::string::npos);
        }
        task.remove();
        testutil::removeAll(folder);
        unlink(kNotes);
    }
}

TEST_F(StoreTask, CancelKillAndASecondInstallLeaveNothingTheNextCallCannotClear) {
    const std::string cpk = testutil::buildPackage(storePackage("hello", "1.0-0001"));
    ASSERT_TRUE(server_.publish(cpk));
    const std::string name = cpk.substr(cpk.rfind('/') + 1);
    server_.setFaults(StoreServer::rulesFromText(
        R"([{"path": "/)" + name + R"(", "stall_after": 2048, "stall_seconds": 60}])"));
    auto started = [] { return taskRecord("hello")["progress"].asDouble() > 0; };

    // Cancel while the transfer stalls.
    pid_t pid = spawnCorvpkg({"download", "hello", "-o", "/tmp/hello.cpk"});
    ASSERT_TRUE(waitFor(started, 20));
    // The same package from the library meanwhile: true at once, the first one's task stays.
    EXPECT_TRUE(CORVPackageServer::BackgroundInstall(nullptr, "/volume1", "hello", "hello", nullptr,
                                                     "enu", 10, link(name).c_str(), nullptr, true));
    EXPECT_EQ(taskRecord("hello")["data"]["pid"].asInt(), pid);
    ASSERT_EQ(corvpkg({"cancel", "hello"}).status, 0);
    EXPECT_EQ(waitExit(pid, 20), 1);
    EXPECT_TRUE(taskIds().empty());
    EXPECT_FALSE(testutil::exists(downloadFolder("hello")));
    EXPECT_FALSE(testutil::exists("/tmp/hello.cpk"));

    // Cancel while it waits for the package lock: no transfer at all.
    ASSERT_TRUE(PackageManager::ExLock(1));
    pid = spawnCorvpkg({"download", "hello"});
    ASSERT_TRUE(waitFor([] { return !taskIds().empty(); }, 20));
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_LE(taskRecord("hello")["progress"].asDouble(), 1e-05) << "no transfer began";
    ASSERT_EQ(corvpkg({"cancel", "hello"}).status, 0);
    EXPECT_EQ(waitExit(pid, 20), 1);
    PackageManager::UnLock();
    EXPECT_TRUE(taskIds().empty());
    EXPECT_FALSE(testutil::exists(downloadFolder("hello")));

    // An installer killed mid-download leaves its record and folder; the next install
    // finds its pid dead, clears them and installs.
    pid = spawnCorvpkg({"install", "hello"});
    ASSERT_TRUE(waitFor(started, 20));
    kill(pid, SIGKILL);
    waitExit(pid, 5);
    EXPECT_EQ(taskIds().size(), 1u);
    server_.setFaults(Json::Value(Json::arrayValue));
    testutil::RunResult r = corvpkg({"install", "hello"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(installedVersion("hello"), "1.0-0001");
    EXPECT_TRUE(taskIds().empty());
    EXPECT_FALSE(testutil::exists(downloadFolder("hello")));
}

TEST_F(StoreTask, BackgroundInstallTakesTheWizardDefaultsAndNotifies) {
    testutil::TestPackage pkg = storePackage("asker", "1.0-0001");
    pkg.wizard["install_uifile"] =
        R"([{"step_title": "t", "items": [{"type": "textfield", "subitems": )"
        R"([{"key": "answer", "desc": "d", "defaultValue": "forty-two"}]}]}])";
    const std::string cpk = testutil::buildPackage(pkg);
    ASSERT_TRUE(server_.publish(cpk));
    Json::Value entry;
    ASSERT_TRUE(CORVPackageServer::GetPackageInfoFromServer("asker", entry, true, "enu"));
    PackageInfo info;
    ASSERT_TRUE(PMSMapJsonToPackageInfo(entry, info));
    ASSERT_TRUE(CORVPackageServer::DownloadInstatll(nullptr, "enu", "/volume1", nullptr, info));
    EXPECT_EQ(installedVersion("asker"), "1.0-0001");
    EXPECT_EQ(testutil::scriptField("asker", "postinst", "answer"), "forty-two");
    EXPECT_TRUE(taskIds().empty()) << "a finished background install leaves no task";
    const std::string notes = testutil::readFile(kNotes);
    EXPECT_NE(notes.find("\t-t\ttrue\t-e\tfalse\t@administrators\ttree:leaf_packagemanage\t"
                         "pkgmgr:install_start_pkg_completed\tasker display"),
              std::string::npos)
        << notes;

    // A fresh install needs a volume: refused with the failure notification, which names
    // the package before its file was read.
    ASSERT_EQ(corvpkg({"uninstall", "asker"}).status, 0);
    unlink(kNotes);
    EXPECT_FALSE(CORVPackageServer::BackgroundInstall("alice", nullptr, "asker", "asker display",
                                                      nullptr, "enu", info.size, info.link.c_str(),
                                                      info.md5.c_str(), true));
    EXPECT_NE(testutil::readFile(kNotes).find("alice\ttree:leaf_packagemanage\t"
                                              "pkgmgr:install_pkg_fail\tasker\t"),
              std::string::npos)
        << testutil::readFile(kNotes);
    EXPECT_TRUE(taskIds().empty());
}

TEST_F(StoreTask, StoreIconsMustBeSmallImages) {
    const std::string png = "\x89PNG\r\n\x1a\n" + std::string(100, 'p');
    testutil::writeFile(std::string(kStoreDir) + "/good.png", png);
    testutil::writeFile(std::string(kStoreDir) + "/page.png", "<html>not an image</html>");
    testutil::writeFile(std::string(kStoreDir) + "/big.png", std::string(3 << 20, 'b'));
    testutil::writeFile(std::string(kStoreDir) + "/icon.html", png);
    server_.setFaults(
        StoreServer::rulesFromText(R"([{"path": "/page.png", "content_type": "text/html"}])"));
    struct Case {
        const char* file;
        bool ok;
    } cases[] = {{"good.png", true}, {"page.png", false}, {"big.png", false}, {"icon.html", false}};
    for (const Case& c : cases) {
        SCOPED_TRACE(c.file);
        char out[4096] = {0};
        EXPECT_EQ(PMSGetServerImage("store", "hello", "1.0", c.file, link(c.file).c_str(), out,
                                    sizeof out),
                  c.ok);
        EXPECT_NE(out[0], '\0');
        EXPECT_EQ(testutil::exists(out), c.ok) << "a refused image is removed";
    }
    // The cached image is served without asking the store again.
    const size_t asked = server_.requests().size();
    EXPECT_TRUE(PMSGetServerImage("store", "hello", "1.0", "good.png", link("good.png").c_str(),
                                  nullptr, 0));
    EXPECT_EQ(server_.requests().size(), asked);
}

}  // namespace
