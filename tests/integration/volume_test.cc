// Volumes, free space at its limits, temporary folders and package targets, on the real
// 64 MiB tmpfs that the sandbox mounts as /volume1.
#include <errno.h>
#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"

using namespace CORVPackageTool;

namespace {

unsigned long long freeBytes(const char* volume) {
    CORVMOUNTVOLINFO info;
    EXPECT_EQ(CORVMountVolInfoGet(volume, &info), 0) << volume;
    return info.freeBytes;
}

void linkTarget(const std::string& name, const std::string& target) {
    std::string dir = "/var/packages/" + name;
    testutil::removeAll(dir);
    ASSERT_EQ(CORVFSMkdirP(dir.c_str(), nullptr, 1, -1, -1, 0755), 0);
    ASSERT_EQ(symlink(target.c_str(), (dir + "/target").c_str()), 0);
}

// Fills a volume up to the last byte it will take.
void fill(const std::string& path) {
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    ASSERT_GE(fd, 0);
    std::string block(1 << 20, 'x');
    while (write(fd, block.data(), block.size()) > 0) {
    }
    while (write(fd, "x", 1) > 0) {
    }
    close(fd);
}

}  // namespace

TEST(Volumes, TheSandboxVolumeIsReadyWithRealFreeSpace) {
    CORVMOUNTVOLINFO info;
    ASSERT_EQ(CORVMountVolInfoGet("/volume1", &info), 0);
    EXPECT_TRUE(info.ready);
    EXPECT_GT(info.freeBytes, 60ull << 20);
    EXPECT_LE(info.freeBytes, 64ull << 20);
    EXPECT_EQ(CORVMountVolInfoGet("/volume11", &info), -1);
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NO_SUCH_VOLUME);
    EXPECT_EQ(VolumeCountGet(1), 1);
}

TEST(Volumes, ExactFreeSizeLimits) {
    const unsigned long long free = freeBytes("/volume1");
    EXPECT_TRUE(PMSCheckVolStatus("/volume1", free)) << "the exact free size passes";
    EXPECT_FALSE(PMSCheckVolStatus("/volume1", free + 1));
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NO_SPACE);

    std::string dir;
    EXPECT_TRUE(PMSGetTmpDir(free - 1, "/volume1", dir));
    EXPECT_EQ(dir, "/volume1/@tmp");
    // Strictly more than the size is needed to take the named volume; then the search for
    // any volume wants the margin on top and finds none.
    const unsigned long long freeNow = freeBytes("/volume1");
    EXPECT_FALSE(PMSGetTmpDir(freeNow, "/volume1", dir));
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NO_SPACE);
    EXPECT_TRUE(PMSGetTmpDir(freeNow - PKG_VOLUME_MARGIN, dir)) << "exactly size + margin";
    EXPECT_FALSE(PMSGetTmpDir(freeNow - PKG_VOLUME_MARGIN + 1, dir));
}

TEST(Volumes, ReadOnlyVolumeIsNotReady) {
    ASSERT_EQ(mkdir("/volume2", 0755), 0);
    ASSERT_EQ(mount("tmpfs", "/volume2", "tmpfs", MS_RDONLY, "size=8m"), 0) << strerror(errno);
    CORVMOUNTVOLINFO info;
    ASSERT_EQ(CORVMountVolInfoGet("/volume2", &info), 0);
    EXPECT_FALSE(info.ready);
    EXPECT_TRUE(info.readOnly);
    EXPECT_FALSE(PMSCheckVolStatus("/volume2", 0));
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NOT_READY);
    EXPECT_EQ(VolumeCountGet(1), 1);
    umount("/volume2");
}

TEST(Volumes, NoSpaceIsAPlatformError) {
    fill("/volume1/filler");
    EXPECT_EQ(VLIBCFileSetKeyValue("/volume1/conf", "key", std::string(8192, 'v').c_str(), nullptr),
              -1);
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NO_SPACE);
    std::string dir;
    EXPECT_FALSE(PMSGetTmpDir(1, dir));
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NO_SPACE);
    unlink("/volume1/filler");
}

TEST(Volumes, NoVolumeAtAll) {
    ASSERT_EQ(umount("/volume1"), 0) << strerror(errno);
    std::string dir;
    EXPECT_FALSE(PMSGetTmpDir(0, dir));
    EXPECT_EQ(VLIBCErrGet(), PKG_VOLERR_NO_VOLUME);
    EXPECT_TRUE(PMSGetSystemTmpDir(0, dir));
    EXPECT_EQ(dir, "/tmp/@tmp");
}

TEST(Volumes, ListDirectoryLinkFollowsTheSpace) {
    testutil::writeFile("/tmp/old-lists/stale", "x");
    ASSERT_EQ(symlink("/tmp/old-lists", PKG_LIST_TMP_LINK), 0);
    std::string dir;
    ASSERT_TRUE(PMSGetListTmpDir(dir));
    EXPECT_EQ(dir, "/volume1/@tmp/pkglist.tmp/");
    EXPECT_EQ(PMSReadLink(PKG_LIST_TMP_LINK), dir);
    EXPECT_FALSE(testutil::exists("/tmp/old-lists")) << "the previous folder is removed";
    testutil::writeFile(dir + "kept", "x");
    ASSERT_TRUE(PMSGetListTmpDir(dir));
    EXPECT_TRUE(testutil::exists(dir + "kept")) << "an unchanged place is left alone";
}

