// Inside the package lint: the collector of findings and the checks of each file kind.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "corvpkg/pkglint.h"

namespace CORVPackageTool {

class LintReport {
  public:
    explicit LintReport(std::vector<PkgLintFinding>& out) : out_(out) {}
    void error(const std::string& file, const std::string& problem, const std::string& fix) {
        out_.push_back({PKG_LINT_ERROR, file, problem, fix});
    }
    void warning(const std::string& file, const std::string& problem, const std::string& fix) {
        out_.push_back({PKG_LINT_WARNING, file, problem, fix});
    }

  private:
    std::vector<PkgLintFinding>& out_;
};

// The package being checked: its top directory (a source directory, or the control members
// of a package file unpacked aside) and whether the payload is a directory package/ that
// can be looked into.
struct LintSubject {
    std::string top;
    bool payloadDir = true;
};

// INFO: keys, values, and the dependency strings it holds.
void LintInfoFile(const LintSubject& pkg, LintReport& report);
// One dependency string of INFO (`key` names it in the findings).
void LintDepString(const std::string& key, const std::string& text, LintReport& report);
// conf/PKG_DEPS or conf/PKG_CONX (`member` is "conf/PKG_DEPS" ...).
void LintDepSectionFile(const LintSubject& pkg, const std::string& member, LintReport& report);
// WIZARD_UIFILES/*.
void LintWizardFiles(const LintSubject& pkg, LintReport& report);
// conf/resource against the worker catalogue.
void LintResourceFile(const LintSubject& pkg, LintReport& report);
// conf/privilege.
void LintPrivilegeFile(const LintSubject& pkg, LintReport& report);
// scripts/*: execute bits, interpreter line, the scripts an upgrade needs.
void LintScripts(const LintSubject& pkg, LintReport& report);

// The engine reads wizard files with the strict reader (no trailing commas) and its
// configuration with the lenient one; both allow comments.
enum class LintJsonReader { Wizard, Configuration };
// Parses a JSON file as the engine does. False with the parser's message, or "cannot be
// read", in `error`.
bool LintReadJson(const std::string& path, LintJsonReader reader, Json::Value& value,
                  std::string& error);

// The name among `known` closest to `word` by edit distance, if it is close enough to be
// a likely misspelling; empty otherwise.
std::string LintClosest(const std::string& word, const std::vector<std::string>& known);

// Whether `text` is "%d.%d-%d" as the OS version keys are written.
bool LintIsOSVersionText(const std::string& text);

}  // namespace CORVPackageTool
