#include "cli.h"

#include <stdio.h>
#include <string.h>

#include <algorithm>

#include "corv/log.h"
#include "corvpkg/corvpkg.h"

namespace cli {

bool parseCommon(const std::vector<std::string>& args, const Command& command, CommonOptions& out,
                 const std::vector<std::string>& extra, std::vector<std::string>* flags) {
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string& arg = args[i];
        if (arg == "--json") {
            out.json = true;
        } else if (arg == "--lang") {
            if (i + 1 >= args.size()) {
                usageError(command, "--lang needs a language code, such as enu or ger");
                return false;
            }
            out.lang = args[++i];
        } else if (arg.rfind("--lang=", 0) == 0) {
            out.lang = arg.substr(7);
        } else if (std::find(extra.begin(), extra.end(), arg) != extra.end() && flags) {
            flags->push_back(arg);
        } else if (arg.size() > 1 && arg[0] == '-') {
            usageError(command, "unknown option " + arg);
            return false;
        } else {
            out.positional.push_back(arg);
        }
    }
    return true;
}

int printFailure(bool json, int code, const std::string& reason, const Json::Value& data) {
    const CORVPackageTool::PKG_ERRCODE_INFO* info = CORVPackageTool::PMSGetErrCodeInfo(code);
    const char* name = info ? info->name : "PKG_ERR_UNKNOWN";
    if (json) {
        Json::Value out(Json::objectValue);
        out["success"] = false;
        out["code"] = code;
        out["name"] = name;
        out["reason"] = reason;
        if (!data.isNull()) {
            out["data"] = data;
        }
        printf("%s\n", CORVPackageTool::toString(out).c_str());
    } else {
        fprintf(stderr, "error: %s (%d): %s\n", name, code, reason.c_str());
        if (!data.isNull()) {
            fprintf(stderr, "data: %s\n", CORVPackageTool::toString(data).c_str());
        }
    }
    return EXIT_FAILED;
}

int usageError(const Command& command, const std::string& message) {
    fprintf(stderr, "corvpkg %s: %s\n\n%s", command.name, message.c_str(), command.usage);
    return EXIT_USAGE;
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
