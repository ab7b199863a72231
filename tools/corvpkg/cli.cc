#include "cli.h"

#include <sys/stat.h>
#include <unistd.h>

#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <algorithm>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"

namespace cli {

const Command& findCommand(const char* name) {
    for (const Command& command : commands()) {
        if (strcmp(command.name, name) == 0) {
            return command;
        }
    }
    abort();  // only called with the names of the table
}

std::string languageOf(const CommonOptions& opts) {
    if (!opts.lang.empty()) {
        return opts.lang;
    }
    char value[256] = {0};
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "language", value, sizeof value, 0) > 0) {
        return value;
    }
    return "enu";
}

bool parseCommon(const std::vector<std::string>& args, const Command& command, CommonOptions& out,
                 const std::vector<OptionSpec>& extra) {
    std::vector<OptionSpec> specs = {{"--json", false}, {"--lang", true},     {"--quiet", false},
                                     {"-q", false},     {"--verbose", false}, {"-v", false}};
    specs.insert(specs.end(), extra.begin(), extra.end());
    bool optionsEnded = false;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string& arg = args[i];
        // "--" ends the options, so that a package named "-x" can still be addressed.
        if (!optionsEnded && arg == "--") {
            optionsEnded = true;
            continue;
        }
        if (optionsEnded || arg.size() < 2 || arg[0] != '-') {
            out.positional.push_back(arg);
            continue;
        }
        std::string name = arg;
        std::string value;
        bool inlineValue = false;
        size_t eq = arg.find('=');
        if (eq != std::string::npos) {
            name = arg.substr(0, eq);
            value = arg.substr(eq + 1);
            inlineValue = true;
        }
        auto spec = std::find_if(specs.begin(), specs.end(),
                                 [&](const OptionSpec& s) { return name == s.name; });
        if (spec == specs.end()) {
            usageError(command, "unknown option " + arg);
            return false;
        }
        if (spec->takesValue && !inlineValue) {
            if (i + 1 >= args.size()) {
                usageError(command, name + " needs a value");
                return false;
            }
            value = args[++i];
        } else if (!spec->takesValue && inlineValue) {
            usageError(command, name + " takes no value");
            return false;
        }
        if (name == "--json") {
            out.json = true;
            verbosity().json = true;
        } else if (name == "--quiet" || name == "-q") {
            verbosity().quiet = true;
        } else if (name == "--verbose" || name == "-v") {
            verbosity().verbose = true;
        } else if (name == "--lang") {
            out.lang = value;
        } else {
            out.options[name] = value;
        }
    }
    return true;
}

int parseSingle(const std::vector<std::string>& args, const char* command, const char* what,
                CommonOptions& out, const std::vector<OptionSpec>& extra) {
    const Command& self = findCommand(command);
    if (!parseCommon(args, self, out, extra)) {
        return EXIT_USAGE;
    }
    if (out.positional.size() != 1) {
        return usageError(self, std::string("give exactly one ") + what);
    }
    return -1;
}

namespace {

std::string inMiB(const Json::Value& bytes) {
    char text[64];
    snprintf(text, sizeof(text), "%.1f MiB", bytes.asDouble() / (1024.0 * 1024.0));
    return text;
}

}  // namespace

// A failure that came from a full volume, in words: a damaged-archive code alone would
// send the user after the file.
void printNoSpace(const Json::Value& data) {
    if (!data.isObject()) {
        return;
    }
    const Json::Value& space =
        data.isMember("no_space") ? data["no_space"] : data["data"]["no_space"];
    if (!space.isObject()) {
        return;
    }
    fprintf(stderr, "the volume %s is full: %s (%s bytes) needed, %s (%s bytes) free\n",
            space["volume"].asString().c_str(), inMiB(space["needed"]).c_str(),
            space["needed"].asString().c_str(), inMiB(space["free"]).c_str(),
            space["free"].asString().c_str());
}

namespace {

// The named values of a failure's data that its words can use.
corvtext::Params textParams(const Json::Value& data) {
    corvtext::Params params = failureContext();
    if (!data.isObject()) {
        return params;
    }
    for (const char* key : {"deppkg", "oldver", "curver", "services", "file", "holder"}) {
        if (data[key].isString()) {
            params[key] = data[key].asString();
        }
    }
    // The dependents come as a JSON array in text; a person reads a list.
    Json::Value names;
    if (CORVPackageTool::fromString(params["deppkg"], names) && names.isArray()) {
        std::string list;
        for (const Json::Value& name : names) {
            list += (list.empty() ? "" : ", ") + (name.isString() ? name.asString() : "?");
        }
        params["deppkg"] = list;
    }
    const Json::Value& inner = data["data"];
    const Json::Value& space = data.isMember("no_space") ? data["no_space"]
                               : inner.isObject()        ? inner["no_space"]
                                                         : Json::Value::nullSingleton();
    if (space.isObject()) {
        params["volume"] = space["volume"].asString();
        params["needed"] = inMiB(space["needed"]);
        params["free"] = inMiB(space["free"]);
    }
    return params;
}

}  // namespace

