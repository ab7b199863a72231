// corvpkg resource: what an installed package asks for, what it holds, which workers serve
// each section and run in each phase; and corvpkg resource update, which has the worker of
// one section change the running resource.
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

// Which workers serve each section of the request, over all phases; a section that no
// worker serves, or that isn't an object, is passed over by every phase and earns a
// warning.
bool sectionWorkers(const Json::Value& request, Json::Value& sections, Json::Value& warnings) {
    sections = Json::Value(Json::arrayValue);
    warnings = Json::Value(Json::arrayValue);
    if (!request.isObject()) {
        return true;
    }
    std::vector<std::vector<std::shared_ptr<Resource::WorkerProxy>>> byPhase;
    for (Resource::TIMING timing : kPhases) {
        byPhase.emplace_back();
        if (!Resource::FindRunnableWorkers(timing, byPhase.back())) {
            return false;
        }
    }
    for (const std::string& id : request.getMemberNames()) {
        Json::Value section(Json::objectValue);
        section["id"] = id;
        section["workers"] = Json::Value(Json::arrayValue);
        Json::Value& workers = section["workers"];
        for (size_t phase = 0; phase < byPhase.size(); ++phase) {
            for (const auto& proxy : byPhase[phase]) {
                if (proxy->GetResourceID() != id) {
                    continue;
                }
                const std::string interval = hex4(proxy->GetInterval());
                Json::Value* worker = nullptr;
                for (Json::Value& known : workers) {
                    if (known["provider"] == proxy->GetProvider() &&
                        known["interval"] == interval) {
                        worker = &known;
                    }
                }
                if (worker == nullptr) {
                    Json::Value added(Json::objectValue);
                    added["provider"] = proxy->GetProvider();
                    added["interval"] = interval;
                    added["phases"] = Json::Value(Json::arrayValue);
                    worker = &workers.append(added);
                }
                (*worker)["phases"].append(Resource::TimingWord(kPhases[phase]));
            }
        }
        if (!request[id].isObject()) {
            warnings.append("the section \"" + id +
                            "\" is not a JSON object: no worker runs for it");
        } else if (workers.empty()) {
            warnings.append("no worker handles the section \"" + id + "\": it is passed over");
        }
        sections.append(section);
    }
    return true;
}

void printText(const Json::Value& report) {
    printf("package: %s\n", report["package"].asCString());
    printf("request (%s, after substitution):\n", report["request_path"].asCString());
    printf("%s\n", report["request"].isNull() ? "  none" : pretty(report["request"]).c_str());
    printf("own (%s):\n", report["own_path"].asCString());
    printf("%s\n", report["own"].isNull() ? "  none" : pretty(report["own"]).c_str());
    printf("sections:\n");
    if (report["sections"].empty()) {
        printf("  none\n");
    }
    for (const Json::Value& section : report["sections"]) {
        std::string workers;
        for (const Json::Value& worker : section["workers"]) {
            std::string phases;
            for (const Json::Value& phase : worker["phases"]) {
                phases += (phases.empty() ? "" : ", ") + phase.asString();
            }
            workers += (workers.empty() ? "" : "; ") + worker["provider"].asString() + " " +
                       worker["interval"].asString() + " (" + phases + ")";
        }
        printf("  %-20s %s\n", section["id"].asCString(),
               workers.empty() ? "no worker" : workers.c_str());
    }
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

int showResource(const std::vector<std::string>& args) {
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
    if (!sectionWorkers(request, report["sections"], report["warnings"])) {
        return printFailure(opts.json, PKG_ERR_SYSTEM,
                            "the plug-in providers can't be read" +
                                (log.reasons().empty() ? "" : ": " + log.reasons()),
                            report);
    }

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
        for (const Json::Value& warning : report["warnings"]) {
            fprintf(stderr, "warning: %s\n", warning.asCString());
        }
    }
    return EXIT_OK;
}

// corvpkg resource update <name> <section> [--args JSON]: the worker of the section
// changes the package's running resource, under the package lock.
int updateResource(const std::vector<std::string>& args) {
    const Command& self = findCommand("resource");
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--args", true}})) {
        return EXIT_USAGE;
    }
    if (opts.positional.size() != 2) {
        return usageError(self, "give a package name and a section to update");
    }
    const std::string& name = opts.positional[0];
    const std::string& id = opts.positional[1];
    Json::Value helperArgs(Json::objectValue);
    if (opts.has("--args") &&
        (!fromString(opts.options["--args"], helperArgs) || !helperArgs.isObject())) {
        return usageError(self, "--args must be a JSON object");
    }
    PackageInfo info;
    if (!isPackageName(name) ||
        !PMSLoadPKGInfoFile("/var/packages/" + name, info, nullptr, PKG_INFO_MASK_ALL)) {
        return printFailure(opts.json, PKG_ERR_NOT_INSTALLED, name + " is not installed");
    }
    if (!PackageManager::ExLock(180)) {
        return printFailure(opts.json, PKG_ERR_LOCKED, "another package operation is running");
    }
    LogCapture log;
    CORV::PkgUtils::WorkerResp resp;
    VLIBCErrSetEx(0, "", 0);
    const bool updated = Resource::Update(info, id, helperArgs, resp);
    const int error = VLIBCErrGet();
    PackageManager::UnLock();

    Json::Value data(Json::objectValue);
    data["package"] = name;
    data["section"] = id;
    data["worker_msg"] = resp.GetErrJsonArray();
    if (!updated) {
        data["error"] = hex4(static_cast<unsigned int>(error));
        const std::string why = error == ERR_NOT_APPLICABLE
                                    ? "the worker of \"" + id + "\" does not update"
                                    : "the update of \"" + id + "\" failed";
        const std::string reasons = log.reasons();
        return printFailure(opts.json, PKG_ERR_SYSTEM,
                            why + (reasons.empty() ? "" : ": " + reasons), data);
    }
    if (opts.json) {
        data["success"] = true;
        printf("%s\n", toString(data).c_str());
    } else {
        printf("updated %s of %s\n", id.c_str(), name.c_str());
    }
    return EXIT_OK;
}

}  // namespace

int cmdResource(const std::vector<std::string>& args) {
    size_t positional = 0;
    for (const std::string& arg : args) {
        positional += arg.compare(0, 2, "--") == 0 ? 0 : 1;
    }
    // "update" is a package name too, when it comes alone.
    if (!args.empty() && args[0] == "update" && positional > 1) {
        return updateResource(std::vector<std::string>(args.begin() + 1, args.end()));
    }
    return showResource(args);
}

}  // namespace cli
