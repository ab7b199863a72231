// corv-feasibility-check TYPE: the reference platform's feasibility checker. Before the
// system powers off (reboots, upgrades, removes a volume), it asks every check installed
// for TYPE whether it may: each config file <config dir of TYPE>/*.cfg (corv/feasibility.h)
// names a plug-in program, which runs with TYPE as its argument; exit 0 means feasible, and
// its first output line is the reason either way. One JSON verdict a line on standard
// output:
//   {"config": "<file>", "task": "...", "plugin": "...", "feasible": true|false,
//    "reason": "..."}
// A config file that does not parse, or whose plug-in can't run, gives "feasible": false.
// Exit status: 0 all feasible (also with no checks), 1 some check says no, 2 usage error.
#include <stdio.h>
#include <sys/wait.h>

#include <memory>
#include <string>

#include "corv/feasibility.h"
#include "corv/vlibc.h"
#include "json/json.h"

namespace {

// The plug-in's first output line and its verdict.
bool runPlugin(const std::string& plugin, const std::string& type, std::string& reason) {
    const char* argv[] = {plugin.c_str(), type.c_str(), nullptr};
    FILE* out = VLIBCPopenv(plugin.c_str(), "r", argv);
    if (out == nullptr) {
        reason = "cannot run " + plugin;
        return false;
    }
    char line[1024] = "";
    if (fgets(line, sizeof(line), out) != nullptr) {
        reason = line;
        if (!reason.empty() && reason.back() == '\n') {
            reason.pop_back();
        }
    }
    for (char rest[1024]; fgets(rest, sizeof(rest), out) != nullptr;) {
    }
    return VLIBCPclose(out) == 0;
}

Json::Value check(const std::string& dir, const std::string& name, const std::string& type) {
    Json::Value verdict(Json::objectValue);
    verdict["config"] = name;
    Json::Value config;
    Json::CharReaderBuilder builder;
    std::string errors;
    FILE* file = fopen((dir + "/" + name).c_str(), "re");
    std::string text;
    if (file != nullptr) {
        char buffer[4096];
        for (size_t got; (got = fread(buffer, 1, sizeof(buffer), file)) > 0;) {
            text.append(buffer, got);
        }
        fclose(file);
    }
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    if (!reader->parse(text.data(), text.data() + text.size(), &config, &errors) ||
        !config.isObject() || !config["plugin"].isString()) {
        verdict["feasible"] = false;
        verdict["reason"] = "unreadable check " + name;
        return verdict;
    }
    verdict["task"] = config["task"];
    verdict["plugin"] = config["plugin"];
    std::string reason;
    verdict["feasible"] = runPlugin(config["plugin"].asString(), type, reason);
    verdict["reason"] = reason;
    return verdict;
}

}  // namespace

int main(int argc, char** argv) {
    char dir[4096];
    if (argc != 2 || CORVFeasibilityCheckTypeValidate(argv[1], 2, dir, sizeof(dir)) != 0) {
        fprintf(stderr,
                "usage: corv-feasibility-check poweroff|reboot|upgrade|volume-remove\n");
        return 2;
    }
    PVLIBSZLIST names = VLIBCSzListAlloc(16);
    VLIBCFileEnumDir(dir, ".cfg", &names, 0);
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    int status = 0;
    for (int i = 0; VLIBCSzListGet(names, i) != nullptr; ++i) {
        Json::Value verdict = check(dir, VLIBCSzListGet(names, i), argv[1]);
        printf("%s\n", Json::writeString(writer, verdict).c_str());
        if (!verdict["feasible"].asBool()) {
            status = 1;
        }
    }
    VLIBCSzListFree(names);
    return status;
}
