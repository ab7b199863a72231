// The store client's pure logic: entry mapping, the token, merging feeds, sorting a list,
// cache freshness and URL pieces.
#include <curl/curl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <time.h>
#include <utime.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgtool.h"
#include "store/pkgserver_private.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;

namespace {

Json::Value parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

std::vector<std::string> namesOf(const Json::Value& array) {
    std::vector<std::string> names;
    for (const Json::Value& entry : array) {
        names.push_back(entry["package"].asString() + "@" + entry["version"].asString() + "@" +
                        entry.get("feed", "").asString());
    }
    return names;
}

// ---------------------------------------------------------------------------------------
// Entry mapping

TEST(StoreEntryMapping, MembersGoToTheirFieldsWithDefaultsForMissingOrMistypedOnes) {
    struct Case {
        const char* entry;
        std::string package, version, dname;
        bool silentUpgrade;
        unsigned long long size;
        unsigned int type;
    } cases[] = {
        {R"({"package":"a","version":"1.0","dname":"A","silent_upgrade":true,"size":"2048",
             "type":3})",
         "a", "1.0", "A", true, 2048, 3},
        {R"({"package":"a","size":4096})", "a", "", "", false, 4096, 0},
        {R"({"package":"a","size":"12abc","silent_upgrade":"yes","version":{}})", "a", "", "",
         false, 0, 0},
        {R"({"package":["x"],"size":-5,"dname":null})", "", "", "", false, 0, 0},
    };
    for (const Case& c : cases) {
        PackageInfo info;
        ASSERT_TRUE(PMSMapJsonToPackageInfo(parse(c.entry), info)) << c.entry;
        EXPECT_EQ(info.package, c.package) << c.entry;
        EXPECT_EQ(info.version, c.version) << c.entry;
        EXPECT_EQ(info.displayname, c.dname) << c.entry;
        EXPECT_EQ(info.silent_upgrade, c.silentUpgrade) << c.entry;
        EXPECT_EQ(info.size, c.size) << c.entry;
        EXPECT_EQ(info.type, c.type) << c.entry;
    }
}

TEST(StoreEntryMapping, OnlyConfDeppkgsOrTheDeppgsSpellingAddDependencies) {
    struct Case {
        const char* entry;
        std::vector<std::string> deps;
    } cases[] = {
        {R"({"package":"g","deppkgs":"hello>=1.0"})", {}},
        {R"({"package":"g","conf_deppkgs":{"hello":{">=":"1.0"}}})", {"hello"}},
        {R"({"package":"g","conf_deppkgs":{"hello":{}},"deppkgs":"other"})", {"hello"}},
        {R"({"package":"g","deppkgs":"hello:other","deppgs":""})", {"hello", "other"}},
        {R"({"package":"g","deppkgs":{"x":1},"deppgs":""})", {}},
    };
    for (const Case& c : cases) {
        PackageInfo info;
        ASSERT_TRUE(PMSMapJsonToPackageInfo(parse(c.entry), info)) << c.entry;
        std::vector<std::string> deps;
        for (const PackageBasicInfo& dep : info.dep_packages) {
            deps.push_back(dep.package);
        }
        EXPECT_EQ(deps, c.deps) << c.entry;
    }
}

TEST(StoreEntryMapping, ConflictsFromTheJsonFormWinOverTheTextForm) {
    PackageInfo info;
    ASSERT_TRUE(PMSMapJsonToPackageInfo(
        parse(R"({"conf_conxpkgs":{"old":{}},"conflictpkgs":"other"})"), info));
    ASSERT_EQ(info.conflict_packages.size(), 1u);
    EXPECT_EQ(info.conflict_packages[0].package, "old");
    PackageInfo text;
    ASSERT_TRUE(PMSMapJsonToPackageInfo(parse(R"({"conflictpkgs":"other"})"), text));
    ASSERT_EQ(text.conflict_packages.size(), 1u);
    EXPECT_EQ(text.conflict_packages[0].package, "other");
}

