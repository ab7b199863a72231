// The package lint: one broken package per kind of finding, each made from the skeleton
// that `corvpkg new` writes (which itself must lint clean).
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <vector>

#include "corvpkg/pkgbuild.h"
#include "corvpkg/pkglint.h"
#include "corvpkg/pkgskeleton.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;

namespace {

std::string describe(const std::vector<PkgLintFinding>& findings) {
    std::string out;
    for (const PkgLintFinding& f : findings) {
        out += std::string(f.severity == PKG_LINT_ERROR ? "error" : "warning") + " [" + f.file +
               "] " + f.problem + " | " + f.fix + "\n";
    }
    return out.empty() ? "(no findings)\n" : out;
}

// Replaces the line of `key` in INFO, or appends it; an empty value removes the key.
void setInfo(const std::string& dir, const std::string& key, const std::string& line) {
    std::string text = testutil::readFile(dir + "/INFO");
    std::string out;
    size_t pos = 0;
    while (pos < text.size()) {
        size_t end = text.find('\n', pos);
        std::string current = text.substr(pos, end - pos);
        if (current.compare(0, key.size() + 1, key + "=") != 0) {
            out += current + "\n";
        }
        pos = end == std::string::npos ? text.size() : end + 1;
    }
    testutil::writeFile(dir + "/INFO", out + line + (line.empty() ? "" : "\n"));
}

std::function<void(const std::string&)> info(const std::string& key, const std::string& line) {
    return [=](const std::string& dir) { setInfo(dir, key, line); };
}

std::function<void(const std::string&)> file(const std::string& member,
                                             const std::string& content) {
    return [=](const std::string& dir) { testutil::writeFile(dir + "/" + member, content); };
}

std::function<void(const std::string&)> chmodTo(const std::string& member, mode_t mode) {
    return [=](const std::string& dir) { chmod((dir + "/" + member).c_str(), mode); };
}

struct Case {
    const char* what;
    std::function<void(const std::string&)> change;
    PKG_LINT_SEVERITY severity;
    const char* file;
    const char* problem;  // a part of the problem's text
    const char* fix;      // a part of the fix's text
};

const char kPrivilegeBase[] =
    R"({"defaults": {"run-as": "package"}, "executable": [{"relpath": "bin/demo-daemon", )"
    R"("run-as": "package"}], )";

const Case kCases[] = {
    {"required key missing", info("maintainer", ""), PKG_LINT_ERROR, "INFO",
     "maintainer is missing", "maintainer=\""},
    {"name with a blank", info("package", "package=\"my pkg\""), PKG_LINT_ERROR, "INFO",
     "holds a blank", "package=\"hello\""},
    {"name the reader refuses", info("package", "package=\"a/b\""), PKG_LINT_ERROR, "INFO",
     "refused by the engine", "letters, digits"},
    {"version that is a word", info("version", "version=\"banana\""), PKG_LINT_ERROR, "INFO",
     "\"banana\" is not a version", "version=\"1.0.0-0001\""},
    {"arch missing", info("arch", ""), PKG_LINT_ERROR, "INFO", "arch is missing",
     "arch=\"x86_64 armv7 armv8\""},
    {"arch of every platform", info("arch", "arch=\"noarch\""), PKG_LINT_ERROR, "INFO",
     "every platform", "arch="},
    {"arch token with a comma", info("arch", "arch=\"x86_64,armv8\""), PKG_LINT_ERROR, "INFO",
     "\"x86_64,armv8\" is no architecture", "separate tokens with blanks"},
    {"exclude_arch token unknown", info("exclude_arch", "exclude_arch=\"arm\""), PKG_LINT_ERROR,
     "INFO", "exclude_arch token \"arm\"", "armv7"},
    {"yes/no misspelt", info("startable", "startable=\"yse\""), PKG_LINT_ERROR, "INFO",
     "keeps the default (yes)", "startable=\"no\""},
    {"adminport above the limit", info("adminport", "adminport=\"65537\""), PKG_LINT_ERROR, "INFO",
     "above 65536", "1 to 65535"},
    {"adminport not a number", info("adminport", "adminport=\"http\""), PKG_LINT_ERROR, "INFO",
     "not a number", "adminport=\"8080\""},
    {"OS version without build", info("os_min_ver", "os_min_ver=\"6.1\""), PKG_LINT_ERROR, "INFO",
     "reads as 6.1-0000", "6.1-15101"},
    {"OS limits crossed", info("os_max_ver", "os_max_ver=\"5.2-0001\""), PKG_LINT_ERROR, "INFO",
     "above the upper one", "os_max_ver"},
    {"unknown key, a typo", info("maintainr", "maintainr=\"x\""), PKG_LINT_WARNING, "INFO",
     "unknown key maintainr", "did you mean maintainer?"},
    {"line that is no pair",
     [](const std::string& dir) {
         testutil::writeFile(dir + "/INFO", testutil::readFile(dir + "/INFO") + "version 1.0\n");
     },
     PKG_LINT_WARNING, "INFO", "is neither key=\"value\" nor a comment", "key=\"value\""},
    {"dependency in another syntax",
     info("install_dep_packages", "install_dep_packages=\"hello (>= 1.0.0)\""), PKG_LINT_ERROR,
     "INFO", "blanks and parentheses", "hello>=1.0.0"},
    {"dependency bound missing", info("install_dep_packages", "install_dep_packages=\"hello>=\""),
     PKG_LINT_ERROR, "INFO", "no version; the engine drops it", "hello>=1.0.0-0001"},
    {"dependency bound a word",
     info("install_conflict_packages", "install_conflict_packages=\"old<latest\""), PKG_LINT_ERROR,
     "INFO", "\"latest\" is not a version", "old>=1.0.0-0001"},
    {"INFO list shadowed by the file",
     [](const std::string& dir) {
         setInfo(dir, "install_dep_packages", "install_dep_packages=\"hello\"");
         testutil::writeFile(dir + "/conf/PKG_DEPS", "[hello]\n");
     },
     PKG_LINT_WARNING, "INFO", "ignored because conf/PKG_DEPS exists", "one place"},
    {"section file bound a word", file("conf/PKG_DEPS", "[hello]\npkg_min_ver=banana\n"),
     PKG_LINT_ERROR, "conf/PKG_DEPS", "pkg_min_ver=banana: not a version", "1.0.0-0001"},
    {"section file key misspelt", file("conf/PKG_CONX", "[old]\npkg_max_vre=2.0\n"),
     PKG_LINT_WARNING, "conf/PKG_CONX", "unknown key", "did you mean pkg_max_ver?"},
    {"section file OS bound", file("conf/PKG_DEPS", "[hello]\nnos_min_ver=6\n"), PKG_LINT_ERROR,
     "conf/PKG_DEPS", "not an OS version", "nos_min_ver=6.1-15101"},
    {"wizard JSON broken", file("WIZARD_UIFILES/install_uifile", R"([{"items": [{"key": "A",}]}])"),
     PKG_LINT_ERROR, "WIZARD_UIFILES/install_uifile", "questions are never asked",
     "correct the JSON"},
    {"wizard step without items", file("WIZARD_UIFILES/install_uifile", R"([{"items": 1}])"),
     PKG_LINT_ERROR, "WIZARD_UIFILES/install_uifile", "step 1 has no array items", "\"items\""},
    {"wizard key no variable",
     file("WIZARD_UIFILES/install_uifile_ger", R"([{"items": [{"key": "MY PORT"}]}])"),
     PKG_LINT_ERROR, "WIZARD_UIFILES/install_uifile_ger", "is no variable name", "MYPKG_PORT"},
    {"wizard file misnamed", file("WIZARD_UIFILES/install_ui", "[]"), PKG_LINT_WARNING,
     "WIZARD_UIFILES/install_ui", "never reads it", "install_uifile"},
    {"wizard script not executable",
     [](const std::string& dir) {
         testutil::writeFile(dir + "/WIZARD_UIFILES/install_uifile.sh", "#!/bin/sh\n");
         chmod((dir + "/WIZARD_UIFILES/install_uifile.sh").c_str(), 0644);
     },
     PKG_LINT_ERROR, "WIZARD_UIFILES/install_uifile.sh", "asks nothing", "chmod 755"},
    {"resource JSON broken", file("conf/resource", "{\"crontab-job\": }"), PKG_LINT_ERROR,
     "conf/resource", "is not JSON", "correct the JSON"},
    {"resource section no worker handles",
     file("conf/resource", R"({"crontab-jobs": {"relpath": "etc/x"}})"), PKG_LINT_WARNING,
     "conf/resource", "no worker handles it", "did you mean crontab-job?"},
    {"resource section not an object", file("conf/resource", R"({"service-cfg": []})"),
     PKG_LINT_ERROR, "conf/resource", "not an object", "\"service-cfg\": {...}"},
    {"privilege identity unknown", file("conf/privilege", R"({"defaults": {"run-as": "admin"}})"),
     PKG_LINT_ERROR, "conf/privilege", "defaults run-as is not an identity", "\"system\""},
    {"privilege tool mode short",
     file("conf/privilege", std::string(kPrivilegeBase) +
                                R"("tool": [{"relpath": "bin/demo-daemon", "user": "package", )"
                                R"("group": "package", "permission": "755"}]})"),
     PKG_LINT_ERROR, "conf/privilege", "not four octal digits", "0750"},
    {"privilege program missing",
     file("conf/privilege", R"({"executable": [{"relpath": "bin/nothing", "run-as": "root"}]})"),
     PKG_LINT_ERROR, "conf/privilege", "package/bin/nothing is not a file", "relpath"},
    {"privilege key misspelt", file("conf/privilege", R"({"usernme": "x"})"), PKG_LINT_WARNING,
     "conf/privilege", "unknown key usernme", "did you mean username?"},
    {"script without execute bit", chmodTo("scripts/postinst", 0644), PKG_LINT_ERROR,
     "scripts/postinst", "lacks the execute bit", "chmod 755 scripts/postinst"},
    {"script without interpreter", file("scripts/preinst", "exit 0\n"), PKG_LINT_ERROR,
     "scripts/preinst", "does not start with #!", "#!/bin/sh"},
    {"script that is a link",
     [](const std::string& dir) {
         unlink((dir + "/scripts/postinst").c_str());
         ASSERT_EQ(symlink("/bin/true", (dir + "/scripts/postinst").c_str()), 0);
     },
     PKG_LINT_ERROR, "scripts/postinst", "is a symbolic link", "regular file"},
    {"no upgrade scripts",
     [](const std::string& dir) {
         unlink((dir + "/scripts/preupgrade").c_str());
         unlink((dir + "/scripts/postupgrade").c_str());
     },
     PKG_LINT_WARNING, "scripts/", "neither preupgrade nor postupgrade", "postupgrade"},
    {"payload missing", [](const std::string& dir) { testutil::removeAll(dir + "/package"); },
     PKG_LINT_ERROR, "package/", "is missing", "package/"},
};

}  // namespace

