// What the command line prints as a person or a script sees it: one JSON object for every
// outcome, refusals in words with a remedy, short usage errors, the progress display on a
// terminal and through a pipe, the wait for the package lock, the wizard's questions.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>

#include <string>
#include <thread>
#include <vector>

#include "corvpkg/json_util.h"
#include "support/files.h"
#include "support/lifecycle_kit.h"
#include "support/pkg_kit.h"
#include "support/run.h"

using testutil::TestPackage;

namespace {

testutil::RunResult corvpkg(const std::vector<std::string>& args) {
    return testutil::run(CORVPKG_CLI_PATH, args);
}

// Runs a shell command line on a pseudo-terminal, `input` typed in; what the terminal
// showed comes back in `out`.
testutil::RunResult onTerminal(const std::string& command, const std::string& input = "") {
    return testutil::run("/bin/sh", {"-c", "printf '" + input + "' | /usr/bin/script -qec '" +
                                               command + "' /dev/null"});
}

TestPackage withWizard(const std::string& name) {
    TestPackage pkg = testutil::recordingPackage(name);
    pkg.wizard["install_uifile"] =
        R"([{"step_title":"Setup","items":[{"type":"textfield","subitems":[)"
        R"({"key":"answer","desc":"The answer","defaultValue":"forty-two"},)"
        R"({"key":"port","desc":"The port","defaultValue":"8080"}]}]}])";
    return pkg;
}

}  // namespace

TEST(CliOutput, EveryRefusalIsOneJsonObjectWithWords) {
    const std::string plain = testutil::buildPackage(testutil::recordingPackage("base"));
    const std::string wizard = testutil::buildPackage(withWizard("asker"));
    TestPackage user = testutil::recordingPackage("user");
    user.info["install_dep_packages"] = "base";
    const std::string userFile = testutil::buildPackage(user);
    testutil::writeFile("/tmp/misspelt.json", R"({"answer":"7","prot":"1"})");
    ASSERT_EQ(corvpkg({"install", plain, "--no-verify"}).status, 0);
    ASSERT_EQ(corvpkg({"install", userFile, "--no-verify"}).status, 0);
    struct Case {
        std::vector<std::string> args;
        int status;
        const char* name;
        const char* inMessage;
        const char* inRemedy;
    };
    const Case cases[] = {
        {{}, 2, "USAGE", "no command given", "corvpkg --help"},
        {{"frobnicate"}, 2, "USAGE", "unknown command 'frobnicate'", "corvpkg --help"},
        {{"info"}, 2, "USAGE", "give exactly one package directory", "corvpkg info --help"},
        {{"list", "--bogus"}, 2, "USAGE", "unknown option --bogus", "corvpkg list --help"},
        {{"install", "/tmp/no-such.cpk"}, 1, "PKG_ERR_FILE_ACCESS", "/tmp/no-such.cpk", "path"},
        {{"install", plain}, 1, "PKG_ERR_NO_SIGNATURE", "not signed", "--no-verify"},
        {{"install", wizard, "--no-verify"}, 2, "USAGE", "asks questions", "--help"},
        {{"install", wizard, "--no-verify", "--answers", "/tmp/misspelt.json"},
         1,
         "PKG_ERR_BAD_ANSWERS",
         "does not ask for: prot",
         "answer, port"},
        {{"uninstall", "base"}, 1, "PKG_ERR_DEPENDENCY", "depend on base: Display user", "--force"},
        {{"start", "nosuch"}, 1, "PKG_ERR_NOT_INSTALLED", "nosuch", "corvpkg list"},
        {{"version-compare", "abc", "<", "1.0"}, 2, "USAGE", "\"abc\" is not a version", "--help"},
    };
    for (const Case& c : cases) {
        std::vector<std::string> args = c.args;
        args.push_back("--json");
        const testutil::RunResult r = corvpkg(args);
        SCOPED_TRACE(testing::PrintToString(args));
        EXPECT_EQ(r.status, c.status) << r.out << r.err;
        ASSERT_EQ(std::count(r.out.begin(), r.out.end(), '\n'), 1) << "one line: " << r.out;
        Json::Value out;
        ASSERT_TRUE(CORVPackageTool::fromString(r.out, out) && out.isObject()) << r.out;
        EXPECT_FALSE(out["success"].asBool());
        EXPECT_EQ(out["name"].asString(), c.name);
        EXPECT_NE(out["message"].asString().find(c.inMessage), std::string::npos) << r.out;
        EXPECT_NE(out["remedy"].asString().find(c.inRemedy), std::string::npos) << r.out;
        EXPECT_EQ(r.err.find('{'), std::string::npos) << "nothing of it on stderr: " << r.err;
    }
    // The questions come with the refusal, for a script to answer.
    const testutil::RunResult asks = corvpkg({"install", wizard, "--no-verify", "--json"});
    Json::Value out;
    ASSERT_TRUE(CORVPackageTool::fromString(asks.out, out));
    EXPECT_EQ(out["questions"][1]["key"].asString(), "port");
    EXPECT_EQ(out["questions"][1]["default"].asString(), "8080");
    // The key and the code stay for whoever translates.
    const testutil::RunResult unsigned_ = corvpkg({"install", plain, "--json"});
    ASSERT_TRUE(CORVPackageTool::fromString(unsigned_.out, out));
    EXPECT_EQ(out["code"].asInt(), 290);
    EXPECT_EQ(out["message_key"].asString(), "pkgmgr:pkgmgr_no_signature");
}

