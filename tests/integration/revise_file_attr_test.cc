// Making an unpacked package safe and owned: set-id bits, package accounts, payload
// owners and the per-file overrides, on real files and real accounts in the sandbox.
#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/eventlog.h"
#include "corv/user.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/privilege.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;
using namespace CORVPackageTool::Privilege;

using testutil::modeOf;
using testutil::ownerOf;

namespace {

std::string makeFile(const std::string& path, mode_t mode) {
    testutil::writeFile(path, "#!/bin/sh\n");
    EXPECT_EQ(chmod(path.c_str(), mode), 0);
    return path;
}

Json::Value parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

// An unpacked package: scripts/postinst with set-id bits, a payload with bin/app and
// bin/tool, and `privilege` as conf/privilege unless empty.
std::string unpacked(const TempDir& tmp, const std::string& privilege) {
    const std::string dir = tmp.path() + "/pkginstall";
    makeFile(dir + "/scripts/postinst", 06755);
    makeFile(dir + "/package/bin/app", 0755);
    makeFile(dir + "/package/bin/tool", 0755);
    if (!privilege.empty()) {
        testutil::writeFile(dir + "/conf/privilege", privilege);
    }
    return dir;
}

}  // namespace

TEST(ReviseFileAttr, ClearSetUGidBitKeepsEverythingElse) {
    TempDir tmp;
    struct Case {
        mode_t before;
        mode_t after;
    };
    const Case cases[] = {
        {06755, 0755}, {04711, 0711}, {02750, 0750}, {01755, 01755}, {0644, 0644}};
    for (const Case& c : cases) {
        SCOPED_TRACE(std::to_string(c.before));
        const std::string path = makeFile(tmp.path() + "/script", c.before);
        EXPECT_TRUE(ClearSetUGidBit(path));
        EXPECT_EQ(modeOf(path), c.after);
    }
    EXPECT_FALSE(ClearSetUGidBit(tmp.path()));
    EXPECT_EQ(VLIBCErrGet(), ERR_NOT_APPLICABLE);
    EXPECT_FALSE(ClearSetUGidBit(tmp.path() + "/missing"));
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
}

TEST(ReviseFileAttr, ToolAndExecutableEntries) {
    TempDir tmp;
    const std::string top = tmp.path() + "/package";
    makeFile(tmp.path() + "/outside", 0644);
    struct Case {
        const char* entry;
        bool tool;  // else executable
        int walk;
        int error;  // when walk is 0
        mode_t mode;
        const char* owner;  // null: untouched (the owner is checked before the mode)
    };
    const Case cases[] = {
        {R"({"relpath":"bin/f","user":"root","group":"package","permission":"4750"})", true, 2, 0,
         04750, "0:2001"},
        {R"({"relpath":"bin/f","user":"package","group":"root","permission":"0700"})", true, 2, 0,
         0700, "1001:0"},
        {R"({"relpath":"bin/f","user":"root","group":"root","permission":"755"})", true, 0,
         ERR_MALFORMED, 0755, "0:0"},
        {R"({"relpath":"bin/f","user":"root","group":"root","permission":"04755"})", true, 0,
         ERR_MALFORMED, 0755, "0:0"},
        {R"({"relpath":"bin/f","user":"root","group":"root","permission":"07x5"})", true, 0,
         ERR_MALFORMED, 0755, "0:0"},
        {R"({"relpath":"bin/f","user":"nobody","group":"root","permission":"0755"})", true, 0,
         ERR_NOT_APPLICABLE, 0755, nullptr},
        {R"({"relpath":"bin/f","user":"","group":"root","permission":"0755"})", true, 0,
         ERR_MALFORMED, 0755, nullptr},
        {R"({"relpath":"bin/f","user":"root","group":"root"})", true, 0, ERR_MALFORMED, 0755,
         nullptr},
        {R"({"relpath":"../outside","user":"root","group":"root","permission":"0600"})", true, 0,
         -1, 0755, nullptr},
        {R"({"relpath":"bin","user":"root","group":"root","permission":"0600"})", true, 0,
         ERR_NOT_APPLICABLE, 0755, nullptr},
        {R"({"relpath":"bin/f","run-as":"package"})", false, 2, 0, 0755, "1001:2001"},
        {R"({"relpath":"bin/f","run-as":"system"})", false, 2, 0, 0755, "1001:1"},
        {R"({"relpath":"bin/f","run-as":"root"})", false, 2, 0, 0755, "0:0"},
        {R"({"relpath":"bin/f","run-as":"nobody"})", false, 0, ERR_MALFORMED, 0755, nullptr},
        {R"({"relpath":"bin/f"})", false, 0, ERR_MALFORMED, 0755, nullptr},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.entry);
        const std::string file = makeFile(top + "/bin/f", 0755);
        ASSERT_EQ(chown(file.c_str(), 5, 5), 0);
        ToolWalker tool(top, 1001, 2001);
        ExeWalker exe(top, 1001, 2001);
        IWalker& walker = c.tool ? static_cast<IWalker&>(tool) : exe;
        EXPECT_EQ(walker.walk(parse(c.entry)), c.walk);
        if (c.walk == 0 && c.error >= 0) {
            EXPECT_EQ(VLIBCErrGet(), c.error);
        }
        EXPECT_EQ(modeOf(file), c.mode);
        EXPECT_EQ(ownerOf(file), c.owner ? c.owner : "5:5");
        EXPECT_EQ(modeOf(tmp.path() + "/outside"), 0644u);
    }
}

