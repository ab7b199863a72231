// Key-value and section files of the platform: what a reader makes of odd files, and
// what a writer leaves behind.
#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "support/files.h"
#include "support/temp_dir.h"

using testutil::readFile;
using testutil::writeFile;

using testutil::modeOf;

namespace {

// The owners of what the platform allocates, for the tests.
struct List {
    PVLIBSZLIST p = VLIBCSzListAlloc(8);
    ~List() { VLIBCSzListFree(p); }
    std::vector<std::string> items() const { return p->items; }
};
struct Hash {
    PVLIBSZHASH p = VLIBCSzHashAlloc(8);
    ~Hash() { VLIBCSzHashFree(p); }
    std::map<std::string, std::string> values() const { return p->values; }
};

// Shows control characters, so that a failing case says which file it was.
std::string shown(const std::string& text) {
    std::string out;
    for (char c : text) {
        if (c == '\n') {
            out += "\\n";
        } else if (c == '\r') {
            out += "\\r";
        } else if (c == '\0') {
            out += "\\0";
        } else {
            out += c;
        }
    }
    return out;
}

std::vector<std::string> filesIn(const std::string& dir) {
    std::vector<std::string> names;
    DIR* d = opendir(dir.c_str());
    while (d != nullptr) {
        struct dirent* e = readdir(d);
        if (e == nullptr) {
            break;
        }
        std::string name = e->d_name;
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    if (d != nullptr) {
        closedir(d);
    }
    return names;
}

const char* kMissing = nullptr;

}  // namespace

TEST(PlatformKvFile, ReadsWhatAShellWouldSource) {
    const struct {
        const char* what;
        std::string text;
        const char* key;
        const char* value;  // kMissing: the key is not there
    } cases[] = {
        {"quoted value", "a=\"x y\"\n", "a", "x y"},
        {"blanks around key and value", "  a \t=  v  \n", "a", "v"},
        {"blanks inside quotes stay", "a=\"  v  \"\n", "a", "  v  "},
        {"one quote is no quoting", "a=\"x\n", "a", "\"x"},
        {"quotes inside the value", "a=\"say \"hi\"\"\n", "a", "say \"hi\""},
        {"empty quoted value", "a=\"\"\n", "a", ""},
        {"empty value", "a=\n", "a", ""},
        {"value holding the separator", "a=b=c\n", "a", "b=c"},
        {"last duplicate wins", "a=1\nb=0\na=2\na=3\n", "a", "3"},
        {"comment line", "#a=1\n", "a", kMissing},
        {"indented comment", "  # a=1\na2=0\n", "a", kMissing},
        {"comment does not hide a later key", "#a=1\na=2\n", "a", "2"},
        {"line without separator", "a\nb=1\n", "a", kMissing},
        {"separator without key", "=5\n", "", kMissing},
        {"longer key is another key", "ab=1\n", "a", kMissing},
        {"CRLF line ends", "a=\"v\"\r\nb=2\r\n", "a", "v"},
        {"CRLF on the last line", "a=1\r\nb=2\r\n", "b", "2"},
        {"no newline at the end", "a=1\nb=last", "b", "last"},
        {"NUL ends the line's text", std::string("a=x\0yz\nb=2\n", 11), "a", "x"},
        {"after a NUL the next line counts", std::string("a=x\0yz\nb=2\n", 11), "b", "2"},
        {"NUL before the separator", std::string("c\0=3\n", 5), "c", kMissing},
        {"blank lines and tabs", "\n\t\n\ta\t=\t1\t\n\n", "a", "1"},
        {"a section line is no key", "[s]\na=1\n", "a", "1"},
        {"empty file", "", "a", kMissing},
        {"only a newline", "\n", "a", kMissing},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string(c.what) + ": [" + shown(c.text) + "] key " + c.key);
        TempDir dir;
        const std::string path = dir.path() + "/f";
        writeFile(path, c.text);

        char buf[256];
        int n = VLIBCFileGetKeyValue(path.c_str(), c.key, buf, sizeof(buf), 0);
        EXPECT_EQ(n, c.value ? static_cast<int>(strlen(c.value)) : 0);
        EXPECT_EQ(std::string(buf), c.value ? c.value : "");

        List keys;
        VLIBCSzListPush(&keys.p, c.key);
        Hash hash;
        EXPECT_EQ(VLIBCFileGetKeys(path.c_str(), keys.p, &hash.p, "="), c.value ? 1 : 0);
        const char* got = VLIBCSzHashGetValue(hash.p, c.key);
        if (c.value) {
            ASSERT_NE(got, nullptr);
            EXPECT_EQ(std::string(got), c.value);
        } else {
            EXPECT_EQ(got, nullptr);
        }
    }
}

