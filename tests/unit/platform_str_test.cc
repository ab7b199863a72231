// String lists, hashes, splitting, growing buffers and shell quoting of the platform.
#include <stdlib.h>
#include <string.h>

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/vlibc.h"

namespace {

struct List {
    PVLIBSZLIST p = VLIBCSzListAlloc(4);
    ~List() { VLIBCSzListFree(p); }
    std::vector<std::string> items() const { return p->items; }
};
struct Hash {
    PVLIBSZHASH p = VLIBCSzHashAlloc(4);
    ~Hash() { VLIBCSzHashFree(p); }
};

std::string joined(const std::vector<std::string>& items) {
    std::string out;
    for (const std::string& s : items) {
        out += "[" + s + "]";
    }
    return out;
}

}  // namespace

TEST(PlatformStr, TokDropsEmptyPiecesSepKeepsThem) {
    const struct {
        const char* text;
        const char* separators;
        std::vector<std::string> tok;
        std::vector<std::string> sep;
    } cases[] = {
        {"a,,b", ",", {"a", "b"}, {"a", "", "b"}},
        {"", ",", {}, {""}},
        {",", ",", {}, {"", ""}},
        {",a,", ",", {"a"}, {"", "a", ""}},
        {"1.0-0001", ".-", {"1", "0", "0001"}, {"1", "0", "0001"}},
        {"-1", "-", {"1"}, {"", "1"}},
        {"a b\tc", " \t", {"a", "b", "c"}, {"a", "b", "c"}},
        {"none", ",", {"none"}, {"none"}},
        {"abc", "", {"abc"}, {"abc"}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string("[") + c.text + "] at [" + c.separators + "]");
        List tok;
        EXPECT_EQ(VLIBCStrTok(c.text, c.separators, &tok.p), static_cast<int>(c.tok.size()));
        EXPECT_EQ(joined(tok.items()), joined(c.tok));
        List sep;
        EXPECT_EQ(VLIBCStrSep(c.text, c.separators, &sep.p), static_cast<int>(c.sep.size()));
        EXPECT_EQ(joined(sep.items()), joined(c.sep));
    }
}

TEST(PlatformStr, SplittingAppends) {
    List list;
    VLIBCSzListPush(&list.p, "first");
    EXPECT_EQ(VLIBCStrTok("a b", " ", &list.p), 2);
    EXPECT_EQ(list.items(), (std::vector<std::string>{"first", "a", "b"}));
    EXPECT_EQ(VLIBCStrTok(nullptr, " ", &list.p), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS);
}

TEST(PlatformStr, StrCatGrowsTheBuffer) {
    char* buffer = nullptr;
    int capacity = 0;
    ASSERT_EQ(VLIBCStrCat(&buffer, &capacity, "seed"), 0) << "a null buffer is allocated";
    ASSERT_NE(buffer, nullptr);
    std::string expected = "seed";
    for (int i = 0; i < 1000; ++i) {
        std::string piece = "&k" + std::to_string(i) + "=v";
        ASSERT_EQ(VLIBCStrCat(&buffer, &capacity, piece.c_str()), 0);
        expected += piece;
        ASSERT_GT(capacity, static_cast<int>(strlen(buffer))) << "room for the terminator";
    }
    EXPECT_EQ(std::string(buffer), expected);
    free(buffer);

    char* small = static_cast<char*>(calloc(1, 4));
    int smallCapacity = 4;
    ASSERT_EQ(VLIBCStrCat(&small, &smallCapacity, "abc"), 0) << "fits exactly";
    EXPECT_EQ(smallCapacity, 4);
    ASSERT_EQ(VLIBCStrCat(&small, &smallCapacity, "d"), 0);
    EXPECT_STREQ(small, "abcd");
    EXPECT_GE(smallCapacity, 5);
    free(small);
}

TEST(PlatformStr, EncShParamSurvivesAShell) {
    const char* texts[] = {"plain",       "with blank", "it's", "'",      "",
                           "$(rm -rf /)", "`id`",       "a\"b", "back\\", "new\nline",
                           "*?[glob]",    "''",         "-n",   "; true"};
    for (const char* text : texts) {
        SCOPED_TRACE(std::string("[") + text + "]");
        char quoted[256];
        ASSERT_EQ(VLIBCEncShParam(text, quoted, sizeof(quoted)), 0);
        // The shell must hand back exactly the text, as one word.
        std::string script = std::string("printf '%s|' ") + quoted;
        FILE* out = VLIBCPopen("/bin/sh", "r", "-c", script.c_str(), nullptr);
        ASSERT_NE(out, nullptr);
        std::string got;
        char buf[256];
        size_t n;
        while ((n = fread(buf, 1, sizeof(buf), out)) > 0) {
            got.append(buf, n);
        }
        EXPECT_EQ(VLIBCPclose(out), 0);
        EXPECT_EQ(got, std::string(text) + "|");
    }
}

