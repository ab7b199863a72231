// The INFO reader against package directories built in a temporary folder.
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "corvpkg/pkgtool.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;
using testutil::writeFile;

namespace {

constexpr unsigned long long ALL = PKG_INFO_MASK_ALL;
const std::string kBase = "package=\"demo\"\nversion=\"1.0-0001\"\n";
const std::string kFull =
    kBase + "maintainer=\"Corv\"\ndescription=\"Demo package\"\ndisplayname=\"Demo\"\n";

struct InfoCase {
    const char* what;
    std::string info;
    unsigned long long mask;
    const char* language;
    bool ok;
    std::function<void(PackageInfo&)> check;
};

std::string nameOfLength(size_t n) {
    return std::string(n, 'p');
}

void runCase(const InfoCase& c) {
    TempDir dir;
    writeFile(dir.path() + "/INFO", c.info);
    PackageInfo info;
    bool ok = PMSLoadPKGInfoFile(dir.path(), info, c.language, c.mask);
    ASSERT_EQ(ok, c.ok) << c.what << "\n--- INFO ---\n" << c.info;
    if (ok && c.check) {
        SCOPED_TRACE(c.what);
        c.check(info);
    }
}

}  // namespace

TEST(InfoReader, RequiredKeysAndNameRules) {
    const InfoCase cases[] = {
        {"mask 0 needs only package and version", kBase, 0, "enu", true, nullptr},
        {"no package", "version=1\n", ALL, "enu", false, nullptr},
        {"empty version", "package=a\nversion=\n", 0, "enu", false, nullptr},
        {"no maintainer fails a full read", kBase + "description=d\n", ALL, "enu", false, nullptr},
        {"no maintainer passes the dependency mask", kBase, 0x1000000, "enu", true, nullptr},
        {"description selected but missing", kBase + "maintainer=m\n", 0x1, "enu", false, nullptr},
        {"description selected but empty", kBase + "description=\n", 0x1, "enu", false, nullptr},
        {"slash in name", "package=foo/bar\nversion=1\n", 0, "enu", false, nullptr},
        {"each forbidden character", "package=a|b\nversion=1\n", 0, "enu", false, nullptr},
        {"equal sign inside a quoted name", "package=\"a=b\"\nversion=1\n", 0, "enu", false,
         nullptr},
        {"dot", "package=.\nversion=1\n", 0, "enu", false, nullptr},
        {"dot dot", "package=..\nversion=1\n", 0, "enu", false, nullptr},
        {"hidden metadata dir", "package=@eaDir\nversion=1\n", 0, "enu", false, nullptr},
        {"name of 491 bytes", "package=" + nameOfLength(491) + "\nversion=1\n", 0, "enu", true,
         nullptr},
        {"name of 492 bytes", "package=" + nameOfLength(492) + "\nversion=1\n", 0, "enu", false,
         nullptr},
        {"UI dir with slash fails even with mask 0", kBase + "nosuidir=ui/x\n", 0, "enu", false,
         nullptr},
        {"UI dir may hold other characters", kBase + "nosuidir=ui<x>\n", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_EQ(i.nosuidir, "ui<x>"); }},
        {"binary garbage",
         std::string("\x7f"
                     "ELF\0\0\x01package",
                     14),
         ALL, "enu", false, nullptr},
        {"truncated last line", "version=1\npackage=tr", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_EQ(i.package, "tr"); }},
    };
    for (const InfoCase& c : cases) {
        runCase(c);
    }
}