TEST(PlatformKvFile, ValueIsCutToTheBuffer) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    writeFile(path, "a=\"abcdef\"\n");
    char buf[4] = "zzz";
    EXPECT_EQ(VLIBCFileGetKeyValue(path.c_str(), "a", buf, sizeof(buf), 0), 3);
    EXPECT_STREQ(buf, "abc");
    char one[1] = {'z'};
    EXPECT_EQ(VLIBCFileGetKeyValue(path.c_str(), "a", one, sizeof(one), 0), 0);
    EXPECT_EQ(one[0], '\0');
    EXPECT_EQ(VLIBCFileGetKeyValue(path.c_str(), "a", buf, 0, 0), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
}

TEST(PlatformKvFile, UnreadableFilesFail) {
    TempDir dir;
    const std::string missing = dir.path() + "/missing";
    List keys;
    VLIBCSzListPush(&keys.p, "a");
    Hash hash;
    char buf[16];
    EXPECT_EQ(VLIBCFileGetKeys(missing.c_str(), keys.p, &hash.p, "="), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_OPEN_FAILED);
    EXPECT_EQ(VLIBCFileGetKeyValue(missing.c_str(), "a", buf, sizeof(buf), 0), -1);
    EXPECT_EQ(VLIBCFileGetPair(missing.c_str(), &hash.p), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_OPEN_FAILED);
    EXPECT_EQ(VLIBCFileEnumSection(missing.c_str(), &keys.p), -1);
    EXPECT_EQ(VLIBCFileGetKeyValue(dir.path().c_str(), "a", buf, sizeof(buf), 0), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_IS_DIRECTORY);
    // A named pipe without a writer would block the open and the read: it is no file.
    const std::string fifo = dir.path() + "/fifo";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0644), 0);
    EXPECT_EQ(VLIBCFileGetKeys(fifo.c_str(), keys.p, &hash.p, "="), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_OPEN_FAILED);
}

TEST(PlatformKvFile, SizeLimit) {
    TempDir dir;
    const std::string path = dir.path() + "/big";
    const std::string head = "a=1\n";
    std::string text = head + std::string(VLIBC_KV_MAX_FILE - head.size() - 1, '#') + "\n";
    ASSERT_EQ(text.size(), static_cast<size_t>(VLIBC_KV_MAX_FILE));
    writeFile(path, text);
    char buf[16];
    EXPECT_EQ(VLIBCFileGetKeyValue(path.c_str(), "a", buf, sizeof(buf), 0), 1) << "at the limit";

    text += "b=2\n";
    writeFile(path, text);
    EXPECT_EQ(VLIBCFileGetKeyValue(path.c_str(), "a", buf, sizeof(buf), 0), -1) << "past it";
    EXPECT_EQ(VLIBCErrGet(), ERR_READ_FAILED);
    EXPECT_EQ(VLIBCFileSetKeyValue(path.c_str(), "a", "2", nullptr), -1)
        << "a writer cannot keep what it did not read";
}

