// corvpkg: the command line over libcorvpkg.
#include <stdio.h>
#include <string.h>

#include <algorithm>
#include <string>
#include <vector>

#include "cli.h"
#include "cmd_kit.h"
#include "corvpkg/corvpkg.h"

namespace cli {

namespace {

// install, upgrade and repair are one command under three names.
const char kInstallUsage[] =
    "usage: corvpkg install|upgrade|repair <file.cpk | name>\n"
    "               [--volume V] [--no-start] [--answers F.json]\n"
    "               [--defaults] [--lang L] [--ignore-dependents] [--no-verify]\n"
    "               [--user U] [--json]\n"
    "       corvpkg upgrade --all [--defaults] [--json]\n"
    "\n"
    "install, upgrade and repair are one entrance: the engine compares the file with\n"
    "what is installed and installs it fresh, upgrades the installed version (the\n"
    "same version counts as an upgrade), or repairs a broken installation.\n"
    "First the installability checks run (architecture, OS version, dependencies,\n"
    "conflicts, signature); a refusal says why and what to do. When the package has\n"
    "an install wizard, its questions are asked one by one on a terminal (Enter takes\n"
    "the default); elsewhere they must be answered with --answers or --defaults. An\n"
    "answer whose key no question has is refused, with the keys there are.\n"
    "A name that is no file here is a store's package: the maker store's order of it\n"
    "and what it depends on (or the feed's package alone) is downloaded, each with a\n"
    "progress bar on a terminal and its checksum checked, and each package that is\n"
    "missing or older is installed in that order as a file would be. A package that\n"
    "asks questions needs --answers (the named package only) or --defaults before\n"
    "anything is installed. upgrade --all does this for every update that \"corvpkg\n"
    "updates\" lists.\n"
    "  --volume V           the volume for a fresh install (a saved default volume wins)\n"
    "  --no-start           leave a newly installed package stopped (an upgrade or\n"
    "                       repair brings back the state the package had)\n"
    "  --answers F.json     the wizard's answers, a JSON object of key: value\n"
    "  --defaults           take the wizard's default answers (for those not in F.json)\n"
    "  --lang L             language of the wizard and messages (default enu)\n"
    "  --ignore-dependents  upgrade even when running packages depend on this one\n"
    "  --no-verify          install an unsigned or untrusted file\n"
    "  --user U             the user on whose behalf it runs\n"
    "  -q, --quiet          print only the outcome\n"
    "  -v, --verbose        also every command and script it runs, and the result code\n"
    "Progress goes to standard error, one line per phase (checking, unpacking, running\n"
    "scripts, starting); on a terminal each line is redrawn in place, with the bytes\n"
    "unpacked. A wait for the package lock says which process holds it. The outcome\n"
    "prints what the scripts left in their message file.\n"
    "Exit status: 0 done, 1 failed or refused, 2 usage error (also: questions left\n"
    "unanswered).\n";

}  // namespace

const std::vector<Command>& commands() {
    static const std::vector<Command> table = {
        {"info", "show a package directory's INFO as the engine reads it",
         "usage: corvpkg info <package-dir> [--json] [--lang L]\n"
         "\n"
         "Reads <package-dir>/INFO (and conf/PKG_DEPS, conf/PKG_CONX) with every key\n"
         "selected and prints the record.\n"
         "  --json     print the record as one JSON object\n"
         "  --lang L   language of the display name and description (enu, ger, ...);\n"
         "             default: the system's language\n"
         "Exit status: 0 when the INFO is valid, 1 when it is not, 2 for a usage error.\n",
         cmdInfo},
        {"system", "show the OS, architecture, volumes and temporary space",
         "usage: corvpkg system [--size BYTES] [--json]\n"
         "\n"
         "Shows the OS version, the platform code and architecture mask, the model, every\n"
         "volume with its free space and readiness, the default volume for packages, and\n"
         "the temporary directory that an install of BYTES bytes would use (default 0).\n"
         "  --size BYTES  size of the install to plan temporary space for\n"
         "  --json        print one JSON object\n",
         cmdSystem},
        {"list", "list the installed packages with version, status and volume",
         "usage: corvpkg list [--volume V] [--json] [--lang L]\n"
         "\n"
         "Lists the packages of /var/packages sorted by name, each with its version,\n"
         "its status (asked of its own status script) and the volume it lives on.\n"
         "  --volume V  only the packages on volume V (for example /volume1)\n"
         "  --json      print an array of objects\n",
         cmdList},
        {"status", "show the status of one installed package",
         "usage: corvpkg status <name> [--json]\n"
         "\n"
         "Shows the package's status number and its meaning, and its rough status\n"
         "(bits: 1 installed, 2 running, 4 broken).\n"
         "Exit status: 0 running, 1 installed but not running, 2 broken, 3 not installed,\n"
         "4 unknown (the status could not be found out).\n",
         cmdStatus},
        {"log", "print a package's own log, through its control script",
         "usage: corvpkg log <name> [--json]\n"
         "\n"
         "Runs the package's start-stop-status script with the argument \"log\" and prints\n"
         "what it prints. Exit status 1, with the reason, when that fails.\n",
         cmdLog},
        {"version-compare", "compare two versions as the engine does",
         "usage: corvpkg version-compare <a> <op> <b>\n"
         "\n"
         "Compares version <a> with version <b>: op is one of = > < >= <= (or eq gt lt\n"
         "ge le). Versions are compared number by number after bringing both to the same\n"
         "count of dotted parts; \".\" and \"-\" delimit alike (1.2 = 1.2.0, 1.2-0045 = 1.2-45).\n"
         "Exit status: 0 when the relation holds, 1 when it does not, 2 for a usage error.\n",
         cmdVersionCompare},
        {"deps", "show what a package needs, what needs it, and its stop order",
         "usage: corvpkg deps <name> [--json] [--lang L]\n"
         "\n"
         "Shows the installed package's dependencies with their bounds, the installed\n"
         "packages that depend on it, and the order in which it and its running dependents\n"
         "are stopped (dependents first).\n"
         "Exit status: 1 when the package is not installed or the dependencies form a cycle.\n",
         cmdDeps},
        {"order", "show the install order of everything installed",
         "usage: corvpkg order [--json]\n"
         "\n"
         "Prints every installed package, each after the packages it depends on.\n"
         "Exit status: 1 with PKG_ERR_DEPENDENCY_CYCLE when the dependencies form a cycle.\n",
         cmdOrder},
        {"build", "make a package file from a package source directory",
         "usage: corvpkg build <source-dir> [-o file.cpk] [--sign KEY] [--json]\n"
         "\n"
         "Packs <source-dir>/package/ into package.tgz, writes its MD5 into the INFO's\n"
         "checksum, and writes an uncompressed .cpk with INFO, package.tgz and, when\n"
         "present, scripts/, conf/, WIZARD_UIFILES/, LICENSE and the icons. The source's\n"
         "INFO must read as the engine reads it (package, version, maintainer, description).\n"
         "  -o FILE     the package file (default <package>-<version>.cpk)\n"
         "  --sign KEY  sign with the platform's signature tool, KEY from the caller's keyring\n"
         "  --force     build although corvpkg lint finds errors (warnings never stop it)\n",
         cmdBuild},
        {"lint", "check a package source or file for what the engine would refuse or drop",
         "usage: corvpkg lint <source-dir | file.cpk> [--json]\n"
         "\n"
         "Checks the package by the rules the engine reads it with: INFO keys and values\n"
         "(required keys, the name, version form, arch tokens, yes/no values, adminport, OS\n"
         "versions, unknown keys), dependency lists in INFO, conf/PKG_DEPS and conf/PKG_CONX,\n"
         "the wizard files' JSON, conf/resource against the workers of this system,\n"
         "conf/privilege, the scripts' execute bits, and that control members are files.\n"
         "Prints one line per finding: error or warning, the file, what is wrong, the fix.\n"
         "  --json     print an array of {severity, file, problem, fix}\n"
         "Exit status: 0 no errors (warnings allowed), 1 errors, 2 usage error.\n",
         cmdLint},
        {"new", "write a package source directory to start from",
         "usage: corvpkg new <package-name> [dir] [--json]\n"
         "\n"
         "Writes a package source for <package-name> into [dir] (default: ./<package-name>;\n"
         "it must not exist or be empty): INFO, a payload program package/bin/<name>-daemon, a\n"
         "start-stop-status that starts, stops and asks it, the other six scripts, an empty\n"
         "install wizard and an empty conf/resource, each commented on what goes in it. It\n"
         "lints clean and builds, installs and starts as it stands.\n"
         "Exit status: 0 written, 1 failed (an illegal name, a directory in use), 2 usage\n"
         "error.\n",
         cmdNew},
        {"inspect", "show a package file's record, scripts, checksum and signature",
         "usage: corvpkg inspect <file.cpk> [--json] [--lang L]\n"
         "\n"
         "Reads INFO, conf/ and the scripts from the file (single members, nothing is\n"
         "installed), checks the payload against its checksum and asks the signature tool\n"
         "for its verdict under the configured trust level.\n",
         cmdInspect},
        {"check", "tell whether a package file can be installed here, and why not",
         "usage: corvpkg check <file.cpk> [--json] [--lang L]\n"
         "\n"
         "Runs the installability checks in their fixed order (record, volume, checksum,\n"
         "OS range, conflicts, services, dependencies, platform, port, upgradability,\n"
         "signature) and prints \"installable\" or the report: a message key of the\n"
         "desktop and the texts for its placeholders.\n"
         "Exit status: 0 installable, 1 not installable, 2 usage error.\n",
         cmdCheck},
        {"resource", "show a package's resources: sections and their workers; update one",
         "usage: corvpkg resource <name> [--json]\n"
         "       corvpkg resource update <name> <section> [--args JSON] [--json]\n"
         "\n"
         "Shows the installed package's conf/resource as its workers see it when no wizard\n"
         "answers are given (placeholders that stay unresolved are dropped), which workers\n"
         "serve each of its sections (provider, span, phases) with a warning for a section\n"
         "that none serves, its conf/resource.own (what the workers recorded), and for each\n"
         "phase the workers that would run, in running order: an acquire phase runs the\n"
         "workers of the ids that the request asks for, a release phase (in reverse) those\n"
         "that the own-file holds.\n"
         "update has the worker of <section> change the running resource, with the JSON\n"
         "object of --args as its \"@helper-args\"; not every worker can update.\n"
         "  --json     print one JSON object\n"
         "Exit status: 1 when the package is not installed, one of its files is unreadable,\n"
         "the plug-in providers can't be read, or the update failed.\n",
         cmdResource},
        {"jobs", "show a package's generated init job and service configuration, and their state",
         "usage: corvpkg jobs <name> [--json]\n"
         "\n"
         "Prints /etc/init/pkgctl-<name>.conf and its service configuration, what the init\n"
         "system says of the job, whether it runs, whether the service is enabled, and the\n"
         "package's own jobs.\n",
         cmdJobs},
        {"start", "start an installed package, and then the packages that depend on it",
         "usage: corvpkg start <name> [--user U] [--lang L] [--json]\n"
         "\n"
         "Starts the package through its init job pkgctl-<name>: checks the services it\n"
         "needs, the OS version limits, the architecture and the volumes, asks its\n"
         "prestart when it has one, acquires its resources, marks it enabled and starts the\n"
         "job. Then its enabled dependents are started, after it. A failure prints the\n"
         "result code's name, the reasons and any \"worker_msg\" of its resource workers.\n"
         "  --user U   the user on whose behalf it starts (gets the package's desktop apps\n"
         "             when an administrator); default: none\n"
         "  --lang L   language passed to the package's scripts\n"
         "Exit status: 0 started, 1 failed (the package's own outcome; a dependent that\n"
         "fails is logged but does not fail the command), 2 usage error.\n",
         cmdStart},
        {"stop", "stop an installed package, after the packages that depend on it",
         "usage: corvpkg stop <name> [--user U] [--lang L] [--json]\n"
         "\n"
         "Stops the running dependents first, then the package: asks its prestop when it\n"
         "has one, removes its enabled flag, stops the job and releases the resources that\n"
         "it holds while enabled.\n"
         "Exit status: 0 stopped, 1 failed, 2 usage error.\n",
         cmdStop},
        {"restart", "stop a package with its dependents and start them again",
         "usage: corvpkg restart <name> [--json]\n"
         "\n"
         "A stop as \"corvpkg stop\" and, only when that succeeded, a start as\n"
         "\"corvpkg start\".\n"
         "Exit status: 0 restarted, 1 failed, 2 usage error.\n",
         cmdRestart},
        {"start-all", "start every package in dependency order, as at boot", kStartAllUsage,
         cmdStartAll},
        {"stop-all", "stop every package in dependency order, as at shutdown", kStartAllUsage,
         cmdStopAll},
        {"service-up", "start the packages that need a system service", kServiceUpUsage,
         cmdServiceUp},
        {"service-down", "stop the packages that need a system service", kServiceUpUsage,
         cmdServiceDown},
        {"wizard", "show a package's wizard steps or defaults", kWizardUsage, cmdWizard},
        {"install", "install a package file or a store's package (or upgrade or repair)",
         kInstallUsage, cmdInstallAny},
        {"upgrade", "the same as install; upgrade --all takes every update the stores offer",
         kInstallUsage, cmdUpgradeAny},
        {"repair", "the same as install: repair a broken package from its file", kInstallUsage,
         cmdRepair},
        {"uninstall", "uninstall a package",
         "usage: corvpkg uninstall <name> [--force] [--answers F.json] [--lang L] [--user U]\n"
         "                         [--json]\n"
         "\n"
         "Stops the package, runs its preuninst, releases its resources, removes its files\n"
         "and registry entry, and runs its postuninst. Its settings under\n"
         "/usr/corv/etc/packages/<name> stay for a later install.\n"
         "  --force          uninstall even when installed packages depend on it\n"
         "  --answers F.json the answers of its uninstall wizard, a JSON object\n"
         "  --lang L         language passed to the package's scripts\n"
         "Exit status: 0 uninstalled, 1 failed or refused, 2 usage error.\n",
         cmdUninstall},
        {"store", "what the package stores offer: list, info <name>, deps <name>",
         "usage: corvpkg store list [--refresh] [--json] [--lang L]\n"
         "       corvpkg store info <name> [--json] [--lang L]\n"
         "       corvpkg store deps <name> [--json] [--lang L]\n"
         "\n"
         "list  the maker store's packages and the feeds' merged, each after the packages it\n"
         "      depends on, with the source it came from (\"maker\" or the feed's URL). A\n"
         "      feed's package of a name that the maker store has is left out; of one name\n"
         "      in several feeds the highest version stays. The lists are cached for an\n"
         "      hour; --refresh asks the stores again.\n"
         "info  one package's store entry: the maker store's, else the feeds'\n"
         "deps  the order in which the package and what it needs would be installed, as\n"
         "      the maker store's entries give it\n"
         "The maker store is package_server in /etc.defaults/corvinfo.conf; the feeds are\n"
         "those of \"corvpkg feed\". A failure says what went wrong: the store could not\n"
         "be reached, its certificate is not trusted, it answered an error, its reply is\n"
         "not JSON or not a package list, or it does not offer the package.\n"
         "Exit status: 0, 1 failed, 2 usage error.\n",
         cmdStore},
        {"download", "download a store's package file with progress",
         "usage: corvpkg download <name> [-o FILE] [--json] [--lang L]\n"
         "\n"
         "Downloads the package from the maker store, else from the feeds, under its task\n"
         "record (see \"corvpkg tasks\"), with a progress bar on a terminal, checks its MD5\n"
         "and that it reads as a package, and saves it as FILE (default\n"
         "<name>-<version>.cpk in the current directory). It waits for any other package\n"
         "operation first. \"corvpkg cancel <name>\" stops it.\n"
         "Exit status: 0, 1 failed or canceled, 2 usage error.\n",
         cmdDownload},
        {"tasks", "the downloads and installs under way and their progress", kStoreTaskUsage,
         cmdTasks},
        {"cancel", "cancel the download of a store's package", kStoreTaskUsage, cmdCancel},
        {"updates", "the installed packages that a store offers newer, and why not the rest",
         "usage: corvpkg updates [--refresh] [--json] [--lang L]\n"
         "\n"
         "Lists the installed packages whose newer versions the maker store or a feed\n"
         "offers (beta releases over a stable installation are marked), then the other\n"
         "installed packages with the reason: no store offers it, the store's version is\n"
         "not newer, or the version limits bar it. --refresh asks the stores again\n"
         "instead of the hour's cache. \"corvpkg upgrade --all\" installs the updates.\n"
         "Exit status: 0, 1 the lists could not be had, 2 usage error.\n",
         cmdUpdates},
        {"chkupgradepkg", "the scheduled update check (the job autopkgupgrade runs it)",
         "usage: corvpkg chkupgradepkg [--json] [--lang L]\n"
         "\n"
         "Asks the stores afresh, upgrades the packages chosen for automatic update\n"
         "(\"corvpkg autoupdate\") whose new version allows a silent upgrade, and tells\n"
         "the administrators about the rest: a desktop notification and a mail, as\n"
         "upgrade_pkg_nos_notification and upgrade_pkg_email_notification in\n"
         "/etc/corvinfo.conf say. Updates the desktop's badge. Prints what it reported.\n"
         "Exit status: 0, 1 the lists could not be had, 2 usage error.\n",
         cmdChkUpgradePkg},
        {"icon", "a package's icon as a PNG or JPEG file",
         "usage: corvpkg icon <name> [-o FILE] [--256] [--json]\n"
         "\n"
         "The icon of the installed package (from its INFO), else the store's thumbnail,\n"
         "through the image cache; --256 the large one. Prints the path of the cached\n"
         "file, or copies it to FILE. A store's icon that is not a PNG or JPEG or not\n"
         "under 2 MiB is refused.\n"
         "Exit status: 0, 1 no icon, 2 usage error.\n",
         cmdIcon},
        {"feed", "the feed servers: add <url>, remove <url>, list",
         "usage: corvpkg feed add <url> [--json]\n"
         "       corvpkg feed remove <url> [--json]\n"
         "       corvpkg feed list [--json]\n"
         "\n"
         "Edits /usr/corv/etc/packages/feeds, the feed servers whose packages \"corvpkg\n"
         "store list\" shows next to the maker store's. A feed is an http:// or https://\n"
         "URL that answers a package list (\"corv-store serve\" answers at <address>/feed).\n"
         "Removing a feed also has the signature tool forget the keys it brought.\n"
         "Exit status: 0, 1 refused (bad URL, already there, not there), 2 usage error.\n",
         cmdFeed},
        {"autoupdate", "the packages updated automatically: list, set",
         "usage: corvpkg autoupdate list [--json]\n"
         "       corvpkg autoupdate set --all | --off | <name>... [--json]\n"
         "\n"
         "list  whether automatic update is off, on for all packages, or on for the chosen\n"
         "      ones, and which those are\n"
         "set   turns it on for all packages, off, or on for the named packages only; the\n"
         "      update check's scheduler job follows\n"
         "Exit status: 0, 1 failed, 2 usage error.\n",
         cmdAutoupdate},
    };
    return table;
}

}  // namespace cli

