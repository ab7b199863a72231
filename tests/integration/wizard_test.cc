// Wizard pages of package files and installed packages: which file wins, what a wizard
// script sees, the licence, the package's own texts, and `corvpkg wizard`.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"
#include "support/files.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using namespace CORVPackageTool;
using testutil::TestPackage;

namespace {

const std::string kCli = CORVPKG_CLI_PATH;

// A static wizard whose one question tells where it came from.
std::string staticWizard(const std::string& from) {
    return R"([{"step_title": "Where", "items": [{"key": "from", "defaultValue": ")" + from +
           R"("}]}])";
}

// A wizard script that answers with its origin and what it was given to see.
std::string scriptWizard(const std::string& from) {
    return "#!/bin/sh\n"
           "cat > \"$CORVPKG_TEMP_LOGFILE\" <<EOF\n"
           "[{\"items\": [{\"key\": \"from\", \"defaultValue\": \"" +
           from +
           "\"},\n"
           " {\"key\": \"name\", \"defaultValue\": \"$CORVPKG_PKGNAME\"},\n"
           " {\"key\": \"lang\", \"defaultValue\": \"$CORVPKG_NOS_LANGUAGE\"},\n"
           " {\"key\": \"status\", \"defaultValue\": \"$CORVPKG_PKG_STATUS\"},\n"
           " {\"key\": \"cpk\", \"defaultValue\": \"${CORVPKG_TEMP_CPKFILE-unset}\"},\n"
           " {\"key\": \"old\", \"defaultValue\": \"${CORVPKG_OLD_PKGVER-unset}\"},\n"
           " {\"key\": \"result\", \"defaultValue\": \"$CORVPKG_TEMP_LOGFILE\"},\n"
           " {\"key\": \"self\", \"defaultValue\": \"$0\"}]}]\n"
           "EOF\n";
}

// The answers of a wizard by key.
Json::Value answers(const Json::Value& wizard) {
    Json::Value values(Json::objectValue);
    getUIDefaultValues(wizard, values);
    return values;
}

std::string dirName(const std::string& path) {
    return path.substr(0, path.rfind('/'));
}

class Wizard : public ::testing::Test {
  protected:
    void SetUp() override {
        CleanAllEnv();
        CORVLogSetSink([this](int, const std::string& line) { log.push_back(line); });
    }
    void TearDown() override {
        CORVLogSetSink(nullptr);
        CleanAllEnv();
    }
    bool logged(const std::string& text) const {
        for (const std::string& line : log) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }
    // The wizard of a package file built from `pkg`.
    Json::Value wizardOf(const TestPackage& pkg, PKG_INSTALLATION_TYPE type, const char* lang,
                         std::string* file = nullptr) {
        const std::string cpk = testutil::buildPackage(pkg);
        if (file != nullptr) {
            *file = cpk;
        }
        PackageManager pm;
        PackageInfo info;
        EXPECT_TRUE(pm.queryPackageFileInfoWithWizard(cpk, info, type, lang));
        EXPECT_EQ(info.package, pkg.name);
        return info.wizard;
    }

    std::vector<std::string> log;
};

}  // namespace

TEST_F(Wizard, ScriptBeatsStaticFileAndTranslationBeatsPlainName) {
    testutil::writeFile("/etc/corvinfo.conf", "language=\"ger\"\n");
    const struct {
        std::vector<const char*> files;
        const char* lang;  // null: the system's, "ger"
        const char* from;
    } cases[] = {
        {{"install_uifile_ger.sh", "install_uifile.sh", "install_uifile_ger", "install_uifile"},
         "ger",
         "install_uifile_ger.sh"},
        {{"install_uifile_ger.sh", "install_uifile.sh", "install_uifile_ger", "install_uifile"},
         nullptr,
         "install_uifile_ger.sh"},
        {{"install_uifile_ger.sh", "install_uifile.sh", "install_uifile_ger", "install_uifile"},
         "enu",
         "install_uifile.sh"},
        {{"install_uifile_ger.sh", "install_uifile"}, "ger", "install_uifile_ger.sh"},
        {{"install_uifile_ger", "install_uifile.sh"}, "ger", "install_uifile.sh"},
        {{"install_uifile_ger", "install_uifile"}, "ger", "install_uifile_ger"},
        {{"install_uifile_ger", "install_uifile"}, "enu", "install_uifile"},
        // Another operation's wizard is not this one's.
        {{"uninstall_uifile", "upgrade_uifile.sh", "install_uifile"}, "ger", "install_uifile"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string(c.lang ? c.lang : "(system)") + " -> " + c.from);
        TestPackage pkg("demo");
        for (const std::string file : c.files) {
            bool script = file.size() > 3 && file.compare(file.size() - 3, 3, ".sh") == 0;
            pkg.wizard[file] = script ? scriptWizard(file) : staticWizard(file);
        }
        Json::Value values = answers(wizardOf(pkg, PKG_INSTALL, c.lang));
        EXPECT_EQ(values["from"].asString(), c.from) << toString(values);
    }
}

