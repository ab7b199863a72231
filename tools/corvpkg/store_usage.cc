// Help texts of the store's install, task and cancel commands.
#include "cli.h"

namespace cli {

const char kStoreInstallUsage[] =
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
    "conflicts, signature); a refusal prints the report. When the package has an\n"
    "install wizard its questions are printed and must be answered.\n"
    "A name that is no file here is a store's package: the maker store's order of it\n"
    "and what it depends on (or the feed's package alone) is downloaded, each with a\n"
    "progress bar on a terminal and its checksum checked, and each package that is\n"
    "missing or older is installed in that order as a file would be. A package that\n"
    "asks questions needs --answers (the named package only) or --defaults before\n"
    "anything is installed. upgrade --all does this for every update that \"corvpkg\n"
    "updates\" lists.\n"
    "  --volume V           the volume for a fresh install (a saved default volume wins)\n"
    "  --no-start           leave the package stopped afterwards\n"
    "  --answers F.json     the wizard's answers, a JSON object of key: value\n"
    "  --defaults           take the wizard's default answers (for those not in F.json)\n"
    "  --lang L             language of the wizard and messages (default enu)\n"
    "  --ignore-dependents  upgrade even when running packages depend on this one\n"
    "  --no-verify          install an unsigned or untrusted file\n"
    "  --user U             the user on whose behalf it runs\n"
    "Progress goes to standard error; the outcome names the result code and the\n"
    "message key, and prints what the scripts left in their message file.\n"
    "Exit status: 0 done, 1 failed or refused, 2 usage error (also: questions left\n"
    "unanswered).\n";

const char kStoreTaskUsage[] =
    "usage: corvpkg tasks [--json]\n"
    "       corvpkg cancel <name> [--json]\n"
    "\n"
    "tasks   the task records of the package manager (/run/corv/task/@administrators):\n"
    "        downloads and installs from the stores with their state (downloading,\n"
    "        installing, repairing, done, failed), progress and process\n"
    "cancel  stops the download of <name>: its process gets SIGTERM (which ends a wait\n"
    "        for the package lock) and its record is removed (which cuts a running\n"
    "        transfer); the downloader removes its files. A record whose process is\n"
    "        gone is cleared with its files. An install that has begun is not stopped.\n"
    "Exit status: 0, 1 nothing to cancel or too late, 2 usage error.\n";

}  // namespace cli
