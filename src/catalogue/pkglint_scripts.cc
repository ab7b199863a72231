// The lint of what the engine runs or shows: the package scripts, which it skips without
// the owner's execute bit or when empty, and the wizard files, whose questions vanish
// without a word when the JSON does not read.
#include <dirent.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>

#include <algorithm>
#include <map>
#include <memory>
#include <regex>
#include <string>
#include <vector>

#include "catalogue/pkglint_private.h"
#include "corvpkg/pkgfile.h"

namespace CORVPackageTool {

namespace {

// "#!" or an ELF header: what execve can start.
bool startsRunnable(const std::string& path) {
    char head[4] = {0, 0, 0, 0};
    FILE* file = fopen(path.c_str(), "rb");
    if (file == nullptr) {
        return false;
    }
    size_t n = fread(head, 1, sizeof(head), file);
    fclose(file);
    return (n >= 2 && head[0] == '#' && head[1] == '!') ||
           (n == 4 && head[0] == 0x7f && head[1] == 'E' && head[2] == 'L' && head[3] == 'F');
}

// A file the engine runs: `what` says what is lost when it does not run.
void lintRunnable(const std::string& member, const std::string& path, const std::string& what,
                  LintReport& report) {
    struct stat st {};
    if (lstat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
        return;  // missing, or reported as no regular file
    }
    if (st.st_size == 0) {
        report.warning(member, "is empty; the engine does not run an empty script",
                       "write the script, or remove the file");
        return;
    }
    if ((st.st_mode & S_IXUSR) == 0) {
        report.error(member, "lacks the execute bit; " + what,
                     "chmod 755 " + member + " (the bit is packed into the file as it is)");
    }
    if (!startsRunnable(path)) {
        report.error(member, "does not start with #! (nor is it a program); it cannot be run",
                     "make the first line #!/bin/sh");
    }
}

std::vector<std::string> namesIn(const std::string& dir) {
    std::vector<std::string> names;
    DIR* handle = opendir(dir.c_str());
    if (handle == nullptr) {
        return names;
    }
    while (struct dirent* entry = readdir(handle)) {
        std::string name = entry->d_name;
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    closedir(handle);
    std::sort(names.begin(), names.end());
    return names;
}

void lintItems(const std::string& member, const Json::Value& steps, LintReport& report) {
    static const std::regex variable("[A-Za-z_][A-Za-z0-9_]*");
    std::map<std::string, int> seen;
    for (Json::ArrayIndex s = 0; s < steps.size(); ++s) {
        const Json::Value& items = steps[s]["items"];
        for (Json::ArrayIndex i = 0; i < items.size(); ++i) {
            const Json::Value& item = items[i];
            if (!item.isObject() || !item.isMember("key")) {
                continue;  // a text or a heading: nothing is answered
            }
            const std::string where =
                "step " + std::to_string(s + 1) + " item " + std::to_string(i + 1);
            if (!item["key"].isString() || !std::regex_match(item["key"].asString(), variable)) {
                report.error(member,
                             where + ": key " + item["key"].toStyledString().substr(0, 40) +
                                 " is no variable name; the answer cannot reach the scripts",
                             "use letters, digits and _, e.g. \"key\": \"MYPKG_PORT\"");
                continue;
            }
            const std::string key = item["key"].asString();
            if (seen.count(key) != 0) {
                report.warning(member,
                               where + ": key " + key +
                                   " is asked twice; one answer "
                                   "overwrites the other",
                               "give each question a key of its own");
            }
            seen[key] = 1;
        }
    }
}

void lintWizardJson(const std::string& member, const std::string& path, LintReport& report) {
    const std::string lost = "; the engine drops the wizard and its questions are never asked";
    Json::Value steps;
    std::string error;
    if (!LintReadJson(path, LintJsonReader::Wizard, steps, error)) {
        report.error(member, "is not JSON (" + error + ")" + lost,
                     "correct the JSON: an array of steps [{\"step_title\": ..., \"items\": "
                     "[...]}]");
        return;
    }
    if (!steps.isArray()) {
        report.error(member, "is not a JSON array of steps" + lost,
                     "write [{\"step_title\": \"...\", \"items\": [...]}]");
        return;
    }
    for (Json::ArrayIndex s = 0; s < steps.size(); ++s) {
        if (!steps[s].isObject() || !steps[s]["items"].isArray()) {
            report.error(member, "step " + std::to_string(s + 1) + " has no array items" + lost,
                         "give every step \"items\": [...]");
            return;
        }
    }
    lintItems(member, steps, report);
}

}  // namespace

void LintScripts(const LintSubject& pkg, LintReport& report) {
    bool upgradable = false;
    for (const PKG_SCRIPT_ENTRY& script : g_PackageScripts) {
        const std::string member = std::string("scripts/") + script.name;
        const std::string path = pkg.top + "/" + member;
        struct stat st {};
        if (lstat(path.c_str(), &st) != 0) {
            continue;
        }
        upgradable |=
            strcmp(script.name, "preupgrade") == 0 || strcmp(script.name, "postupgrade") == 0;
        lintRunnable(member, path,
                     std::string("the engine skips it, and the operation ends as if it had run "
                                 "(an install ends \"installed\" but without what ") +
                         script.name + " does)",
                     report);
    }
    struct stat st {};
    if (lstat((pkg.top + "/scripts/start-stop-status").c_str(), &st) != 0) {
        report.warning("scripts/start-stop-status",
                       "is missing; the package can be neither started nor asked its status",
                       "write it (corvpkg new writes a skeleton)");
    }
    if (!upgradable) {
        report.warning("scripts/",
                       "has neither preupgrade nor postupgrade; an installed version "
                       "can then not be upgraded or reinstalled in place",
                       "add scripts/postupgrade, even one that only exits 0");
    }
}

void LintWizardFiles(const LintSubject& pkg, LintReport& report) {
    static const std::regex wizardName("(install|upgrade|uninstall)_uifile(_[a-z]+)?(\\.sh)?");
    const std::string dir = pkg.top + "/WIZARD_UIFILES";
    for (const std::string& name : namesIn(dir)) {
        const std::string member = "WIZARD_UIFILES/" + name;
        const std::string path = dir + "/" + name;
        struct stat st {};
        if (lstat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
            continue;
        }
        if (!std::regex_match(name, wizardName)) {
            report.warning(
                member, "is no wizard file name; the engine never reads it",
                "name it install_uifile, upgrade_uifile or uninstall_uifile, with _<lang> "
                "for a translation and .sh for a script that prints the steps");
            continue;
        }
        if (name.size() > 3 && name.compare(name.size() - 3, 3, ".sh") == 0) {
            lintRunnable(member, path, "the engine cannot run it and asks nothing", report);
        } else if (st.st_size != 0) {
            lintWizardJson(member, path, report);
        }
    }
}

}  // namespace CORVPackageTool
