// The lint of the JSON configuration: conf/resource against the worker catalogue, and
// conf/privilege by the rules that the file-attribute revision applies before any script
// runs (where a bad entry fails the install).
#include <sys/stat.h>

#include <algorithm>
#include <regex>
#include <set>
#include <string>
#include <vector>

#include "catalogue/pkglint_private.h"
#include "corv/vlibc.h"
#include "corvpkg/resource.h"
#include "corvpkg/worker.h"
#include "resource/resource_private.h"

namespace CORVPackageTool {

namespace {

const char kResource[] = "conf/resource";
const char kPrivilege[] = "conf/privilege";

// The ids some worker serves here: the built-in rows, and the plug-ins of the registered
// providers. A provider installed later on the target may add more, so an unknown id is
// a warning.
std::vector<std::string> servedIds() {
    std::set<std::string> ids;
    for (const Resource::BuiltinWorker* row = Resource::g_BuiltinWorkers; row->id; ++row) {
        ids.insert(row->id);
    }
    std::vector<std::string> providers;
    if (Resource::EnumProviders(Resource::kProviderDir, providers)) {
        for (const std::string& provider : providers) {
            Json::Value conf;
            if (!Resource::ReadJsonFile(std::string(Resource::kProviderDir) + "/" + provider,
                                        conf) ||
                !conf.isObject() || !conf["workers"].isArray()) {
                continue;
            }
            for (const Json::Value& entry : conf["workers"]) {
                if (entry.isObject() && entry["id"].isString()) {
                    ids.insert(entry["id"].asString());
                }
            }
        }
    }
    return std::vector<std::string>(ids.begin(), ids.end());
}

std::string joined(const std::vector<std::string>& words) {
    std::string out;
    for (const std::string& word : words) {
        out += (out.empty() ? "" : ", ") + word;
    }
    return out;
}

bool readObject(const std::string& path, const char* member, const char* what, Json::Value& conf,
                LintReport& report) {
    std::string error;
    if (!LintReadJson(path, LintJsonReader::Configuration, conf, error)) {
        report.error(member, std::string("is not JSON (") + error + "); the engine " + what,
                     "correct the JSON: one object, strings in double quotes, no trailing commas");
        return false;
    }
    if (!conf.isObject()) {
        report.error(member, std::string("is not a JSON object; the engine ") + what,
                     "write one object {...}");
        return false;
    }
    return true;
}

const std::set<std::string> kIdentities = {"package", "system", "root"};

void lintIdentity(const std::string& where, const Json::Value& value, LintReport& report) {
    if (!value.isString() || kIdentities.count(value.asString()) == 0) {
        report.error(kPrivilege, where + " is not an identity; the install fails",
                     "write \"package\", \"system\" or \"root\"");
    }
}

const Json::Value* arrayMember(const Json::Value& conf, const char* key, LintReport& report) {
    if (!conf.isMember(key)) {
        return nullptr;
    }
    if (!conf[key].isArray()) {
        report.error(kPrivilege,
                     std::string(key) +
                         " is not an array; the engine reads nothing "
                         "of it",
                     std::string("write \"") + key + "\": [ {...}, ... ]");
        return nullptr;
    }
    return &conf[key];
}

bool stringMembers(const Json::Value& entry, const std::vector<const char*>& names) {
    return entry.isObject() && std::all_of(names.begin(), names.end(), [&](const char* name) {
               return entry[name].isString();
           });
}

void lintPayloadPath(const LintSubject& pkg, const std::string& where, const std::string& rel,
                     LintReport& report) {
    if (rel.empty() || rel[0] == '/' || rel.find("..") != std::string::npos) {
        report.error(kPrivilege, where + ": relpath \"" + rel + "\" must stay inside package/",
                     "write the path relative to package/, e.g. bin/daemon");
        return;
    }
    struct stat st {};
    if (pkg.payloadDir &&
        (stat((pkg.top + "/package/" + rel).c_str(), &st) != 0 || !S_ISREG(st.st_mode))) {
        report.error(kPrivilege, where + ": package/" + rel + " is not a file; the install fails",
                     "point relpath at a file of the payload");
    }
}

void lintCtrlScripts(const Json::Value& conf, LintReport& report) {
    static const std::vector<std::string> actions = {
        "preinst",     "postinst", "preuninst", "postuninst", "preupgrade",
        "postupgrade", "prestart", "prestop",   "status",     "log"};
    const Json::Value* entries = arrayMember(conf, "ctrl-script", report);
    for (Json::ArrayIndex i = 0; entries && i < entries->size(); ++i) {
        const Json::Value& entry = (*entries)[i];
        const std::string where = "ctrl-script[" + std::to_string(i) + "]";
        if (!stringMembers(entry, {"action", "run-as"})) {
            report.error(kPrivilege, where + " needs the strings action and run-as",
                         "write {\"action\": \"postinst\", \"run-as\": \"root\"}");
            continue;
        }
        const std::string action = entry["action"].asString();
        if (std::find(actions.begin(), actions.end(), action) == actions.end()) {
            std::string closest = LintClosest(action, actions);
            report.warning(kPrivilege, where + ": no script runs as action \"" + action + "\"",
                           closest.empty() ? "use one of " + joined(actions)
                                           : "did you mean " + closest + "?");
        }
        lintIdentity(where + " run-as", entry["run-as"], report);
    }
}

void lintOwners(const LintSubject& pkg, const Json::Value& conf, LintReport& report) {
    const Json::Value* exes = arrayMember(conf, "executable", report);
    for (Json::ArrayIndex i = 0; exes && i < exes->size(); ++i) {
        const std::string where = "executable[" + std::to_string(i) + "]";
        if (!stringMembers((*exes)[i], {"relpath", "run-as"})) {
            report.error(kPrivilege, where + " needs the strings relpath and run-as",
                         "write {\"relpath\": \"bin/daemon\", \"run-as\": \"package\"}");
            continue;
        }
        lintPayloadPath(pkg, where, (*exes)[i]["relpath"].asString(), report);
        lintIdentity(where + " run-as", (*exes)[i]["run-as"], report);
    }
    static const std::regex mode("[0-7]{4}");
    const Json::Value* tools = arrayMember(conf, "tool", report);
    for (Json::ArrayIndex i = 0; tools && i < tools->size(); ++i) {
        const Json::Value& entry = (*tools)[i];
        const std::string where = "tool[" + std::to_string(i) + "]";
        if (!stringMembers(entry, {"relpath", "user", "group", "permission"})) {
            report.error(kPrivilege, where + " needs the strings relpath, user, group, permission",
                         "write {\"relpath\": \"bin/tool\", \"user\": \"package\", \"group\": "
                         "\"package\", \"permission\": \"0750\"}");
            continue;
        }
        lintPayloadPath(pkg, where, entry["relpath"].asString(), report);
        for (const char* key : {"user", "group"}) {
            const std::string value = entry[key].asString();
            if (value != "root" && value != "package") {
                report.error(kPrivilege,
                             where + " " + key + " \"" + value + "\" is refused; the install fails",
                             std::string("write \"") + key + "\": \"package\" or \"root\"");
            }
        }
        if (!std::regex_match(entry["permission"].asString(), mode)) {
            report.error(kPrivilege,
                         where + " permission \"" + entry["permission"].asString() +
                             "\" is not four octal digits; the install fails",
                         "write e.g. \"permission\": \"0750\"");
        }
    }
}

void lintAccounts(const Json::Value& conf, LintReport& report) {
    for (const char* key : {"username", "groupname", "join-groupname"}) {
        if (!conf.isMember(key)) {
            continue;
        }
        if (!conf[key].isString()) {
            report.error(kPrivilege, std::string(key) + " is not a string",
                         std::string("write \"") + key + "\": \"<name>\"");
        } else if (std::string(key) != "join-groupname" && conf[key].asString() == "root") {
            report.error(kPrivilege,
                         std::string(key) +
                             " \"root\" is reserved for the system; "
                             "the install fails",
                         "leave it out (the package's name is used) or name an account of its "
                         "own");
        }
    }
    if (conf.isMember("defaults")) {
        if (!conf["defaults"].isObject() || !conf["defaults"].isMember("run-as")) {
            report.error(kPrivilege, "defaults needs the member run-as; the install fails",
                         "write \"defaults\": {\"run-as\": \"package\"}");
        } else {
            lintIdentity("defaults run-as", conf["defaults"]["run-as"], report);
        }
    }
}

}  // namespace

void LintResourceFile(const LintSubject& pkg, LintReport& report) {
    const std::string path = pkg.top + "/" + kResource;
    Json::Value conf;
    if (!VLIBCFileExist(path.c_str()) ||
        !readObject(path, kResource, "acquires none of the package's resources", conf, report)) {
        return;
    }
    const std::vector<std::string> ids = servedIds();
    for (const std::string& id : conf.getMemberNames()) {
        if (!conf[id].isObject()) {
            report.error(kResource,
                         "section " + id +
                             " is not an object; its worker passes it "
                             "over",
                         "write \"" + id + "\": {...}");
        } else if (std::find(ids.begin(), ids.end(), id) == ids.end()) {
            std::string closest = LintClosest(id, ids);
            report.warning(kResource,
                           "section " + id + ": no worker handles it here; the engine ignores it",
                           closest.empty() ? "use a section that a worker handles: " + joined(ids)
                                           : "did you mean " + closest + "?");
        }
    }
}

void LintPrivilegeFile(const LintSubject& pkg, LintReport& report) {
    const std::string path = pkg.top + "/" + kPrivilege;
    Json::Value conf;
    if (!VLIBCFileExist(path.c_str()) ||
        !readObject(path, kPrivilege, "fails the install", conf, report)) {
        return;
    }
    static const std::vector<std::string> known = {
        "defaults", "username", "groupname", "join-groupname", "ctrl-script", "executable", "tool"};
    for (const std::string& key : conf.getMemberNames()) {
        if (std::find(known.begin(), known.end(), key) == known.end()) {
            std::string closest = LintClosest(key, known);
            report.warning(
                kPrivilege, "unknown key " + key + "; the engine ignores it",
                closest.empty() ? "use " + joined(known) : "did you mean " + closest + "?");
        }
    }
    lintAccounts(conf, report);
    lintCtrlScripts(conf, report);
    lintOwners(pkg, conf, report);
}

}  // namespace CORVPackageTool