TEST(InfoReader, AdminPortBounds) {
    const InfoCase cases[] = {
        {"65536 passes", kBase + "adminport=65536\n", 0x2000, "enu", true,
         [](PackageInfo& i) { EXPECT_EQ(i.adminport, 65536); }},
        {"65537 fails", kBase + "adminport=65537\n", 0x2000, "enu", false, nullptr},
        {"-1 fails", kBase + "adminport=-1\n", 0x2000, "enu", false, nullptr},
        {"not selected, not checked", kBase + "adminport=65537\n", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_EQ(i.adminport, 0); }},
        {"protocol defaults to http", kBase + "adminport=8080\nadminurl=/x\n", 0x2000, "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.adminport, 8080);
             EXPECT_EQ(i.adminurl, "/x");
             EXPECT_EQ(i.adminprotocol, std::vector<std::string>{"http"});
         }},
        {"protocols as tokens", kBase + "adminprotocol=\"https  http\"\n", 0x2000, "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.adminprotocol, (std::vector<std::string>{"https", "http"}));
         }},
        {"no http without the admin bit", kBase, 0, "enu", true,
         [](PackageInfo& i) { EXPECT_TRUE(i.adminprotocol.empty()); }},
    };
    for (const InfoCase& c : cases) {
        runCase(c);
    }
}

TEST(InfoReader, MaskSelectsKeys) {
    const std::string everything = kFull +
                                   "helpurl=h\nchecksum=abc\nextractsize=10\npackage_icon=ICON\n"
                                   "precheckstartstop=yes\nsupport_url=s\nsupport_center=yes\n"
                                   "install_type=system\nsilent_install=YES\ninstall_reboot=yes\n"
                                   "ctl_uninstall=no\ninstall_conflict_packages=c\n"
                                   "install_dep_packages=d\nos_max_ver=7.0-1\n";
    const InfoCase cases[] = {
        {"mask 0 reads the unconditional keys only", everything, 0, "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.checksum, "abc");
             EXPECT_EQ(i.extractsize, 10 * 1024);
             EXPECT_TRUE(PMSGetPrecheckStartStop(i));
             EXPECT_EQ(PMSGetOSMaxVer(i)[0], 7);
             EXPECT_EQ(i.description, "");
             EXPECT_EQ(i.displayname, "");
             EXPECT_EQ(i.maintainer, "");
             EXPECT_EQ(i.helpurl, "");
             EXPECT_EQ(i.package_icon, "");
             EXPECT_EQ(i.support_url, "");
             EXPECT_FALSE(i.support_center);
             EXPECT_EQ(i.install_type, "");
             EXPECT_FALSE(i.silent_install);
             EXPECT_FALSE(i.install_reboot);
             EXPECT_TRUE(PMSGetCtlUninstall(i));
             EXPECT_TRUE(i.dep_packages.empty());
             EXPECT_TRUE(i.conflict_packages.empty());
         }},
        {"full mask reads all", everything, ALL, "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.description, "Demo package");
             EXPECT_EQ(i.displayname, "Demo");
             EXPECT_EQ(i.maintainer, "Corv");
             EXPECT_EQ(i.helpurl, "h");
             EXPECT_EQ(i.package_icon, "ICON");
             EXPECT_EQ(i.support_url, "s");
             EXPECT_TRUE(i.support_center);
             EXPECT_EQ(i.install_type, "system");
             EXPECT_TRUE(i.silent_install);
             EXPECT_TRUE(i.install_reboot);
             EXPECT_FALSE(PMSGetCtlUninstall(i));
             ASSERT_EQ(i.dep_packages.size(), 1u);
             ASSERT_EQ(i.conflict_packages.size(), 1u);
         }},
        {"bit 31 selects the conflicts but not ctl_uninstall", everything, 0x80000000ULL, "enu",
         true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.conflict_packages.size(), 1u);
             EXPECT_TRUE(PMSGetCtlUninstall(i));
         }},
        {"bit 32 selects both ctl_uninstall and the conflicts", everything, 0x100000000ULL, "enu",
         true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.conflict_packages.size(), 1u);
             EXPECT_FALSE(PMSGetCtlUninstall(i));
         }},
        {"an upper bit other than 32 selects the conflicts only", everything, 0x4000000000000000ULL,
         "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.conflict_packages.size(), 1u);
             EXPECT_TRUE(PMSGetCtlUninstall(i));
         }},
        {"icons are skipped by the listing masks", everything, 0x11000000, "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.package_icon, "");
             EXPECT_EQ(i.displayname, "Demo");
             EXPECT_EQ(i.dep_packages.size(), 1u);
         }},
    };
    for (const InfoCase& c : cases) {
        runCase(c);
    }
}

