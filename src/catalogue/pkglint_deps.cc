// The lint of dependency and conflict lists: the one-line form of INFO and the section
// files conf/PKG_DEPS and conf/PKG_CONX. The one-line form has no blank handling and drops
// an item whose bound is missing, so the usual ways of writing a bound elsewhere
// ("hello (>= 1.0)", "hello >= 1.0") make a dependency on a package that does not exist.
#include <string.h>

#include <algorithm>
#include <string>
#include <vector>

#include "catalogue/pkginfo_private.h"
#include "catalogue/pkglint_private.h"
#include "common/vlibc_holders.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

// The operators in the order the reader tries them; the first one found decides.
const char* const kOperators[] = {"<=", ">=", "<", ">", "="};

std::string withoutBlanksAndParens(const std::string& text) {
    std::string out;
    for (char c : text) {
        if (c != ' ' && c != '\t' && c != '(' && c != ')') {
            out += c;
        }
    }
    return out;
}

bool isPlainName(const std::string& name) {
    return PMSIsLegalName(name.c_str(), kPackageNameForbidden) &&
           name.find_first_of(" \t()") == std::string::npos;
}

void lintItem(const std::string& key, const std::string& item, LintReport& report) {
    const std::string where = "in " + key + ": \"" + item + "\"";
    std::string name = item;
    std::string bound;
    for (const char* op : kOperators) {
        size_t at = item.rfind(op);
        if (at == std::string::npos) {
            continue;
        }
        name = item.substr(0, at);
        bound = item.substr(at + strlen(op));
        if (bound.empty()) {
            report.error("INFO", where + " has an operator but no version; the engine drops it",
                         "write name" + std::string(op) + "version, e.g. " + name + op +
                             "1.0.0-0001, or the name alone");
            return;
        }
        break;
    }
    const std::string compact = withoutBlanksAndParens(item);
    if (!isPlainName(name) || bound.find_first_of(" \t()") != std::string::npos) {
        report.error("INFO",
                     where +
                         " is not name, or name op version: blanks and parentheses "
                         "stay in the name and version",
                     "write it as " + compact + " (items are separated by :, without blanks)");
        return;
    }
    if (!bound.empty() && !PMSIsVersionText(bound)) {
        report.error("INFO", where + ": the bound \"" + bound + "\" is not a version",
                     "write a version such as " + name + ">=1.0.0-0001");
    }
    if (name == "Python") {
        report.warning("INFO",
                       where +
                           ": a package named Python is never a dependency or a "
                           "conflict; the engine drops it",
                       "remove the item");
    }
}

std::vector<std::string> sectionKeys(const std::string& path, const char* section,
                                     std::vector<std::string>& values) {
    std::vector<std::string> keys;
    SzHash hash(64);
    SzList names(64);
    if (!hash || !names || VLIBCFileGetSection(path.c_str(), section, hash.addr()) < 0 ||
        VLIBCSzHashEnumKey(hash.get(), names.addr()) < 0) {
        return keys;
    }
    for (int i = 0; const char* name = VLIBCSzListGet(names.get(), i); ++i) {
        const char* value = VLIBCSzHashGetValue(hash.get(), name);
        keys.push_back(name);
        values.push_back(value ? value : "");
    }
    return keys;
}

void lintSection(const std::string& member, const std::string& path, const std::string& section,
                 LintReport& report) {
    static const std::vector<std::string> known = {"pkg_min_ver", "pkg_max_ver", "nos_min_ver",
                                                   "nos_max_ver"};
    if (!isPlainName(section)) {
        report.error(member, "section [" + section + "] is not a package name",
                     "name the other package alone, e.g. [hello], and put its bounds below it as "
                     "pkg_min_ver=1.0.0-0001");
    }
    std::vector<std::string> values;
    std::vector<std::string> keys = sectionKeys(path, section.c_str(), values);
    for (size_t i = 0; i < keys.size(); ++i) {
        const std::string& key = keys[i];
        const std::string& value = values[i];
        const std::string where = "[" + section + "] " + key + "=" + value;
        if (std::find(known.begin(), known.end(), key) == known.end()) {
            std::string closest = LintClosest(key, known);
            report.warning(member, where + ": unknown key; the engine ignores it",
                           closest.empty() ? "use pkg_min_ver, pkg_max_ver, nos_min_ver or "
                                             "nos_max_ver"
                                           : "did you mean " + closest + "?");
        } else if (key.compare(0, 4, "pkg_") == 0 && !PMSIsVersionText(value)) {
            report.error(member, where + ": not a version",
                         "write a version such as " + key + "=1.0.0-0001");
        } else if (key.compare(0, 4, "nos_") == 0 && !LintIsOSVersionText(value)) {
            report.error(member, where + ": not an OS version major.minor-build",
                         "write e.g. " + key + "=6.1-15101");
        }
    }
}

}  // namespace

void LintDepString(const std::string& key, const std::string& text, LintReport& report) {
    for (const std::string& item : PMSExplodeString(text, ":")) {
        lintItem(key, item, report);
    }
}

void LintDepSectionFile(const LintSubject& pkg, const std::string& member, LintReport& report) {
    const std::string path = pkg.top + "/" + member;
    if (!VLIBCFileExist(path.c_str())) {
        return;
    }
    SzList sections(64);
    int count = sections ? VLIBCFileEnumSection(path.c_str(), sections.addr()) : -1;
    if (count < 0) {
        report.error(member, "cannot be read", "make it a readable text file of [name] sections");
        return;
    }
    if (count == 0) {
        report.warning(member, "has no [name] section, so it declares nothing",
                       "write one section per package, e.g. [hello] and below it "
                       "pkg_min_ver=1.0.0-0001");
        return;
    }
    for (int i = 0; const char* section = VLIBCSzListGet(sections.get(), i); ++i) {
        lintSection(member, path, section, report);
    }
}

}  // namespace CORVPackageTool