TEST(ReviseFileAttr, CreatesThePackageAccountsAndOwnsThePayload) {
    ASSERT_EQ(VLIBCExecl("/usr/sbin/groupadd", 0xbb, "--system", "crew", nullptr), 0);
    TempDir tmp;
    const std::string dir = unpacked(
        tmp,
        R"({"username":"svc","groupname":"svcgrp","join-groupname":"crew",)"
        R"("defaults":{"run-as":"system"},"executable":[{"relpath":"bin/app","run-as":"root"}],)"
        R"("tool":[{"relpath":"bin/tool","user":"package","group":"package","permission":"4750"}]})");
    ASSERT_TRUE(ReviseFileAttr("demo", dir));

    EXPECT_EQ(modeOf(dir + "/scripts/postinst"), 0755u);
    struct passwd* pw = getpwnam("svc");
    ASSERT_NE(pw, nullptr);
    EXPECT_STREQ(pw->pw_dir, "/var/packages/demo/target");
    EXPECT_STREQ(pw->pw_shell, "/usr/sbin/nologin");
    EXPECT_FALSE(CORVUserIsReserved("svc", pw->pw_uid));
    const uid_t uid = pw->pw_uid;
    struct group* gr = getgrnam("svcgrp");
    ASSERT_NE(gr, nullptr);
    const gid_t gid = gr->gr_gid;
    EXPECT_EQ(pw->pw_gid, gid);
    // Default identity "system": the package's user with the system group, id 1.
    EXPECT_EQ(ownerOf(dir + "/package"), std::to_string(uid) + ":1");
    EXPECT_EQ(ownerOf(dir + "/package/bin/app"), "0:0");
    EXPECT_EQ(ownerOf(dir + "/package/bin/tool"), std::to_string(uid) + ":" + std::to_string(gid));
    EXPECT_EQ(modeOf(dir + "/package/bin/tool"), 04750u);

    PCORVGROUP crew = nullptr;
    ASSERT_EQ(CORVGroupGet("crew", &crew), 0);
    ASSERT_EQ(crew->nMember, 1u);
    EXPECT_STREQ(crew->ppszMember[0], "svc");
    CORVGroupFree(crew);

    // Again, as an upgrade does: the accounts exist, the membership is not doubled.
    ASSERT_TRUE(ReviseFileAttr("demo", dir));
    ASSERT_EQ(CORVGroupGet("crew", &crew), 0);
    EXPECT_EQ(crew->nMember, 1u);
    CORVGroupFree(crew);
}

