// Initialisation, the machine's architecture and the services the system knows.
#include <sys/stat.h>

#include <gtest/gtest.h>

#include <string>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "support/files.h"

using namespace CORVPackageTool;

namespace {
const char* kDefaults = "/etc.defaults/corvinfo.conf";
}

TEST(ManagerInit, ArchitectureFromTheUniqueKey) {
    const std::string saved = testutil::readFile(kDefaults);
    const struct {
        const char* content;
        const char* code;
        int arch;
    } cases[] = {
        {"unique=\"corv_broadwell_vs1000\"\n", "broadwell", 0x00200000},
        {"unique=\"corv_x86_64_vs1000\"\n", "x86", 0x00000100},
        {"unique=\"corv_riscv_vs1000\"\n", "riscv", 1},
        {"unique=\"corv_broadwell\"\n", "", 0},
        {"other=1\n", "", 0},
    };
    for (const auto& c : cases) {
        testutil::writeFile(kDefaults, c.content);
        EXPECT_EQ(PMSGetSystemArchString(), c.code) << c.content;
        EXPECT_EQ(PMSGetSystemArch(), c.arch) << c.content;
    }
    testutil::writeFile(kDefaults, saved);
}

TEST(ManagerInit, CreatesTheRegistryWithItsMode) {
    testutil::removeAll("/var/packages");
    ASSERT_EQ(mkdir("/var/packages", 0700), 0);
    testutil::removeAll("/usr/local/etc/rc.d");
    PackageManager pm;
    ASSERT_TRUE(pm.init());
    struct stat st {};
    ASSERT_EQ(stat("/var/packages", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0755u);
    ASSERT_EQ(stat("/usr/local/etc/rc.d", &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_EQ(pm.getPackageInfoData().arch, static_cast<unsigned int>(PMSGetSystemArch()));
    EXPECT_EQ(pm.getResult(), PKG_OK);
}

TEST(ManagerInit, FailsWithoutAnArchitecture) {
    testutil::removeAll(kDefaults);
    PackageManager pm;
    EXPECT_FALSE(pm.init());
    EXPECT_EQ(pm.getResult(), PKG_ERR_SYSTEM);
}

TEST(ManagerInit, ServicesKnownToTheSystem) {
    testutil::writeFile("/usr/corv/etc/corvservice.d/ssh-shell.cfg", "{}");
    testutil::writeFile("/usr/corv/etc/corvservice.d/pgsql.cfg", "{}");
    EXPECT_EQ(PackageManager::getServiceSetFromString("ssh pgsql bogus"),
              (std::set<std::string>{"ssh-shell", "pgsql"}));
    EXPECT_TRUE(PackageManager::getServiceSetFromString(nullptr).empty());
    EXPECT_TRUE(PackageManager::getServiceSetFromString("ssh-shellx").empty());
}

TEST(ManagerInit, InfoReaderUsesTheSystemLanguage) {
    testutil::writeFile("/etc/corvinfo.conf", "language=\"ger\"\n");
    testutil::writeFile("/tmp/pkg/INFO",
                        "package=a\nversion=1\ndisplayname=Demo\ndisplayname_ger=Vorführung\n");
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile("/tmp/pkg", info, nullptr, 0x10000000));
    EXPECT_EQ(info.displayname, "Vorführung");
}