TEST(PlatformKvFile, HugeLineAndBinaryGarbage) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    std::string garbage;
    for (int i = 0; i < 4096; ++i) {
        garbage += static_cast<char>((i * 7919) & 0xff);
    }
    const std::string huge(3 << 20, 'v');
    writeFile(path, garbage + "\nbig=\"" + huge + "\"\n" + garbage + "\nlast=1");
    List keys;
    VLIBCSzListPush(&keys.p, "big");
    VLIBCSzListPush(&keys.p, "last");
    Hash hash;
    EXPECT_EQ(VLIBCFileGetKeys(path.c_str(), keys.p, &hash.p, "="), 2);
    EXPECT_EQ(hash.values()["big"], huge);
    EXPECT_EQ(hash.values()["last"], "1");
}

TEST(PlatformKvFile, GetKeysLoadsOnlyTheWantedKeysAndKeepsTheRest) {
    TempDir dir;
    const std::string path = dir.path() + "/INFO";
    writeFile(path, "package=\"demo\"\nversion=\"1.0\"\nother=\"x\"\npackage=\"final\"\n");
    List keys;
    for (const char* k : {"package", "version", "absent"}) {
        VLIBCSzListPush(&keys.p, k);
    }
    Hash hash;
    VLIBCSzHashSetValue(&hash.p, "absent", "kept");
    VLIBCSzHashSetValue(&hash.p, "version", "old");
    EXPECT_EQ(VLIBCFileGetKeys(path.c_str(), keys.p, &hash.p, "="), 2);
    const std::map<std::string, std::string> expected = {
        {"absent", "kept"}, {"package", "final"}, {"version", "1.0"}};
    EXPECT_EQ(hash.values(), expected);

    writeFile(path, "a: 1\nb=2\n");
    List colon;
    VLIBCSzListPush(&colon.p, "a");
    VLIBCSzListPush(&colon.p, "b");
    Hash other;
    EXPECT_EQ(VLIBCFileGetKeys(path.c_str(), colon.p, &other.p, ":"), 1);
    EXPECT_EQ(other.values()["a"], "1");
}

TEST(PlatformKvFile, GetPairReadsEverything) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    writeFile(path, "# head\nb=2\na=\"1\"\nb=3\nnoise\n");
    Hash hash;
    EXPECT_EQ(VLIBCFileGetPair(path.c_str(), &hash.p), 2);
    const std::map<std::string, std::string> expected = {{"a", "1"}, {"b", "3"}};
    EXPECT_EQ(hash.values(), expected);
}

TEST(PlatformKvFile, SetKeyValueRewritesInPlace) {
    const struct {
        const char* what;
        std::string before;
        const char* format;
        std::string after;
    } cases[] = {
        {"replaced where it stood", "a=1\nb=2\nc=3\n", nullptr, "a=1\nb=\"X\"\nc=3\n"},
        {"later duplicates go", "b=1\na=1\nb=2\n b = 3\n", nullptr, "b=\"X\"\na=1\n"},
        {"appended when new", "a=1\n", nullptr, "a=1\nb=\"X\"\n"},
        {"appended after a last line without newline", "a=1", nullptr, "a=1\nb=\"X\"\n"},
        {"created in an empty file", "", nullptr, "b=\"X\"\n"},
        {"comments, CRLF and junk kept", "# c\r\njunk\r\nb=1\r\na=2\r\n", nullptr,
         "# c\r\njunk\r\nb=\"X\"\na=2\r\n"},
        {"the caller's format", "b=1\n", "%s=%s\n", "b=X\n"},
        {"a format without newline ends the line", "b=1\nc=2\n", "%s: %s", "b: X\nc=2\n"},
        {"a literal percent", "", "%s=%s%%\n", "b=X%\n"},
        {"a commented key is not the key", "#b=1\n", nullptr, "#b=1\nb=\"X\"\n"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string(c.what) + ": [" + shown(c.before) + "]");
        TempDir dir;
        const std::string path = dir.path() + "/f";
        writeFile(path, c.before);
        ASSERT_EQ(VLIBCFileSetKeyValue(path.c_str(), "b", "X", c.format), 0);
        EXPECT_EQ(shown(readFile(path)), shown(c.after));
        EXPECT_EQ(filesIn(dir.path()), std::vector<std::string>{"f"}) << "no temporary left";
    }
}

