// corvpkg start-all, stop-all, service-up and service-down: many packages at once, as at
// boot, at shutdown, and when a system service goes up or down.
#include <stdio.h>

#include <set>
#include <string>
#include <vector>

#include "cli.h"
#include "corvpkg/corvpkg.h"

namespace cli {

using namespace CORVPackageTool;

const char kStartAllUsage[] =
    "usage: corvpkg start-all|stop-all [--filter ITEMS --key KEY] [--quiet] [--json]\n"
    "\n"
    "Starts (stops) every installed package in dependency order, as at boot (shutdown):\n"
    "dependencies start first and stop last. Only packages with their enabled flag, or\n"
    "that cannot be stopped by the user, are driven; the flags stay as they are (paused\n"
    "jobs are resumed). A start reloads the daemons that the started packages name.\n"
    "Progress is one JSON object a line: status begin, end or skip, action, id, number\n"
    "and total.\n"
    "  --filter ITEMS  comma-separated items, with --key: a package whose\n"
    "                  /var/packages/<name>/etc/corvpkg_conf/reg_<KEY> (a JSON array of\n"
    "                  strings) names none of them is skipped; one without the file is not\n"
    "  --key KEY       the kind of the items, such as volume\n"
    "  --quiet         no progress lines\n"
    "Exit status: 0 when every package went, 1 when one failed (the others still went),\n"
    "2 usage error.\n";

const char kServiceUpUsage[] =
    "usage: corvpkg service-up|service-down <service>... [--quiet] [--json]\n"
    "\n"
    "Starts (stops) the enabled packages that need one of the system services, such as\n"
    "ssh-shell or pgsql, as when the service has come up (is going down), and reloads the\n"
    "daemons that they name. Their enabled flags stay as they are.\n"
    "  --quiet  no progress lines\n"
    "Exit status: 0 when every package went, 1 when one failed, 2 usage error.\n";

namespace {

int printBulkOutcome(const CommonOptions& opts, int outcome, const char* what,
                     const LogCapture& log) {
    if (outcome == 0) {
        return printFailure(opts.json, PKG_ERR_START_FAILED, log.reasons());
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["action"] = what;
        printf("%s\n", toString(out).c_str());
    } else {
        printf("%s\n", what);
    }
    return EXIT_OK;
}

int allPackages(const std::vector<std::string>& args, const char* command, bool start) {
    const Command& self = findCommand(command);
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--filter", true}, {"--key", true}, {"--quiet", false}})) {
        return EXIT_USAGE;
    }
    if (!opts.positional.empty()) {
        return usageError(self, "unexpected argument " + opts.positional[0]);
    }
    if (opts.has("--filter") != opts.has("--key")) {
        return usageError(self, "--filter and --key go together");
    }
    if (opts.has("--key") && opts.options["--key"].empty()) {
        return usageError(self, "--key takes a kind, such as volume");
    }
    const char* filter = opts.has("--filter") ? opts.options["--filter"].c_str() : nullptr;
    const char* key = opts.has("--key") ? opts.options["--key"].c_str() : nullptr;
    PackageManager pm;
    LogCapture log;
    int outcome = pm.serviceControlOnOffALL(start, !opts.has("--quiet"), filter, key);
    return printBulkOutcome(opts, outcome, start ? "started all" : "stopped all", log);
}

int byService(const std::vector<std::string>& args, const char* command, bool start) {
    const Command& self = findCommand(command);
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--quiet", false}})) {
        return EXIT_USAGE;
    }
    if (opts.positional.empty()) {
        return usageError(self, "missing service name");
    }
    std::set<std::string> services(opts.positional.begin(), opts.positional.end());
    PackageManager pm;
    LogCapture log;
    int outcome = pm.serviceControlByService(services, start, !opts.has("--quiet"));
    return printBulkOutcome(
        opts, outcome,
        start ? "started the packages that need it" : "stopped the packages that need it", log);
}

}  // namespace

int cmdStartAll(const std::vector<std::string>& args) {
    return allPackages(args, "start-all", true);
}

int cmdStopAll(const std::vector<std::string>& args) {
    return allPackages(args, "stop-all", false);
}

int cmdServiceUp(const std::vector<std::string>& args) {
    return byService(args, "service-up", true);
}

int cmdServiceDown(const std::vector<std::string>& args) {
    return byService(args, "service-down", false);
}

}  // namespace cli
