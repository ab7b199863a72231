// "usr-local-linker" and "sdk-plugin": a package's programs on PATH while it runs, and its
// event hooks under /usr/local/libexec run by the platform's hook runner.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgtool.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;

namespace {

const PKG_INSTALLATION_TYPE kUserStart = static_cast<PKG_INSTALLATION_TYPE>(8);
const PKG_INSTALLATION_TYPE kUserStop = static_cast<PKG_INSTALLATION_TYPE>(0x10);

testutil::TestPackage linking(const std::string& name, const std::string& section) {
    testutil::TestPackage pkg = testutil::recordingPackage(name);
    pkg.conf["resource"] = R"({"service-cfg":{},"usr-local-linker":)" + section + "}";
    pkg.payload["bin/greet-tool"] = "#!/bin/sh\necho \"hello from $0\"\n";
    pkg.payload["bin/other-tool"] = "#!/bin/sh\necho other\n";
    pkg.payload["etc/tool.conf"] = "x=1\n";
    return pkg;
}

bool isLink(const std::string& path) {
    struct stat st;
    return lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode);
}

int control(const std::string& name, bool start) {
    PackageManager pm;
    return pm.serviceControl(start ? kUserStart : kUserStop, name, start, nullptr, nullptr, nullptr,
                             true, false);
}

}  // namespace

TEST(UsrLocalLinker, LinkedProgramRunsFromPathWhileThePackageRuns) {
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, linking("tools", R"({"bin":["bin/*-tool"],
                  "etc":["etc/tool.conf"],"lib":["lib/nomatch.so"]})")),
              1);
    ASSERT_EQ(chmod("/var/packages/tools/target/bin/greet-tool", 0755), 0);
    testutil::RunResult ran = testutil::run(
        "/usr/bin/env", {"PATH=/usr/local/bin:/usr/bin:/bin", "/bin/sh", "-c", "greet-tool"});
    EXPECT_EQ(ran.status, 0) << ran.err;
    EXPECT_EQ(ran.out, "hello from /usr/local/bin/greet-tool\n");
    EXPECT_TRUE(isLink("/usr/local/bin/other-tool"));
    EXPECT_EQ(testutil::readFile("/usr/local/etc/tool.conf"), "x=1\n");
    // A pattern without match still stands for itself: a dangling link.
    EXPECT_TRUE(isLink("/usr/local/lib/nomatch.so"));

    ASSERT_EQ(control("tools", false), 1);
    for (const char* link : {"/usr/local/bin/greet-tool", "/usr/local/bin/other-tool",
                             "/usr/local/etc/tool.conf", "/usr/local/lib/nomatch.so"}) {
        EXPECT_FALSE(testutil::exists(link) || isLink(link)) << link;
    }
}

TEST(UsrLocalLinker, PlainFileIsReplacedAndADirectoryFailsTheStartWithRollback) {
    testutil::writeFile("/usr/local/bin/greet-tool", "#!/bin/sh\necho old\n");
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, linking("tools", R"({"bin":["bin/greet-tool"]})")), 1);
    EXPECT_TRUE(isLink("/usr/local/bin/greet-tool"));
    ASSERT_EQ(control("tools", false), 1);

    // bin links first, then etc, whose target is a directory: the start fails and the bin
    // link made before is taken back.
    testutil::writeFile("/var/packages/tools/conf/resource",
                        R"({"service-cfg":{},"usr-local-linker":{"bin":["bin/greet-tool"],
                            "etc":["etc/tool.conf"]}})");
    ASSERT_EQ(mkdir("/usr/local/etc/tool.conf", 0755), 0);
    EXPECT_EQ(control("tools", true), 0);
    EXPECT_FALSE(isLink("/usr/local/bin/greet-tool"));
    struct stat st;
    ASSERT_EQ(stat("/usr/local/etc/tool.conf", &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_FALSE(testutil::exists("/var/packages/tools/enabled"));
}

TEST(UsrLocalLinker, PathsThatLeaveThePackageAreNotLinked) {
    PackageManager pm;
    ASSERT_EQ(
        testutil::installBuilt(
            pm, linking("tools", R"({"bin":["../../../../bin/sh","/bin/ls","bin/greet-tool"]})")),
        1);
    EXPECT_TRUE(isLink("/usr/local/bin/greet-tool"));
    EXPECT_FALSE(isLink("/usr/local/bin/sh"));
    EXPECT_FALSE(isLink("/usr/local/bin/ls"));
}

TEST(SdkPlugin, HooksAreInstalledUnderTheirEventAndRunAtIt) {
    testutil::TestPackage pkg = testutil::recordingPackage("hooks");
    pkg.conf["resource"] = R"({"service-cfg":{},"sdk-plugin":{"plugins":[
        {"event":"volume/mounted","relpath":"hooks/on-mount"},
        {"event":"volume/../../etc","relpath":"hooks/on-mount"},
        {"event":"boot","relpath":"hooks/none"}]}})";
    pkg.payload["hooks/on-mount"] = "#!/bin/sh\necho \"$CORV_SDK_EVENT $1\" >> /tmp/hook.log\n";
    PackageManager pm;
    ASSERT_EQ(testutil::installBuilt(pm, pkg), 1);
    const std::string hook = "/usr/local/libexec/volume/mounted/on-mount";
    EXPECT_EQ(testutil::modeOf(hook), 0755u);
    EXPECT_FALSE(testutil::exists("/usr/local/libexec/boot/none"));

    testutil::RunResult ran =
        testutil::run("/usr/corv/bin/corv-sdk-event", {"volume/mounted", "/volume1"});
    EXPECT_EQ(ran.status, 0) << ran.err;
    EXPECT_EQ(ran.out, "on-mount 0\n");
    EXPECT_EQ(testutil::readFile("/tmp/hook.log"), "volume/mounted /volume1\n");

    ASSERT_EQ(pm.uninstall("hooks", nullptr, "enu", PKG_UNINSTALL, false, nullptr), 1);
    EXPECT_FALSE(testutil::exists(hook));
    struct stat st;
    EXPECT_EQ(stat("/usr/local/libexec/volume/mounted", &st), 0);
}
