// corvpkg resource: what an installed package asks for, what it holds, and which workers
// would run for it in each phase.
#include <stdio.h>

#include <memory>
#include <string>
#include <vector>

#include "cli.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/resource.h"
#include "corvpkg/worker.h"

namespace cli {

namespace {

using namespace CORVPackageTool;

const Resource::TIMING kPhases[] = {
    Resource::TIMING_PREINST, Resource::TIMING_POSTINST,  Resource::TIMING_ENABLE,
    Resource::TIMING_STARTUP, Resource::TIMING_PREUNINST, Resource::TIMING_POSTUNINST,
    Resource::TIMING_DISABLE, Resource::TIMING_HALT,
};

bool isAcquirePhase(unsigned int timing) {
    return (timing & 0x0F) != 0;
}

std::string hex4(unsigned int value) {
    char text[16];
    snprintf(text, sizeof(text), "0x%04X", value);
    return text;
}

// Indented JSON, every line shifted under its heading.
std::string pretty(const Json::Value& value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    builder["emitUTF8"] = true;
    std::string text = "  " + Json::writeString(builder, value);
    for (size_t at = text.find('\n'); at != std::string::npos; at = text.find('\n', at + 1)) {
        text.insert(at + 1, "  ");
    }
    return text;
}

bool isPackageName(const std::string& name) {
    return !name.empty() && name != "." && name != ".." && name.find('/') == std::string::npos;
}

// A file that may be missing (null then), and must otherwise hold a JSON object.
bool readObject(const std::string& path, Json::Value& out, std::string& why) {
    out = Json::Value();
    if (!Resource::ReadJsonFile(path, out)) {
        if (VLIBCErrGet() == ERR_NO_SUCH_FILE) {
            out = Json::Value();
            return true;
        }
        why = path + " is not valid JSON";
        return false;
    }
    if (!out.isObject()) {
        why = path + " is not a JSON object";
        return false;
    }
    return true;
}

// The workers that a phase would run for this package, in the order they would run:
// acquire phases run the ids that the request asks for, release phases (in reverse) the
// ids that the own-file holds.
bool phaseWorkers(Resource::TIMING timing, const Json::Value& request, const Json::Value& own,
                  Json::Value& out) {
    std::vector<std::shared_ptr<Resource::WorkerProxy>> proxies;
    if (!Resource::FindRunnableWorkers(timing, proxies)) {
        return false;
    }
    out = Json::Value(Json::arrayValue);
    const bool acquire = isAcquirePhase(timing);
    std::vector<std::shared_ptr<Resource::WorkerProxy>> order(proxies);
    if (!acquire) {
        order.assign(proxies.rbegin(), proxies.rend());
    }
    for (const auto& proxy : order) {
        const std::string& id = proxy->GetResourceID();
        bool runs = acquire ? request.isObject() && request[id].isObject()
                            : own.isObject() && own.isMember(id);
        if (!runs) {
            continue;
        }
        Json::Value worker(Json::objectValue);
        worker["id"] = id;
        worker["provider"] = proxy->GetProvider();
        worker["interval"] = hex4(proxy->GetInterval());
        out.append(worker);
    }
    return true;
}

void printText(const Json::Value& report) {
    printf("package: %s\n", report["package"].asCString());
    printf("request (%s, after substitution):\n", report["request_path"].asCString());
    printf("%s\n", report["request"].isNull() ? "  none" : pretty(report["request"]).c_str());
    printf("own (%s):\n", report["own_path"].asCString());
    printf("%s\n", report["own"].isNull() ? "  none" : pretty(report["own"]).c_str());
    printf("workers by phase:\n");
    for (const Json::Value& phase : report["phases"]) {
        std::string names;
        for (const Json::Value& worker : phase["workers"]) {
            names += (names.empty() ? "" : ", ") + worker["id"].asString() + " (" +
                     worker["provider"].asString() + ", " + worker["interval"].asString() + ")";
        }
        printf("  %-11s %-8s %s\n", phase["phase"].asCString(), phase["call"].asCString(),
               names.empty() ? "-" : names.c_str());
    }
}

}  // namespace

int cmdResource(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "resource", "package name", opts); status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    if (!isPackageName(name) || VLIBCFileExist(("/var/packages/" + name + "/INFO").c_str()) != 1) {
        return printFailure(opts.json, PKG_ERR_NOT_INSTALLED, name + " is not installed");
    }

    LogCapture log;
    Json::Value report(Json::objectValue);
    report["package"] = name;
    report["request_path"] = Resource::RequestFilePath(name, "");
    report["own_path"] = Resource::OwnFilePath(name, "");

    std::string why;
    Json::Value request;
    if (!readObject(report["request_path"].asString(), request, why)) {
        return printFailure(opts.json, PKG_ERR_BROKEN, why);
    }
    // As the phases without wizard answers see it: every placeholder left is dropped.
    if (!request.isNull() && !Util::ReplaceVariables(Json::Value(Json::objectValue), request)) {
        return printFailure(opts.json, PKG_ERR_BROKEN, "substitution failed");
    }
    Json::Value own;
    if (!readObject(report["own_path"].asString(), own, why)) {
        return printFailure(opts.json, PKG_ERR_BROKEN, why);
    }
    report["request"] = request;
    report["own"] = own;

    report["phases"] = Json::Value(Json::arrayValue);
    for (Resource::TIMING timing : kPhases) {
        Json::Value phase(Json::objectValue);
        phase["phase"] = Resource::TimingWord(timing);
        phase["timing"] = static_cast<unsigned int>(timing);
        phase["call"] = isAcquirePhase(timing) ? "acquire" : "release";
        Json::Value workers;
        if (!phaseWorkers(timing, request, own, workers)) {
            std::string reason = log.reasons();
            return printFailure(
                opts.json, PKG_ERR_SYSTEM,
                "the plug-in providers can't be read" + (reason.empty() ? "" : ": " + reason),
                report);
        }
        phase["workers"] = workers;
        report["phases"].append(phase);
    }

    if (opts.json) {
        printf("%s\n", toString(report).c_str());
    } else {
        printText(report);
    }
    return EXIT_OK;
}

}  // namespace cli