TEST(StoreEntryMapping, AnArrayIsRefusedWithOneLogLine) {
    std::vector<std::string> lines;
    CORVLogSetSink([&lines](int, const std::string& line) { lines.push_back(line); });
    PackageInfo info;
    const bool mapped = PMSMapJsonToPackageInfo(parse(R"([{"package":"a"}])"), info);
    CORVLogSetSink(nullptr);
    EXPECT_FALSE(mapped);
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_NE(lines[0].find("Format Error: jsData is not json object"), std::string::npos);
    EXPECT_TRUE(info.package.empty());
}

TEST(StoreEntryMapping, FieldsTheEntryDoesNotNameKeepTheirValues) {
    PackageInfo info;
    info.package = "before";
    info.adminport = 8080;
    info.beta = true;
    info.nosappname = "App";
    ASSERT_TRUE(PMSMapJsonToPackageInfo(parse(R"({"package":"after","depsers":"ssh"})"), info));
    EXPECT_EQ(info.package, "after");
    EXPECT_EQ(info.adminport, 8080);
    EXPECT_TRUE(info.beta);
    EXPECT_EQ(info.nosappname, "App");
    EXPECT_EQ(info.install_dep_services, 0x08u);
}

// ---------------------------------------------------------------------------------------
// Request token (expected values computed with md5sum(1) in a shell loop)

TEST(StoreToken, RoundsFollowTheFirstDigitOfTheTimesDigest) {
    struct Case {
        const char* time;
        const char* token;  // md5("27") starts with "0": one round; md5("44") with "f": 16
    } cases[] = {
        {"27", "6cda98e7af2e7c3df6bb766bdf314960"},
        {"44", "0a01cfc049a134870cd82f64a36307de"},
        {"1795483661", "6ed534f7fc2fbe63320a7c5e3cc7f54f"},
    };
    for (const Case& c : cases) {
        std::string token;
        ASSERT_TRUE(PMSGenerateNsToken(c.time, token)) << c.time;
        EXPECT_EQ(token, c.token) << c.time;
    }
}

TEST(StoreToken, DigestNeedsRoomForItsTerminator) {
    char out[33];
    EXPECT_FALSE(PMSMd5Hex("x", out, 32));
    EXPECT_FALSE(PMSMd5Hex(nullptr, out, sizeof out));
    ASSERT_TRUE(PMSMd5Hex("", out, sizeof out));
    EXPECT_STREQ(out, "d41d8cd98f00b204e9800998ecf8427e");
}

// ---------------------------------------------------------------------------------------
// Merging feeds

TEST(StoreFeedMerge, HigherVersionStaysInThePlaceOfTheFirstAndTheMakerShadowsFeeds) {
    const std::unordered_set<std::string> maker = {"official"};
    Json::Value out(Json::arrayValue);
    std::unordered_map<std::string, Json::ArrayIndex> index;
    PMSMergeFeedEntries(maker, "http://one/feed", parse(R"([
        {"package":"a","version":"1.0"}, {"package":"b","version":"2.0"},
        {"package":"official","version":"9.0"}, {"package":"c"}, 5, {"package":7,"version":"1"}
    ])"),
                        out, index);
    PMSMergeFeedEntries(maker, "http://two/feed", parse(R"([
        {"package":"d","version":"1.0"}, {"package":"b","version":"2.0"},
        {"package":"a","version":"1.0.1"}
    ])"),
                        out, index);
    EXPECT_EQ(namesOf(out),
              (std::vector<std::string>{"a@1.0.1@http://two/feed", "b@2.0@http://one/feed",
                                        "d@1.0@http://two/feed"}));
}

TEST(StoreFeedMerge, ALowerVersionOfALaterFeedDoesNotReplace) {
    Json::Value out(Json::arrayValue);
    std::unordered_map<std::string, Json::ArrayIndex> index;
    PMSMergeFeedEntries({}, "f1", parse(R"([{"package":"a","version":"1.10"}])"), out, index);
    PMSMergeFeedEntries({}, "f2", parse(R"([{"package":"a","version":"1.9"}])"), out, index);
    EXPECT_EQ(namesOf(out), (std::vector<std::string>{"a@1.10@f1"}));
}

// ---------------------------------------------------------------------------------------
// Sorting a list