namespace {

void printHelp() {
    printf(
        "usage: corvpkg <command> [options]\n"
        "       corvpkg --version | --help  (also -V, -h)\n"
        "       corvpkg <command> --help\n\n"
        "The package engine of the NOS appliance. \"--\" ends a command's options: what\n"
        "follows is taken as names and files, even when it begins with \"-\".\n"
        "Every command takes --json (its outcome, a refusal or usage error too, as one JSON\n"
        "object on standard output), -q/--quiet (only the outcome) and -v/--verbose (the\n"
        "command trace, result codes and message keys).\n\ncommands:\n");
    int width = 0;
    for (const cli::Command& command : cli::commands()) {
        width = std::max(width, static_cast<int>(strlen(command.name)));
    }
    for (const cli::Command& command : cli::commands()) {
        printf("  %-*s  %s\n", width, command.name, command.summary);
    }
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    // Known before any parsing, so that every outcome, a usage error too, is one JSON object.
    for (const std::string& arg : args) {
        if (arg == "--") {
            break;
        }
        if (arg == "--json") {
            cli::verbosity().json = true;
        }
    }
    // The common options may also come before the command.
    while (!args.empty() && (args[0] == "--json" || args[0] == "-q" || args[0] == "--quiet" ||
                             args[0] == "-v" || args[0] == "--verbose")) {
        cli::verbosity().quiet = cli::verbosity().quiet || args[0] == "-q" || args[0] == "--quiet";
        cli::verbosity().verbose =
            cli::verbosity().verbose || args[0] == "-v" || args[0] == "--verbose";
        args.erase(args.begin());
    }
    if (args.empty()) {
        return cli::programUsageError("no command given");
    }
    if (args[0] == "--help" || args[0] == "-h" || args[0] == "help") {
        printHelp();
        return cli::EXIT_OK;
    }
    if (args[0] == "--version" || args[0] == "-V") {
        printf("corvpkg %s (libcorvpkg.so.1, NOS %d.%d-%d)\n",
               CORVPackageTool::CORVPKGLibraryVersion(), CORVPackageTool::PKG_OS_MAJOR,
               CORVPackageTool::PKG_OS_MINOR, CORVPackageTool::PKG_OS_BUILD);
        return cli::EXIT_OK;
    }
    for (const cli::Command& command : cli::commands()) {
        if (args[0] != command.name) {
            continue;
        }
        std::vector<std::string> rest(args.begin() + 1, args.end());
        for (const std::string& arg : rest) {
            if (arg == "--") {
                break;
            }
            if (arg == "--help" || arg == "-h") {
                printf("%s", command.usage);
                return cli::EXIT_OK;
            }
        }
        cli::failureContext()["operation"] = command.name;
        return command.run(rest);
    }
    return cli::programUsageError("unknown command '" + args[0] + "'");
}
