// The package skeleton of `corvpkg new`: every file an author edits, commented where the
// format allows comments, and runnable as it stands.
#include "corvpkg/pkgskeleton.h"

#include <dirent.h>
#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include <fstream>
#include <regex>
#include <string>

#include "catalogue/pkginfo_private.h"
#include "corv/vlibc.h"

namespace CORVPackageTool {

namespace {

const char kInfo[] =
    R"(# INFO of @NAME@: one key="value" a line; a line starting with # is a comment.
# Required: package, version, maintainer, description.
package="@NAME@"
# Dotted numbers and a build number; an upgrade must have a higher version.
version="1.0.0-0001"
displayname="@NAME@"
description="What @NAME@ does, in one line."
maintainer="Your Name"
# The platforms it runs on, separated by blanks (x86_64, x86, armv7, armv8, or platform
# names). A package without arch, or with "noarch", is refused at install.
arch="x86_64 x86 armv7 armv8"
# The lowest OS it installs on, major.minor-build (os_max_ver sets the highest).
os_min_ver="6.0-0000"
# Packages it needs: name or name>=version, separated by ":" without blanks, e.g.
# install_dep_packages="hello>=1.0.0-0001"
# (conf/PKG_DEPS says the same in sections and wins over this key.)
# yes or no: whether it can be started and stopped.
startable="yes"
)";

const char kStartStopStatus[] = R"(#!/bin/sh
# start-stop-status of @NAME@: the engine runs it with one argument.
#   start, stop   start or stop the package's program; exit 0 when done
#   status        exit 0 running, 3 stopped, 1 stopped but its pid file is left,
#                 150 broken (the program is missing)
#   log           print the package's log and exit 0
#   prestart, prestop   only with precheckstartstop="yes" in INFO: non-zero refuses
# The environment carries CORVPKG_PKGNAME, CORVPKG_PKGVER and, once installed,
# CORVPKG_PKGDEST (the installed payload).

DEST=${CORVPKG_PKGDEST:-/var/packages/@NAME@/target}
DAEMON=$DEST/bin/@NAME@-daemon
VAR=$DEST/var
PIDFILE=$VAR/@NAME@.pid
LOG=$VAR/@NAME@.log

running() {
    [ -f "$PIDFILE" ] || return 1
    read -r pid <"$PIDFILE" 2>/dev/null || return 1
    [ -n "$pid" ] && kill -0 "$pid" 2>/dev/null
}

case $1 in
start)
    running && exit 0
    [ -x "$DAEMON" ] || exit 1
    mkdir -p "$VAR" || exit 1
    # A session of its own, so that the program outlives this script.
    setsid "$DAEMON" </dev/null >>"$LOG" 2>&1 &
    echo $! >"$PIDFILE"
    exit 0
    ;;
stop)
    running && kill "$pid"
    rm -f "$PIDFILE"
    exit 0
    ;;
status)
    running && exit 0
    [ -x "$DAEMON" ] || exit 150
    [ -f "$PIDFILE" ] && exit 1
    exit 3
    ;;
log)
    [ -f "$LOG" ] && cat "$LOG"
    exit 0
    ;;
prestart | prestop)
    exit 0
    ;;
*)
    echo "usage: start-stop-status start|stop|status|log" >&2
    exit 1
    ;;
esac
)";

const char kDaemon[] = R"(#!/bin/sh
# The program of @NAME@: replace it by yours. This one notes once a minute that it lives.
while :; do
    date '+%Y-%m-%d %H:%M:%S @NAME@ is running'
    sleep 60
done
)";

// The lifecycle scripts differ only in when they run and what a failure does.
const struct {
    const char* name;
    const char* when;
} kLifecycleScripts[] = {
    {"preinst", "before the payload is moved into place; non-zero refuses the install"},
    {"postinst", "after the package is registered, before it starts; non-zero fails the install"},
    {"preuninst", "before the package's files are removed; non-zero refuses the uninstall"},
    {"postuninst", "after the package's files are removed"},
    {"preupgrade", "in an upgrade, before the old version is removed; non-zero refuses it"},
    {"postupgrade", "in an upgrade, after postinst of the new version"},
};

