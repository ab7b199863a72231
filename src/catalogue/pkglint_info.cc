// The lint of INFO: the keys the reader knows, the values it can read, and what it does
// with the rest (a missing key, a word it does not know, a value it reads as the default).
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <algorithm>
#include <fstream>
#include <map>
#include <regex>
#include <string>
#include <vector>

#include "catalogue/pkginfo_private.h"
#include "catalogue/pkglint_private.h"
#include "common/vlibc_holders.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

const char kInfo[] = "INFO";

using Keys = std::map<std::string, std::string>;

// What the engine reads: the last of duplicate keys, quotes taken off.
bool readPairs(const std::string& path, Keys& keys) {
    SzHash hash(512);
    SzList names(512);
    if (!hash || !names || VLIBCFileGetPair(path.c_str(), hash.addr()) < 0 ||
        VLIBCSzHashEnumKey(hash.get(), names.addr()) < 0) {
        return false;
    }
    for (int i = 0; const char* name = VLIBCSzListGet(names.get(), i); ++i) {
        const char* value = VLIBCSzHashGetValue(hash.get(), name);
        keys[name] = value ? value : "";
    }
    return true;
}

// Lines the reader passes over without a word, and keys given twice.
void lintLines(const std::string& path, LintReport& report) {
    std::ifstream in(path);
    std::map<std::string, int> seen;
    std::string line;
    for (int number = 1; std::getline(in, line); ++number) {
        size_t start = line.find_first_not_of(" \t\r");
        if (start == std::string::npos || line[start] == '#') {
            continue;
        }
        size_t eq = line.find('=');
        if (eq == std::string::npos) {
            report.warning(kInfo,
                           "line " + std::to_string(number) +
                               " is neither key=\"value\" nor a comment; the engine skips it",
                           "write key=\"value\", or start the line with # to keep it as a "
                           "comment");
            continue;
        }
        std::string key = line.substr(start, eq - start);
        key.erase(key.find_last_not_of(" \t") + 1);
        if (seen.count(key) != 0) {
            report.warning(kInfo,
                           "key " + key + " is given on line " + std::to_string(seen[key]) +
                               " and again on line " + std::to_string(number) +
                               "; only the last one counts",
                           "keep one line of " + key);
        }
        seen[key] = number;
    }
}

std::vector<std::string> knownKeys() {
    std::vector<std::string> known;
    for (const auto& entry : g_MappingPKGInfoFields) {
        known.push_back(entry.second);
    }
    return known;
}

void lintUnknownKeys(const Keys& keys, LintReport& report) {
    static const std::regex languageVariant("(displayname|description)_[a-z]{2,8}");
    const std::vector<std::string> known = knownKeys();
    for (const auto& [key, value] : keys) {
        if (std::find(known.begin(), known.end(), key) != known.end() ||
            std::regex_match(key, languageVariant)) {
            continue;
        }
        std::string closest = LintClosest(key, known);
        report.warning(kInfo, "unknown key " + key + "; the engine ignores it",
                       closest.empty() ? "remove it, or use one of the keys the engine reads"
                                       : "did you mean " + closest + "? write " + closest + "=\"" +
                                             value + "\"");
    }
}

const std::string* find(const Keys& keys, const char* key) {
    auto it = keys.find(key);
    return it == keys.end() ? nullptr : &it->second;
}

void lintRequired(const Keys& keys, LintReport& report) {
    static const struct {
        const char* key;
        const char* example;
    } required[] = {{"package", "package=\"hello\""},
                    {"version", "version=\"1.0.0-0001\""},
                    {"maintainer", "maintainer=\"Your Name\""},
                    {"description", "description=\"What the package does, in one line.\""}};
    for (const auto& entry : required) {
        const std::string* value = find(keys, entry.key);
        if (value == nullptr || value->empty()) {
            report.error(kInfo,
                         std::string("required key ") + entry.key +
                             (value ? " is empty" : " is missing") +
                             "; the engine refuses the INFO",
                         std::string("write ") + entry.example);
        }
    }
}