TEST(ReviseFileAttr, WithoutPrivilegeOrAsRootThePayloadKeepsItsOwner) {
    struct Case {
        const char* privilege;
        const char* toolOwner;  // after the tool entry; "5:5" when untouched
    };
    const Case cases[] = {
        {"", "5:5"},
        {R"({"defaults":{"run-as":"root"},"tool":[{"relpath":"bin/tool","user":"root",)"
         R"("group":"root","permission":"0700"}]})",
         "0:0"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.privilege);
        TempDir tmp;
        const std::string dir = unpacked(tmp, c.privilege);
        ASSERT_EQ(VLIBCExecl("/bin/chown", 0xbb, "-R", "5:5", (dir + "/package").c_str(), nullptr),
                  0);
        ASSERT_TRUE(ReviseFileAttr("demo", dir));
        EXPECT_EQ(modeOf(dir + "/scripts/postinst"), 0755u);
        EXPECT_EQ(ownerOf(dir + "/package/bin/app"), "5:5");
        EXPECT_EQ(ownerOf(dir + "/package/bin/tool"), c.toolOwner);
    }
}

TEST(ReviseFileAttr, RefusesSystemAccountsAndBadEntries) {
    ASSERT_EQ(VLIBCExecl("/usr/sbin/groupadd", 0xbb, "--system", "crew", nullptr), 0);
    const char* const cases[] = {
        R"({"username":"root"})",
        R"({"username":"daemon"})",
        R"({"username":"admin"})",  // built-in even before it exists
        R"({"groupname":"users"})",
        R"({"groupname":"system"})",
        R"({"defaults":{"run-as":"sometimes"}})",
        R"({"join-groupname":"no-such-group"})",
        R"({"tool":[{"relpath":"../../../../etc/passwd","user":"root","group":"root","permission":"0666"}]})",
        R"({"executable":[{"relpath":"bin/missing","run-as":"root"}]})",
        "{not json",
    };
    for (const char* privilege : cases) {
        SCOPED_TRACE(privilege);
        TempDir tmp;
        const std::string dir = unpacked(tmp, privilege);
        EXPECT_FALSE(ReviseFileAttr("demo", dir));
        EXPECT_EQ(modeOf("/etc/passwd"), 0644u);
        EXPECT_EQ(getpwnam("admin"), nullptr);
    }
    EXPECT_FALSE(ReviseFileAttr("", "/tmp"));
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
}

TEST(ReviseFileAttr, SystemGroupIsGroupIdOne) {
    gid_t gid = 0;
    ASSERT_EQ(CORVGroupGetGID("system", &gid), 0);
    EXPECT_EQ(gid, 1u);
    EXPECT_TRUE(CORVGroupIsReserved("system", gid));
    EXPECT_EQ(CORVGroupGet("no-such-group", nullptr), -1);
    PCORVGROUP group = nullptr;
    EXPECT_EQ(CORVGroupGet("no-such-group", &group), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_GROUP);
    EXPECT_EQ(group, nullptr);
}

TEST(EventLog, OneReadableLinePerEvent) {
    unlink("/var/log/corvevents.log");
    ASSERT_EQ(CORVLogSet1(2, 1, 0x13700001, "Hello\tWorld", "", "", ""), 0);
    ASSERT_EQ(CORVLogSet1(2, 3, 0x13700008, "Greeter", nullptr, nullptr, nullptr), 0);
    ASSERT_EQ(CORVLogSet1(1, 2, 0x10000001, "a", "", "b", nullptr), 0);
    const std::string text = testutil::readFile("/var/log/corvevents.log");
    std::vector<std::string> lines;
    size_t start = 0;
    for (size_t end; (end = text.find('\n', start)) != std::string::npos; start = end + 1) {
        const std::string line = text.substr(start, end - start);
        // Drop the time stamp, which the next field follows after a tab.
        lines.push_back(line.substr(line.find('\t') + 1));
    }
    EXPECT_EQ(lines, (std::vector<std::string>{
                         "package\tinfo\t0x13700001\tPackage [Hello World] was installed.",
                         "package\terror\t0x13700008\tFailed to uninstall package [Greeter].",
                         "system\twarning\t0x10000001\ta b",
                     }));
}
