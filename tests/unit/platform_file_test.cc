// Files, directories and the error slot of the platform.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "corv/vlibc.h"
#include "support/files.h"
#include "support/temp_dir.h"

using testutil::writeFile;

namespace {

struct List {
    PVLIBSZLIST p = VLIBCSzListAlloc(4);
    ~List() { VLIBCSzListFree(p); }
    std::vector<std::string> items() const { return p->items; }
};

struct stat statOf(const std::string& path) {
    struct stat st {};
    stat(path.c_str(), &st);
    return st;
}

}  // namespace

TEST(PlatformFile, ExistAndCheckDir) {
    TempDir dir;
    const std::string file = dir.path() + "/file";
    const std::string sub = dir.path() + "/sub";
    writeFile(file, "x");
    ASSERT_EQ(mkdir(sub.c_str(), 0755), 0);
    ASSERT_EQ(symlink(file.c_str(), (dir.path() + "/to-file").c_str()), 0);
    ASSERT_EQ(symlink(sub.c_str(), (dir.path() + "/to-dir").c_str()), 0);
    ASSERT_EQ(symlink("/nonexistent", (dir.path() + "/dangling").c_str()), 0);
    const struct {
        const char* name;
        int exist;
        int isDir;
    } cases[] = {
        {"file", 1, 0},   {"sub", 0, 1},      {"to-file", 1, 0},
        {"to-dir", 0, 1}, {"dangling", 0, 0}, {"missing", 0, 0},
    };
    for (const auto& c : cases) {
        const std::string path = dir.path() + "/" + c.name;
        EXPECT_EQ(VLIBCFileExist(path.c_str()), c.exist) << c.name;
        EXPECT_EQ(VLIBCFileCheckDir(path.c_str()), c.isDir) << c.name;
    }
    EXPECT_EQ(VLIBCFileExist(nullptr), 0);
    EXPECT_EQ(VLIBCFileCheckDir(nullptr), 0);
}