TEST(PlatformKvFile, SetKeyValueRefusesWhatWouldNotReadBack) {
    const struct {
        const char* what;
        const char* key;
        const char* value;
        const char* format;
    } cases[] = {
        {"newline in the value", "k", "a\nb=1", nullptr},
        {"carriage return in the value", "k", "a\r", nullptr},
        {"separator in the key", "k=j", "v", nullptr},
        {"blank around the key", " k", "v", nullptr},
        {"comment key", "#k", "v", nullptr},
        {"empty key", "", "v", nullptr},
        {"null value", "k", nullptr, nullptr},
        {"a conversion other than %s", "k", "v", "%s=%d\n"},
        {"one %s only", "k", "v", "%s\n"},
        {"three %s", "k", "v", "%s=%s%s\n"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        TempDir dir;
        const std::string path = dir.path() + "/f";
        writeFile(path, "k=1\n");
        EXPECT_EQ(VLIBCFileSetKeyValue(path.c_str(), c.key, c.value, c.format), -1);
        EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
        EXPECT_EQ(readFile(path), "k=1\n");
    }
}

TEST(PlatformKvFile, WrittenValuesReadBack) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    const char* values[] = {"", "  blanks  ", "\"quoted\"", "a=b", "# not a comment", "x'y"};
    for (const char* v : values) {
        ASSERT_EQ(VLIBCFileSetKeyValue(path.c_str(), "k", v, nullptr), 0) << v;
        char buf[64];
        EXPECT_EQ(VLIBCFileGetKeyValue(path.c_str(), "k", buf, sizeof(buf), 0),
                  static_cast<int>(strlen(v)));
        EXPECT_STREQ(buf, v);
    }
}

TEST(PlatformKvFile, SetKeyValueCreatesAndKeepsModes) {
    TempDir dir;
    const std::string fresh = dir.path() + "/fresh";
    mode_t old = umask(077);
    EXPECT_EQ(VLIBCFileSetKeyValue(fresh.c_str(), "a", "1", nullptr), 0);
    umask(old);
    EXPECT_EQ(readFile(fresh), "a=\"1\"\n");
    EXPECT_EQ(modeOf(fresh), 0644u) << "a new file is world-readable whatever the umask";

    const std::string secret = dir.path() + "/secret";
    writeFile(secret, "a=1\n");
    chmod(secret.c_str(), 0600);
    EXPECT_EQ(VLIBCFileSetKeyValue(secret.c_str(), "a", "2", nullptr), 0);
    EXPECT_EQ(modeOf(secret), 0600u);

    const std::string noParent = dir.path() + "/none/f";
    EXPECT_EQ(VLIBCFileSetKeyValue(noParent.c_str(), "a", "1", nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_CREATE_FAILED);
}

TEST(PlatformKvFile, ALinkStaysALink) {
    TempDir dir;
    const std::string target = dir.path() + "/target";
    const std::string link = dir.path() + "/link";
    writeFile(target, "a=1\n");
    ASSERT_EQ(symlink(target.c_str(), link.c_str()), 0);
    EXPECT_EQ(VLIBCFileSetKeyValue(link.c_str(), "a", "2", nullptr), 0);
    struct stat st {};
    ASSERT_EQ(lstat(link.c_str(), &st), 0);
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    EXPECT_EQ(readFile(target), "a=\"2\"\n");
}

TEST(PlatformKvFile, RemoveKey) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    writeFile(path, "a=1\nb=2\n a = 3\n#a=4\nc=5");
    EXPECT_EQ(VLIBCFileRemoveKey(path.c_str(), "a"), 0);
    EXPECT_EQ(readFile(path), "b=2\n#a=4\nc=5");
    EXPECT_EQ(VLIBCFileRemoveKey(path.c_str(), "zz"), 0);
    EXPECT_EQ(readFile(path), "b=2\n#a=4\nc=5");

    const std::string missing = dir.path() + "/missing";
    EXPECT_EQ(VLIBCFileRemoveKey(missing.c_str(), "a"), 0);
    EXPECT_FALSE(testutil::exists(missing)) << "nothing to remove creates nothing";
}

