#include "message_text.h"

#include <string.h>

#include <sstream>

namespace corvtext {

namespace {

// A text in the tables. Placeholders are "{name}"; a part in "[...]" is kept only when every
// placeholder in it has a non-empty value. `ops` limits an entry to some operations (names
// separated by spaces); the first entry that fits wins, so the general one comes last.
// A null `desktop` means the command line's remedy serves the desktop as well.
struct Entry {
    const char* ops;
    const char* sentence;
    const char* remedy;
    const char* desktop;
};

struct CodeEntry {
    int code;
    Entry text;
};

const char kFromFile[] = "install upgrade repair check inspect";
const char kLeaving[] = "uninstall stop restart";
const char kVerbose[] = "Run it again with --verbose to see every command and script it ran.";
const char kLogRemedy[] =
    "See the reasons above[ and the package's own log ('corvpkg log {package}')]; --verbose "
    "shows every command and script it ran.";
const char kLogDesktop[] = "See the package's log for the reason.";

const CodeEntry kCodes[] = {
    {0, {nullptr, "Done.", "", nullptr}},
    {1,
     {nullptr, "The package[ {package}] is not running.",
      "Start it with 'corvpkg start[ {package}]'.", "Start it from its page."}},
    {2,
     {nullptr, "The package[ {package}] is not running.",
      "Start it with 'corvpkg start[ {package}]'.", "Start it from its page."}},
    {3,
     {nullptr, "The package[ {package}] is not running.",
      "Start it with 'corvpkg start[ {package}]'.", "Start it from its page."}},
    {150,
     {kFromFile, "The file[ {file}] is not a package this system can read.",
      "Check that it is a whole .cpk file: download or build it again; 'corvpkg lint' on the "
      "file names what is wrong with it.",
      "Download the package again."}},
    {150,
     {"info build", "The directory[ {file}] is not a package source that the engine can read.",
      "See the reason given; 'corvpkg lint' on it names every finding with its fix.",
      "Check the package's source."}},
    {150,
     {nullptr, "The package[ {package}] is broken: its installation is incomplete or damaged.",
      "Repair it with 'corvpkg repair <file.cpk>' from its package file, or remove it with "
      "'corvpkg uninstall[ {package}]'.",
      "Repair it from its package file, or uninstall it."}},
    {255,
     {nullptr, "The package[ {package}] is not installed.",
      "'corvpkg list' shows what is installed; install it with 'corvpkg install <file.cpk>'.",
      "Install it first."}},
    {256,
     {nullptr,
      "The package[ {package}] has no start-stop-status script, so it can't be asked or run.",
      "Install a version that has scripts/start-stop-status ('corvpkg lint' checks a package "
      "for it).",
      "Install a version of the package that works, or ask its maker."}},
    {257,
     {nullptr, "A volume or the package folder on it could not be checked.",
      "Check that the volume is mounted and writable ('corvpkg system' lists the volumes).",
      "Check that the volume is healthy and mounted."}},
    {258,
     {nullptr, "The package is built for another architecture or model.",
      "Get the package built for this system ('corvpkg system' shows its architecture); a "
      "package of scripts only says arch=\"noarch\" in its INFO.",
      "Get the package built for this model."}},
    {259,
     {nullptr,
      "Version[ {curver} of] the package is below the lowest version allowed here[ ({oldver})].",
      "Install[ version {oldver} or] a newer version.", nullptr}},
    {260,
     {nullptr, "A system service that the package needs is not running[: {services}].",
      "Start that service, then try again.", nullptr}},
    {261,
     {nullptr,
      "The package file is damaged: its payload doesn't match its checksum or can't be unpacked.",
      "Download or build the file again.", nullptr}},
    {262,
     {nullptr, "The package[ {package}] is not enabled: it was stopped.",
      "Start it with 'corvpkg start[ {package}]'.", "Start it from its page."}},
    {263,
     {nullptr, "The operation failed on a system error or a failing package script.", kLogRemedy,
      kLogDesktop}},
    {264,
     {nullptr, "This version of the package is blocked on this system.",
      "Ask the package's maker for a version that is allowed here.", nullptr}},
    {265,
     {nullptr, "This package is prohibited on this system.",
      "It can't be installed here; ask its maker for an alternative.", nullptr}},
    {266,
     {nullptr, "The version limits for third-party packages could not be checked.",
      "Check that /etc.defaults/corvpackageslimit.conf is readable, then try again.",
      "Try again later."}},
    {267,
     {nullptr, "A newer version[ ({curver})] is installed than the file's[ {oldver}].",
      "To go back to the older version, uninstall the package first ('corvpkg uninstall[ "
      "{package}]'), then install the file.",
      "To go back to the older version, uninstall the package first."}},
    {268,
     {kLeaving, "Installed packages depend on[ {package}][: {deppkg}].",
      "Uninstall or stop those first, or give --force to go ahead anyway (they stop working "
      "without it).",
      "Uninstall or stop those packages first."}},
    {268,
     {nullptr, "Packages that this one needs are missing or not running[: {deppkg}].",
      "Install and start them first[ ('corvpkg store deps {package}' lists them)].",
      "Install and start them first."}},
    {269,
     {nullptr, "The upgrade would break packages that depend on this one[: {deppkg}].",
      "Upgrade those first, or give --ignore-dependents to upgrade anyway.",
      "Upgrade those packages first."}},
    {270,
     {nullptr, "This version[ of {package}] is already installed.",
      "Nothing to do; a broken installation is mended with 'corvpkg repair <file.cpk>'.",
      "Nothing to do."}},
    {271,
     {nullptr, "A system service that the package works with failed to restart.",
      "Check that service and restart it; the package itself is in place.", nullptr}},
    {272,
     {nullptr, "The package[ {package}] could not be started.",
      "See why in its log[ ('corvpkg log {package}')]: its start-stop-status must exit 0 on "
      "start.",
      kLogDesktop}},
    {273,
     {nullptr, "The package[ {package}] could not be stopped.",
      "See why in its log[ ('corvpkg log {package}')]: its start-stop-status must exit 0 on "
      "stop.",
      kLogDesktop}},
    {274,
     {nullptr, "The packages' dependencies form a cycle.",
      "Change the dependencies (INFO install_dep_packages or conf/PKG_DEPS) so that no package "
      "needs itself through others; 'corvpkg order' shows the installed ones.",
      "Ask the packages' makers to fix their dependencies."}},
    {275,
     {nullptr, "Another package operation holds the package lock[ (process {holder})].",
      "Wait until it ends, then try again.", nullptr}},
    {276,
     {nullptr, "The installation failed; what it had done was undone.", kLogRemedy, kLogDesktop}},
    {277,
     {"repair", "The package could not be repaired from this file.",
      "'corvpkg status[ {package}]' tells whether it is broken at all: a working package needs "
      "no repair. To install it afresh, uninstall it and install the file.",
      "A working package needs no repair; to install it afresh, uninstall it first."}},
    {277,
     {"check",
      "The installed package can't be upgraded in place: the new version has no "
      "preupgrade or postupgrade script.",
      "Uninstall the installed version first[ ('corvpkg uninstall {package}')], then install "
      "the file.",
      "Uninstall the installed version first."}},
    {277,
     {nullptr, "The upgrade failed; the earlier version stays as it was left.", kLogRemedy,
      kLogDesktop}},
    {278, {nullptr, "The repair failed.", kLogRemedy, kLogDesktop}},
    {279,
     {nullptr, "There is not enough free space[ on {volume}][: {needed} needed, {free} free].",
      "Free some space on the volume, or choose another with --volume.",
      "Free some space, or choose another volume."}},
    {281,
     {nullptr, "The package does not support this platform[ ({product})].",
      "Get the package built for this platform.", nullptr}},
    {282,
     {nullptr, "The package needs another OS version[ ({osver})].",
      "Get a version of the package made for this OS.", nullptr}},
    {283,
     {nullptr, "The package's port[ {port}] is already in use.",
      "Stop the program or package that uses it, then try again.", nullptr}},
    {284,
     {nullptr, "Installed packages conflict with this one[: {names}].",
      "Uninstall them first[ ('corvpkg uninstall <name>')].", "Uninstall them first."}},
    {285,
     {nullptr, "A volume that the package needs is not ready yet.",
      "Wait until the volume has been created, then try again.", nullptr}},
    {286,
     {nullptr, "System services that the package needs are not running.",
      "Start those services, then try again.", nullptr}},
    {287, {nullptr, "The package's signature is good.", "", nullptr}},
    {288,
     {nullptr,
      "The package is not signed by the system's maker, and the trust level accepts only "
      "those.",
      "Accept trusted publishers too (pkg_source_trust_level in /etc/corvinfo.conf), or give "
      "--no-verify to install it anyway.",
      "Allow packages of trusted publishers in the settings."}},
    {289,
     {nullptr, "The package is signed by a publisher this system does not trust.",
      "Add the publisher's feed (its keys come with it: 'corvpkg feed add <url>'), lower the "
      "trust level (pkg_source_trust_level in /etc/corvinfo.conf), or give --no-verify.",
      "Add the publisher's package source, or allow any publisher in the settings."}},
    {290,
     {nullptr, "The package file is not signed.",
      "Sign it when it is built ('corvpkg build --sign KEY'), allow any publisher "
      "(pkg_source_trust_level in /etc/corvinfo.conf), or give --no-verify to install it "
      "anyway.",
      "Allow packages of any publisher in the settings."}},
    {291,
     {nullptr, "The certificate that signed the package has expired.",
      "Get a newly signed file, or give --no-verify to install it anyway.",
      "Get a newly signed version of the package."}},
    {292,
     {nullptr,
      "The package's signature does not match its content: the file changed after it was "
      "signed.",
      "Download or build it again; don't force it with --no-verify unless you know why it "
      "changed.",
      "Download the package again."}},
    {293,
     {nullptr, "The signature could not be checked: the signature tool failed.",
      "Check the signature tool; --no-verify skips the check.", "Try again later."}},
    {294,
     {nullptr, "A directory of packages could not be read in full.",
      "Check /var/packages and its permissions.", "Try again later."}},
    {295,
     {nullptr, "The package server failed or answered badly.",
      "Check the network and the sources ('corvpkg feed list'), then try again.",
      "Check the network, then try again."}},
    {296,
     {nullptr, "There is no volume to install packages on.",
      "Attach and mount a volume, then try again.", nullptr}},
    {297,
     {nullptr, "There is no volume to install packages on.",
      "Create or mount a volume first ('corvpkg system' lists them).", "Create a volume first."}},
    {299,
     {nullptr, "Some of the package's resources could not be released.",
      "See the worker messages; run the uninstall again to retry.", "Try the uninstall again."}},
    {300,
     {nullptr, "The package's prestart check refused to start it.",
      "Do what its message asks, then start it again.", nullptr}},
    {301,
     {nullptr, "The package's prestop check refused to stop it.",
      "Do what its message asks, then stop it again.", nullptr}},
    {302,
     {nullptr, "The package needs an OS no newer than[ {osver}].",
      "Get a newer version of the package.", nullptr}},
    {303,
     {nullptr, "The package needs OS[ {osver}] or newer.",
      "Update the OS, or get an older version of the package.", nullptr}},
    {304,
     {nullptr, "The package file[ {file}] can't be read.",
      "Check the path and that you may read the file.", "Upload the file again."}},
    {305,
     {nullptr, "The wizard answers[ in {file}] are not a JSON object.",
      "Write them as {\"KEY\": \"value\", ...}; 'corvpkg wizard <file.cpk>' lists the keys.",
      "Answer the wizard again."}},
};

// A key either has words of its own, placeholders 1, 2, ... for its arguments, or takes the
// text of a result code (`code` non-zero, `text.sentence` null).
struct KeyEntry {
    const char* key;
    int code;
    Entry text;
};

const KeyEntry kKeys[] = {
    {"error:error_error_system", 263, {}},
    {"pkgmgr:pkgmgr_file_not_package",
     0,
     {nullptr, "The file is not a package this system can read, or it is damaged.",
      "Download or build it again; 'corvpkg lint' on the file names what is wrong with it.",
      "Download the package again."}},
    {"pkgmgr:pkgmgr_pkg_not_available", 255, {}},
    {"pkgmgr:install_version_less_than_limit",
     0,
     {nullptr, "Version[ {2}] is below the lowest version allowed here[ ({1})].",
      "Install[ version {1} or] a newer version.", nullptr}},
    {"pkgmgr:require_service",
     0,
     {nullptr, "The package needs the service[ {1}], which is not running.",
      "Start the service, then try again.", nullptr}},
    {"tree:require_sshd",
     0,
     {nullptr, "The package needs the SSH service, which is not running.",
      "Turn on the SSH service, then try again.", nullptr}},
    {"pkgmgr:broken_package", 261, {}},
    {"pkgmgr:downgrade_version",
     0,
     {nullptr, "A newer version[ ({1})] is installed than the file's[ {2}].",
      "To go back to the older version, uninstall the package first, then install the file.",
      nullptr}},
    {"pkgmgr:depend_packages",
     0,
     {nullptr, "The package needs packages that are not installed[: {1}].", "Install them first.",
      nullptr}},
    {"pkgmgr:depend_unstart",
     0,
     {nullptr, "The package needs packages that are installed but not running[: {1}].",
      "Start them first[ ('corvpkg start <name>')].", "Start them first."}},
    {"pkgmgr:depend_uninst_unstart",
     0,
     {nullptr,
      "The package needs packages that are not installed[ ({1})] and others that are "
      "not running[ ({2})].",
      "Install and start them first.", nullptr}},
    {"pkgmgr:error_upgrade_dep_packages",
     0,
     {kLeaving, "Installed packages depend on this one[: {1}].",
      "Uninstall or stop those first, or give --force to go ahead anyway (they stop working "
      "without it).",
      "Uninstall or stop those packages first."}},
    {"pkgmgr:error_upgrade_dep_packages",
     0,
     {nullptr, "Packages that depend on this one would break[: {1}].",
      "Upgrade those first, or give --ignore-dependents to upgrade anyway.",
      "Upgrade those packages first."}},
    {"pkgmgr:pkgmgr_pkg_install_already", 270, {}},
    {"pkgmgr:depend_cycle", 274, {}},
    {"pkgmgr:error_occupied", 275, {}},
    {"pkgmgr:pkgmgr_file_install_failed", 276, {}},
    {"pkgmgr:pkgmgr_pkg_cannot_upgrade",
     0,
     {nullptr,
      "The installed package can't be upgraded in place: the new version has no "
      "preupgrade or postupgrade script.",
      "Uninstall the installed version first, then install the file.", nullptr}},
    {"pkgmgr:upgrade_fail", 277, {}},
    {"pkgmgr:error_sys_no_space", 279, {}},
    {"pkgError:error_space_not_enough", 279, {}},
    {"pkgmgr:pkgmgr_pkg_not_support_platform",
     0,
     {nullptr, "The package does not support this platform[ ({1})].",
      "Get the package built for this platform.", nullptr}},
    {"pkgmgr:port_conflict",
     0,
     {nullptr, "The package's port[ {1}] is already in use.",
      "Stop the program or package that uses it, then try again.", nullptr}},
    {"pkgmgr:conflict_packages",
     0,
     {nullptr, "Installed packages conflict with this one[: {1}].", "Uninstall them first.",
      nullptr}},
    {"pkgmgr:pkgmgr_space_not_ready",
     0,
     {nullptr, "No volume is ready for packages.",
      "Create a volume, or wait until the one being created is ready.", nullptr}},
    {"pkgError:volume_creating", 285, {}},
    {"pkgError:volume_no_volumes", 297, {}},
    {"pkgmgr:pkgmgr_not_corv_publish", 288, {}},
    {"pkgmgr:pkgmgr_unknown_publisher", 289, {}},
    {"pkgmgr:pkgmgr_no_signature", 290, {}},
    {"pkgmgr:pkgmgr_cert_expired", 291, {}},
    // The engine names the upper OS limit with both keys.
    {"pkgmgr:pkgmgr_pkg_required_older_version",
     0,
     {nullptr, "The package needs an OS no newer than[ {1}].",
      "Get a newer version of the package.", nullptr}},
    {"pkgmgr:pkgmgr_pkg_required_newer_version",
     0,
     {nullptr, "The package needs a newer OS than this one.",
      "Update the OS, or get an older version of the package.", nullptr}},
    {"pkgmgr:share_is_encrypted",
     0,
     {nullptr, "The shared folder[ {1}] is encrypted and not mounted.",
      "Mount the encrypted shared folder with its key, then start the package again.", nullptr}},
    {"pkgmgr:install_start_pkg_completed",
     0,
     {nullptr, "The package was installed and started.", "", nullptr}},
    {"pkgmgr:install_pkg_completed", 0, {nullptr, "The package was installed.", "", nullptr}},
    {"pkgmgr:upgrade_start_pkg_completed",
     0,
     {nullptr, "The package was upgraded and started.", "", nullptr}},
    {"pkgmgr:upgrade_pkg_completed", 0, {nullptr, "The package was upgraded.", "", nullptr}},
    {"pkgmgr:install_pkg_fail",
     0,
     {nullptr, "The package could not be installed.", kLogRemedy, kLogDesktop}},
    {"pkgmgr:upgrade_pkg_fail",
     0,
     {nullptr, "The package could not be upgraded.", kLogRemedy, kLogDesktop}},
    {"pkgmgr:download_pkg_fail",
     0,
     {nullptr, "The package[ {1}] could not be downloaded.",
      "Check the network and the package source, then try again.", nullptr}},
    {"pkgmgr:fail_start_nos_version",
     0,
     {nullptr, "The package[ {1}] can't start on this OS version.",
      "Get a version of the package made for this OS.", nullptr}},
    {"pkgmgr:dep_start_failed",
     0,
     {nullptr, "The package[ {1}] failed, so the packages that depend on it were stopped[: {2}].",
      "See its log, fix it, and start it again; its dependents start after it.", nullptr}},
    {"pkgmgr:auto_update_non_support",
     0,
     {nullptr, "The package[ {1}] can't be updated automatically.",
      "Upgrade it by hand[ ('corvpkg upgrade <file.cpk>')].", "Update it by hand."}},
    {"pkgmgr:upgrade_one_package",
     0,
     {nullptr, "An update is available[: {1}].", "Upgrade it when convenient.", nullptr}},
    {"pkgmgr:upgrade_packages",
     0,
     {nullptr, "Updates are available for[ {1}] packages.", "Upgrade them when convenient.",
      nullptr}},
    {"pkgmgr:pkgmgr_upgrade_noti_link", 0, {nullptr, "Open the Package Center.", "", nullptr}},
    // The programs' own: answers that the wizard does not ask for, and the keys it does.
    {"corvpkg:unknown_answer_keys",
     0,
     {nullptr, "The answers name keys that the package's wizard does not ask for[: {1}].",
      "Use the keys it asks for[: {2}]; 'corvpkg wizard <file.cpk>' shows the questions.",
      "Answer the questions the wizard asks[: {2}]."}},
    {"tree:leaf_packagemanage", 0, {nullptr, "Package Center.", "", nullptr}},
};

bool fitsOperation(const char* ops, const Params& params) {
    if (!ops) {
        return true;
    }
    auto op = params.find("operation");
    if (op == params.end() || op->second.empty()) {
        return false;
    }
    std::istringstream words(ops);
    std::string word;
    while (words >> word) {
        if (word == op->second) {
            return true;
        }
    }
    return false;
}

// Fills "{name}" from `params`. A "[...]" part is dropped when one of its placeholders has
// no value; outside such a part a missing value leaves nothing.
std::string fill(const char* text, const Params& params) {
    std::string out;
    std::string part;
    bool inPart = false;
    bool partComplete = true;
    for (const char* p = text; *p; ++p) {
        std::string& into = inPart ? part : out;
        if (*p == '[') {
            inPart = true;
            part.clear();
            partComplete = true;
        } else if (*p == ']' && inPart) {
            inPart = false;
            if (partComplete) {
                out += part;
            }
        } else if (*p == '{' && strchr(p, '}') && p[1] != '"' && p[1] != '}') {
            const char* end = strchr(p, '}');
            auto value = params.find(std::string(p + 1, end));
            if (value != params.end() && !value->second.empty()) {
                into += value->second;
            } else {
                partComplete = false;
            }
            p = end;
        } else {
            into += *p;
        }
    }
    return out;
}

Text render(const Entry& entry, const Params& params, Audience audience) {
    const char* remedy =
        audience == Audience::Desktop && entry.desktop ? entry.desktop : entry.remedy;
    return {fill(entry.sentence, params), remedy ? fill(remedy, params) : std::string()};
}

const Entry* findCode(int code, const Params& params) {
    for (const CodeEntry& entry : kCodes) {
        if (entry.code == code && fitsOperation(entry.text.ops, params)) {
            return &entry.text;
        }
    }
    return nullptr;
}

const KeyEntry* findKey(const std::string& key, const Params& params) {
    for (const KeyEntry& entry : kKeys) {
        if (key == entry.key && fitsOperation(entry.text.ops, params)) {
            return &entry;
        }
    }
    return nullptr;
}

}  // namespace

Text textForCode(int code, const Params& params, Audience audience) {
    if (const Entry* entry = findCode(code, params)) {
        return render(*entry, params, audience);
    }
    return {"The operation failed with result code " + std::to_string(code) + ".",
            audience == Audience::Desktop ? kLogDesktop : kVerbose};
}

Text textForKey(const std::string& key, const std::vector<std::string>& args, const Params& params,
                Audience audience) {
    Params filled = params;
    for (size_t i = 0; i < args.size(); ++i) {
        filled[std::to_string(i + 1)] = args[i];
    }
    const KeyEntry* entry = findKey(key, filled);
    if (!entry) {
        return {"The operation failed (" + key + ").",
                audience == Audience::Desktop ? kLogDesktop : kVerbose};
    }
    if (!entry->text.sentence) {
        return textForCode(entry->code, params, audience);
    }
    return render(entry->text, filled, audience);
}

Text textForMessage(const Json::Value& array, const Params& params, Audience audience) {
    if (!array.isArray() || array.empty() || !array[0].isString()) {
        return {};
    }
    std::vector<std::string> args;
    for (Json::ArrayIndex i = 1; i < array.size(); ++i) {
        if (array[i].isString()) {
            args.push_back(array[i].asString());
        } else {
            Json::StreamWriterBuilder compact;
            compact["indentation"] = "";
            args.push_back(Json::writeString(compact, array[i]));
        }
    }
    return textForKey(array[0].asString(), args, params, audience);
}

bool hasTextForKey(const std::string& key) {
    for (const KeyEntry& entry : kKeys) {
        if (key == entry.key) {
            return true;
        }
    }
    return false;
}

bool hasTextForCode(int code) {
    for (const CodeEntry& entry : kCodes) {
        if (entry.code == code) {
            return true;
        }
    }
    return false;
}

std::string oneLine(const Text& text) {
    return text.remedy.empty() ? text.sentence : text.sentence + " " + text.remedy;
}

}  // namespace corvtext