TEST(CliOutput, WordsWithoutCodesUnlessVerbose) {
    const std::string plain = testutil::buildPackage(testutil::recordingPackage("base"));
    testutil::RunResult r = corvpkg({"install", plain});
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("error: The package file is not signed.\n"), std::string::npos) << r.err;
    EXPECT_NE(r.err.find("hint: "), std::string::npos) << r.err;
    EXPECT_EQ(r.err.find("PKG_ERR_"), std::string::npos) << r.err;
    r = corvpkg({"install", plain, "-v"});
    EXPECT_NE(r.err.find("result: PKG_ERR_NO_SIGNATURE (290)"), std::string::npos) << r.err;
    EXPECT_NE(r.err.find("pkgmgr:pkgmgr_no_signature"), std::string::npos) << r.err;

    // A usage error: what is wrong, the usage line, where the help is; nothing else.
    r = corvpkg({"uninstall"});
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err,
              "corvpkg: uninstall: give exactly one package name\n"
              "usage: corvpkg uninstall <name> [--force] [--answers F.json] [--lang L] [--user "
              "U]\n"
              "see 'corvpkg uninstall --help'\n");
}

TEST(CliOutput, PhasesThroughAPipeQuietAndVerbose) {
    TestPackage pkg = testutil::recordingPackage("demo");
    // Appended to: the message file then holds the words of every install so far.
    pkg.scripts["postinst"] =
        "echo 'Ready on port 9.' >> \"$CORVPKG_TEMP_LOGFILE\"\n" + pkg.scripts["postinst"];
    const std::string file = testutil::buildPackage(pkg);
    testutil::RunResult r = corvpkg({"install", file, "--no-verify"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "installed demo\n");
    size_t at = 0;
    for (const char* phase : {"checking\n", "unpacking\n", "running scripts: preinst\n",
                              "running scripts: postinst\n", "starting\n"}) {
        size_t found = r.err.find(phase, at);
        EXPECT_NE(found, std::string::npos) << phase << " in order in:\n" << r.err;
        at = found == std::string::npos ? at : found;
    }
    EXPECT_EQ(r.err.find_first_of("\r\033"), std::string::npos) << "no control characters";
    EXPECT_EQ(r.err.find(" Begin "), std::string::npos) << "the trace is for --verbose";

    r = corvpkg({"uninstall", "demo", "-q"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "uninstalled demo\n");
    EXPECT_EQ(r.err, "");

    // A fresh install left stopped is a plain success, with no warning after it.
    r = corvpkg({"install", file, "--no-verify", "--no-start"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.err.find("warning"), std::string::npos) << r.err;
    EXPECT_EQ(r.err.find("starting"), std::string::npos) << r.err;
    ASSERT_EQ(corvpkg({"uninstall", "demo", "-q"}).status, 0);

    r = corvpkg({"install", file, "--no-verify", "--verbose"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_NE(r.err.find(" Begin "), std::string::npos) << r.err;
    // Only this install's words, not those of the one before the uninstall.
    const size_t first = r.err.find("Ready on port 9.");
    ASSERT_NE(first, std::string::npos) << r.err;
    EXPECT_EQ(r.err.find("Ready on port 9.", first + 1), std::string::npos) << r.err;
}

TEST(CliOutput, ProgressRedrawsInPlaceOnATerminal) {
    TestPackage pkg = testutil::recordingPackage("demo");
    // Enough payload that unpacking shows its bytes.
    pkg.payload["share/blob"] = std::string(3 << 20, 'x');
    const std::string file = testutil::buildPackage(pkg);
    testutil::RunResult r =
        onTerminal(std::string(CORVPKG_CLI_PATH) + " install " + file + " --no-verify");
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("\r\033[Kchecking"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("\r\033[Kunpacking  ["), std::string::npos) << r.out;
    EXPECT_NE(r.out.find(" of 3.0 MiB"), std::string::npos) << "bytes of the known size: " << r.out;
    EXPECT_NE(r.out.find("installed demo"), std::string::npos) << r.out;

    // NO_COLOR or not, no colour codes: only line redraws.
    EXPECT_EQ(r.out.find("\033[3"), std::string::npos) << r.out;
}

TEST(CliOutput, WizardQuestionsAreAskedOnATerminal) {
    const std::string file = testutil::buildPackage(withWizard("asker"));
    testutil::RunResult r = onTerminal(
        std::string(CORVPKG_CLI_PATH) + " install " + file + " --no-verify", "seven\\n\\n");
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("The answer (answer) [forty-two]: "), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("The port (port) [8080]: "), std::string::npos) << r.out;
    EXPECT_EQ(testutil::scriptField("asker", "postinst", "answer"), "seven");
}

TEST(CliOutput, ASecondInstallSaysItWaitsForTheLock) {
    TestPackage slow = testutil::recordingPackage("slow");
    slow.scripts["postinst"] = "sleep 2\n" + slow.scripts["postinst"];
    const std::string slowFile = testutil::buildPackage(slow);
    const std::string other = testutil::buildPackage(testutil::recordingPackage("other"));
    testutil::RunResult first;
    std::thread holder([&] { first = corvpkg({"install", slowFile, "--no-verify"}); });
    // The first install must hold the lock before the second begins.
    for (int i = 0; i < 100 && !testutil::exists("/tmp/slow.scripts"); ++i) {
        usleep(50 * 1000);
    }
    testutil::RunResult second = corvpkg({"install", other, "--no-verify"});
    holder.join();
    ASSERT_EQ(first.status, 0) << first.err;
    ASSERT_EQ(second.status, 0) << second.err;
    EXPECT_NE(second.err.find("waiting for the package lock (held by process "), std::string::npos)
        << second.err;
    EXPECT_NE(second.err.find(": corvpkg install " + slowFile), std::string::npos) << second.err;
    EXPECT_EQ(second.out, "installed other\n");
}