void lintNames(const Keys& keys, LintReport& report) {
    if (const std::string* name = find(keys, "package"); name && !name->empty()) {
        static const std::regex plain("[A-Za-z0-9._+-]+");
        if (!PMSIsLegalName(name->c_str(), kPackageNameForbidden)) {
            report.error(kInfo,
                         "package name \"" + *name +
                             "\" is refused by the engine (not . or .., none of : / < > = |, "
                             "shorter than 492 bytes)",
                         "use letters, digits, . _ + and -, e.g. package=\"hello\"");
        } else if (name->find_first_of(" \t") != std::string::npos) {
            report.error(kInfo,
                         "package name \"" + *name +
                             "\" holds a blank: its job name and dependency lists break on it",
                         "use letters, digits, . _ + and -, e.g. package=\"hello\"");
        } else if (!std::regex_match(*name, plain)) {
            report.warning(kInfo, "package name \"" + *name + "\" holds unusual characters",
                           "use letters, digits, . _ + and -");
        }
    }
    if (const std::string* dir = find(keys, "nosuidir");
        dir && !dir->empty() && !PMSIsLegalName(dir->c_str(), kUIDirNameForbidden)) {
        report.error(kInfo, "nosuidir \"" + *dir + "\" is refused by the engine (no : or /)",
                     "name one directory under the payload, e.g. nosuidir=\"ui\"");
    }
}

void lintVersion(const Keys& keys, LintReport& report) {
    const std::string* version = find(keys, "version");
    if (version && !version->empty() && !PMSIsVersionText(*version)) {
        report.error(kInfo,
                     "version \"" + *version +
                         "\" is not a version: the engine compares number by number and reads "
                         "words as 0",
                     "write dotted numbers and a build number, e.g. version=\"1.0.0-0001\"");
    }
}

void lintArchKey(const Keys& keys, const char* key, LintReport& report) {
    const std::string* value = find(keys, key);
    if (value == nullptr) {
        return;
    }
    for (const std::string& token : PMSExplodeString(*value, " \t")) {
        if (PMSMapSystemArch(token.c_str()) == 0) {
            report.error(kInfo,
                         std::string(key) + " token \"" + token +
                             "\" is no architecture the engine knows; it counts for none",
                         "separate tokens with blanks and use x86_64, x86, armv7, armv8 or a "
                         "platform name such as apollolake");
        }
    }
}

void lintArch(const Keys& keys, LintReport& report) {
    const std::string* arch = find(keys, "arch");
    const char* fix = "write the platforms it runs on, e.g. arch=\"x86_64 armv7 armv8\"";
    if (arch == nullptr || PMSExplodeString(*arch, " \t").empty()) {
        report.error(kInfo, "arch is missing: a package without it is refused at install", fix);
        return;
    }
    unsigned int mask = 0;
    for (const std::string& token : PMSExplodeString(*arch, " \t")) {
        mask |= static_cast<unsigned int>(PMSMapSystemArch(token.c_str()));
    }
    if (mask == 0xFFFFFFFFu) {
        report.error(kInfo,
                     "arch \"" + *arch +
                         "\" means every platform, which is refused at "
                         "install",
                     fix);
    }
    lintArchKey(keys, "arch", report);
    lintArchKey(keys, "exclude_arch", report);
}

// Keys read by comparing with "yes" or "no" (either case); any other text keeps the default.
void lintYesNo(const Keys& keys, LintReport& report) {
    static const struct {
        const char* key;
        const char* fallback;
    } flags[] = {{"checkport", "yes"},
                 {"startable", "yes"},
                 {"ctl_stop", "the value of startable"},
                 {"ctl_uninstall", "yes"},
                 {"install_reboot", "no"},
                 {"support_center", "no"},
                 {"silent_install", "no"},
                 {"silent_upgrade", "no"},
                 {"silent_uninstall", "no"},
                 {"precheckstartstop", "no"},
                 {"beta", "no"}};
    for (const auto& flag : flags) {
        const std::string* value = find(keys, flag.key);
        if (value == nullptr || value->empty() || strcasecmp(value->c_str(), "yes") == 0 ||
            strcasecmp(value->c_str(), "no") == 0) {
            continue;
        }
        report.error(kInfo,
                     std::string(flag.key) + "=\"" + *value +
                         "\" is neither yes nor no; the engine keeps the default (" +
                         flag.fallback + ")",
                     std::string("write ") + flag.key + "=\"yes\" or " + flag.key + "=\"no\"");
    }
}