TEST(PlatformFile, EnumDirSortsAndFilters) {
    TempDir dir;
    for (const char* name : {"b.conf", "a.conf", "c.conf.bak", ".conf", "notes"}) {
        writeFile(dir.path() + "/" + name, "");
    }
    mkdir((dir.path() + "/d.conf").c_str(), 0755);
    List list;
    VLIBCSzListPush(&list.p, "kept");
    EXPECT_EQ(VLIBCFileEnumDir(dir.path().c_str(), ".conf", &list.p, 0x84), 4);
    EXPECT_EQ(list.items(),
              (std::vector<std::string>{"kept", ".conf", "a.conf", "b.conf", "d.conf"}));

    List all;
    EXPECT_EQ(VLIBCFileEnumDir(dir.path().c_str(), nullptr, &all.p, 0), 6);
    EXPECT_EQ(all.items().front(), ".conf");
    EXPECT_EQ(all.items().back(), "notes");

    List none;
    EXPECT_EQ(VLIBCFileEnumDir((dir.path() + "/missing").c_str(), "", &none.p, 0), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
}

TEST(PlatformFile, ReadRetriesAndReports) {
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    ASSERT_EQ(write(fds[1], "abc", 3), 3);
    close(fds[1]);
    char buf[8];
    EXPECT_EQ(VLIBCRead(fds[0], buf, sizeof(buf)), 3);
    EXPECT_EQ(VLIBCRead(fds[0], buf, sizeof(buf)), 0);
    close(fds[0]);
    EXPECT_EQ(VLIBCRead(fds[0], buf, sizeof(buf)), -1);
}

TEST(PlatformFile, MkdirPMakesEveryLevelWithItsMode) {
    TempDir dir;
    const mode_t old = umask(022);
    const struct {
        const char* what;
        std::string path;
        int parents;
        int rc;
    } cases[] = {
        {"three levels", "/a/b/c", 1, 0},
        {"existing directory", "/a/b", 1, 0},
        {"existing without parents", "/a", 0, 0},
        {"trailing and doubled slashes", "/x//y/", 1, 0},
        {"one level without parents", "/one", 0, 0},
        {"missing parent without parents", "/p/q", 0, -1},
    };
    for (const auto& c : cases) {
        const std::string path = dir.path() + c.path;
        EXPECT_EQ(CORVFSMkdirP(path.c_str(), nullptr, c.parents, -1, -1, 0770), c.rc) << c.what;
    }
    umask(old);
    // The last level gets the mode asked for, not the umask's; levels above it stay open
    // for traversal.
    const std::pair<const char*, mode_t> made[] = {{"/a", 0775}, {"/a/b", 0775}, {"/a/b/c", 0770},
                                                   {"/x", 0775}, {"/x/y", 0770}, {"/one", 0770}};
    for (const auto& [level, mode] : made) {
        struct stat st = statOf(dir.path() + level);
        EXPECT_TRUE(S_ISDIR(st.st_mode)) << level;
        EXPECT_EQ(st.st_mode & 07777, mode) << level;
    }
    EXPECT_EQ(VLIBCErrGet(), ERR_MKDIR_FAILED);

    writeFile(dir.path() + "/file", "");
    EXPECT_EQ(CORVFSMkdirP((dir.path() + "/file/sub").c_str(), nullptr, 1, -1, -1, 0755), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_MKDIR_FAILED);
    EXPECT_EQ(CORVFSMkdirP((dir.path() + "/file").c_str(), nullptr, 1, -1, -1, 0755), -1)
        << "a file is not a directory";
    EXPECT_EQ(CORVFSMkdirP("", nullptr, 1, -1, -1, 0755), -1);
}

TEST(PlatformFile, MkdirPChownsOnlyTheLastLevel) {
    if (geteuid() != 0) {
        GTEST_SKIP() << "changing owners needs root";
    }
    TempDir dir;
    const std::string base = dir.path() + "/base";
    ASSERT_EQ(mkdir(base.c_str(), 0755), 0);
    ASSERT_EQ(CORVFSMkdirP((base + "/u/v").c_str(), nullptr, 1, 4321, -1, 0700), 0);
    // A folder made for a package's user under shared parents: the parents stay the
    // caller's and traversable, or the user could never reach its own folder.
    struct Case {
        const char* level;
        uid_t uid;
        mode_t mode;
    };
    const Case cases[] = {{"", 0, 0755}, {"/u", 0, 0755}, {"/u/v", 4321, 0700}};
    for (const Case& c : cases) {
        struct stat st = statOf(base + c.level);
        EXPECT_EQ(st.st_uid, c.uid) << c.level;
        EXPECT_EQ(st.st_gid, 0u) << c.level << ": -1 leaves the group";
        EXPECT_EQ(st.st_mode & 07777, c.mode) << c.level;
    }
}

TEST(PlatformFile, ErrorSlotIsPerThread) {
    VLIBCErrSetEx(ERR_NO_SPACE, "here.cc", 12);
    int otherCode = -1;
    std::string otherFile = "unset";
    int otherLine = -1;
    std::thread other([&] {
        otherCode = VLIBCErrGet();
        otherFile = VLIBCErrorGetFile();
        otherLine = VLIBCErrorGetLine();
        VLIBCErrSetEx(ERR_TIMEOUT, "there.cc", 34);
    });
    other.join();
    EXPECT_EQ(otherCode, 0);
    EXPECT_EQ(otherFile, "");
    EXPECT_EQ(otherLine, 0);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SPACE);
    EXPECT_STREQ(VLIBCErrorGetFile(), "here.cc");
    EXPECT_EQ(VLIBCErrorGetLine(), 12);

    std::string temporary = "gone-soon.cc";
    VLIBCErrSetEx(1, temporary.c_str(), 1);
    temporary.assign(64, 'x');
    EXPECT_STREQ(VLIBCErrorGetFile(), "gone-soon.cc") << "the name is copied";
}

TEST(PlatformFile, HiddenDirName) {
    EXPECT_TRUE(CORVEAIsHiddenDir("@eaDir"));
    EXPECT_FALSE(CORVEAIsHiddenDir("@eadir"));
    EXPECT_FALSE(CORVEAIsHiddenDir("@eaDir2"));
    EXPECT_FALSE(CORVEAIsHiddenDir(nullptr));
}