TEST(InfoReader, FlagsAndBeta) {
    const InfoCase cases[] = {
        {"report_url makes a beta whatever beta says", kBase + "report_url=x\nbeta=no\n", 0x4,
         "enu", true,
         [](PackageInfo& i) {
             EXPECT_TRUE(i.beta);
             EXPECT_EQ(i.report_url, "x");
         }},
        {"either bit of the pair selects beta", kBase + "beta=Yes\n", 0x200, "enu", true,
         [](PackageInfo& i) { EXPECT_TRUE(i.beta); }},
        {"beta unselected", kBase + "beta=yes\nreport_url=x\n", 0x1000, "enu", true,
         [](PackageInfo& i) { EXPECT_FALSE(i.beta); }},
        {"ctl_stop alone decides", kBase + "ctl_stop=yes\nstartable=no\n", 0x400, "enu", true,
         [](PackageInfo& i) { EXPECT_TRUE(i.startable); }},
        {"ctl_stop=no", kBase + "ctl_stop=NO\nstartable=yes\n", 0x400, "enu", true,
         [](PackageInfo& i) { EXPECT_FALSE(i.startable); }},
        {"startable=no without ctl_stop", kBase + "startable=no\n", 0x400, "enu", true,
         [](PackageInfo& i) { EXPECT_FALSE(i.startable); }},
        {"startable unselected", kBase + "startable=no\n", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_TRUE(i.startable); }},
        {"other text keeps the default", kBase + "checkport=maybe\n", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_TRUE(i.checkport); }},
        {"checkport=no", kBase + "checkport=No\n", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_FALSE(i.checkport); }},
        {"restart daemons", kBase + "startstop_restart_services=\"nginx cron bogus\"\n", 0x20000000,
         "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.startstop_restart_services, 0x40000008u);
             EXPECT_EQ(i.instuninst_restart_services, 0u);
         }},
        {"services required", kBase + "install_dep_services=\"ssh pgsql\"\n", 0x40000000, "enu",
         true, [](PackageInfo& i) { EXPECT_EQ(i.install_dep_services, 0x18u); }},
        {"extractsize in KiB", kBase + "extractsize=3\n", 0, "enu", true,
         [](PackageInfo& i) { EXPECT_EQ(i.extractsize, 3072); }},
    };
    for (const InfoCase& c : cases) {
        runCase(c);
    }
}

TEST(InfoReader, ArchitecturesAndOSVersions) {
    auto osMin = [](PackageInfo& i) {
        return std::vector<int>(PMSGetOSMinVer(i), PMSGetOSMinVer(i) + 3);
    };
    auto firmware = [](PackageInfo& i) { return std::vector<int>(i.firmware, i.firmware + 3); };
    const InfoCase cases[] = {
        {"no arch is every arch", kBase, 0, "enu", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.arch, 0xFFFFFFFFu);
             EXPECT_TRUE(i.arch_list.empty());
         }},
        {"tokens OR their masks, unknown adds 0",
         kBase + "arch=\"x86 broadwell riscv\"\nexclude_arch=ppc\nmodel=\"m1 m2\"\n", 0, "enu",
         true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.arch, 0x00200100u);
             EXPECT_EQ(i.arch_list, (std::vector<std::string>{"x86", "broadwell", "riscv"}));
             EXPECT_EQ(i.exclude_arch, 0x800u);
             EXPECT_EQ(i.model_list, (std::vector<std::string>{"m1", "m2"}));
         }},
        {"os_min_ver wins over firmware", kBase + "os_min_ver=6.1-15000\nfirmware=5.0-4000\n", 0,
         "enu", true,
         [&](PackageInfo& i) {
             EXPECT_EQ(osMin(i), (std::vector<int>{6, 1, 15000}));
             EXPECT_EQ(firmware(i), (std::vector<int>{6, 1, 15000}));
         }},
        {"firmware alone fills both", kBase + "firmware=5.2-4000\n", 0, "enu", true,
         [&](PackageInfo& i) {
             EXPECT_EQ(osMin(i), (std::vector<int>{5, 2, 4000}));
             EXPECT_EQ(firmware(i), (std::vector<int>{5, 2, 4000}));
         }},
        {"partial version", kBase + "os_min_ver=6.1\nos_max_ver=junk\n", 0, "enu", true,
         [&](PackageInfo& i) {
             EXPECT_EQ(osMin(i), (std::vector<int>{6, 1, 0}));
             EXPECT_EQ(PMSGetOSMaxVer(i)[0], 0);
         }},
    };
    for (const InfoCase& c : cases) {
        runCase(c);
    }
}

