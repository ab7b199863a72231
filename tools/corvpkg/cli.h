// The command line's frame: a table of commands, each a function over its arguments.
// Commands parse, call the library and print; they decide nothing themselves.
#pragma once

#include <json/json.h>

#include <map>
#include <set>
#include <string>
#include <vector>

#include "corvpkg/packagemanager.h"
#include "message_text.h"

namespace cli {

// Exit statuses of the program.
enum ExitStatus {
    EXIT_OK = 0,
    EXIT_FAILED = 1,  // the library refused or failed; details were printed
    EXIT_USAGE = 2,   // the command line itself was wrong
};

struct Command {
    const char* name;
    const char* summary;
    const char* usage;  // the full help text of the command
    int (*run)(const std::vector<std::string>& args);
};

const std::vector<Command>& commands();
const Command& findCommand(const char* name);

// A command's own option: a flag, or an option with a value ("--size N" or "--size=N").
struct OptionSpec {
    const char* name;
    bool takesValue;
};

// How much this run prints, from -q/--quiet, -v/--verbose and --json. main sets `json` before
// the command runs, so that even a usage error comes as JSON; parseCommon sets the rest.
struct Verbosity {
    bool json = false;
    bool verbose = false;  // the command trace, result codes and message keys too
    bool quiet = false;    // only the outcome
};
Verbosity& verbosity();
// What a failure's words may name: "operation" (the command) and, once known, "package".
corvtext::Params& failureContext();

// What parseCommon took out of the arguments.
struct CommonOptions {
    bool json = false;
    std::string lang;  // empty: the system's language
    std::vector<std::string> positional;
    std::map<std::string, std::string> options;  // the command's own; "" for a flag
    bool has(const char* name) const { return options.count(name) != 0; }
};
// --json, --lang, -q/--quiet and -v/--verbose for every command, plus `extra`. False (after
// printing why) when an option is unknown or lacks its value.
// The language of `opts`, else the system's ("language" in the system's settings), else "enu".
std::string languageOf(const CommonOptions& opts);

bool parseCommon(const std::vector<std::string>& args, const Command& command, CommonOptions& out,
                 const std::vector<OptionSpec>& extra = {});

// parseCommon for a command that takes exactly one positional argument; `what` names it
// in the usage error ("package name"). -1 when all is well, else the exit status to return.
int parseSingle(const std::vector<std::string>& args, const char* command, const char* what,
                CommonOptions& out, const std::vector<OptionSpec>& extra = {});

// Prints a failure in words: "error: <sentence>", the reason, and "hint: <remedy>" (with
// --verbose also the code's name, the message key and the data), or with --json as
// {"success":false,"code":N,"name":"...","message":"...","remedy":"...","reason":"...",
//  "message_key":"...","data":...}. A "report" array in `data` (an installability refusal)
// chooses the words. Returns EXIT_FAILED.
int printFailure(bool json, int code, const std::string& reason,
                 const Json::Value& data = Json::Value());
// When `data` (or its member "data") holds "no_space" ({"volume", "needed", "free"}),
// says on standard error that the volume is full, with both sizes.
void printNoSpace(const Json::Value& data);
// The usage error path: the message, the command's first usage line and where its help is,
// on standard error; with --json one object {"success":false,"name":"USAGE", ...} on standard
// output. Returns EXIT_USAGE.
int usageError(const Command& command, const std::string& message);
// The same for the program as a whole (no command, or an unknown one).
int programUsageError(const std::string& message);
// Prints a JSON object on standard output, on one line.
void printJson(const Json::Value& object);

// A regular file that this process may read.
bool isReadableFile(const std::string& path);

// Collects the library's log lines while alive, so that a failure can say why.
class LogCapture {
  public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;
    // The collected lines without their "file:line " prefixes, joined by "; ".
    std::string reasons() const;

  private:
    std::vector<std::string> lines_;
};

// Removes, when it goes, the folders that appeared in the library's temporary folder while
// it lived and hold no file: the checksum check of a package file leaves its empty outer
// folder behind by rule.
class TmpLeftovers {
  public:
    TmpLeftovers();
    ~TmpLeftovers();
    TmpLeftovers(const TmpLeftovers&) = delete;
    TmpLeftovers& operator=(const TmpLeftovers&) = delete;

  private:
    std::string dir_;
    std::set<std::string> before_;
};
// Removes the resource record that an upgrade of `name` in this process saved for the new
// version and, by rule, leaves in /var/tmp.
void removeResourceBackup(const std::string& name);

int cmdInfo(const std::vector<std::string>& args);
int cmdSystem(const std::vector<std::string>& args);
int cmdList(const std::vector<std::string>& args);
int cmdStatus(const std::vector<std::string>& args);
int cmdLog(const std::vector<std::string>& args);
int cmdVersionCompare(const std::vector<std::string>& args);
int cmdDeps(const std::vector<std::string>& args);
int cmdOrder(const std::vector<std::string>& args);
int cmdBuild(const std::vector<std::string>& args);
int cmdInspect(const std::vector<std::string>& args);
int cmdCheck(const std::vector<std::string>& args);
int cmdResource(const std::vector<std::string>& args);
int cmdJobs(const std::vector<std::string>& args);
int cmdStart(const std::vector<std::string>& args);
int cmdStop(const std::vector<std::string>& args);
int cmdRestart(const std::vector<std::string>& args);
int cmdWizard(const std::vector<std::string>& args);
int cmdInstall(const std::vector<std::string>& args);
int cmdUpgrade(const std::vector<std::string>& args);
int cmdRepair(const std::vector<std::string>& args);
int cmdUninstall(const std::vector<std::string>& args);
int cmdStore(const std::vector<std::string>& args);
int cmdFeed(const std::vector<std::string>& args);
int cmdAutoupdate(const std::vector<std::string>& args);
int cmdInstallAny(const std::vector<std::string>& args);  // a file or a store's package
int cmdUpgradeAny(const std::vector<std::string>& args);
int cmdDownload(const std::vector<std::string>& args);
int cmdTasks(const std::vector<std::string>& args);
int cmdCancel(const std::vector<std::string>& args);
int cmdUpdates(const std::vector<std::string>& args);
int cmdChkUpgradePkg(const std::vector<std::string>& args);
int cmdIcon(const std::vector<std::string>& args);
extern const char kStoreTaskUsage[];
int cmdStartAll(const std::vector<std::string>& args);
int cmdStopAll(const std::vector<std::string>& args);
int cmdServiceUp(const std::vector<std::string>& args);
int cmdServiceDown(const std::vector<std::string>& args);
extern const char kStartAllUsage[];
extern const char kServiceUpUsage[];
extern const char kWizardUsage[];

// The end of an operation: on success "<done> <name>" (and any "worker_msg"); on failure
// the result code's name, the library's reasons, and the result data and parameters.
int printOperationOutcome(const CommonOptions& opts, CORVPackageTool::PackageManager& pm,
                          int outcome, const char* done, const std::string& name,
                          const LogCapture& log);

}  // namespace cli
