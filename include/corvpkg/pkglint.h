// Checking a package before it is built or shipped: everything that the engine would later
// refuse, or read past without a word, found while the author can still fix it.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

enum PKG_LINT_SEVERITY {
    // The engine refuses the package, or drops what the author meant (a wizard question,
    // a script, a dependency): building it would ship a broken package.
    PKG_LINT_ERROR = 0,
    // Legal, but most likely not what was meant (an unknown key, a section no worker reads).
    PKG_LINT_WARNING = 1,
};

// One finding: `file` is relative to the package's top ("INFO", "conf/resource",
// "scripts/postinst"), empty when the finding is about the whole path given.
struct PkgLintFinding {
    PKG_LINT_SEVERITY severity = PKG_LINT_ERROR;
    std::string file;
    std::string problem;  // what is wrong, in one sentence
    std::string fix;      // what to write or do instead
};

// Checks a package source directory (INFO, package/, scripts/, conf/, WIZARD_UIFILES/ ...)
// or a package file (.cpk, whose members are looked at without installing anything) by the
// rules the engine reads them with: INFO keys and values, the version form, architecture
// tokens, yes/no values, OS versions, dependency lists in INFO and in conf/PKG_DEPS and
// conf/PKG_CONX, wizard files, conf/resource against the worker catalogue (built-in rows
// and registered plug-in providers), conf/privilege, the scripts' execute bits, and that
// control members are regular files. Findings come in file order; none means clean.
CORVPKG_API std::vector<PkgLintFinding> PMSLintPackageSource(const std::string& path);

// Whether any finding is an error.
CORVPKG_API bool PMSLintHasErrors(const std::vector<PkgLintFinding>& findings);

// {"severity": "error"|"warning", "file": ..., "problem": ..., "fix": ...}
CORVPKG_API Json::Value PMSLintFindingToJson(const PkgLintFinding& finding);

// Whether `text` has the form of a package version: dotted numbers with an optional "-"
// and build number, as 1.2.3 or 1.2.3-0045. The comparison reads anything, but reads a
// word as 0 and drops letters and a second "-": such a text compares wrongly.
CORVPKG_API bool PMSIsVersionText(const std::string& text);

}  // namespace CORVPackageTool
