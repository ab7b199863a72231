// corvpkg install (and its other names upgrade and repair) and uninstall: the local life
// of a package file.
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <fstream>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgverify.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

const char kOperationsLog[] = "/var/log/corvpkg.log";

// Shows what an operation does while it runs: each command and script the library logs,
// and the package's own progress file, on standard error.
class ProgressWatcher {
  public:
    explicit ProgressWatcher(std::string package) : progress_(PMSGetProgressPath(package)) {
        std::ifstream log(kOperationsLog, std::ios::ate);
        offset_ = log ? static_cast<long long>(log.tellg()) : 0;
        thread_ = std::thread([this] { loop(); });
    }
    ~ProgressWatcher() {
        {
            std::lock_guard<std::mutex> hold(mutex_);
            stop_ = true;
        }
        // Woken at once: the operation is over and must not wait out a polling pause.
        wake_.notify_one();
        thread_.join();
        poll();
    }
    ProgressWatcher(const ProgressWatcher&) = delete;
    ProgressWatcher& operator=(const ProgressWatcher&) = delete;

  private:
    static bool endedWell(const std::string& message) {
        static const std::string kOk = " ret=[0]";
        return message.find(" End ") != std::string::npos && message.size() >= kOk.size() &&
               message.compare(message.size() - kOk.size(), kOk.size(), kOk) == 0;
    }
    void loop() {
        std::unique_lock<std::mutex> hold(mutex_);
        while (!stop_) {
            hold.unlock();
            poll();
            hold.lock();
            wake_.wait_for(hold, std::chrono::milliseconds(100), [this] { return stop_; });
        }
    }
    void poll() {
        std::ifstream log(kOperationsLog);
        if (log && log.seekg(offset_)) {
            std::string line;
            while (std::getline(log, line)) {
                offset_ += static_cast<long long>(line.size()) + 1;
                // "<time>\t<message>"; only the message says what happens. A command
                // that ended well was already shown when it began.
                size_t tab = line.find('\t');
                const std::string message = tab == std::string::npos ? line : line.substr(tab + 1);
                if (!endedWell(message)) {
                    fprintf(stderr, "  %s\n", message.c_str());
                }
            }
        }
        std::ifstream file(progress_);
        std::stringstream text;
        text << file.rdbuf();
        if (file && text.str() != lastProgress_ && !text.str().empty()) {
            lastProgress_ = text.str();
            fprintf(stderr, "  progress: %s\n", lastProgress_.c_str());
        }
    }

    std::string progress_;
    long long offset_ = 0;
    std::string lastProgress_;
    std::mutex mutex_;
    std::condition_variable wake_;
    bool stop_ = false;
    std::thread thread_;
};

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

// The questions of a wizard, one line each: key, description and default, wherever the
// steps nest them.
void printQuestions(const Json::Value& node, const Json::Value& defaults) {
    if (node.isArray()) {
        for (const Json::Value& element : node) {
            printQuestions(element, defaults);
        }
        return;
    }
    if (!node.isObject()) {
        return;
    }
    if (node.isMember("key") && node["key"].isString()) {
        const std::string key = node["key"].asString();
        const Json::Value desc = node.get("desc", "");
        std::string line = "  " + key;
        if (desc.isString() && !desc.asString().empty()) {
            line += " - " + desc.asString();
        }
        if (defaults.isMember(key)) {
            line += " (default: " + defaults[key].asString() + ")";
        }
        fprintf(stderr, "%s\n", line.c_str());
    }
    for (const std::string& member : node.getMemberNames()) {
        if (node[member].isArray() || node[member].isObject()) {
            printQuestions(node[member], defaults);
        }
    }
}

bool isSignatureVerdict(PKG_ERRCODE code) {
    return code >= PKG_ERR_NOT_MAKER_SIGNED && code <= PKG_ERR_SIGNATURE_SYSTEM;
}