TEST(StoreListSort, EachEntryComesAfterWhatItDependsOn) {
    Json::Value sorted = parse(R"([
        {"package":"top","version":"1","conf_deppkgs":{"mid":{}}},
        {"package":"mid","version":"1","conf_deppkgs":{"base":{}}},
        {"package":"alone","version":"1"},
        {"package":"base","version":"1","keep":{"x":1}}
    ])");
    ASSERT_TRUE(PMSSortPackageArray(sorted));
    std::vector<std::string> names;
    for (const Json::Value& entry : sorted) {
        names.push_back(entry["package"].asString());
    }
    ASSERT_EQ(names.size(), 4u);
    auto at = [&names](const char* name) {
        return std::find(names.begin(), names.end(), name) - names.begin();
    };
    EXPECT_LT(at("base"), at("mid"));
    EXPECT_LT(at("mid"), at("top"));
    EXPECT_EQ(sorted[static_cast<Json::ArrayIndex>(at("base"))]["keep"]["x"].asInt(), 1);
}

TEST(StoreListSort, ACycleOrANonObjectFailsAndLeavesTheArrayAlone) {
    for (const char* text : {R"([{"package":"a","conf_deppkgs":{"b":{}}},
                                 {"package":"b","conf_deppkgs":{"a":{}}}])",
                             R"([{"package":"a"}, "b"])"}) {
        const Json::Value given = parse(text);
        Json::Value array = given;
        EXPECT_FALSE(PMSSortPackageArray(array)) << text;
        EXPECT_EQ(array, given) << text;
    }
}

// ---------------------------------------------------------------------------------------
// Cache freshness

TEST(StoreCache, FreshWithinAnHourEitherWayOfTheClock) {
    TempDir dir;
    const std::string file = dir.path() + "/corvserver.enu";
    testutil::writeFile(file, "{}");
    struct Case {
        long offset;
        bool fresh;
    } cases[] = {{0, true}, {-3599, true}, {3599, true}, {-3601, false}, {3601, false}};
    for (const Case& c : cases) {
        struct utimbuf times;
        times.actime = times.modtime = time(nullptr) + c.offset;
        ASSERT_EQ(utime(file.c_str(), &times), 0);
        EXPECT_EQ(PMSIsCacheFresh(file, nullptr), c.fresh) << "offset " << c.offset;
    }
    EXPECT_FALSE(PMSIsCacheFresh(dir.path(), nullptr));
    EXPECT_FALSE(PMSIsCacheFresh(dir.path() + "/missing", nullptr));
}

// ---------------------------------------------------------------------------------------
// URL pieces

TEST(StoreUrl, FileNameIsCutAtTheLastSlashFirst) {
    struct Case {
        const char* url;
        const char* name;
    } cases[] = {{"a/b.png?x=/y", "y"},
                 {"http://h/icons/x.png?v=1", "x.png"},
                 {"plain?q=1", "plain?q=1"},
                 {"http://h/dir/", ""}};
    for (const Case& c : cases) {
        std::string name;
        PMSParseUrlToFileName(c.url, name);
        EXPECT_EQ(name, c.name) << c.url;
    }
}

TEST(StoreUrl, QueryIsAppendedWithTheRightSeparatorAndValuesEscaped) {
    CURL* curl = curl_easy_init();
    ASSERT_NE(curl, nullptr);
    PVLIBSZHASH params = VLIBCSzHashAlloc(16);
    VLIBCSzHashSetValue(&params, "a b", "x y&z");
    VLIBCSzHashSetValue(&params, "lang", "enu");
    std::string url;
    ASSERT_TRUE(PMSCurlGetQueryURL(curl, "http://h/feed", params, url));
    EXPECT_EQ(url, "http://h/feed?a b=x%20y%26z&lang=enu");
    ASSERT_TRUE(PMSCurlGetQueryURL(curl, "http://h/feed?k=1", params, url));
    EXPECT_EQ(url, "http://h/feed?k=1&a b=x%20y%26z&lang=enu");
    VLIBCSzHashFree(params);
    curl_easy_cleanup(curl);
}

}  // namespace