const char kScriptBody[] = R"(#!/bin/sh
# @SCRIPT@ of @NAME@: runs @WHEN@.
# It gets CORVPKG_PKGNAME, CORVPKG_PKGVER, CORVPKG_PKG_STATUS (INSTALL, UPGRADE,
# UNINSTALL), CORVPKG_PKGDEST (the installed payload, once there), and the wizard's answers
# as variables named by their keys. The scripts of an install and an upgrade also get
# CORVPKG_PKGINST_TEMP_DIR (the unpacked payload); those of an upgrade CORVPKG_OLD_PKGVER.
# Text written to the file named by CORVPKG_TEMP_LOGFILE is shown to the user.
exit 0
)";

const char kWizard[] =
    R"(// Install wizard of @NAME@: the questions asked before the install, as a JSON array of
// steps. Each step has "step_title" and "items"; an item with a "key" asks a question,
// and its answer reaches the scripts as the environment variable of that name, e.g.
//   [{"step_title": "Settings",
//     "items": [{"type": "textfield", "desc": "Port", "key": "MYPKG_PORT",
//                "defaultValue": "8080"}]}]
// An empty array asks nothing. Broken JSON makes the engine drop the wizard silently:
// run corvpkg lint.
[]
)";

const char kResource[] =
    R"(// Resources of @NAME@: one JSON object, one member per resource id, each handled by
// the engine's worker of that id at fixed moments of the package's life, e.g.
//   "crontab-job": {"relpath": "etc/@NAME@.crontab"}
// A member that no worker handles is ignored: run corvpkg lint.
{
}
)";

std::string fill(std::string text, const std::string& name, const std::string& script = "",
                 const std::string& when = "") {
    for (const auto& [token, value] : {std::pair<std::string, std::string>{"@NAME@", name},
                                       {"@SCRIPT@", script},
                                       {"@WHEN@", when}}) {
        for (size_t at = text.find(token); at != std::string::npos;
             at = text.find(token, at + value.size())) {
            text.replace(at, token.size(), value);
        }
    }
    return text;
}

bool writeFile(const std::string& path, const std::string& text, mode_t mode, std::string& error) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << text;
    out.close();
    if (!out || chmod(path.c_str(), mode) != 0) {
        error = "cannot write " + path + ": " + strerror(errno);
        return false;
    }
    return true;
}

bool makeDirs(const std::string& top, std::string& error) {
    for (const char* sub :
         {"", "/package", "/package/bin", "/scripts", "/conf", "/WIZARD_UIFILES"}) {
        const std::string path = top + sub;
        if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
            error = "cannot make " + path + ": " + strerror(errno);
            return false;
        }
    }
    return true;
}

bool isEmptyOrMissing(const std::string& dir) {
    DIR* handle = opendir(dir.c_str());
    if (handle == nullptr) {
        return errno == ENOENT;
    }
    int entries = 0;
    while (readdir(handle) != nullptr) {
        ++entries;
    }
    closedir(handle);
    return entries <= 2;
}

}  // namespace

bool PMSWritePackageSkeleton(const std::string& name, const std::string& dir, std::string& error) {
    static const std::regex plain("[A-Za-z0-9][A-Za-z0-9._+-]*");
    if (!PMSIsLegalName(name.c_str(), kPackageNameForbidden) || !std::regex_match(name, plain)) {
        error = "\"" + name +
                "\" is not a package name: use letters, digits, . _ + and -, "
                "starting with a letter or digit";
        return false;
    }
    if (dir.empty() || !isEmptyOrMissing(dir)) {
        error = dir + " exists and is not empty; give a new directory";
        return false;
    }
    if (!makeDirs(dir, error) || !writeFile(dir + "/INFO", fill(kInfo, name), 0644, error) ||
        !writeFile(dir + "/package/bin/" + name + "-daemon", fill(kDaemon, name), 0755, error) ||
        !writeFile(dir + "/scripts/start-stop-status", fill(kStartStopStatus, name), 0755, error) ||
        !writeFile(dir + "/WIZARD_UIFILES/install_uifile", fill(kWizard, name), 0644, error) ||
        !writeFile(dir + "/conf/resource", fill(kResource, name), 0644, error)) {
        return false;
    }
    for (const auto& script : kLifecycleScripts) {
        if (!writeFile(dir + "/scripts/" + script.name,
                       fill(kScriptBody, name, script.name, script.when), 0755, error)) {
            return false;
        }
    }
    return true;
}

}  // namespace CORVPackageTool