TEST(PlatformStr, EncShParamBufferSize) {
    char out[8];
    EXPECT_EQ(VLIBCEncShParam("abcde", out, sizeof(out)), 0) << "'abcde' and NUL fit";
    EXPECT_STREQ(out, "'abcde'");
    EXPECT_EQ(VLIBCEncShParam("abcdef", out, sizeof(out)), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BUF_TOO_SMALL);
    EXPECT_EQ(VLIBCEncShParam("a'b", out, sizeof(out)), -1) << "the quote costs four bytes";
}

TEST(PlatformStr, ListOperations) {
    List list;
    for (const char* item : {"Alice", "bob", "alice", "Carol"}) {
        ASSERT_EQ(VLIBCSzListPush(&list.p, item), 0);
    }
    EXPECT_EQ(VLIBCSzListPush(&list.p, nullptr), -1);
    EXPECT_EQ(VLIBCSzListCount(list.p), 4);
    EXPECT_STREQ(VLIBCSzListGet(list.p, 0), "Alice");
    EXPECT_EQ(VLIBCSzListGet(list.p, 4), nullptr);
    EXPECT_EQ(VLIBCSzListGet(list.p, -1), nullptr);

    const struct {
        const char* item;
        int exact;
        int ignoringCase;
    } finds[] = {
        {"alice", 2, 0}, {"ALICE", -1, 0}, {"Bob", -1, 1}, {"carol", -1, 3}, {"dave", -1, -1},
    };
    for (const auto& f : finds) {
        EXPECT_EQ(VLIBCSzListFind(list.p, f.item), f.exact) << f.item;
        EXPECT_EQ(VLIBCSzListCaseFind(list.p, f.item), f.ignoringCase) << f.item;
    }

    EXPECT_EQ(VLIBCSzListRemove(list.p, 1), 0);
    EXPECT_EQ(list.items(), (std::vector<std::string>{"Alice", "alice", "Carol"}));
    EXPECT_EQ(VLIBCSzListRemove(list.p, 3), -1);
    EXPECT_EQ(VLIBCSzListRemove(list.p, -1), -1);
    VLIBCSzListRemoveAll(list.p);
    EXPECT_EQ(VLIBCSzListCount(list.p), 0);
    EXPECT_EQ(VLIBCSzListGet(list.p, 0), nullptr);
}

TEST(PlatformStr, ListGrowsBeyondItsCapacity) {
    PVLIBSZLIST list = VLIBCSzListAlloc(1);
    for (int i = 0; i < 5000; ++i) {
        ASSERT_EQ(VLIBCSzListPush(&list, std::to_string(i).c_str()), 0);
    }
    EXPECT_STREQ(VLIBCSzListGet(list, 4999), "4999");
    VLIBCSzListFree(list);
}

TEST(PlatformStr, HashOperations) {
    Hash hash;
    for (const char* key : {"zeta", "alpha", "Beta", "alpha"}) {
        ASSERT_EQ(VLIBCSzHashSetValue(&hash.p, key, (std::string("v-") + key).c_str()), 0);
    }
    ASSERT_EQ(VLIBCSzHashSetValue(&hash.p, "alpha", "replaced"), 0);
    EXPECT_EQ(VLIBCSzHashCount(hash.p), 3);
    EXPECT_STREQ(VLIBCSzHashGetValue(hash.p, "alpha"), "replaced");
    EXPECT_EQ(VLIBCSzHashGetValue(hash.p, "ALPHA"), nullptr) << "keys compare exactly";

    List keys;
    VLIBCSzListPush(&keys.p, "kept");
    EXPECT_EQ(VLIBCSzHashEnumKey(hash.p, &keys.p), 3);
    EXPECT_EQ(keys.items(), (std::vector<std::string>{"kept", "Beta", "alpha", "zeta"}))
        << "appended in byte order";

    EXPECT_EQ(VLIBCSzHashRemoveKey(hash.p, "zeta"), 0);
    EXPECT_EQ(VLIBCSzHashRemoveKey(hash.p, "zeta"), -1);
    EXPECT_EQ(VLIBCSzHashSetValue(&hash.p, "k", nullptr), -1);
    VLIBCHashRemoveAll(hash.p);
    EXPECT_EQ(VLIBCSzHashCount(hash.p), 0);
}

TEST(PlatformStr, AMissingKeyLeavesTheErrorAlone) {
    Hash hash;
    VLIBCErrSetEx(0x1234, "caller.cc", 77);
    EXPECT_EQ(VLIBCSzHashGetValue(hash.p, "nothing"), nullptr);
    EXPECT_EQ(VLIBCErrGet(), 0x1234);
}
