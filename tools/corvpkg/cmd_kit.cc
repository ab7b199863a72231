// corvpkg lint and new: the package author's kit over the library's lint and skeleton.
#include "cmd_kit.h"

#include <stdio.h>

#include <string>
#include <vector>

#include "corvpkg/json_util.h"
#include "corvpkg/pkglint.h"
#include "corvpkg/pkgskeleton.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

void printFinding(FILE* out, const PkgLintFinding& finding) {
    fprintf(out, "%s: %s%s%s; fix: %s\n", finding.severity == PKG_LINT_ERROR ? "error" : "warning",
            finding.file.c_str(), finding.file.empty() ? "" : ": ", finding.problem.c_str(),
            finding.fix.c_str());
}

Json::Value findingsJson(const std::vector<PkgLintFinding>& findings) {
    Json::Value out(Json::arrayValue);
    for (const PkgLintFinding& finding : findings) {
        out.append(PMSLintFindingToJson(finding));
    }
    return out;
}

}  // namespace

int cmdLint(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "lint", "package source directory or .cpk file", opts);
        status >= 0) {
        return status;
    }
    const std::vector<PkgLintFinding> findings = PMSLintPackageSource(opts.positional[0]);
    if (opts.json) {
        printf("%s\n", toString(findingsJson(findings)).c_str());
    } else {
        size_t errors = 0;
        for (const PkgLintFinding& finding : findings) {
            printFinding(stdout, finding);
            errors += finding.severity == PKG_LINT_ERROR ? 1 : 0;
        }
        if (findings.empty()) {
            printf("%s: clean\n", opts.positional[0].c_str());
        } else {
            printf("%s: %zu error(s), %zu warning(s)\n", opts.positional[0].c_str(), errors,
                   findings.size() - errors);
        }
    }
    return PMSLintHasErrors(findings) ? EXIT_FAILED : EXIT_OK;
}

int cmdNew(const std::vector<std::string>& args) {
    const Command& self = findCommand("new");
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    if (opts.positional.empty() || opts.positional.size() > 2) {
        return usageError(self, "give a package name and, optionally, a directory");
    }
    const std::string& name = opts.positional[0];
    const std::string dir = opts.positional.size() == 2 ? opts.positional[1] : name;
    std::string error;
    if (!PMSWritePackageSkeleton(name, dir, error)) {
        return printFailure(opts.json, PKG_ERR_FILE_ACCESS, error);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["package"] = name;
        out["dir"] = dir;
        printf("%s\n", toString(out).c_str());
    } else {
        printf(
            "wrote %s: edit INFO, package/ and scripts/, then\n"
            "  corvpkg lint %s && corvpkg build %s\n",
            dir.c_str(), dir.c_str(), dir.c_str());
    }
    return EXIT_OK;
}

bool lintBeforeBuild(const std::string& source, bool force, Json::Value* json) {
    const std::vector<PkgLintFinding> findings = PMSLintPackageSource(source);
    if (json != nullptr) {
        (*json)["lint"] = findingsJson(findings);
    } else {
        for (const PkgLintFinding& finding : findings) {
            printFinding(stderr, finding);
        }
    }
    return force || !PMSLintHasErrors(findings);
}

}  // namespace cli