TEST(PackageLint, TheSkeletonAndItsCleanVariantsHaveNoFindings) {
    TempDir tmp;
    const std::string dir = tmp.path() + "/demo";
    std::string error;
    ASSERT_TRUE(PMSWritePackageSkeleton("demo", dir, error)) << error;
    EXPECT_EQ(describe(PMSLintPackageSource(dir)), "(no findings)\n");
    // Language variants, a dependency list in the reader's syntax, a plain wizard question.
    setInfo(dir, "displayname_ger", "displayname_ger=\"Demo\"");
    setInfo(dir, "install_dep_packages", "install_dep_packages=\"hello>=1.0.0-0001:other\"");
    testutil::writeFile(dir + "/WIZARD_UIFILES/install_uifile",
                        R"([{"items": [{"key": "DEMO_PORT", "defaultValue": "1"}]}])");
    EXPECT_EQ(describe(PMSLintPackageSource(dir)), "(no findings)\n");
    EXPECT_FALSE(PMSWritePackageSkeleton("demo", dir, error)) << "a directory in use";
}

TEST(PackageLint, EachKindOfFaultIsFoundWithItsFix) {
    for (const Case& c : kCases) {
        TempDir tmp;
        const std::string dir = tmp.path() + "/demo";
        std::string error;
        ASSERT_TRUE(PMSWritePackageSkeleton("demo", dir, error)) << error;
        c.change(dir);
        const std::vector<PkgLintFinding> findings = PMSLintPackageSource(dir);
        bool found = false;
        for (const PkgLintFinding& f : findings) {
            found |= f.severity == c.severity && f.file == c.file &&
                     f.problem.find(c.problem) != std::string::npos &&
                     f.fix.find(c.fix) != std::string::npos;
        }
        EXPECT_TRUE(found) << "case: " << c.what << "\nINFO:\n"
                           << testutil::readFile(dir + "/INFO") << "findings:\n"
                           << describe(findings);
        EXPECT_EQ(PMSLintHasErrors(findings), c.severity == PKG_LINT_ERROR) << c.what;
    }
}