int printFailure(bool json, int code, const std::string& reason, const Json::Value& data) {
    json = json || verbosity().json;
    const CORVPackageTool::PKG_ERRCODE_INFO* info = CORVPackageTool::PMSGetErrCodeInfo(code);
    const char* name = info ? info->name : "PKG_ERR_UNKNOWN";
    // The key the desktop would translate for this failure, so scripts can do the same.
    const char* key = info ? (info->installMsg ? info->installMsg : info->checkReport) : nullptr;
    const corvtext::Params params = textParams(data);
    // A refusal's report names the case more closely than its code (which dependency is
    // missing, which port is taken).
    const Json::Value& report = data.isObject() ? data["report"] : Json::Value::nullSingleton();
    if (report.isArray() && !report.empty() && report[0].isString()) {
        key = report[0].asCString();
    }
    const corvtext::Text text = report.isArray() && !report.empty()
                                    ? corvtext::textForMessage(report, params)
                                    : corvtext::textForCode(code, params);
    if (json) {
        Json::Value out(Json::objectValue);
        out["success"] = false;
        out["code"] = code;
        out["name"] = name;
        out["message"] = text.sentence;
        out["remedy"] = text.remedy;
        out["reason"] = !reason.empty() || !info ? reason : info->meaning;
        if (key) {
            out["message_key"] = key;
        }
        if (!data.isNull()) {
            out["data"] = data;
        }
        printJson(out);
        return EXIT_FAILED;
    }
    fprintf(stderr, "error: %s\n", text.sentence.c_str());
    // The reason adds what the sentence does not say already.
    if (!reason.empty() && text.sentence.find(reason) == std::string::npos) {
        fprintf(stderr, "  %s\n", reason.c_str());
    }
    if (!text.remedy.empty()) {
        fprintf(stderr, "hint: %s\n", text.remedy.c_str());
    }
    if (verbosity().verbose) {
        fprintf(stderr, "result: %s (%d)\n", name, code);
        if (key) {
            fprintf(stderr, "message key: %s\n", key);
        }
        if (!data.isNull()) {
            fprintf(stderr, "data: %s\n", CORVPackageTool::toString(data).c_str());
        }
    }
    return EXIT_FAILED;
}

void printJson(const Json::Value& object) {
    printf("%s\n", CORVPackageTool::toString(object).c_str());
}

Verbosity& verbosity() {
    static Verbosity state;
    return state;
}

corvtext::Params& failureContext() {
    static corvtext::Params context;
    return context;
}

bool isReadableFile(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode) && access(path.c_str(), R_OK) == 0;
}

namespace {

int reportUsage(const std::string& message, const std::string& usage, const std::string& help) {
    if (verbosity().json) {
        Json::Value out(Json::objectValue);
        out["success"] = false;
        out["name"] = "USAGE";
        out["message"] = message;
        out["remedy"] = "see '" + help + "'";
        out["usage"] = usage;
        printJson(out);
    } else {
        fprintf(stderr, "corvpkg: %s\n%s\nsee '%s'\n", message.c_str(), usage.c_str(),
                help.c_str());
    }
    return EXIT_USAGE;
}

}  // namespace

int usageError(const Command& command, const std::string& message) {
    // The first usage line is enough to see the slip; the rest is one --help away.
    const std::string usage = command.usage;
    return reportUsage(std::string(command.name) + ": " + message,
                       usage.substr(0, usage.find('\n')),
                       std::string("corvpkg ") + command.name + " --help");
}

int programUsageError(const std::string& message) {
    return reportUsage(message, "usage: corvpkg <command> [options]", "corvpkg --help");
}

LogCapture::LogCapture() {
    CORVLogSetSink([this](int, const std::string& line) { lines_.push_back(line); });
}

LogCapture::~LogCapture() {
    CORVLogSetSink(nullptr);
}

std::string LogCapture::reasons() const {
    std::string out;
    for (const std::string& line : lines_) {
        // Lines start with "file.cc:123 "; a person wants only what follows.
        size_t space = line.find(' ');
        std::string text = space == std::string::npos ? line : line.substr(space + 1);
        if (!out.empty()) {
            out += "; ";
        }
        out += text;
    }
    return out;
}

}  // namespace cli
