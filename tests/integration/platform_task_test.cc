// The platform facilities of starting and stopping: task records shared between
// processes, the desktop notifier's log and the ACL test of a path.
#include <dirent.h>
#include <errno.h>
#include <stdint.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <regex>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

#include "corv/acl.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "support/files.h"
#include "support/run.h"

namespace {

const std::string kOwner = "@administrators";
const std::string kId = "@CORVPKG_STARTSTOP_demo";
const std::string kRecord = std::string(NOS_TASK_DIR) + "/" + kOwner + "/" + kId + ".json";

Json::Value parse(const std::string& text) {
    Json::Value value;
    Json::Reader reader;
    EXPECT_TRUE(reader.parse(text, value)) << text;
    return value;
}

Json::Value onDisk() {
    return parse(testutil::readFile(kRecord));
}

// The exit status of `body` run in a child process.
int inChild(const std::function<int()>& body) {
    pid_t pid = fork();
    if (pid == 0) {
        int rc = 1;
        try {
            rc = body();
        } catch (...) {
            rc = 99;
        }
        _exit(rc);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// A process that has ended: its pid names nobody (pids are not reused this soon).
pid_t deadPid() {
    pid_t pid = fork();
    if (pid == 0) {
        _exit(0);
    }
    waitpid(pid, nullptr, 0);
    return pid;
}

std::vector<std::string> namesIn(const std::string& dir) {
    std::vector<std::string> names;
    DIR* d = opendir(dir.c_str());
    if (d == nullptr) {
        return names;
    }
    while (struct dirent* e = readdir(d)) {
        std::string name = e->d_name;
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    closedir(d);
    std::sort(names.begin(), names.end());
    return names;
}

}  // namespace

TEST(PlatformTask, NewRecordAndProperties) {
    NOS::Task task(kOwner, kId);
    EXPECT_EQ(task.getOwner(), kOwner);
    EXPECT_EQ(task.getTaskId(), kId);
    EXPECT_EQ(task.path(), kRecord);

    Json::Value record = onDisk();
    EXPECT_EQ(record["progress"], Json::Value(0));
    EXPECT_TRUE(record["data"].isNull());
    EXPECT_TRUE(record.isMember("data"));
    EXPECT_EQ(record["pid"].asInt64(), getpid());
    EXPECT_EQ(record["finished"], Json::Value(false));
    struct stat st {};
    ASSERT_EQ(stat(kRecord.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);
    ASSERT_EQ(stat((std::string(NOS_TASK_DIR) + "/" + kOwner).c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0755u);

    Json::Value data(Json::objectValue);
    data["id"] = "demo";
    data["status"] = "starting";
    ASSERT_TRUE(task.setProperty("data", data));
    EXPECT_EQ(task.getProperty("data"), data);
    EXPECT_EQ(onDisk()["data"], data);
    EXPECT_TRUE(task.getProperty("absent").isNull());

    // Grouped changes reach the file together, at the outermost endUpdate.
    task.beginUpdate();
    task.beginUpdate();
    ASSERT_TRUE(task.setProperty("progress", 40));
    EXPECT_EQ(onDisk()["progress"], Json::Value(0)) << "not written inside an update";
    ASSERT_TRUE(task.endUpdate());
    EXPECT_EQ(onDisk()["progress"], Json::Value(0));
    ASSERT_TRUE(task.endUpdate());
    EXPECT_EQ(onDisk()["progress"], Json::Value(40));

    ASSERT_TRUE(task.finish(false));
    EXPECT_EQ(onDisk()["finished"], Json::Value(true));
    ASSERT_TRUE(task.finish(true));
    EXPECT_FALSE(testutil::exists(kRecord));

    // Only the record and its lock file: no temporary file stays behind.
    ASSERT_TRUE(task.setProperty("progress", 50));
    EXPECT_EQ(namesIn(std::string(NOS_TASK_DIR) + "/" + kOwner),
              (std::vector<std::string>{"." + kId + ".lock", kId + ".json"}));
}

TEST(PlatformTask, SharedBetweenProcesses) {
    NOS::Task task(kOwner, kId);
    Json::Value data(Json::objectValue);
    data["pid"] = static_cast<Json::Int64>(getpid());
    ASSERT_TRUE(task.setProperty("data", data));

    // Another process finds the task, reads what this one wrote and reports progress.
    EXPECT_EQ(inChild([&] {
                  NOS::TaskMgr mgr(kOwner);
                  std::unique_ptr<NOS::Task> found(mgr.getTask(kId));
                  if (!found || found->getProperty("data") != data) {
                      return 2;
                  }
                  return found->setProperty("progress", 70) ? 0 : 3;
              }),
              0);
    EXPECT_EQ(task.getProperty("progress"), Json::Value(0)) << "not before reload";
    ASSERT_TRUE(task.reload());
    EXPECT_EQ(task.getProperty("progress"), Json::Value(70));

    // Writers of different properties keep each other's values.
    task.beginUpdate();
    ASSERT_TRUE(task.setProperty("data", Json::Value("mine")));
    EXPECT_EQ(inChild([&] {
                  std::unique_ptr<NOS::Task> found(NOS::TaskMgr(kOwner).getTask(kId));
                  return found && found->setProperty("progress", 90) ? 0 : 2;
              }),
              0);
    ASSERT_TRUE(task.endUpdate());
    EXPECT_EQ(onDisk()["progress"], Json::Value(90));
    EXPECT_EQ(onDisk()["data"], Json::Value("mine"));

    // Removed by another process: gone for this one too, and a write brings it back.
    EXPECT_EQ(inChild([&] {
                  std::unique_ptr<NOS::Task> found(NOS::TaskMgr(kOwner).getTask(kId));
                  return NOS::Task::remove(found.get()) ? 0 : 2;
              }),
              0);
    EXPECT_FALSE(task.reload());
    EXPECT_TRUE(task.getProperty("progress").isNull());
    EXPECT_EQ(NOS::TaskMgr(kOwner).getTask(kId), nullptr);
    ASSERT_TRUE(task.setProperty("progress", 5));
    EXPECT_EQ(onDisk()["progress"], Json::Value(5));
    EXPECT_TRUE(task.remove());
    EXPECT_TRUE(task.remove()) << "a missing record is removed already";
    EXPECT_FALSE(NOS::Task::remove(nullptr));
}

TEST(PlatformTask, ManagerFindsAndLists) {
    NOS::TaskMgr mgr(kOwner);
    EXPECT_EQ(mgr.getTask(kId), nullptr) << "no task yet";
    EXPECT_TRUE(mgr.list().empty());
    NOS::Task b(kOwner, "@CORVPKG_STARTSTOP_b");
    NOS::Task a(kOwner, "@CORVPKG_DOWNLOAD_a");
    NOS::Task elsewhere("someone", "@CORVPKG_STARTSTOP_c");
    EXPECT_EQ(mgr.list(),
              (std::vector<std::string>{"@CORVPKG_DOWNLOAD_a", "@CORVPKG_STARTSTOP_b"}));
    std::unique_ptr<NOS::Task> found(mgr.getTask("@CORVPKG_DOWNLOAD_a"));
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(found->getTaskId(), "@CORVPKG_DOWNLOAD_a");
    EXPECT_EQ(found->getProperty("pid").asInt64(), getpid());

    testutil::writeFile(std::string(NOS_TASK_DIR) + "/" + kOwner + "/damaged.json", "{");
    EXPECT_THROW(mgr.getTask("damaged"), std::runtime_error);
    testutil::writeFile(std::string(NOS_TASK_DIR) + "/" + kOwner + "/list.json", "[]");
    EXPECT_THROW(mgr.getTask("list"), std::runtime_error);
}

TEST(PlatformTask, InvalidWordsThrow) {
    const std::string longest(200, 'x');
    const std::vector<std::string> bad = {"",      "../x", "a/b",         ".hidden", "sp ace",
                                          "tab\t", "é",    longest + "x", "a*"};
    for (const std::string& word : bad) {
        SCOPED_TRACE("'" + word + "'");
        EXPECT_THROW(NOS::Task(kOwner, word), std::runtime_error);
        EXPECT_THROW(NOS::Task(word, kId), std::runtime_error);
        EXPECT_THROW(NOS::TaskMgr{word}, std::runtime_error);
        EXPECT_THROW(NOS::TaskMgr(kOwner).getTask(word), std::runtime_error);
    }
    EXPECT_FALSE(testutil::exists(NOS_TASK_DIR "/x")) << "nothing made outside the tree";
    for (const std::string& word : {longest, std::string("a.b-c_d@E9")}) {
        SCOPED_TRACE(word);
        EXPECT_NO_THROW(NOS::Task(kOwner, word));
    }
}

TEST(PlatformTask, StaleRecordsAreTakenOver) {
    const struct {
        const char* what;
        bool livingHolder;
        const char* extra;  // JSON members after "pid"
        bool takenOver;
    } cases[] = {
        {"holder gone", false, R"("finished": false, "progress": 60)", true},
        {"holder alive", true, R"("finished": false, "progress": 60)", false},
        {"holder alive but finished", true, R"("finished": true, "progress": 60)", true},
        {"no pid at all", true, R"("finished": false, "progress": 60, "nopid": 1)", true},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        pid_t holder = -1;
        int pipeFds[2] = {-1, -1};
        if (c.livingHolder) {
            ASSERT_EQ(pipe(pipeFds), 0);
            holder = fork();
            if (holder == 0) {
                char byte;
                close(pipeFds[1]);
                (void)!read(pipeFds[0], &byte, 1);  // until the parent closes its end
                _exit(0);
            }
            close(pipeFds[0]);
        } else {
            holder = deadPid();
        }
        std::string pid = std::string(c.extra).find("nopid") != std::string::npos
                              ? std::string("\"x\"")
                              : std::to_string(holder);
        testutil::writeFile(kRecord, "{\"pid\": " + pid + ", " + c.extra + "}");

        if (c.takenOver) {
            NOS::Task task(kOwner, kId);
            EXPECT_EQ(onDisk()["pid"].asInt64(), getpid());
            EXPECT_EQ(onDisk()["progress"], Json::Value(0));
            EXPECT_EQ(task.getProperty("progress"), Json::Value(0));
        } else {
            EXPECT_THROW(NOS::Task(kOwner, kId), std::runtime_error);
            EXPECT_EQ(onDisk()["progress"], Json::Value(60)) << "the holder's record stays";
        }
        if (c.livingHolder) {
            close(pipeFds[1]);
            waitpid(holder, nullptr, 0);
        }
    }

    // A damaged record holds nothing.
    testutil::writeFile(kRecord, "{\"pid\": ");
    NOS::Task task(kOwner, kId);
    EXPECT_EQ(onDisk()["pid"].asInt64(), getpid());
    // The calling process may create its own task again.
    ASSERT_TRUE(task.setProperty("progress", 30));
    NOS::Task again(kOwner, kId);
    EXPECT_EQ(onDisk()["progress"], Json::Value(0));
}

// ---------------------------------------------------------------------------------------
// The desktop notifier.

namespace {

const char kNotifier[] = "/usr/corv/bin/corvnosnotify";
const char kNotifyLog[] = "/var/log/corvnosnotify.log";

// One log line back into its time and arguments.
std::vector<std::string> parseNotifyLine(const std::string& line, std::string* time) {
    std::vector<std::string> fields;
    std::string field;
    for (size_t i = 0; i < line.size(); ++i) {
        char c = line[i];
        if (c == '\t') {
            fields.push_back(field);
            field.clear();
        } else if (c == '\\' && i + 1 < line.size()) {
            char e = line[++i];
            field += e == 't' ? '\t' : e == 'n' ? '\n' : e == 'r' ? '\r' : e;
        } else {
            field += c;
        }
    }
    fields.push_back(field);
    *time = fields.front();
    return std::vector<std::string>(fields.begin() + 1, fields.end());
}

std::vector<std::string> logLines() {
    std::vector<std::string> lines;
    std::string text = testutil::readFile(kNotifyLog);
    size_t start = 0;
    for (size_t nl; (nl = text.find('\n', start)) != std::string::npos; start = nl + 1) {
        lines.push_back(text.substr(start, nl - start));
    }
    EXPECT_EQ(start, text.size()) << "every line ends with a newline";
    return lines;
}

}  // namespace

TEST(PlatformNotify, EachCallIsOneLineThatParsesBack) {
    testutil::removeAll(kNotifyLog);
    const std::vector<std::vector<std::string>> calls = {
        {"-c", "CORV.NDS.PkgManApp.Instance", "-t", "false", "@administrators",
         "tree:leaf_packagemanage", "pkgmgr:fail_start_nos_version", "Demo Package"},
        {"-e", "false", "Demo: line one\nline\ttwo\\n not a newline\r", "", "a=b", "-"},
        {},
        {""},
    };
    for (const auto& args : calls) {
        testutil::RunResult r = testutil::run(kNotifier, args);
        ASSERT_EQ(r.status, 0) << r.err;
    }
    std::vector<std::string> lines = logLines();
    ASSERT_EQ(lines.size(), calls.size());
    const std::regex stamp(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d[+-]\d{4})");
    for (size_t i = 0; i < calls.size(); ++i) {
        SCOPED_TRACE(lines[i]);
        std::string time;
        EXPECT_EQ(parseNotifyLine(lines[i], &time), calls[i]);
        EXPECT_TRUE(std::regex_match(time, stamp)) << time;
    }
}

// ---------------------------------------------------------------------------------------
// ACLs.

namespace {

// The kernel's form of an access ACL (little-endian, as on every platform we run on):
// owner rw, user 65534 r, group r, mask r, others r.
std::string extendedAcl() {
    auto le16 = [](uint16_t v) { return std::string{char(v & 0xff), char(v >> 8)}; };
    auto le32 = [&](uint32_t v) { return le16(v & 0xffff) + le16(v >> 16); };
    auto entry = [&](uint16_t tag, uint16_t perm, uint32_t id) {
        return le16(tag) + le16(perm) + le32(id);
    };
    const uint32_t none = 0xffffffffu;
    return le32(2) + entry(0x01, 6, none) + entry(0x02, 4, 65534) + entry(0x04, 4, none) +
           entry(0x10, 4, none) + entry(0x20, 4, none);
}

// Gives `path` an ACL beyond its mode: 0 done, 1 the file system has no ACLs, -1 failed.
int addAcl(const std::string& path) {
    if (access("/usr/bin/setfacl", X_OK) == 0) {
        return testutil::run("/usr/bin/setfacl", {"-m", "u:65534:r", path}).status == 0 ? 0 : -1;
    }
    const std::string acl = extendedAcl();
    if (setxattr(path.c_str(), "system.posix_acl_access", acl.data(), acl.size(), 0) == 0) {
        return 0;
    }
    return errno == ENOTSUP || errno == EOPNOTSUPP ? 1 : -1;
}

}  // namespace

TEST(PlatformAcl, ExtendedAclOrModeBitsOnly) {
    for (const std::string path : {"/volume1/@appstore", "/volume1/file", "/var/packages"}) {
        SCOPED_TRACE(path);
        if (path == "/volume1/file") {
            testutil::writeFile(path, "x");
        } else {
            ASSERT_EQ(CORVFSMkdirP(path.c_str(), nullptr, 1, -1, -1, 0755), 0);
        }
        EXPECT_EQ(CORVACLIsSupport(path.c_str(), -1, 2), 0) << "mode bits only";
        int added = addAcl(path);
        if (added == 1) {
            GTEST_SKIP() << "no ACLs on the file system of " << path;
        }
        ASSERT_EQ(added, 0);
        EXPECT_EQ(CORVACLIsSupport(path.c_str(), -1, 2), 1);
        ASSERT_EQ(chmod(path.c_str(), 0755), 0);
        EXPECT_EQ(CORVACLIsSupport(path.c_str(), -1, 2), 1) << "chmod keeps the named entry";
        ASSERT_EQ(removexattr(path.c_str(), "system.posix_acl_access"), 0);
        EXPECT_EQ(CORVACLIsSupport(path.c_str(), -1, 2), 0);
    }

    EXPECT_EQ(CORVACLIsSupport("/volume1/missing", -1, 2), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
    EXPECT_EQ(CORVACLIsSupport(nullptr, -1, 2), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
}
