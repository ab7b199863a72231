// Paths that a package names: nothing may lead outside the package, neither by "..", nor
// by an absolute path, nor through a symbolic link inside it.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>

#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "support/files.h"
#include "support/temp_dir.h"

using CORV::PkgUtils::IsLegalRelPath;
using CORV::PkgUtils::ResolveRelPath;

namespace {

// <tmp>/outside/secret, and the package <tmp>/pkg, reached as the tests' root through the
// link <tmp>/target, as a package's root is reached through /var/packages/<pkg>/target.
class RelPath : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_FALSE(tmp.path().empty());
        base = tmp.path();
        pkg = base + "/pkg";
        root = base + "/target";
        testutil::writeFile(base + "/outside/secret", "s");
        testutil::writeFile(pkg + "/conf/file", "f");
        testutil::writeFile(pkg + "/bin/tool", "t");
        link("../outside/secret", pkg + "/rel-out");
        link(base + "/outside", pkg + "/abs-out-dir");
        link("conf/file", pkg + "/rel-in");
        link(pkg + "/conf", pkg + "/abs-in-dir");
        link("../pkg/conf/file", pkg + "/out-and-back");
        link("/nonexistent-corvpkg-test/x", pkg + "/dangling-out");
        link("conf/missing", pkg + "/dangling-in");
        link("loop-b", pkg + "/loop-a");
        link("loop-a", pkg + "/loop-b");
        link("..", pkg + "/conf/up");
        link("..", pkg + "/parent");
        link("bin/../conf", pkg + "/dotdot-in");
        link(pkg, root);
    }

    static void link(const std::string& target, const std::string& path) {
        ASSERT_EQ(symlink(target.c_str(), path.c_str()), 0) << path;
    }

    TempDir tmp;
    std::string base;
    std::string pkg;
    std::string root;
};

struct PathCase {
    const char* relative;
    bool legal;      // IsLegalRelPath
    int legalError;  // its error when not legal
    bool resolves;   // ResolveRelPath
    int resolveError;
    const char* out;  // ResolveRelPath's result, relative to the root
};

const PathCase kPaths[] = {
    {"conf/file", true, 0, true, 0, "conf/file"},
    {"./conf//file", true, 0, true, 0, "conf/file"},
    {"conf/", true, 0, true, 0, "conf"},
    {"conf/missing", true, 0, false, ERR_NO_SUCH_FILE, nullptr},
    {"newdir/newfile", true, 0, false, ERR_NO_SUCH_FILE, nullptr},
    {"conf/file/below-a-file", true, 0, false, ERR_NO_SUCH_FILE, nullptr},
    {"rel-in", true, 0, true, 0, "rel-in"},
    {"abs-in-dir/file", true, 0, true, 0, "abs-in-dir/file"},
    {"out-and-back", true, 0, true, 0, "out-and-back"},
    {"dotdot-in/file", true, 0, true, 0, "dotdot-in/file"},
    {"conf/up/bin/tool", true, 0, true, 0, "conf/up/bin/tool"},
    {"dangling-in", true, 0, false, ERR_NO_SUCH_FILE, nullptr},
    {"", false, ERR_BAD_PARAMETERS, false, ERR_BAD_PARAMETERS, nullptr},
    {".", false, ERR_BAD_PARAMETERS, false, ERR_BAD_PARAMETERS, nullptr},
    {"/etc/passwd", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"..", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"../outside/secret", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"conf/../conf/file", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"conf/..", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"rel-out", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"abs-out-dir/secret", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"abs-out-dir/not-yet", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"abs-out-dir", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"dangling-out", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"conf/up/up", true, 0, false, ERR_NO_SUCH_FILE, nullptr},
    {"parent", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"parent/outside/secret", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"parent/pkg/conf/file", true, 0, true, 0, "parent/pkg/conf/file"},
    {"conf/up/../x", false, ERR_OUTSIDE_PACKAGE, false, ERR_OUTSIDE_PACKAGE, nullptr},
    {"loop-a", false, ERR_STAT_FAILED, false, ERR_STAT_FAILED, nullptr},
};

}  // namespace

TEST_F(RelPath, Table) {
    for (const PathCase& c : kPaths) {
        VLIBCErrSet(0);
        EXPECT_EQ(IsLegalRelPath(root, c.relative), c.legal) << "IsLegalRelPath " << c.relative;
        if (!c.legal) {
            EXPECT_EQ(VLIBCErrGet(), c.legalError) << "IsLegalRelPath " << c.relative;
        }
        std::string out = "unchanged";
        VLIBCErrSet(0);
        EXPECT_EQ(ResolveRelPath(root, c.relative, out), c.resolves)
            << "ResolveRelPath " << c.relative;
        if (c.resolves) {
            EXPECT_EQ(out, root + "/" + c.out) << "ResolveRelPath " << c.relative;
        } else {
            EXPECT_EQ(out, "unchanged") << "ResolveRelPath " << c.relative;
            EXPECT_EQ(VLIBCErrGet(), c.resolveError) << "ResolveRelPath " << c.relative;
        }
    }
}

TEST_F(RelPath, ResultKeepsTheRootAsGivenAndDropsItsTrailingSlash) {
    std::string out;
    ASSERT_TRUE(ResolveRelPath(root + "/", "bin/tool", out));
    EXPECT_EQ(out, root + "/bin/tool");
    ASSERT_TRUE(ResolveRelPath(pkg, "bin/tool", out));
    EXPECT_EQ(out, pkg + "/bin/tool");
}

TEST_F(RelPath, ALinkToTheRootItselfStaysInside) {
    link(".", pkg + "/self");
    std::string out;
    EXPECT_TRUE(ResolveRelPath(root, "self/self/conf/file", out));
    EXPECT_EQ(out, root + "/self/self/conf/file");
}

TEST_F(RelPath, ASiblingThatSharesTheRootsNameAsPrefixIsOutside) {
    testutil::writeFile(base + "/pkg2/file", "x");
    link("../pkg2/file", pkg + "/sibling");
    VLIBCErrSet(0);
    EXPECT_FALSE(IsLegalRelPath(root, "sibling"));
    EXPECT_EQ(VLIBCErrGet(), ERR_OUTSIDE_PACKAGE);
}

TEST_F(RelPath, RootMustBeAnExistingDirectory) {
    const std::string kRoots[] = {"", base + "/nope", pkg + "/conf/file"};
    for (const std::string& bad : kRoots) {
        std::string out;
        VLIBCErrSet(0);
        EXPECT_FALSE(IsLegalRelPath(bad, "conf/file")) << bad;
        EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS) << bad;
        EXPECT_FALSE(ResolveRelPath(bad, "conf/file", out)) << bad;
    }
}

TEST_F(RelPath, TheWholeFileSystemAsRootAcceptsAbsoluteLinks) {
    std::string out;
    EXPECT_TRUE(ResolveRelPath("/", base.substr(1) + "/pkg/abs-out-dir/secret", out));
    EXPECT_EQ(out, base + "/pkg/abs-out-dir/secret");
}