TEST(InfoReader, LanguageVariants) {
    const std::string texts = kFull +
                              "displayname_ger=\"Vorführung\"\ndescription_ger=\"Ein Paket\"\n"
                              "description_enu=\"English text\"\ndisplayname_fre=\"\"\n";
    const InfoCase cases[] = {
        {"German texts", texts, ALL, "ger", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.displayname, "Vorführung");
             EXPECT_EQ(i.description, "Ein Paket");
             EXPECT_EQ(i.description_enu, "English text");
         }},
        {"empty variant keeps the plain text", texts, ALL, "fre", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.displayname, "Demo");
             EXPECT_EQ(i.description, "Demo package");
         }},
        {"no language texts without the text bits", texts, 0x1000000, "ger", true,
         [](PackageInfo& i) {
             EXPECT_EQ(i.displayname, "");
             EXPECT_EQ(i.description_enu, "");
         }},
    };
    for (const InfoCase& c : cases) {
        runCase(c);
    }
}

TEST(InfoReader, DependencyFileReplacesTheInfoKey) {
    TempDir dir;
    writeFile(dir.path() + "/INFO", kFull +
                                        "install_dep_packages=\"a>=1:b\"\n"
                                        "install_conflict_packages=\"c\"\n");
    PackageInfo info;
    ASSERT_TRUE(PMSLoadPKGInfoFile(dir.path(), info, "enu", ALL));
    EXPECT_EQ(info.dep_packages.size(), 2u);
    EXPECT_EQ(info.conflict_packages.size(), 1u);

    // Present but yielding nothing: the INFO key is still ignored.
    writeFile(dir.path() + "/conf/PKG_DEPS", "");
    writeFile(dir.path() + "/conf/PKG_CONX", "[x]\npkg_max_ver=2\n");
    ASSERT_TRUE(PMSLoadPKGInfoFile(dir.path(), info, "enu", ALL));
    EXPECT_TRUE(info.dep_packages.empty());
    ASSERT_EQ(info.conflict_packages.size(), 1u);
    EXPECT_EQ(info.conflict_packages[0].package, "x");
    EXPECT_EQ(info.conflict_packages[0].compop, PKG_COMPOP_LE);
}

TEST(InfoReader, NotAPackageDirectory) {
    TempDir dir;
    PackageInfo info;
    info.package = "stale";
    EXPECT_FALSE(PMSLoadPKGInfoFile(dir.path(), info, "enu", ALL));
    EXPECT_EQ(info.package, "") << "the record is reset before anything else";
    EXPECT_FALSE(PMSLoadPKGInfoFile(dir.path() + "/missing", info, "enu", ALL));
    writeFile(dir.path() + "/file", kBase);
    EXPECT_FALSE(PMSLoadPKGInfoFile(dir.path() + "/file", info, "enu", ALL));
}

TEST(InfoReader, HugeFileIsRefused) {
    TempDir dir;
    std::string huge = kBase + std::string(17 * 1024 * 1024, '#') + "\n";
    writeFile(dir.path() + "/INFO", huge);
    PackageInfo info;
    EXPECT_FALSE(PMSLoadPKGInfoFile(dir.path(), info, "enu", ALL));
}
