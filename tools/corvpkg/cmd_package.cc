// corvpkg build, inspect and check: package files before they are installed.
#include <stdio.h>
#include <sys/stat.h>

#include <string>

#include "cli.h"
#include "cmd_kit.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgbuild.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkgverify.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

Json::Value scriptNames(unsigned int mask) {
    Json::Value names(Json::arrayValue);
    for (const PKG_SCRIPT_ENTRY& script : g_PackageScripts) {
        if (mask & script.bit) {
            names.append(script.name);
        }
    }
    return names;
}

// The words of an installability refusal: its report, which names the case, or its code.
corvtext::Text refusalText(int code, const Json::Value& report) {
    corvtext::Params params = failureContext();
    params["operation"] = "check";
    return report.isArray() && !report.empty() ? corvtext::textForMessage(report, params)
                                               : corvtext::textForCode(code, params);
}

}  // namespace

int cmdBuild(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "build", "package source directory", opts,
                                 {{"-o", true}, {"--sign", true}, {"--force", false}});
        status >= 0) {
        return status;
    }
    const std::string& source = opts.positional[0];
    failureContext()["file"] = source;
    std::string output = opts.has("-o") ? opts.options["-o"] : "";
    if (output.empty()) {
        PackageInfo info;
        if (!PMSLoadPKGInfoFile(source, info, "enu", 0)) {
            return printFailure(opts.json, PKG_ERR_BROKEN, source + "/INFO does not read");
        }
        output = info.package + "-" + info.version + ".cpk";
    }
    // What the engine would refuse or drop is found here rather than on the target.
    Json::Value lint(Json::objectValue);
    if (!lintBeforeBuild(source, opts.has("--force"), opts.json ? &lint : nullptr)) {
        return printFailure(opts.json, PKG_ERR_BROKEN,
                            source + " has lint errors; fix them, or build anyway with --force",
                            opts.json ? lint["lint"] : Json::Value());
    }
    LogCapture log;
    std::string error;
    if (!PMSBuildPackageFile(source, output, opts.has("--sign") ? opts.options["--sign"] : "",
                             error)) {
        std::string why = log.reasons();
        return printFailure(opts.json, PKG_ERR_BROKEN,
                            error + (why.empty() ? "" : " (" + why + ")"));
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["file"] = output;
        out["lint"] = lint["lint"];
        printf("%s\n", toString(out).c_str());
    } else {
        printf("built %s\n", output.c_str());
    }
    return EXIT_OK;
}

int cmdInspect(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "inspect", "package file", opts); status >= 0) {
        return status;
    }
    const std::string& file = opts.positional[0];
    failureContext()["file"] = file;
    if (!isReadableFile(file)) {
        return printFailure(opts.json, PKG_ERR_FILE_ACCESS, file + " is not a readable file");
    }
    TmpLeftovers leftovers;
    PackageManager pm;
    LogCapture log;
    PackageInfo info;
    if (!pm.queryPackageFileInfo(file, info, PKG_INSTALL,
                                 opts.lang.empty() ? nullptr : opts.lang.c_str()) ||
        info.package.empty()) {
        return printFailure(opts.json, PKG_ERR_BROKEN, file + " is no package: " + log.reasons());
    }
    bool checksumOk = info.checksum.empty() || pm.verifyPackageTgzFile(file, info.checksum.c_str());
    PKG_ERRCODE signature = PackageManager::verifyPackageSignature(file.c_str());
    const PKG_ERRCODE_INFO* sigInfo = PMSGetErrCodeInfo(signature);
    Json::Value out = PackageInfoToJson(info, false);
    out["scripts"] = scriptNames(info.script_mask);
    out["checksum_ok"] = checksumOk;
    out["signature"] = sigInfo ? sigInfo->name : "PKG_ERR_SIGNATURE_SYSTEM";
    if (opts.json) {
        printf("%s\n", toString(out).c_str());
        return EXIT_OK;
    }
    printf("%-14s %s %s\n", "package:", info.package.c_str(), info.version.c_str());
    printf("%-14s %s\n", "displayname:", info.displayname.c_str());
    printf("%-14s %s\n", "maintainer:", info.maintainer.c_str());
    std::string scripts;
    joinJsonArray(out["scripts"], " ", scripts);
    printf("%-14s %s (mask 0x%02X)\n", "scripts:", scripts.c_str(), info.script_mask);
    printf("%-14s %s\n", "payload:",
           info.checksum.empty() ? "no checksum" : (checksumOk ? "checksum ok" : "CHECKSUM WRONG"));
    printf("%-14s %s\n", "signature:", out["signature"].asCString());
    return EXIT_OK;
}

int cmdCheck(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "check", "package file", opts); status >= 0) {
        return status;
    }
    const std::string& file = opts.positional[0];
    failureContext()["file"] = file;
    if (!isReadableFile(file)) {
        return printFailure(opts.json, PKG_ERR_FILE_ACCESS, file + " is not a readable file");
    }
    TmpLeftovers leftovers;
    PackageInfo info;
    PKG_ERRCODE code = PKG_OK;
    Json::Value data;
    std::string displayName;
    std::string lang = opts.lang.empty() ? "enu" : opts.lang;
    bool ok = CheckPackageFileInfoImpl(lang.c_str(), file.c_str(), displayName, code, data, info);
    Json::Value report(Json::arrayValue);
    if (!ok) {
        CheckPackageFileReport(code, data, info, report);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["installable"] = ok;
        out["package"] = info.package;
        out["displayname"] = displayName;
        out["report"] = report;
        if (!ok) {
            const PKG_ERRCODE_INFO* codeInfo = PMSGetErrCodeInfo(code);
            const corvtext::Text text = refusalText(code, report);
            out["message"] = text.sentence;
            out["remedy"] = text.remedy;
            out["code"] = code;
            out["name"] = codeInfo ? codeInfo->name : "";
            out["data"] = data;
        }
        printf("%s\n", toString(out).c_str());
    } else if (ok) {
        printf("%s: installable\n", displayName.empty() ? file.c_str() : displayName.c_str());
    } else {
        std::string text;
        joinJsonArray(report, " ", text);
        const PKG_ERRCODE_INFO* codeInfo = PMSGetErrCodeInfo(code);
        printf("%s: not installable: %s (%s)\n",
               displayName.empty() ? file.c_str() : displayName.c_str(), text.c_str(),
               codeInfo ? codeInfo->name : "PKG_ERR_UNKNOWN");
        printNoSpace(data);
        const corvtext::Text words = refusalText(code, report);
        printf("  %s\n", corvtext::oneLine(words).c_str());
    }
    return ok ? EXIT_OK : EXIT_FAILED;
}

}  // namespace cli