int installCommand(const std::vector<std::string>& args, const char* command) {
    CommonOptions opts;
    if (int status = parseSingle(args, command, "package file", opts,
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
    if (!isReadableFile(file)) {
        return printFailure(opts.json, PKG_ERR_FILE_ACCESS, file + " is not a readable file");
    }
    Json::Value answers(Json::objectValue);
    if (opts.has("--answers") && !readAnswers(opts.options["--answers"], answers)) {
        return printFailure(opts.json, PKG_ERR_BAD_ANSWERS,
                            opts.options["--answers"] + " is not a JSON object of answers");
    }
    const std::string lang = opts.lang.empty() ? "enu" : opts.lang;
    const bool verify = !opts.has("--no-verify");
    TmpLeftovers leftovers;
    LogCapture log;

    // The installability checks, so that a refusal comes with the desktop's report.
    PackageInfo info;
    PKG_ERRCODE code = PKG_OK;
    Json::Value data;
    std::string displayName;
    if (!CheckPackageFileInfoImpl(lang.c_str(), file.c_str(), displayName, code, data, info) &&
        !(isSignatureVerdict(code) && !verify)) {
        Json::Value report(Json::arrayValue);
        CheckPackageFileInfo(lang.c_str(), file.c_str(), displayName, report);
        Json::Value details(Json::objectValue);
        details["report"] = report;
        if (!data.isNull()) {
            details["data"] = data;
        }
        std::string text;
        joinJsonArray(report, " ", text);
        return printFailure(opts.json, code, "not installable: " + text, details);
    }

    // The wizard's questions.
    PackageManager pm;
    PackageInfo withWizard;
    pm.queryPackageFileInfoWithWizard(file, withWizard, static_cast<PKG_INSTALLATION_TYPE>(0),
                                      lang.c_str());
    Json::Value defaults(Json::objectValue);
    getUIDefaultValues(withWizard.wizard, defaults);
    if (withWizard.wizard.isArray() && !withWizard.wizard.empty()) {
        if (opts.has("--defaults")) {
            for (const std::string& key : defaults.getMemberNames()) {
                if (!answers.isMember(key)) {
                    answers[key] = defaults[key];
                }
            }
        } else if (!opts.has("--answers")) {
            fprintf(stderr, "the package asks:\n");
            printQuestions(withWizard.wizard, defaults);
            return usageError(findCommand(command),
                              "answer the questions with --answers F.json, or take the "
                              "defaults with --defaults");
        }
    }

    // The message file may hold the words of an earlier operation: only a file that
    // this one wrote is the package's message now.
    const std::string messageFile = pm.getFixedLogFilePath(info.package);
    const FileStamp before = stampOf(messageFile);
    const bool wasInstalled = PMSCheckPackage(info.package);
    int outcome = 0;
    {
        ProgressWatcher watcher(info.package);
        outcome = pm.install(opts.has("--user") ? opts.options["--user"].c_str() : nullptr, file,
                             opts.has("--volume") ? opts.options["--volume"] : "",
                             !opts.has("--no-start"), answers.empty() ? nullptr : &answers,
                             lang.c_str(), opts.has("--ignore-dependents"), verify);
    }
    removeResourceBackup(info.package);
    std::string message;
    if (stampOf(messageFile) != before) {
        PMReadFile(messageFile.c_str(), 0x10000, message, nullptr);
    }
    if (!message.empty() && !opts.json) {
        fprintf(stderr, "message from the package: %s\n", message.c_str());
    }
    if (outcome == 1 && pm.getResult() != PKG_OK && !opts.json) {
        const PKG_ERRCODE_INFO* after = PMSGetErrCodeInfo(pm.getResult());
        fprintf(stderr, "warning: installed, but then: %s\n", after ? after->name : "?");
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
    PackageManager pm;
    LogCapture log;
    int outcome = 0;
    {
        ProgressWatcher watcher(name);
        outcome = pm.uninstall(name, answers.empty() ? nullptr : &answers,
                               opts.lang.empty() ? nullptr : opts.lang.c_str(),
                               static_cast<PKG_INSTALLATION_TYPE>(4), opts.has("--force"),
                               opts.has("--user") ? opts.options["--user"].c_str() : nullptr);
    }
    return printOperationOutcome(opts, pm, outcome, "uninstalled", name, log);
}

}  // namespace cli
