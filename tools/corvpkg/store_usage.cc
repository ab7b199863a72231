// Help text of the store's task and cancel commands.
#include "cli.h"

namespace cli {

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
