// corvpkg install (and its other names upgrade and repair) and uninstall: the local life
// of a package file.
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgverify.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"
#include "progress.h"
#include "wizard_answers.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

// When and how a file was last written; all zero when it does not exist.
struct FileStamp {
    long long seconds = 0;
    long long nanoseconds = 0;
    long long size = -1;
    bool operator!=(const FileStamp& other) const {
        return seconds != other.seconds || nanoseconds != other.nanoseconds || size != other.size;
    }
};

FileStamp stampOf(const std::string& path) {
    struct stat st {};
    FileStamp stamp;
    if (stat(path.c_str(), &st) == 0) {
        stamp.seconds = st.st_mtim.tv_sec;
        stamp.nanoseconds = st.st_mtim.tv_nsec;
        stamp.size = st.st_size;
    }
    return stamp;
}

// The answers of --answers F.json: a JSON object. False when the file does not read as one.
bool readAnswers(const std::string& path, Json::Value& answers) {
    std::ifstream in(path);
    if (!in) {
        return false;
    }
    std::stringstream text;
    text << in.rdbuf();
    return fromString(text.str(), answers) && answers.isObject();
}

// Answers for every question of the wizard, from --answers, --defaults or the terminal.
// -1 when they are complete, else the exit status of the refusal already printed.
int completeAnswers(const CommonOptions& opts, const Command& self, const PackageInfo& withWizard,
                    Json::Value& answers, ProgressDisplay& display) {
    Json::Value defaults(Json::objectValue);
    getUIDefaultValues(withWizard.wizard, defaults);
    const std::vector<WizardQuestion> questions = wizardQuestions(withWizard.wizard, defaults);
    // A misspelt key would leave its question at the default without a word.
    const std::vector<std::string> unknown = unknownAnswerKeys(answers, questions);
    if (!unknown.empty()) {
        std::string unknownText, known;
        for (const std::string& key : unknown) {
            unknownText += (unknownText.empty() ? "" : ", ") + key;
        }
        for (const WizardQuestion& question : questions) {
            known += (known.empty() ? "" : ", ") + question.key;
        }
        Json::Value data(Json::objectValue);
        data["report"].append("corvpkg:unknown_answer_keys");
        data["report"].append(unknownText);
        data["report"].append(known.empty() ? "none" : known);
        data["questions"] = questionsJson(questions);
        return printFailure(opts.json, PKG_ERR_BAD_ANSWERS, "", data);
    }
    if (questions.empty()) {
        return -1;
    }
    if (opts.has("--defaults")) {
        for (const std::string& key : defaults.getMemberNames()) {
            if (!answers.isMember(key)) {
                answers[key] = defaults[key];
            }
        }
        return -1;
    }
    if (opts.has("--answers")) {
        return -1;
    }
    if (!opts.json && isatty(STDIN_FILENO) && isatty(STDERR_FILENO)) {
        display.breakLine();
        if (askQuestions(questions, answers)) {
            return -1;
        }
    }
    const std::string message =
        "the package asks questions: answer them with --answers F.json, "
        "or take the defaults with --defaults";
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = false;
        out["name"] = "USAGE";
        out["message"] = message;
        out["remedy"] = std::string("see 'corvpkg ") + self.name + " --help'";
        out["questions"] = questionsJson(questions);
        printJson(out);
        return EXIT_USAGE;
    }
    display.breakLine();
    fprintf(stderr, "the package asks:\n");
    for (const WizardQuestion& question : questions) {
        std::string line = "  " + question.key;
        if (!question.desc.empty()) {
            line += " - " + question.desc;
        }
        if (!question.defaultValue.isNull()) {
            line += " (default: " + question.defaultValue.asString() + ")";
        }
        fprintf(stderr, "%s\n", line.c_str());
    }
    return usageError(self, message);
}

// Reads the file's record with its wizard and runs the installability checks on that
// record. -1 when the file can be installed (and `pm` knows whether to hash the payload
// while it unpacks), else the exit status of the refusal, printed.
int checkInstallable(const CommonOptions& opts, const std::string& file, const std::string& lang,
                     bool verify, ProgressDisplay& display, PackageManager& pm,
                     PackageInfo& withWizard, PackageInfo& info) {
    // The record with licence and wizard is read first, and the checks judge that same
    // record: the file's members are unpacked once for both. A file whose record does not
    // read that way is read again by the checks, which then tell why.
    const bool queried = pm.queryPackageFileInfoWithWizard(
        file, withWizard, static_cast<PKG_INSTALLATION_TYPE>(0), lang.c_str());

    // The installability checks, so that a refusal comes with the desktop's report. The
    // signature is not asked for when the file goes on unverified anyway. The payload is
    // hashed by the install itself, beside its unpacking, unless the package asks
    // questions first: nobody is asked about a package whose payload is damaged.
    unsigned int skip = verify ? PKG_FILE_CHECK_SKIP_NONE : PKG_FILE_CHECK_SKIP_SIGNATURE;
    if (queried) {
        info = withWizard;
        if (withWizard.wizard.empty()) {
            skip |= PKG_FILE_CHECK_SKIP_PAYLOAD;
            pm.setChecksumWhileUnpacking(true);
        }
    }
    PKG_ERRCODE code = PKG_OK;
    Json::Value data;
    std::string displayName;
    const bool installable =
        CheckPackageFileInfoImpl(lang.c_str(), file.c_str(), displayName, code, data, info, skip);
    failureContext()["package"] = info.package;
    if (!installable) {
        Json::Value report(Json::arrayValue);
        CheckPackageFileReport(code, data, info, report);
        Json::Value details(Json::objectValue);
        details["report"] = report;
        if (!data.isNull()) {
            details["data"] = data;
        }
        std::string text;
        joinJsonArray(report, " ", text);
        display.breakLine();
        failureContext()["operation"] = "check";
        return printFailure(opts.json, code, verbosity().verbose ? "not installable: " + text : "",
                            details);
    }
    return -1;
}