void lintNumbers(const Keys& keys, LintReport& report) {
    static const std::regex digits("[0-9]+");
    if (const std::string* port = find(keys, "adminport"); port && !port->empty()) {
        if (!std::regex_match(*port, digits)) {
            report.error(kInfo, "adminport \"" + *port + "\" is not a number",
                         "write the port in decimal, e.g. adminport=\"8080\"");
        } else if (port->size() > 5 || atol(port->c_str()) > 65536) {
            report.error(kInfo, "adminport " + *port + " is above 65536; the engine refuses it",
                         "write a port from 1 to 65535");
        }
    }
    if (const std::string* size = find(keys, "extractsize");
        size && !size->empty() && !std::regex_match(*size, digits)) {
        report.warning(kInfo, "extractsize \"" + *size + "\" is not a number; it reads as 0",
                       "write the unpacked size in KiB, e.g. extractsize=\"2048\"");
    }
}

void parseOS(const std::string& text, int out[3]) {
    PMSParseOSVersion(text.c_str(), out);
}

void lintOSVersions(const Keys& keys, LintReport& report) {
    for (const char* key : {"os_min_ver", "os_max_ver", "firmware"}) {
        const std::string* value = find(keys, key);
        if (value && !value->empty() && !LintIsOSVersionText(*value)) {
            int parsed[3] = {0, 0, 0};
            parseOS(*value, parsed);
            report.error(kInfo,
                         std::string(key) + " \"" + *value +
                             "\" is not major.minor-build; it "
                             "reads as " +
                             PMSOSVersionText(parsed),
                         std::string("write e.g. ") + key + "=\"6.1-15101\"");
        }
    }
    const std::string* low = find(keys, "os_min_ver");
    if (low && find(keys, "firmware")) {
        report.warning(kInfo, "firmware is ignored when os_min_ver is given",
                       "remove firmware; os_min_ver is the lower OS limit");
    }
    const std::string* high = find(keys, "os_max_ver");
    if (!low) {
        low = find(keys, "firmware");
    }
    if (low && high && !high->empty()) {
        int a[3] = {0, 0, 0};
        int b[3] = {0, 0, 0};
        parseOS(*low, a);
        parseOS(*high, b);
        if ((b[0] || b[1] || b[2]) && std::lexicographical_compare(b, b + 3, a, a + 3)) {
            report.error(kInfo,
                         "the lower OS limit " + *low + " is above the upper one " + *high +
                             "; no OS accepts the package",
                         "swap or correct os_min_ver and os_max_ver");
        }
    }
}

}  // namespace

void LintInfoFile(const LintSubject& pkg, LintReport& report) {
    const std::string path = pkg.top + "/INFO";
    Keys keys;
    if (!VLIBCFileExist(path.c_str())) {
        return;  // the layout check has said so
    }
    if (!readPairs(path, keys)) {
        report.error(kInfo, "cannot be read",
                     "make it a readable text file of key=\"value\" lines");
        return;
    }
    lintLines(path, report);
    lintRequired(keys, report);
    lintNames(keys, report);
    lintVersion(keys, report);
    lintArch(keys, report);
    lintYesNo(keys, report);
    lintNumbers(keys, report);
    lintOSVersions(keys, report);
    lintUnknownKeys(keys, report);
    static const struct {
        const char* key;
        const char* file;
    } lists[] = {{"install_dep_packages", "conf/PKG_DEPS"},
                 {"install_conflict_packages", "conf/PKG_CONX"}};
    for (const auto& list : lists) {
        const std::string* value = find(keys, list.key);
        if (value == nullptr) {
            continue;
        }
        if (VLIBCFileExist((pkg.top + "/" + list.file).c_str())) {
            report.warning(
                kInfo, std::string(list.key) + " is ignored because " + list.file + " exists",
                std::string("declare the list in one place: ") + list.file + " or the INFO key");
            continue;
        }
        LintDepString(list.key, *value, report);
    }
}

}  // namespace CORVPackageTool
