// The package lint: a source directory or a package file in, findings out. Each kind of
// file has its own checks; this part finds the files, unpacks a package file's control
// members aside, and checks what every member must be.
#include "corvpkg/pkglint.h"

#include <dirent.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <regex>
#include <string>
#include <vector>

#include "catalogue/pkglint_private.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"

namespace CORVPackageTool {

namespace {

// The package file's control members go here; the payload stays packed.
class ScratchDir {
  public:
    ScratchDir() {
        char tmpl[] = "/tmp/corvpkg-lint.XXXXXX";
        if (mkdtemp(tmpl) != nullptr) {
            path_ = tmpl;
        }
    }
    ~ScratchDir() {
        if (!path_.empty()) {
            VLIBCExec("/bin/rm", "-rf", path_.c_str(), nullptr);
        }
    }
    ScratchDir(const ScratchDir&) = delete;
    ScratchDir& operator=(const ScratchDir&) = delete;
    const std::string& path() const { return path_; }

  private:
    std::string path_;
};

struct DirCloser {
    void operator()(DIR* dir) const { closedir(dir); }
};

std::vector<std::string> entriesOf(const std::string& dir) {
    std::vector<std::string> names;
    std::unique_ptr<DIR, DirCloser> handle(opendir(dir.c_str()));
    if (!handle) {
        return names;
    }
    while (struct dirent* entry = readdir(handle.get())) {
        std::string name = entry->d_name;
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    std::sort(names.begin(), names.end());
    return names;
}

// The engine reads every control member as a file: a link would be followed to whatever
// it names on the target machine, and a directory is read as nothing.
void lintMemberKinds(const LintSubject& pkg, LintReport& report) {
    const char* const topFiles[] = {"INFO", "LICENSE", "PACKAGE_ICON.PNG", "PACKAGE_ICON_256.PNG"};
    std::vector<std::string> members;
    for (const char* name : topFiles) {
        members.push_back(name);
    }
    for (const char* dir : {"scripts", "conf", "WIZARD_UIFILES"}) {
        for (const std::string& name : entriesOf(pkg.top + "/" + dir)) {
            members.push_back(std::string(dir) + "/" + name);
        }
    }
    for (const std::string& member : members) {
        struct stat st {};
        if (lstat((pkg.top + "/" + member).c_str(), &st) != 0 || S_ISREG(st.st_mode)) {
            continue;
        }
        const char* kind = S_ISLNK(st.st_mode)   ? "a symbolic link"
                           : S_ISDIR(st.st_mode) ? "a directory"
                                                 : "not a regular file";
        report.error(member,
                     std::string("is ") + kind +
                         "; the engine reads control members as "
                         "plain files",
                     "replace it by a regular file with the content itself");
    }
}

void lintLayout(const LintSubject& pkg, LintReport& report) {
    struct stat st {};
    if (lstat((pkg.top + "/INFO").c_str(), &st) != 0) {
        report.error("INFO", "is missing; without it nothing is a package",
                     "write an INFO (corvpkg new <name> writes one to start from)");
    }
    if (pkg.payloadDir && !VLIBCFileCheckDir((pkg.top + "/package").c_str())) {
        report.error("package/", "is missing: it is the payload, packed into package.tgz",
                     "make the directory package/ with what goes to the target (it may be "
                     "empty)");
    }
    if (!pkg.payloadDir && lstat((pkg.top + "/package.tgz").c_str(), &st) != 0) {
        report.error("package.tgz", "is missing from the package file",
                     "build the file with corvpkg build");
    }
}

void lintTree(const LintSubject& pkg, LintReport& report) {
    lintLayout(pkg, report);
    lintMemberKinds(pkg, report);
    LintInfoFile(pkg, report);
    LintDepSectionFile(pkg, "conf/PKG_DEPS", report);
    LintDepSectionFile(pkg, "conf/PKG_CONX", report);
    LintScripts(pkg, report);
    LintWizardFiles(pkg, report);
    LintResourceFile(pkg, report);
    LintPrivilegeFile(pkg, report);
}

// The control members, with their modes, without the payload; package.tgz is only
// listed, as an empty stand-in.
bool unpackControl(const std::string& file, const std::string& dir, std::string& error) {
    CORVUtils::ProcessRunner untar(
        "/bin/tar", {"xpf", file, "-C", dir, "--no-same-owner", "--exclude=package.tgz",
                     "--exclude=./package.tgz"});
    if (untar.run(true, true) != 0) {
        error = untar.getCapturedOutputErr();
        return false;
    }
    CORVUtils::ProcessRunner list("/bin/tar", {"tf", file});
    if (list.run(true, true) != 0) {
        error = list.getCapturedOutputErr();
        return false;
    }
    const std::string names = "\n" + list.getCapturedOutput();
    if (names.find("\npackage.tgz\n") != std::string::npos ||
        names.find("\n./package.tgz\n") != std::string::npos) {
        FILE* standIn = fopen((dir + "/package.tgz").c_str(), "w");
        if (standIn != nullptr) {
            fclose(standIn);
        }
    }
    return true;
}

}  // namespace

std::vector<PkgLintFinding> PMSLintPackageSource(const std::string& path) {
    std::vector<PkgLintFinding> findings;
    LintReport report(findings);
    struct stat st {};
    if (stat(path.c_str(), &st) != 0) {
        report.error("", path + " does not exist",
                     "give a package source directory or a .cpk file");
    } else if (S_ISDIR(st.st_mode)) {
        lintTree({path, true}, report);
    } else if (!S_ISREG(st.st_mode)) {
        report.error("", path + " is neither a directory nor a file",
                     "give a package source directory or a .cpk file");
    } else {
        ScratchDir scratch;
        std::string error;
        if (scratch.path().empty()) {
            report.error("", "cannot make a temporary directory under /tmp", "free space in /tmp");
        } else if (!unpackControl(path, scratch.path(), error)) {
            while (!error.empty() && error.back() == '\n') {
                error.pop_back();
            }
            report.error("", path + " is not a package file (an uncompressed tar): " + error,
                         "build it with corvpkg build");
        } else {
            lintTree({scratch.path(), false}, report);
        }
    }
    return findings;
}

bool PMSLintHasErrors(const std::vector<PkgLintFinding>& findings) {
    return std::any_of(findings.begin(), findings.end(),
                       [](const PkgLintFinding& f) { return f.severity == PKG_LINT_ERROR; });
}

Json::Value PMSLintFindingToJson(const PkgLintFinding& finding) {
    Json::Value out(Json::objectValue);
    out["severity"] = finding.severity == PKG_LINT_ERROR ? "error" : "warning";
    out["file"] = finding.file;
    out["problem"] = finding.problem;
    out["fix"] = finding.fix;
    return out;
}

bool PMSIsVersionText(const std::string& text) {
    static const std::regex form("[0-9]+(\\.[0-9]+)*(-[0-9]+)?");
    return std::regex_match(text, form);
}

bool LintIsOSVersionText(const std::string& text) {
    static const std::regex form("[0-9]+\\.[0-9]+-[0-9]+");
    return std::regex_match(text, form);
}

bool LintReadJson(const std::string& path, LintJsonReader reader, Json::Value& value,
                  std::string& error) {
    std::string text;
    FILE* file = fopen(path.c_str(), "rb");
    if (file == nullptr) {
        error = "cannot be read";
        return false;
    }
    char buffer[4096];
    size_t n;
    while ((n = fread(buffer, 1, sizeof(buffer), file)) > 0) {
        text.append(buffer, n);
    }
    fclose(file);
    value = Json::Value();
    bool parsed = false;
    if (reader == LintJsonReader::Wizard) {
        Json::Reader wizardReader;
        parsed = wizardReader.parse(text, value);
        error = parsed ? "" : wizardReader.getFormattedErrorMessages();
    } else {
        Json::CharReaderBuilder builder;
        builder["collectComments"] = false;
        std::unique_ptr<Json::CharReader> charReader(builder.newCharReader());
        parsed = charReader->parse(text.data(), text.data() + text.size(), &value, &error);
    }
    if (!parsed) {
        // The parser's message ends with a newline and may span lines; one line is kept.
        std::replace(error.begin(), error.end(), '\n', ' ');
        while (!error.empty() && error.back() == ' ') {
            error.pop_back();
        }
        if (error.compare(0, 2, "* ") == 0) {
            error.erase(0, 2);
        }
        return false;
    }
    return true;
}

std::string LintClosest(const std::string& word, const std::vector<std::string>& known) {
    std::string best;
    size_t bestDistance = 3;  // more than two edits away is another word, not a typo
    for (const std::string& candidate : known) {
        std::vector<size_t> row(candidate.size() + 1);
        for (size_t j = 0; j < row.size(); ++j) {
            row[j] = j;
        }
        for (size_t i = 1; i <= word.size(); ++i) {
            size_t diagonal = row[0];
            row[0] = i;
            for (size_t j = 1; j <= candidate.size(); ++j) {
                size_t up = row[j];
                size_t cost = word[i - 1] == candidate[j - 1] ? 0 : 1;
                row[j] = std::min({row[j] + 1, row[j - 1] + 1, diagonal + cost});
                diagonal = up;
            }
        }
        if (row.back() < bestDistance) {
            bestDistance = row.back();
            best = candidate;
        }
    }
    return best;
}

}  // namespace CORVPackageTool
