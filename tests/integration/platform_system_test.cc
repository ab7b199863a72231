// The platform against the system's own paths: service names, the model, the system
// configuration and a full volume.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/process_runner.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "support/files.h"

namespace {

struct List {
    PVLIBSZLIST p = VLIBCSzListAlloc(4);
    ~List() { VLIBCSzListFree(p); }
    std::vector<std::string> items() const { return p->items; }
};

// Writes until the file system says no more.
void fill(const std::string& path) {
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    ASSERT_GE(fd, 0);
    std::string block(1 << 16, 'x');
    while (write(fd, block.data(), block.size()) > 0) {
    }
    while (write(fd, block.data(), 1) > 0) {
    }
    close(fd);
}

std::vector<std::string> namesIn(const std::string& dir) {
    List list;
    VLIBCFileEnumDir(dir.c_str(), nullptr, &list.p, 0);
    return list.items();
}

}  // namespace

TEST(PlatformSystem, ServiceNames) {
    testutil::removeAll(VLIB_SERVICE_CFG_DIR);
    List none;
    EXPECT_EQ(VLIBServiceEnum(&none.p), 0) << "no directory, no services";

    for (const char* name : {"sshd.cfg", "pkgctl-demo.cfg", "notes.txt", ".cfg", "nginx.cfg"}) {
        testutil::writeFile(std::string(VLIB_SERVICE_CFG_DIR "/") + name, "");
    }
    List list;
    VLIBCSzListPush(&list.p, "kept");
    EXPECT_EQ(VLIBServiceEnum(&list.p), 3);
    EXPECT_EQ(list.items(), (std::vector<std::string>{"kept", "nginx", "pkgctl-demo", "sshd"}));
}

TEST(PlatformSystem, DocketteFromTheDefaults) {
    const struct {
        const char* defaults;  // null: no file at all
        int dockette;
    } cases[] = {
        {nullptr, 0},
        {"unique=\"corv_x\"\n", 0},
        {"dockette=\"yes\"\n", 1},
        {"dockette=YES\n", 1},
        {"dockette=\"no\"\n", 0},
        {"dockette=\"yes\"\ndockette=\"no\"\n", 0},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.defaults ? c.defaults : "(no file)");
        testutil::removeAll(VLIBC_INFO_DEFAULTS_PATH);
        if (c.defaults) {
            testutil::writeFile(VLIBC_INFO_DEFAULTS_PATH, c.defaults);
        }
        VLIBCErrSetEx(0x2900, "caller.cc", 9);
        EXPECT_EQ(VLIBCIsDockette(), c.dockette);
        EXPECT_EQ(VLIBCErrGet(), 0x2900) << "a yes/no answer leaves the caller's error";
        EXPECT_STREQ(VLIBCErrorGetFile(), "caller.cc");
    }
}

TEST(PlatformSystem, SystemConfigurationKeys) {
    testutil::writeFile(VLIBC_INFO_PATH, "language=\"enu\"\n# kept\ntimezone=\"UTC\"");
    chmod(VLIBC_INFO_PATH, 0640);
    EXPECT_EQ(VLIBCINFOSetKeyValue("language", "ger"), 0);
    EXPECT_EQ(VLIBCINFOSetKeyValue("pkg_def_intall_vol", "/volume1"), 0);
    EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH),
              "language=\"ger\"\n# kept\ntimezone=\"UTC\"\npkg_def_intall_vol=\"/volume1\"\n");
    EXPECT_EQ(VLIBCINFORemoveKey("language"), 0);
    EXPECT_EQ(VLIBCINFORemoveKey("language"), 0);
    EXPECT_EQ(testutil::readFile(VLIBC_INFO_PATH),
              "# kept\ntimezone=\"UTC\"\npkg_def_intall_vol=\"/volume1\"\n");
    struct stat st {};
    ASSERT_EQ(stat(VLIBC_INFO_PATH, &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640u);
    for (const std::string& name : namesIn("/etc")) {
        EXPECT_EQ(name.find(".corvinfo.conf."), std::string::npos) << "temporary left: " << name;
    }
}

TEST(PlatformSystem, FullVolumeIsNoSpace) {
    const std::string conf = "/volume1/platform.conf";
    testutil::writeFile(conf, "key=\"old\"\n");
    fill("/volume1/filler");
    const std::string big(64 * 1024, 'v');
    EXPECT_EQ(VLIBCFileSetKeyValue(conf.c_str(), "key", big.c_str(), nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SPACE);
    EXPECT_EQ(testutil::readFile(conf), "key=\"old\"\n") << "the old file is whole";
    EXPECT_EQ(namesIn("/volume1"), (std::vector<std::string>{"filler", "platform.conf"}))
        << "no temporary left";
    unlink("/volume1/filler");
    EXPECT_EQ(VLIBCFileSetKeyValue(conf.c_str(), "key", "new", nullptr), 0);
    EXPECT_EQ(testutil::readFile(conf), "key=\"new\"\n");
}

// tar finds the platform's pigz as its gzip; every other program keeps the caller's PATH.
TEST(PlatformSystem, TarAloneGetsTheFasterGzip) {
    if (access("/usr/bin/pigz", X_OK) != 0) {
        GTEST_SKIP() << "no pigz on this machine";
    }
    char target[256] = "";
    ASSERT_GT(readlink("/usr/corv/libexec/tar-gzip/gzip", target, sizeof(target) - 1), 0);
    EXPECT_STREQ(target, "/usr/bin/pigz");

    testutil::writeFile("/tmp/member", "x");
    ASSERT_EQ(VLIBCExecl("/bin/tar", 0xbb, "czf", "/tmp/a.tgz", "-C", "/tmp", "member", nullptr),
              0);
    // --to-command runs with tar's own environment: it shows the PATH tar searched.
    CORVUtils::ProcessRunner tar("/bin/tar",
                                 {"xzf", "/tmp/a.tgz", "--to-command=/bin/sh -c 'echo \"$PATH\"'"});
    ASSERT_EQ(tar.run(true, true), 0) << tar.getCapturedOutputErr();
    EXPECT_EQ(tar.getCapturedOutput().rfind("/usr/corv/libexec/tar-gzip:", 0), 0u)
        << tar.getCapturedOutput();

    CORVUtils::ProcessRunner shell("/bin/sh", {"-c", "echo \"$PATH\""});
    ASSERT_EQ(shell.run(true, true), 0);
    EXPECT_EQ(shell.getCapturedOutput().find("tar-gzip"), std::string::npos)
        << shell.getCapturedOutput();
}
