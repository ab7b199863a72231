// Identities of control scripts from conf/privilege.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/privilege.h"

using namespace CORVPackageTool;
using namespace CORVPackageTool::Privilege;

namespace {
Json::Value parse(const char* text) {
    Json::Value v;
    EXPECT_TRUE(fromString(text, v)) << text;
    return v;
}
}  // namespace

TEST(Privilege, IdentityOfAnAction) {
    const struct {
        const char* conf;
        const char* action;
        bool ok;
        int identity;  // walker's find, or the default when it found none
    } cases[] = {
        {R"({"defaults":{"run-as":"system"}})", "preinst", true, IDENTITY_SYSTEM},
        {R"({})", "preinst", true, IDENTITY_PACKAGE},
        {R"({"defaults":{"run-as":"root"}})", "status", true, IDENTITY_ROOT},
        {R"({"defaults":{"run-as":"wizard"}})", "status", true, IDENTITY_INVALID},
        {R"({"defaults":"root"})", "status", true, IDENTITY_PACKAGE},
        {R"({"ctrl-script":[{"action":"preinst","run-as":"root"}]})", "preinst", true,
         IDENTITY_ROOT},
        {R"({"ctrl-script":[{"action":"preinst","run-as":"root"}]})", "postinst", true,
         IDENTITY_PACKAGE},
        {R"({"ctrl-script":[{"action":"preinst","run-as":"root"},
                            {"action":"preinst","run-as":"system"}]})",
         "preinst", true, IDENTITY_ROOT},
        {R"({"ctrl-script":[{"action":"preinst","run-as":"nobody"}]})", "preinst", false, 0},
        {R"({"ctrl-script":[{"action":"preinst","run-as":"nobody"}]})", "status", true,
         IDENTITY_PACKAGE},
        {R"({"ctrl-script":[{"action":"preinst"}]})", "status", false, 0},
        {R"({"ctrl-script":[3, "x", {"action":"status","run-as":"system"}]})", "status", true,
         IDENTITY_SYSTEM},
        {R"({"ctrl-script":{"action":"status","run-as":"root"}})", "status", true,
         IDENTITY_PACKAGE},
        {R"([1,2])", "status", true, IDENTITY_PACKAGE},
    };
    for (const auto& c : cases) {
        Json::Value conf = parse(c.conf);
        CtrlScriptWalker walker(c.action);
        bool ok = TraversePrivilege(conf, "ctrl-script", walker);
        EXPECT_EQ(ok, c.ok) << c.conf << " action " << c.action;
        if (ok) {
            int identity = walker.identity ? walker.identity : GetDefaultIdentity(conf);
            EXPECT_EQ(identity, c.identity) << c.conf << " action " << c.action;
        }
    }
    CtrlScriptWalker walker("x");
    EXPECT_FALSE(TraversePrivilege(Json::Value(), "", walker));
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
}

TEST(Privilege, TranslateIdentity) {
    EXPECT_EQ(TranslateIdentity("package"), IDENTITY_PACKAGE);
    EXPECT_EQ(TranslateIdentity("system"), IDENTITY_SYSTEM);
    EXPECT_EQ(TranslateIdentity("root"), IDENTITY_ROOT);
    EXPECT_EQ(TranslateIdentity("Root"), IDENTITY_INVALID);
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
    EXPECT_EQ(TranslateIdentity(""), IDENTITY_INVALID);
}

TEST(Privilege, UpgradeFolderPath) {
    const struct {
        const char* volume;
        const char* expected;
    } cases[] = {
        {"/volume2", "/volume2/@tmp/corvpkg.tmp/demo"},
        {"/volume1", "/volume1/@tmp/corvpkg.tmp/demo"},
        {"/usr/local/packages", "/usr/local/packages/@tmp/corvpkg.tmp/demo"},
        {"/mnt/disk", ""},
        {"", ""},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(GetTmpFolderPath("demo", c.volume), c.expected) << c.volume;
    }
    EXPECT_EQ(GetTmpFolderPath("", "/volume1"), "");
    EXPECT_EQ(GetUserName("", ""), "");
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
}
