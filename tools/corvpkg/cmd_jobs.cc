// corvpkg jobs: a package's generated init job and service file, and their state in the
// service manager.
#include <stdio.h>

#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "cli.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"
#include "corvpkg/service.h"

namespace cli {

namespace {

using namespace CORVPackageTool;

// Null when the file is not there: "absent" is an answer, not a failure.
Json::Value fileText(const std::string& path) {
    std::ifstream in(path);
    if (!in) {
        return Json::Value();
    }
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// The init system's own words for the job ("pkgctl-x stop/waiting"), or "" when unknown.
std::string jobStatus(const std::string& job) {
    FILE* pipe = VLIBCPopen("/sbin/initctl", "r", "status", job.c_str(), nullptr);
    if (pipe == nullptr) {
        return "";
    }
    std::string out;
    char buffer[256];
    while (fgets(buffer, sizeof(buffer), pipe) != nullptr) {
        out += buffer;
    }
    const int status = VLIBCPclose(pipe);
    while (!out.empty() && (out.back() == '\n' || out.back() == '\r')) {
        out.pop_back();
    }
    return status == 0 ? out : "";
}

void printSection(const char* title, const std::string& path, const Json::Value& text) {
    printf("%s (%s):\n", title, path.c_str());
    if (text.isNull()) {
        printf("  absent\n");
        return;
    }
    std::istringstream lines(text.asString());
    std::string line;
    while (std::getline(lines, line)) {
        if (line.empty()) {
            printf("\n");
        } else {
            printf("  %s\n", line.c_str());
        }
    }
}

}  // namespace

int cmdJobs(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "jobs", "package name", opts); status >= 0) {
        return status;
    }
    const std::string name = opts.positional[0];
    if (name.empty() || name.find('/') != std::string::npos || name == "." || name == ".." ||
        VLIBCFileCheckDir(("/var/packages/" + name).c_str()) != 1) {
        return printFailure(opts.json, PKG_ERR_NOT_INSTALLED, name + " is not installed");
    }
    const std::string job = Service::PackageJobName(name);
    Json::Value report(Json::objectValue);
    report["package"] = name;
    report["job"] = job;
    report["job_path"] = Service::JobAdapterPath(name);
    report["job_text"] = fileText(Service::JobAdapterPath(name));
    report["service_cfg_path"] = Service::ServiceCfgPath(name);
    report["service_cfg"] = fileText(Service::ServiceCfgPath(name));
    const std::string status = jobStatus(job);
    report["job_known"] = !status.empty();
    report["job_status"] = status;
    report["running"] = VLIBServicectlIsJobRunning(job.c_str(), 0) == 1;
    report["service_enabled"] = VLIBServiceIsEnabled(job.c_str()) == 1;
    Json::Value own;
    report["package_jobs"] =
        Resource::GetOwnObject(name, "service-cfg", own) && own["jobs"].isArray()
            ? own["jobs"]
            : Json::Value(Json::arrayValue);

    if (opts.json) {
        printf("%s\n", toString(report).c_str());
        return EXIT_OK;
    }
    printf("package: %s\n", name.c_str());
    printf("job: %s (%s)\n", job.c_str(),
           status.empty() ? "unknown to the init system" : status.c_str());
    printf("running: %s\n", report["running"].asBool() ? "yes" : "no");
    printf("service enabled: %s\n", report["service_enabled"].asBool() ? "yes" : "no");
    printf("package jobs:");
    for (const Json::Value& each : report["package_jobs"]) {
        printf(" %s", each.asCString());
    }
    printf("%s\n", report["package_jobs"].empty() ? " none" : "");
    printSection("job adapter", report["job_path"].asString(), report["job_text"]);
    printSection("service configuration", report["service_cfg_path"].asString(),
                 report["service_cfg"]);
    return EXIT_OK;
}

}  // namespace cli