TEST(PlatformKvFile, SetPairReplacesTheFile) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    writeFile(path, "old=1\n");
    Hash hash;
    VLIBCSzHashSetValue(&hash.p, "b", "2 two");
    VLIBCSzHashSetValue(&hash.p, "a", "");
    EXPECT_EQ(VLIBCFileSetPair(path.c_str(), hash.p, 0), 0);
    EXPECT_EQ(readFile(path), "a=\"\"\nb=\"2 two\"\n");
    Hash back;
    EXPECT_EQ(VLIBCFileGetPair(path.c_str(), &back.p), 2);
    EXPECT_EQ(back.values(), hash.values());

    VLIBCSzHashSetValue(&hash.p, "bad", "x\ny");
    EXPECT_EQ(VLIBCFileSetPair(path.c_str(), hash.p, 0), -1);
    EXPECT_EQ(readFile(path), "a=\"\"\nb=\"2 two\"\n");
}

TEST(PlatformKvFile, AddLine) {
    TempDir dir;
    const std::string path = dir.path() + "/f";
    writeFile(path, "first");
    EXPECT_EQ(VLIBCFileAddLine(path.c_str(), 0, "second", 0), 0);
    EXPECT_EQ(VLIBCFileAddLine(path.c_str(), 0, "third\n", 0), 0);
    EXPECT_EQ(readFile(path), "first\nsecond\nthird\n");
    const std::string fresh = dir.path() + "/fresh";
    EXPECT_EQ(VLIBCFileAddLine(fresh.c_str(), 0, "one", 0), 0);
    EXPECT_EQ(readFile(fresh), "one\n");
}

TEST(PlatformKvFile, Sections) {
    TempDir dir;
    const std::string path = dir.path() + "/PKG_DEPS";
    writeFile(path,
              "top=1\n"
              "[one]\n"
              "a=1\n"
              "b = \"2\"\n"
              "  [ two ]  \n"
              "a=3\n"
              "[one]\n"
              "c=4\n"
              "a=5\n"
              "[empty]\n");
    List names;
    EXPECT_EQ(VLIBCFileEnumSection(path.c_str(), &names.p), 3);
    EXPECT_EQ(names.items(), (std::vector<std::string>{"one", "two", "empty"}));

    const struct {
        const char* section;
        int count;
        std::map<std::string, std::string> fields;
    } cases[] = {
        {"one", 3, {{"a", "5"}, {"b", "2"}, {"c", "4"}}},
        {"two", 1, {{"a", "3"}}},
        {"empty", 0, {}},
    };
    for (const auto& c : cases) {
        Hash hash;
        EXPECT_EQ(VLIBCFileGetSection(path.c_str(), c.section, &hash.p), c.count) << c.section;
        EXPECT_EQ(hash.values(), c.fields) << c.section;
    }
    Hash hash;
    EXPECT_EQ(VLIBCFileGetSection(path.c_str(), "three", &hash.p), -1);
    EXPECT_EQ(VLIBCFileGetSection(path.c_str(), "", &hash.p), -1)
        << "keys before the first section are in none";

    writeFile(path, "a=1\n");
    List none;
    EXPECT_EQ(VLIBCFileEnumSection(path.c_str(), &none.p), 0);
}

TEST(PlatformKvFile, SystemConfigurationNeedsItsFile) {
    // The real /etc/corvinfo.conf is not for unit tests; only the refusals are checked.
    EXPECT_EQ(VLIBCINFOSetKeyValue("bad\nkey", "v"), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
}
