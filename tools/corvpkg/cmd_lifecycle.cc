// corvpkg start, stop and restart: drive installed packages with their dependents.
#include <stdio.h>

#include <string>
#include <vector>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgvolume.h"
#include "progress.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

const char* optionalText(const CommonOptions& opts, const char* name) {
    auto it = opts.options.find(name);
    return it == opts.options.end() ? nullptr : it->second.c_str();
}

// The resource workers' messages ([{"sec", "key", "params"}]) in words, one line each.
void printWorkerMessages(const Json::Value& messages) {
    if (!messages.isArray()) {
        return;
    }
    for (const Json::Value& message : messages) {
        if (!message.isObject() || !message["key"].isString()) {
            continue;
        }
        Json::Value array(Json::arrayValue);
        array.append(message["sec"].asString() + ":" + message["key"].asString());
        for (const Json::Value& param : message["params"]) {
            array.append(param.isString() ? param.asString() : toString(param));
        }
        fprintf(stderr, "  %s\n",
                corvtext::oneLine(corvtext::textForMessage(array, failureContext())).c_str());
    }
}

}  // namespace

int printOperationOutcome(const CommonOptions& opts, PackageManager& pm, int outcome,
                          const char* done, const std::string& name, const LogCapture& log) {
    Json::Value data(Json::objectValue);
    pm.getResult(data["result"]);
    if (data["result"].isNull()) {
        data.removeMember("result");
    }
    Json::Value workerMsg = pm.getJsonParam("worker_msg");
    if (!(workerMsg.isString() && workerMsg.asString().empty())) {
        data["worker_msg"] = workerMsg;
    }
    Json::Value noSpace = pm.getJsonParam("no_space");
    if (noSpace.isObject()) {
        data["no_space"] = noSpace;
    }
    for (const char* key : {"deppkg", "oldver", "curver", "services"}) {
        const std::string value = pm.getMapParam(key);
        if (!value.empty()) {
            data[key] = value;
        }
    }
    if (outcome == 0) {
        const int status = printFailure(opts.json, pm.getResult(), log.reasons(),
                                        data.empty() ? Json::Value() : data);
        if (!opts.json) {
            printWorkerMessages(data["worker_msg"]);
        }
        return status;
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["package"] = name;
        out["action"] = done;
        if (data.isMember("worker_msg")) {
            out["worker_msg"] = data["worker_msg"];
        }
        printf("%s\n", toString(out).c_str());
    } else {
        printf("%s %s\n", done, name.c_str());
        printWorkerMessages(data["worker_msg"]);
    }
    return EXIT_OK;
}

namespace {

int startStop(const std::vector<std::string>& args, const char* command, bool start, bool restart) {
    CommonOptions opts;
    if (int status = parseSingle(args, command, "package name", opts, {{"--user", true}});
        status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    failureContext()["package"] = name;
    PackageManager pm;
    LogCapture log;
    // Without this a name that is not installed has no dependency order and counts as done.
    if (!PMSCheckPackage(name)) {
        return printFailure(opts.json, PKG_ERR_NOT_INSTALLED, name + " is not installed");
    }
    const char* language = opts.lang.empty() ? nullptr : opts.lang.c_str();
    // A stop takes the running dependents along; say which, in the order they go.
    std::string dependents;
    std::vector<std::string> order;
    if (!start && pm.getDependencyOrder(name.c_str(), order, false)) {
        for (const std::string& entry : order) {
            if (entry != name) {
                dependents += (dependents.empty() ? "" : ", ") + entry;
            }
        }
    }
    int outcome = 0;
    ProgressDisplay display(command);
    display.follow(name);
    if (restart) {
        outcome = pm.serviceControlRestart(name);
    } else {
        outcome =
            pm.serviceControl(static_cast<PKG_INSTALLATION_TYPE>(start ? 8 : 0x10), name, start,
                              language, optionalText(opts, "--user"), nullptr, true, true);
    }
    display.finish();
    int status = printOperationOutcome(
        opts, pm, outcome, restart ? "restarted" : (start ? "started" : "stopped"), name, log);
    if (status == EXIT_OK && !opts.json && !dependents.empty()) {
        printf("with the dependents that ran, %s: %s\n",
               restart ? "stopped before it and started after it" : "stopped before it",
               dependents.c_str());
    }
    return status;
}

}  // namespace

int cmdStart(const std::vector<std::string>& args) {
    return startStop(args, "start", true, false);
}

int cmdStop(const std::vector<std::string>& args) {
    return startStop(args, "stop", false, false);
}

int cmdRestart(const std::vector<std::string>& args) {
    return startStop(args, "restart", false, true);
}

}  // namespace cli