// The package's message file as it stood before an operation: only words that this
// operation wrote are its message now.
class MessageWatch {
  public:
    explicit MessageWatch(std::string path) : path_(std::move(path)), before_(stampOf(path_)) {
        PMReadFile(path_.c_str(), 0x10000, earlier_, nullptr);
    }
    std::string newWords() const {
        std::string message;
        if (!(stampOf(path_) != before_)) {
            return message;
        }
        PMReadFile(path_.c_str(), 0x10000, message, nullptr);
        // A script that appends leaves the words of earlier operations in front.
        if (!earlier_.empty() && message.compare(0, earlier_.size(), earlier_) == 0) {
            message.erase(0, earlier_.size());
        }
        return message;
    }

  private:
    std::string path_;
    FileStamp before_;
    std::string earlier_;
};

int installCommand(const std::vector<std::string>& args, const char* command) {
    CommonOptions opts;
    if (int status = parseSingle(args, command, "package file or name", opts,
                                 {{"--volume", true},
                                  {"--no-start", false},
                                  {"--answers", true},
                                  {"--defaults", false},
                                  {"--ignore-dependents", false},
                                  {"--no-verify", false},
                                  {"--user", true}});
        status >= 0) {
        return status;
    }
    const std::string& file = opts.positional[0];
    failureContext()["file"] = file;
    if (!isReadableFile(file)) {
        return printFailure(opts.json, PKG_ERR_FILE_ACCESS, file + " is not a readable file");
    }
    Json::Value answers(Json::objectValue);
    if (opts.has("--answers") && !readAnswers(opts.options["--answers"], answers)) {
        Json::Value data(Json::objectValue);
        data["file"] = opts.options["--answers"];
        return printFailure(opts.json, PKG_ERR_BAD_ANSWERS,
                            opts.options["--answers"] + " is not a JSON object of answers", data);
    }
    const std::string lang = opts.lang.empty() ? "enu" : opts.lang;
    const bool verify = !opts.has("--no-verify");
    TmpLeftovers leftovers;
    LogCapture log;
    ProgressDisplay display(command, unpackSizeOf(file));
    display.phase("checking");

    PackageManager pm;
    PackageInfo withWizard;
    PackageInfo info;
    if (int status = checkInstallable(opts, file, lang, verify, display, pm, withWizard, info);
        status >= 0) {
        return status;
    }

    if (int status = completeAnswers(opts, findCommand(command), withWizard, answers, display);
        status >= 0) {
        return status;
    }

    const MessageWatch watch(pm.getFixedLogFilePath(info.package));
    const bool wasInstalled = PMSCheckPackage(info.package);
    int outcome = 0;
    display.follow(info.package);
    outcome = pm.install(opts.has("--user") ? opts.options["--user"].c_str() : nullptr, file,
                         opts.has("--volume") ? opts.options["--volume"] : "",
                         !opts.has("--no-start"), answers.empty() ? nullptr : &answers,
                         lang.c_str(), opts.has("--ignore-dependents"), verify);
    display.finish();
    removeResourceBackup(info.package);
    const std::string message = watch.newWords();
    if (!message.empty() && !opts.json) {
        fprintf(stderr, "message from the package: %s\n", message.c_str());
    }
    // A fresh install that is not started keeps the "not installed" of the status check
    // it began with: that is no news about the package now installed.
    const PKG_ERRCODE after = pm.getResult();
    if (outcome == 1 && after != PKG_OK && after != PKG_ERR_NOT_INSTALLED && !opts.json) {
        fprintf(stderr, "warning: installed, but then: %s\n",
                corvtext::oneLine(corvtext::textForCode(after, failureContext())).c_str());
    }
    return printOperationOutcome(opts, pm, outcome, wasInstalled ? "upgraded" : "installed",
                                 info.package, log);
}

}  // namespace

int cmdInstall(const std::vector<std::string>& args) {
    return installCommand(args, "install");
}
int cmdUpgrade(const std::vector<std::string>& args) {
    return installCommand(args, "upgrade");
}
int cmdRepair(const std::vector<std::string>& args) {
    return installCommand(args, "repair");
}

int cmdUninstall(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "uninstall", "package name", opts,
                                 {{"--force", false}, {"--answers", true}, {"--user", true}});
        status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    Json::Value answers(Json::objectValue);
    if (opts.has("--answers") && !readAnswers(opts.options["--answers"], answers)) {
        return printFailure(opts.json, PKG_ERR_BAD_ANSWERS,
                            opts.options["--answers"] + " is not a JSON object of answers");
    }
    failureContext()["package"] = name;
    PackageManager pm;
    LogCapture log;
    int outcome = 0;
    {
        ProgressDisplay display("uninstall");
        display.follow(name);
        outcome = pm.uninstall(name, answers.empty() ? nullptr : &answers,
                               opts.lang.empty() ? nullptr : opts.lang.c_str(),
                               static_cast<PKG_INSTALLATION_TYPE>(4), opts.has("--force"),
                               opts.has("--user") ? opts.options["--user"].c_str() : nullptr);
    }
    return printOperationOutcome(opts, pm, outcome, "uninstalled", name, log);
}

}  // namespace cli