TEST_F(Wizard, ScriptRunsWithTheInstallEnvironmentAndLeavesNothingBehind) {
    TestPackage pkg("demo", "1.2-0003");
    pkg.wizard["install_uifile.sh"] = scriptWizard("script");
    std::string cpk;
    Json::Value values = answers(wizardOf(pkg, PKG_INSTALL, "enu", &cpk));
    ASSERT_EQ(values["from"].asString(), "script") << toString(values);
    EXPECT_EQ(values["name"].asString(), "demo");
    EXPECT_EQ(values["lang"].asString(), "enu");
    EXPECT_EQ(values["status"].asString(), "INSTALL");
    EXPECT_EQ(values["cpk"].asString(), cpk);
    EXPECT_EQ(values["old"].asString(), "unset");
    // The result file and the folder the package was looked at in are gone again.
    const std::string result = values["result"].asString();
    const std::string self = values["self"].asString();
    ASSERT_FALSE(result.empty());
    EXPECT_FALSE(testutil::exists(result)) << result;
    ASSERT_NE(self.find("/WIZARD_UIFILES/install_uifile.sh"), std::string::npos) << self;
    EXPECT_FALSE(testutil::exists(dirName(dirName(self)))) << self;
}

TEST_F(Wizard, ScriptWithoutStepsFallsThroughToThePlainFile) {
    const struct {
        const char* why;
        std::string script;
    } cases[] = {
        {"empty array", "#!/bin/sh\necho '[]' > \"$CORVPKG_TEMP_LOGFILE\"\n"},
        {"writes nothing", "#!/bin/sh\nexit 0\n"},
        {"no JSON", "#!/bin/sh\necho '[{' > \"$CORVPKG_TEMP_LOGFILE\"\n"},
        // Steps from a script that then fails are not taken.
        {"fails", scriptWizard("failed") + "exit 3\n"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.why);
        log.clear();
        TestPackage pkg("demo");
        pkg.wizard["install_uifile.sh"] = c.script;
        pkg.wizard["install_uifile"] = staticWizard("plain");
        Json::Value values = answers(wizardOf(pkg, PKG_INSTALL, "enu"));
        EXPECT_EQ(values["from"].asString(), "plain") << toString(values);
        if (std::string(c.why) == "fails") {
            EXPECT_TRUE(logged("Failed to run ")) << "the failed run is logged";
        }
    }
}

TEST_F(Wizard, StepsWithoutItemsArrayStopTheSearch) {
    TestPackage pkg("demo");
    pkg.wizard["install_uifile_ger"] = R"([{"items": 1}])";
    pkg.wizard["install_uifile"] = staticWizard("plain");
    Json::Value wizard = wizardOf(pkg, PKG_INSTALL, "ger");
    Json::Value expected;
    ASSERT_TRUE(fromString(R"([{"items": 1}])", expected));
    EXPECT_EQ(wizard, expected) << toString(wizard);
    EXPECT_TRUE(logged("WIZARD_UIFILES/install_uifile_ger in [items]"));
}

TEST_F(Wizard, PackageWithoutWizardHasNone) {
    Json::Value wizard = wizardOf(TestPackage("demo"), PKG_INSTALL, "enu");
    EXPECT_TRUE(wizard.empty()) << toString(wizard);
}

