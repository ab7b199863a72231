// Package files: building, reading single members, the payload checksum.
#include <dirent.h>
#include <sys/stat.h>

#include <gtest/gtest.h>

#include <string>

#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgbuild.h"
#include "corvpkg/pkgfile.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

TestPackage sample() {
    TestPackage pkg("sample", "2.1-0003");
    pkg.scripts["start-stop-status"] = testutil::statusScript(0);
    pkg.scripts["postinst"] = "exit 0\n";
    pkg.conf["privilege"] = R"({"defaults":{"run-as":"root"}})";
    pkg.payload["bin/tool"] = "#!/bin/sh\necho tool\n";
    return pkg;
}

int entries(const char* dir) {
    int n = 0;
    if (DIR* d = opendir(dir)) {
        while (struct dirent* e = readdir(d)) {
            n += e->d_name[0] != '.';
        }
        closedir(d);
    }
    return n;
}

std::string tarList(const std::string& file) {
    CORVUtils::ProcessRunner tar("/bin/tar", {"tf", file});
    tar.run(true, true);
    return tar.getCapturedOutput();
}

}  // namespace

TEST(PackageFile, BuildAndQuery) {
    const std::string file = testutil::buildPackage(sample());
    const std::string members = tarList(file);
    for (const char* member :
         {"INFO\n", "package.tgz\n", "scripts/postinst\n", "conf/privilege\n"}) {
        EXPECT_NE(members.find(member), std::string::npos) << member << " in\n" << members;
    }
    EXPECT_EQ(members.find("package/"), std::string::npos) << "the payload is only in package.tgz";

    PackageManager pm;
    PackageInfo info;
    ASSERT_TRUE(pm.queryPackageFileInfo(file, info, PKG_INSTALL, "enu"));
    EXPECT_EQ(info.package, "sample");
    EXPECT_EQ(info.version, "2.1-0003");
    EXPECT_EQ(info.script_mask, 0x01u | 0x04u);
    ASSERT_EQ(info.checksum.size(), 32u);
    EXPECT_EQ(info.checksum.find_first_not_of("0123456789abcdef"), std::string::npos);
    EXPECT_EQ(entries("/volume1/@tmp"), 0) << "the temporary folder is gone";

    EXPECT_TRUE(pm.verifyPackageTgzFile(file, info.checksum.c_str()));
    EXPECT_TRUE(pm.verifyPackageTgzFile(file, nullptr));
    EXPECT_FALSE(pm.verifyPackageTgzFile(file, ""));
    std::string upper = info.checksum;
    for (char& c : upper) {
        c = static_cast<char>(toupper(c));
    }
    EXPECT_FALSE(pm.verifyPackageTgzFile(file, upper.c_str())) << "the comparison is exact";
    EXPECT_FALSE(pm.verifyPackageTgzFile("", info.checksum.c_str()));
}

TEST(PackageFile, BuilderRefusesWhatWouldNotInstall) {
    TestPackage noMaintainer("bad");
    noMaintainer.info.erase("maintainer");
    testutil::writePackageDir("/tmp/src-bad", noMaintainer);
    std::string error;
    EXPECT_FALSE(PMSBuildPackageFile("/tmp/src-bad", "/tmp/bad.cpk", "", error));
    EXPECT_NE(error.find("INFO"), std::string::npos) << error;
    EXPECT_FALSE(testutil::exists("/tmp/bad.cpk"));

    testutil::writePackageDir("/tmp/src-ok", sample());
    testutil::removeAll("/tmp/src-ok/package");
    EXPECT_FALSE(PMSBuildPackageFile("/tmp/src-ok", "/tmp/ok.cpk", "", error));
    EXPECT_NE(error.find("payload"), std::string::npos) << error;
    EXPECT_FALSE(testutil::exists("/tmp/ok.cpk.partial"));
}

TEST(PackageFile, DamagedFiles) {
    PackageManager pm;
    PackageInfo info;
    testutil::writeFile("/tmp/notatar.cpk", "this is no archive\n");
    EXPECT_FALSE(pm.queryPackageFileInfo("/tmp/notatar.cpk", info, PKG_INSTALL, "enu"));

    testutil::writeFile("/tmp/parts/README", "x");
    ASSERT_EQ(VLIBCExec("/bin/tar", "cf", "/tmp/noinfo.cpk", "-C", "/tmp/parts", "README", nullptr),
              0);
    EXPECT_FALSE(pm.queryPackageFileInfo("/tmp/noinfo.cpk", info, PKG_INSTALL, "enu"));

    // An INFO without version: the query passes with what it could read.
    testutil::writeFile("/tmp/nover/INFO", "package=\"nover\"\n");
    testutil::writeFile("/tmp/nover/scripts/preinst", "#!/bin/sh\n");
    ASSERT_EQ(VLIBCExec("/bin/tar", "cf", "/tmp/nover.cpk", "-C", "/tmp/nover", "INFO", "scripts",
                        nullptr),
              0);
    EXPECT_TRUE(pm.queryPackageFileInfo("/tmp/nover.cpk", info, PKG_INSTALL, "enu"));
    EXPECT_EQ(info.package, "nover");
    EXPECT_EQ(info.version, "");
    EXPECT_EQ(info.script_mask, 0u);

    // A truncated archive.
    const std::string file = testutil::buildPackage(sample());
    const std::string whole = testutil::readFile(file);
    testutil::writeFile("/tmp/truncated.cpk", whole.substr(0, 700));
    PackageInfo cut;
    pm.queryPackageFileInfo("/tmp/truncated.cpk", cut, PKG_INSTALL, "enu");
    EXPECT_FALSE(pm.verifyPackageTgzFile("/tmp/truncated.cpk", "0123"));
    EXPECT_EQ(entries("/volume1/@tmp"), 0) << "the payload is checked without a folder";
}

TEST(PackageFile, ScriptsWithoutTheExecuteBitAreMadeRunnable) {
    testutil::writeFile("/tmp/noexec/INFO", testutil::infoOf(sample()));
    testutil::writeFile("/tmp/noexec/scripts/preinst", "#!/bin/sh\nexit 0\n");
    chmod("/tmp/noexec/scripts/preinst", 0644);
    ASSERT_EQ(VLIBCExec("/bin/tar", "cf", "/tmp/noexec.cpk", "-C", "/tmp/noexec", "INFO", "scripts",
                        nullptr),
              0);
    PackageManager pm;
    PackageInfo info;
    ASSERT_TRUE(pm.queryPackageFileInfo("/tmp/noexec.cpk", info, PKG_INSTALL, "enu"));
    EXPECT_EQ(info.script_mask, 0x02u);
}