TEST(PackageLint, APackageFileIsCheckedByItsMembers) {
    TempDir tmp;
    const std::string dir = tmp.path() + "/demo";
    std::string error;
    ASSERT_TRUE(PMSWritePackageSkeleton("demo", dir, error)) << error;
    chmod((dir + "/scripts/postinst").c_str(), 0644);
    ASSERT_TRUE(PMSBuildPackageFile(dir, tmp.path() + "/demo.cpk", "", error)) << error;
    std::vector<PkgLintFinding> findings = PMSLintPackageSource(tmp.path() + "/demo.cpk");
    ASSERT_EQ(findings.size(), 1u) << describe(findings);
    EXPECT_EQ(findings[0].file, "scripts/postinst");

    testutil::writeFile(tmp.path() + "/junk.cpk", "junk");
    findings = PMSLintPackageSource(tmp.path() + "/junk.cpk");
    ASSERT_EQ(findings.size(), 1u) << describe(findings);
    EXPECT_NE(findings[0].problem.find("is not a package file"), std::string::npos);
}

TEST(PackageLint, VersionTextHasTheFormTheComparisonReads) {
    const struct {
        const char* text;
        bool ok;
    } cases[] = {{"1", true},         {"1.2.3", true}, {"1.2.3-0045", true}, {"", false},
                 {"abc", false},      {"1.2b", false}, {"1.2-3-9", false},   {"1..2", false},
                 {"1.0-beta", false}, {" 1.0", false}, {"-1", false},        {"1.", false}};
    for (const auto& c : cases) {
        EXPECT_EQ(PMSIsVersionText(c.text), c.ok) << "\"" << c.text << "\"";
    }
}