TEST_F(Wizard, LicenseIsReadAndCutAtOneMebibyte) {
    const size_t kLimit = 0x100000;
    std::string text;
    while (text.size() < kLimit + 1000) {
        text += std::to_string(text.size()) + " ";
    }
    const struct {
        size_t size;  // 0: no LICENSE at all
        size_t read;
    } cases[] = {{0, 0}, {10, 10}, {kLimit, kLimit}, {kLimit + 1, kLimit}, {kLimit + 1000, kLimit}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.size);
        TestPackage pkg("demo");
        if (c.size != 0) {
            pkg.extraFiles["LICENSE"] = text.substr(0, c.size);
        }
        PackageManager pm;
        PackageInfo info;
        ASSERT_TRUE(pm.queryPackageFileInfoWithWizard(testutil::buildPackage(pkg), info,
                                                      PKG_INSTALL, "enu"));
        EXPECT_EQ(info.license.size(), c.read);
        EXPECT_TRUE(info.license == text.substr(0, c.read)) << "a prefix of the file";
    }
}

TEST_F(Wizard, TypeZeroIsUpgradeWhenThePackageIsInstalled) {
    TestPackage pkg("demo", "2.0-0001");
    pkg.wizard["install_uifile"] = staticWizard("install");
    pkg.wizard["upgrade_uifile"] = staticWizard("upgrade");
    EXPECT_EQ(answers(wizardOf(pkg, static_cast<PKG_INSTALLATION_TYPE>(0), "enu"))["from"],
              "install");
    testutil::installFixture(TestPackage("demo", "1.0-0001"));
    ASSERT_TRUE(PMSCheckPackage("demo"));
    EXPECT_EQ(answers(wizardOf(pkg, static_cast<PKG_INSTALLATION_TYPE>(0), "enu"))["from"],
              "upgrade");
}

TEST_F(Wizard, UpgradeScriptSeesTheInstalledVersion) {
    TestPackage pkg("demo", "2.0-0001");
    pkg.wizard["upgrade_uifile.sh"] = scriptWizard("script");
    pkg.wizard["upgrade_uifile"] = staticWizard("plain");

    // Nothing installed: the script is not run, and the plain file answers.
    Json::Value values = answers(wizardOf(pkg, PKG_UPGRADE, "enu"));
    EXPECT_EQ(values["from"].asString(), "plain");
    EXPECT_TRUE(logged("Previous demo not installed, upgrade not possible"));

    testutil::installFixture(TestPackage("demo", "1.0-0001"));
    std::string cpk;
    values = answers(wizardOf(pkg, PKG_UPGRADE, "enu", &cpk));
    ASSERT_EQ(values["from"].asString(), "script") << toString(values);
    EXPECT_EQ(values["old"].asString(), "1.0-0001");
    EXPECT_EQ(values["status"].asString(), "UPGRADE");
    EXPECT_EQ(values["cpk"].asString(), cpk);
}

TEST_F(Wizard, InstalledPackageWizard) {
    PackageManager pm;
    TestPackage none("plain");
    testutil::installFixture(none);
    PackageInfo info;
    EXPECT_FALSE(pm.readUIFile(PKG_UNINSTALL, "plain", info, "enu"));
    EXPECT_TRUE(pm.readUIFile(static_cast<PKG_INSTALLATION_TYPE>(0), "plain", info, "enu"));
    EXPECT_TRUE(info.wizard.empty());
    EXPECT_FALSE(pm.readUIFile("plain", "uninstall", info, "enu"));

    TestPackage file("file");
    file.wizard["uninstall_uifile_ger"] = "[]";
    file.wizard["uninstall_uifile"] = staticWizard("static");
    testutil::installFixture(file);
    info = PackageInfo();
    ASSERT_TRUE(pm.readUIFile(PKG_UNINSTALL, "file", info, "ger"));
    EXPECT_EQ(answers(info.wizard)["from"], "static");

    TestPackage script("script");
    script.wizard["uninstall_uifile.sh"] = scriptWizard("script");
    script.wizard["uninstall_uifile"] = staticWizard("static");
    testutil::installFixture(script);
    info = PackageInfo();
    ASSERT_TRUE(pm.getInstallPackageInfo("script", info, "enu", PKG_INFO_MASK_ALL));
    ASSERT_TRUE(pm.readUIFile(PKG_UNINSTALL, "script", info, "enu"));
    Json::Value values = answers(info.wizard);
    EXPECT_EQ(values["from"].asString(), "script");
    EXPECT_EQ(values["name"].asString(), "script");
    EXPECT_EQ(values["status"].asString(), "UNINSTALL");
    EXPECT_EQ(values["cpk"].asString(), "unset");
    EXPECT_FALSE(testutil::exists(values["result"].asString()));
}

