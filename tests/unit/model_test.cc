// The model's copy semantics and the fixed tables.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtool.h"

using namespace CORVPackageTool;

TEST(Model, CopiesNeverShareTheExtension) {
    PackageInfo a;
    PMSGetOSMinVer(a)[0] = 6;
    PackageInfo b(a);
    PackageInfo c;
    c = a;
    PMSGetOSMinVer(b)[0] = 7;
    PMSGetOSMinVer(c)[0] = 8;
    EXPECT_EQ(PMSGetOSMinVer(a)[0], 6);
    EXPECT_EQ(PMSGetOSMinVer(b)[0], 7);
    EXPECT_EQ(PMSGetOSMinVer(c)[0], 8);

    std::vector<PackageInfo> many(3, a);
    many.push_back(b);
    many.erase(many.begin());
    EXPECT_EQ(PMSGetOSMinVer(many.back())[0], 7);
    EXPECT_EQ(PMSGetOSMinVer(many.front())[0], 6);
}

TEST(Model, Defaults) {
    PackageInfo info;
    EXPECT_TRUE(info.checkport);
    EXPECT_TRUE(info.startable);
    EXPECT_TRUE(PMSGetCtlUninstall(info));
    EXPECT_TRUE(info.wizard.isNull());
    PackageBasicInfo basic("a", "1");
    EXPECT_EQ(basic.compop, PKG_COMPOP_NONE);
    EXPECT_FALSE(basic.beta);
}

TEST(Tables, InstallTypeText) {
    const struct {
        int type;
        const char* text;
    } cases[] = {
        {1, "install"},
        {2, "upgrade"},
        {4, "uninstall"},
        {8, "start"},
        {0x10, "stop"},
        {0x20, "restart"},
        {0, "(system) trigger"},
        {3, "(system) trigger"},
        {0x40, "(system) trigger"},
    };
    for (const auto& c : cases) {
        EXPECT_STREQ(parseInstallTypeToStr(static_cast<PKG_INSTALLATION_TYPE>(c.type)), c.text)
            << "type " << c.type;
    }
}

TEST(Tables, ServiceErrorEnumReportsOnlyDaemonsWithStatus) {
    const struct {
        int requested;
        int healthy;
        std::vector<std::string> expected;
    } cases[] = {
        {0x40000000, 0, {"firewall"}},
        {0x40000000, 0x04000000, {}},
        {0x7FFFFFFF, 0, {"firewall"}},
        {0x00000008, 0, {}},
        {0, 0, {}},
    };
    for (const auto& c : cases) {
        std::vector<std::string> names{"kept"};
        int n = ServiceErrorEnum(names, c.requested, c.healthy);
        std::vector<std::string> expected{"kept"};
        expected.insert(expected.end(), c.expected.begin(), c.expected.end());
        EXPECT_EQ(names, expected) << std::hex << c.requested << " " << c.healthy;
        EXPECT_EQ(n, static_cast<int>(expected.size()));
    }
}

TEST(Tables, RestartAndDependencyServiceNames) {
    EXPECT_EQ(PMSConvMapRestartService("nginx firewall"), 0x40000000ul);
    EXPECT_EQ(PMSConvMapRestartService("samba  cron\tnfs mdns applenetwork"), 0x0002800Dul);
    EXPECT_EQ(PMSConvMapRestartService("Nginx other"), 0ul);
    EXPECT_EQ(PMSConvMapRestartService(nullptr), 0ul);

    EXPECT_EQ(PackageManager::PMSExplodeServiceString("ssh pgsql"), 0x18u);
    EXPECT_EQ(PackageManager::PMSExplodeServiceString("other"), 0u);
    EXPECT_EQ(PackageManager::PMSExplodeServiceString(nullptr), 0u);
    Json::Value names(5);
    PackageManager::parseService(0x18 | 0x1, names);
    ASSERT_TRUE(names.isArray());
    ASSERT_EQ(names.size(), 2u);
    EXPECT_EQ(names[0].asString(), "ssh");
    EXPECT_EQ(names[1].asString(), "pgsql");
    PackageManager::parseService(0, names);
    EXPECT_TRUE(names.isArray());
    EXPECT_EQ(names.size(), 0u);
}

TEST(Tables, ArchitectureTokens) {
    const struct {
        const char* token;
        unsigned int mask;
    } cases[] = {
        {"x86_64", 0x6CFA0700},
        {"broadwell", 0x00200000},
        {"noarch", 0xFFFFFFFF},
        {"armv8", 0x90000000},
        {"88f6282", 0x00000080},
        {"X86", 0},
        {"", 0},
        {"x86 ", 0},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(static_cast<unsigned int>(PMSMapSystemArch(c.token)), c.mask)
            << "token [" << c.token << "]";
    }
    EXPECT_EQ(PMSMapSystemArch(nullptr), 0);
}

TEST(Tables, ErrorCodesAreAClosedList) {
    EXPECT_STREQ(PMSGetErrCodeInfo(0)->name, "PKG_OK");
    EXPECT_STREQ(PMSGetErrCodeInfo(275)->installMsg, "pkgmgr:error_occupied");
    EXPECT_STREQ(PMSGetErrCodeInfo(279)->checkReport, "pkgmgr:error_sys_no_space");
    EXPECT_EQ(PMSGetErrCodeInfo(280), nullptr);
    EXPECT_EQ(PMSGetErrCodeInfo(298), nullptr);
    EXPECT_EQ(PMSGetErrCodeInfo(306), nullptr);
    // Every enumerator from 150 to 305 that the list names is found by its own value.
    int named = 0;
    for (int code = 0; code <= 400; ++code) {
        if (const PKG_ERRCODE_INFO* info = PMSGetErrCodeInfo(code)) {
            EXPECT_EQ(info->code, code);
            ++named;
        }
    }
    EXPECT_EQ(named, 4 + 1 + 1 + (305 - 256 + 1) - 2);
}

TEST(ManagerFrame, ResultsAndParameters) {
    PackageManager pm;
    EXPECT_EQ(pm.getResult(), PKG_OK);
    Json::Value data(Json::arrayValue);
    data.append("x");
    pm.setResult(PKG_ERR_DEPENDENCY, data);
    Json::Value out;
    EXPECT_EQ(pm.getResult(out), PKG_ERR_DEPENDENCY);
    EXPECT_EQ(out, data);
    pm.setResult(PKG_ERR_SYSTEM);
    EXPECT_EQ(pm.getResult(out), PKG_ERR_SYSTEM);
    EXPECT_TRUE(out.isNull()) << "setResult(code) clears the data";

    pm.insertMapParam("a", "1");
    pm.insertMapParam("a", "2");
    EXPECT_EQ(pm.getMapParam("a"), "1");
    EXPECT_EQ(pm.getMapParam("missing"), "");

    Json::Value msg(Json::arrayValue);
    msg.append("pkgmgr:x");
    pm.insertJsonParam("worker_msg", msg);
    pm.insertJsonParam("worker_msg", Json::Value("later"));
    EXPECT_EQ(pm.getJsonParam("worker_msg"), msg);
    Json::Value missing = pm.getJsonParam("nothing");
    EXPECT_TRUE(missing.isString());
    EXPECT_EQ(missing.asString(), "");

    pm.setIntParam(42);
    EXPECT_EQ(pm.getIntParam(), 42u);
    EXPECT_EQ(pm.getLogFilePath(), "");
    EXPECT_EQ(pm.getFixedLogFilePath("demo"), "/tmp/corvpkgmgr.log-demo");
    EXPECT_EQ(pm.logFilePath, "/tmp/corvpkgmgr.log-demo");
}
