// corvpkg wizard: the questions a package asks at install, upgrade or uninstall.
#include <stdio.h>

#include <string>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"

namespace cli {

using namespace CORVPackageTool;

const char kWizardUsage[] =
    "usage: corvpkg wizard <file.cpk | installed-name> [--type install|upgrade|uninstall]\n"
    "                      [--lang L] [--defaults] [--json]\n"
    "\n"
    "Shows the wizard steps that the package asks before the operation: from a package\n"
    "file (its WIZARD_UIFILES/ and LICENSE) or from an installed package's registry. A\n"
    "wizard script of the package is run to print its steps.\n"
    "  --type T    install, upgrade or uninstall; default: for a file install, or upgrade\n"
    "              when the package is installed; for an installed package uninstall\n"
    "  --lang L    the language of the wizard (default: the system's language)\n"
    "  --defaults  print only the default answers, as the JSON object that an operation\n"
    "              without answers uses\n"
    "  --json      print {\"package\",\"type\",\"wizard\"} (and \"license\" when there is one)\n"
    "A package without a wizard has no steps; that is no failure.\n";

namespace {

bool parseType(const std::string& word, PKG_INSTALLATION_TYPE& type) {
    for (PKG_INSTALLATION_TYPE candidate : {PKG_INSTALL, PKG_UPGRADE, PKG_UNINSTALL}) {
        if (word == parseInstallTypeToStr(candidate)) {
            type = candidate;
            return true;
        }
    }
    return false;
}

bool endsWith(const std::string& text, const std::string& suffix) {
    return text.size() >= suffix.size() &&
           text.compare(text.size() - suffix.size(), suffix.size(), suffix) == 0;
}

std::string textOf(const Json::Value& value) {
    return value.isArray() || value.isObject() ? toString(value) : value.asString();
}

// Every question of a step: the objects that carry a "key", however deep.
void printQuestions(const Json::Value& node) {
    if (node.isObject() && node.isMember("key")) {
        printf("  %s", textOf(node["key"]).c_str());
        if (node.isMember("defaultValue")) {
            printf(" [default: %s]", textOf(node["defaultValue"]).c_str());
        }
        if (node["desc"].isString()) {
            printf("  %s", node["desc"].asCString());
        }
        printf("\n");
    }
    if (node.isArray() || node.isObject()) {
        for (const Json::Value& child : node) {
            printQuestions(child);
        }
    }
}

}  // namespace

int cmdWizard(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "wizard", "package file or installed package name", opts,
                                 {{"--type", true}, {"--defaults", false}});
        status >= 0) {
        return status;
    }
    PKG_INSTALLATION_TYPE type = static_cast<PKG_INSTALLATION_TYPE>(0);
    if (opts.has("--type") && !parseType(opts.options["--type"], type)) {
        return usageError(findCommand("wizard"), "unknown --type " + opts.options["--type"]);
    }
    const char* lang = opts.lang.empty() ? nullptr : opts.lang.c_str();
    const std::string& target = opts.positional[0];

    PackageManager pm;
    LogCapture log;
    PackageInfo info;
    if (isReadableFile(target)) {
        if (!pm.queryPackageFileInfoWithWizard(target, info, type, lang) || info.package.empty()) {
            return printFailure(opts.json, PKG_ERR_BROKEN,
                                target + " is no package: " + log.reasons());
        }
        if (type == 0) {
            // Only to name it: the library has chosen the same way.
            type = PMSCheckPackage(info.package) ? PKG_UPGRADE : PKG_INSTALL;
        }
    } else if (target.find('/') != std::string::npos || endsWith(target, ".cpk")) {
        return printFailure(opts.json, PKG_ERR_FILE_ACCESS, target + " is not a readable file");
    } else {
        if (!pm.getInstallPackageInfo(target, info, lang, PKG_INFO_MASK_ALL)) {
            return printFailure(opts.json, PKG_ERR_NOT_INSTALLED, target + " is not installed");
        }
        if (type == 0) {
            type = PKG_UNINSTALL;
        }
        pm.readUIFile(type, target, info, lang);
    }

    const Json::Value steps = info.wizard.isNull() ? Json::Value(Json::arrayValue) : info.wizard;
    if (opts.has("--defaults")) {
        Json::Value values(Json::objectValue);
        getUIDefaultValues(steps, values);
        printf("%s\n", toString(values).c_str());
        return EXIT_OK;
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["package"] = info.package;
        out["type"] = parseInstallTypeToStr(type);
        out["wizard"] = steps;
        if (!info.license.empty()) {
            out["license"] = info.license;
        }
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    printf("%s %s: %u step(s)\n", info.package.c_str(), parseInstallTypeToStr(type), steps.size());
    if (!info.license.empty()) {
        printf("licence: %zu bytes\n", info.license.size());
    }
    for (Json::ArrayIndex i = 0; steps.isArray() && i < steps.size(); ++i) {
        const Json::Value& step = steps[i];
        const bool titled = step.isObject() && step["step_title"].isString();
        printf("step %u%s%s\n", i + 1, titled ? ": " : "",
               titled ? step["step_title"].asCString() : "");
        printQuestions(step);
    }
    return EXIT_OK;
}

}  // namespace cli