TEST_F(Wizard, PackageTexts) {
    TestPackage pkg("demo");
    pkg.payload["ui/texts/enu/strings"] = "[wizard]\ntitle=\"Welcome\"\n\n[other]\nx=\"y\"\n";
    pkg.payload["ui/texts/ger/strings"] = "[other]\nx=\"z\"\n";
    testutil::installFixture(pkg);
    EXPECT_EQ(PMSGetText("demo", "enu", "wizard", "title"), "Welcome");
    EXPECT_EQ(PMSGetText("demo", "ger", "other", "x"), "z");

    const struct {
        const char* lang;
        const char* section;
        const char* key;
        const char* logged;
    } misses[] = {
        {"enu", "absent", "title",
         "/var/packages/demo/target/ui/texts/enu/strings] no found the "
         "section[absent] [0x0600"},
        {"enu", "wizard", "absent", "key no found [absent] "},
        // No fallback to another language.
        {"ger", "wizard", "title", "no found the section[wizard]"},
        {"fre", "wizard", "title", "/ui/texts/fre/strings] no found the section[wizard]"},
    };
    for (const auto& m : misses) {
        SCOPED_TRACE(std::string(m.lang) + " " + m.section + " " + m.key);
        log.clear();
        EXPECT_EQ(PMSGetText("demo", m.lang, m.section, m.key), "");
        EXPECT_TRUE(logged(m.logged));
    }
}

TEST_F(Wizard, WhatIsNoPackageFileIsRefused) {
    PackageManager pm;
    PackageInfo info;
    EXPECT_FALSE(pm.queryPackageFileInfoWithWizard("", info, PKG_INSTALL, "enu"));
    EXPECT_TRUE(logged("Wrong parameters"));
    testutil::writeFile("/tmp/junk.cpk", "junk");
    EXPECT_FALSE(pm.queryPackageFileInfoWithWizard("/tmp/junk.cpk", info, PKG_INSTALL, "enu"));
    EXPECT_TRUE(logged("Failed to query info"));
}

TEST(WizardCli, StepsAndDefaultAnswers) {
    TestPackage pkg("demo");
    pkg.wizard["install_uifile"] =
        R"([{"step_title": "Setup", "items": [{"key": "port", "defaultValue": 8080,
              "desc": "Port"}, {"key": "name", "defaultValue": "box"}]},
            {"items": [{"type": "multiselect", "subitems": [{"key": "keep", "defaultValue": true}]}]}])";
    const std::string cpk = testutil::buildPackage(pkg);

    auto defaults = testutil::run(kCli, {"wizard", cpk, "--defaults", "--json"});
    ASSERT_EQ(defaults.status, 0) << defaults.out << defaults.err;
    Json::Value values;
    ASSERT_TRUE(fromString(defaults.out, values)) << defaults.out;
    Json::Value expected;
    ASSERT_TRUE(fromString(R"({"port": "8080", "name": "box", "keep": "true"})", expected));
    EXPECT_EQ(values, expected) << defaults.out;

    auto steps = testutil::run(kCli, {"wizard", cpk, "--json"});
    ASSERT_EQ(steps.status, 0) << steps.out << steps.err;
    Json::Value out;
    ASSERT_TRUE(fromString(steps.out, out)) << steps.out;
    EXPECT_EQ(out["package"], "demo");
    EXPECT_EQ(out["type"], "install");
    EXPECT_EQ(out["wizard"].size(), 2u);

    // An installed package without an uninstall wizard has no questions to ask.
    testutil::installFixture(TestPackage("quiet"));
    auto none = testutil::run(kCli, {"wizard", "quiet", "--defaults"});
    EXPECT_EQ(none.status, 0) << none.err;
    EXPECT_EQ(none.out, "{}\n");

    auto missing = testutil::run(kCli, {"wizard", "absent", "--json"});
    EXPECT_EQ(missing.status, 1);
    EXPECT_NE(missing.out.find("PKG_ERR_NOT_INSTALLED"), std::string::npos) << missing.out;
    EXPECT_EQ(testutil::run(kCli, {"wizard", cpk, "--type", "start"}).status, 2);
}