TEST(Volumes, PackageTargets) {
    linkTarget("sys", "/usr/local/packages/sys");
    linkTarget("v2", "/volume2");
    linkTarget("v1", "/volume1/@appstore/v1");
    ASSERT_EQ(CORVFSMkdirP("/var/packages/none", nullptr, 1, -1, -1, 0755), 0);
    EXPECT_EQ(PMSGetPackageTargetVolByPath("/var/packages/sys"), "not_volume_path");
    EXPECT_EQ(PMSGetPackageTargetVolByPath("/var/packages/v2"), "/volume2");
    EXPECT_EQ(PMSGetPackageTargetVolByPath("/var/packages/v1"), "/volume1");
    EXPECT_EQ(PMSGetPackageTargetVolByPath("/var/packages/none"), "");
    EXPECT_EQ(PMSGetPackageTargetVolByPath(nullptr), "");

    EXPECT_EQ(PMSGetPackageTarget("v1"), "") << "the link leads nowhere yet";
    ASSERT_EQ(CORVFSMkdirP("/volume1/@appstore/v1", nullptr, 1, -1, -1, 0755), 0);
    EXPECT_EQ(PMSGetPackageTarget("v1"), "/volume1/@appstore/v1");

    std::string volume;
    EXPECT_TRUE(PMSGetPackageVol("v1", volume));
    EXPECT_EQ(volume, "/volume1");
    EXPECT_TRUE(PMSGetPackageVol("sys", volume));
    EXPECT_EQ(volume, "/usr/local/packages");
    EXPECT_FALSE(PMSGetPackageVol("none", volume));
    EXPECT_FALSE(PMSGetPackageVol("", volume));
}

TEST(Volumes, DefaultVolume) {
    // A default volume must offer the root margin of 200 MiB.
    ASSERT_EQ(mount("tmpfs", "/volume1", "tmpfs", MS_REMOUNT, "size=300m"), 0) << strerror(errno);
    EXPECT_TRUE(PMSSavePackageDefVolPath("/volume1"));
    std::string volume;
    EXPECT_TRUE(PMSGetPackageDefVol(volume));
    EXPECT_EQ(volume, "/volume1");

    EXPECT_TRUE(PMSSavePackageDefVolPath("/mnt/x")) << "a non-volume path clears the key";
    char value[64] = "unchanged";
    EXPECT_EQ(
        VLIBCFileGetKeyValue("/etc/corvinfo.conf", "pkg_def_intall_vol", value, sizeof(value), 0),
        0);
    EXPECT_FALSE(PMSSavePackageDefVolPath("/volume7")) << "a missing volume is refused";
    EXPECT_FALSE(PMSSavePackageDefVolPath(nullptr));

    EXPECT_EQ(VLIBCINFOSetKeyValue("pkg_def_intall_vol", "/volume7"), 0);
    volume = "x";
    EXPECT_FALSE(PMSGetPackageDefVol(volume));
    EXPECT_EQ(volume, "") << "a volume that does not exist is not named";
}

TEST(Volumes, ArchitectureAndModelMatch) {
    const std::string saved = testutil::readFile("/etc.defaults/corvinfo.conf");
    const struct {
        const char* unique;
        const char* arch;
        const char* exclude;
        const char* model;
        bool matches;
    } cases[] = {
        {"corv_avoton_m1", "x86_64", "", "", true},
        {"corv_armada370_m1", "x86_64", "", "", false},
        {"corv_avoton_m1", "x86_64", "avoton", "", false},
        {"corv_avoton_m1", "noarch", "", "", false},
        {"corv_avoton_m1", "", "", "", false},
        {"corv_riscv_m1", "riscv x86", "", "", true},
        {"corv_riscv_m1", "riscv", "riscv", "", false},
        {"corv_riscv_m1", "x86_64", "", "", false},
        {"corv_avoton_m1", "avoton", "", "corv_avoton_m1 other", true},
        {"corv_avoton_m1", "avoton", "", "corv_avoton_m2", false},
        {"corv_avoton", "avoton", "", "", false},
    };
    for (const auto& c : cases) {
        testutil::writeFile("/etc.defaults/corvinfo.conf",
                            std::string("unique=\"") + c.unique + "\"\n");
        PackageInfo info;
        testutil::writeFile("/tmp/p/INFO", std::string("package=p\nversion=1\narch=\"") + c.arch +
                                               "\"\nexclude_arch=\"" + c.exclude + "\"\nmodel=\"" +
                                               c.model + "\"\n");
        ASSERT_TRUE(PMSLoadPKGInfoFile("/tmp/p", info, "enu", 0));
        EXPECT_EQ(PMSCheckPackageArchModelMatched(info), c.matches)
            << c.unique << " arch=" << c.arch << " exclude=" << c.exclude << " model=" << c.model;
    }
    testutil::writeFile("/etc.defaults/corvinfo.conf", saved);
}
