// The English texts of result codes and message keys: complete over what the engine hands
// out, with the remedy that fits the operation.
#include "message_text.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corvpkg/pkgtypes.h"

using corvtext::Audience;
using corvtext::Params;

TEST(MessageText, EveryResultCodeAndItsKeysHaveWords) {
    int known = 0;
    for (int code = 0; code < 512; ++code) {
        const CORVPackageTool::PKG_ERRCODE_INFO* info = CORVPackageTool::PMSGetErrCodeInfo(code);
        if (!info) {
            continue;
        }
        ++known;
        EXPECT_TRUE(corvtext::hasTextForCode(code)) << info->name;
        for (const char* key : {info->checkReport, info->installMsg}) {
            if (key) {
                EXPECT_TRUE(corvtext::hasTextForKey(key)) << info->name << " " << key;
            }
        }
    }
    EXPECT_GT(known, 50);
}

TEST(MessageText, CodesTellWhatToDo) {
    struct Case {
        int code;
        Params params;
        std::string sentence;               // exact
        std::vector<std::string> inRemedy;  // each must appear
        std::vector<std::string> notInRemedy;
    };
    const std::vector<Case> cases = {
        {290, {}, "The package file is not signed.", {"--no-verify", "pkg_source_trust_level"}, {}},
        {268,
         {{"operation", "uninstall"}, {"package", "hello"}, {"deppkg", "greeter, notes"}},
         "Installed packages depend on hello: greeter, notes.",
         {"--force"},
         {}},
        {268,
         {{"operation", "install"}, {"deppkg", "hello"}},
         "Packages that this one needs are missing or not running: hello.",
         {"Install and start them"},
         {"--force"}},
        {277,
         {{"operation", "repair"}, {"package", "hello"}},
         "The package could not be repaired from this file.",
         {"corvpkg status hello", "needs no repair"},
         {}},
        {277,
         {{"operation", "upgrade"}},
         "The upgrade failed; the earlier version stays as it was left.",
         {"--verbose"},
         {}},
        // Optional parts vanish with their missing values.
        {279, {}, "There is not enough free space.", {"--volume"}, {}},
        {279,
         {{"volume", "/volume1"}, {"needed", "5.0 MiB"}},
         "There is not enough free space on /volume1.",
         {},
         {}},
        {267,
         {{"package", "demo"}, {"oldver", "1.0"}, {"curver", "2.0"}},
         "A newer version (2.0) is installed than the file's 1.0.",
         {"corvpkg uninstall demo"},
         {}},
        {150,
         {{"operation", "install"}, {"file", "x.cpk"}},
         "The file x.cpk is not a package this system can read.",
         {"corvpkg lint"},
         {}},
        {150,
         {{"package", "x"}},
         "The package x is broken: its installation is incomplete or damaged.",
         {"corvpkg repair"},
         {}},
        {305, {}, "The wizard answers are not a JSON object.", {"{\"KEY\": \"value\", ...}"}, {}},
        {999, {}, "The operation failed with result code 999.", {"--verbose"}, {}},
    };
    for (const Case& c : cases) {
        const corvtext::Text text = corvtext::textForCode(c.code, c.params);
        EXPECT_EQ(text.sentence, c.sentence) << c.code;
        for (const std::string& word : c.inRemedy) {
            EXPECT_NE(text.remedy.find(word), std::string::npos) << c.code << ": " << text.remedy;
        }
        for (const std::string& word : c.notInRemedy) {
            EXPECT_EQ(text.remedy.find(word), std::string::npos) << c.code << ": " << text.remedy;
        }
    }
}

TEST(MessageText, KeysTakeTheirArguments) {
    Json::Value report(Json::arrayValue);
    report.append("pkgmgr:depend_uninst_unstart");
    report.append("hello");
    report.append("base");
    EXPECT_EQ(corvtext::textForMessage(report).sentence,
              "The package needs packages that are not installed (hello) and others that are not "
              "running (base).");
    EXPECT_EQ(corvtext::textForKey("pkgmgr:port_conflict", {"8080"}).sentence,
              "The package's port 8080 is already in use.");
    // A key that stands for a code gives the code's text.
    EXPECT_EQ(corvtext::textForKey("pkgmgr:pkgmgr_no_signature").sentence,
              corvtext::textForCode(290).sentence);
    EXPECT_EQ(corvtext::textForKey("pkgmgr:error_upgrade_dep_packages", {"[\"b\"]"},
                                   {{"operation", "uninstall"}})
                      .remedy.find("--force") != std::string::npos,
              true);
    EXPECT_EQ(corvtext::textForKey("pkgmgr:no_such_key").sentence,
              "The operation failed (pkgmgr:no_such_key).");
    EXPECT_TRUE(corvtext::textForMessage(Json::Value(Json::arrayValue)).sentence.empty());
}

TEST(MessageText, TheDesktopIsNotToldCommandLineOptions) {
    for (int code = 0; code < 512; ++code) {
        if (!corvtext::hasTextForCode(code)) {
            continue;
        }
        for (const char* op : {"install", "uninstall", "repair", "check", "start"}) {
            const corvtext::Text text = corvtext::textForCode(
                code, {{"operation", op}, {"package", "p"}}, Audience::Desktop);
            EXPECT_EQ(text.remedy.find("--"), std::string::npos) << code << " " << text.remedy;
            EXPECT_EQ(text.remedy.find("corvpkg"), std::string::npos) << code << " " << text.remedy;
        }
    }
}
