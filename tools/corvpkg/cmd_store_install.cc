// corvpkg install <name>, upgrade <name> and upgrade --all, download <name>: packages
// from the stores, downloaded under their task records and installed as files are.
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include "cli.h"
#include "corv/task.h"
#include "corv/vlibc.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgserver.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"
#include "store_download.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

const std::vector<OptionSpec> kInstallOptions = {{"--volume", true},
                                                 {"--no-start", false},
                                                 {"--answers", true},
                                                 {"--defaults", false},
                                                 {"--ignore-dependents", false},
                                                 {"--no-verify", false},
                                                 {"--user", true},
                                                 {"--all", false}};

// A name, not a file: nothing of that name here, no "/" and no ".cpk" at its end.
bool namesStorePackage(const std::string& arg) {
    struct stat st {};
    const std::string cpk = ".cpk";
    return stat(arg.c_str(), &st) != 0 && arg.find('/') == std::string::npos &&
           !(arg.size() > cpk.size() && arg.compare(arg.size() - cpk.size(), 4, cpk) == 0);
}

// The installed version of `name`, "" when it is not installed.
std::string installedVersion(const std::string& name) {
    if (!PMSCheckPackage(name)) {
        return "";
    }
    PackageManager pm;
    PackageInfo info;
    return pm.getInstallPackageInfo(name, info, nullptr, PKG_INFO_MASK_ALL) ? info.version : "";
}

bool isNewer(const PackageInfo& entry, const std::string& installed) {
    return installed.empty() ||
           PackageBasicInfo(entry.package, installed)
               .compare(PackageBasicInfo(entry.package, entry.version), PKG_COMPOP_LT);
}

// `name` and what it needs, in install order, from the maker store's entries or, for a
// package only a feed offers, that entry alone.
bool storeOrder(const std::string& name, const std::string& language,
                std::vector<PackageInfo>& order, std::string& error) {
    // What the stores offer now, not what the hour's cache remembers: a package just
    // published must be found.
    Json::Value fresh;
    CORVPackageServer::PMSQueryCorvPkgServer(true, language.c_str(), fresh);
    CORVPackageServer::PMSQueryOtherPkgServer(true, language.c_str(), fresh);
    PackageManager pm;
    std::vector<PackageInfo> pkgs;
    if (pm.getAncestryDepOrderByServer(name.c_str(), language.c_str(), pkgs)) {
        order.assign(pkgs.rbegin(), pkgs.rend());
        return true;
    }
    PackageInfo entry;
    std::string source;
    if (!findStoreEntry(name, language, entry, source, error)) {
        return false;
    }
    order = {entry};
    return true;
}

// The command line of one file's install: the file and the options given, less --all and
// the answers, which belong to the named package alone.
std::vector<std::string> fileArgs(const CommonOptions& opts, const std::string& file,
                                  bool namedPackage) {
    std::vector<std::string> args = {file};
    for (const auto& option : opts.options) {
        if (option.first == "--all" || (option.first == "--answers" && !namedPackage)) {
            continue;
        }
        bool takesValue = false;
        for (const OptionSpec& spec : kInstallOptions) {
            takesValue = takesValue || (option.first == spec.name && spec.takesValue);
        }
        args.push_back(takesValue ? option.first + "=" + option.second : option.first);
    }
    if (!opts.lang.empty()) {
        args.push_back("--lang=" + opts.lang);
    }
    if (opts.json) {
        args.push_back("--json");
    }
    return args;
}

// Runs `run` with standard output going into `captured`.
int captureStdout(int (*run)(const std::vector<std::string>&), const std::vector<std::string>& args,
                  std::string& captured) {
    fflush(stdout);
    FILE* tmp = tmpfile();
    const int saved = dup(1);
    if (tmp == nullptr || saved < 0) {
        return run(args);
    }
    dup2(fileno(tmp), 1);
    const int status = run(args);
    fflush(stdout);
    dup2(saved, 1);
    close(saved);
    rewind(tmp);
    char block[4096];
    size_t n;
    while ((n = fread(block, 1, sizeof block, tmp)) > 0) {
        captured.append(block, n);
    }
    fclose(tmp);
    return status;
}

// Refuses up front when a package asks questions that nobody answered.
bool wizardsAnswered(const CommonOptions& opts, const std::string& name,
                     const std::vector<std::unique_ptr<StoreDownload>>& files,
                     const std::vector<PackageInfo>& plan, std::string& asking) {
    for (size_t i = 0; i < files.size(); ++i) {
        PackageManager pm;
        PackageInfo info;
        pm.queryPackageFileInfoWithWizard(files[i]->path(), info,
                                          static_cast<PKG_INSTALLATION_TYPE>(0),
                                          languageOf(opts).c_str());
        const bool asks = info.wizard.isArray() && !info.wizard.empty();
        const bool answered =
            opts.has("--defaults") || (plan[i].package == name && opts.has("--answers"));
        if (asks && !answered) {
            asking = plan[i].package;
            return false;
        }
    }
    return true;
}

// Downloads and installs `name` and what it lacks of its dependencies. `steps` receives
// one object per package installed.
int installFromStore(const CommonOptions& opts, const std::string& name, const char* command,
                     Json::Value& steps) {
    const std::string language = languageOf(opts);
    std::vector<PackageInfo> order, plan;
    std::string error;
    if (!storeOrder(name, language, order, error)) {
        return printFailure(opts.json, PKG_ERR_SERVER, error);
    }
    for (const PackageInfo& entry : order) {
        if (isNewer(entry, installedVersion(entry.package))) {
            plan.push_back(entry);
        }
    }
    if (plan.empty()) {
        return EXIT_OK;
    }
    std::vector<std::unique_ptr<StoreDownload>> files;
    for (const PackageInfo& entry : plan) {
        files.push_back(std::make_unique<StoreDownload>());
        if (!files.back()->fetch(entry, language, error)) {
            return printFailure(opts.json, PKG_ERR_SERVER, error);
        }
    }
    // One package alone meets the file install's own check of its questions.
    std::string asking;
    if (files.size() > 1 && !wizardsAnswered(opts, name, files, plan, asking)) {
        fprintf(stderr, "%s asks questions before it installs (corvpkg wizard <file> shows them)\n",
                asking.c_str());
        return usageError(findCommand(command),
                          "answer the questions with --answers F.json, or take the defaults "
                          "with --defaults");
    }
    for (size_t i = 0; i < files.size(); ++i) {
        if (CORVPackageServer::isCanceled()) {
            return printFailure(opts.json, PKG_ERR_SERVER, "canceled before " + plan[i].package);
        }
        const std::vector<std::string> args =
            fileArgs(opts, files[i]->path(), plan[i].package == name);
        std::string output;
        const int status = opts.json ? captureStdout(cmdInstall, args, output) : cmdInstall(args);
        Json::Value step(Json::objectValue), result;
        step["package"] = plan[i].package;
        step["version"] = plan[i].version;
        if (opts.json && fromString(output, result)) {
            step["result"] = result;
        }
        steps.append(step);
        if (status != EXIT_OK) {
            if (opts.json) {
                printf("%s", output.c_str());
            }
            return status;
        }
    }
    return EXIT_OK;
}

int printInstalled(const CommonOptions& opts, const Json::Value& steps, const char* nothing) {
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["installed"] = steps;
        printf("%s\n", toString(out).c_str());
    } else if (steps.empty()) {
        printf("%s\n", nothing);
    }
    return EXIT_OK;
}

int upgradeAll(const CommonOptions& opts) {
    PackageManager pm;
    PackageBasicInfoMap installed = pm.enumPackageMap(PKG_INFO_MASK_ALL);
    Json::Value maker, feeds, steps(Json::arrayValue);
    const std::string language = languageOf(opts);
    if (!getUpdatableRepairablePackageList(true, true, language, true, false, installed, maker,
                                           true) ||
        !getUpdatableRepairablePackageList(true, false, language, true, false, installed, feeds,
                                           false)) {
        return printFailure(opts.json, PKG_ERR_SERVER,
                            "cannot get the stores' lists: " + PMSGetLastStoreFailure());
    }
    for (const Json::Value* list : {&maker, &feeds}) {
        for (const Json::Value& entry : *list) {
            const int status =
                installFromStore(opts, entry.get("package", "").asString(), "upgrade", steps);
            if (status != EXIT_OK) {
                return status;
            }
        }
    }
    return printInstalled(opts, steps, "every package is up to date");
}

int byNameOrFile(const std::vector<std::string>& args, const char* command,
                 int (*fromFile)(const std::vector<std::string>&)) {
    CommonOptions opts;
    const Command& self = findCommand(command);
    if (!parseCommon(args, self, opts, kInstallOptions)) {
        return EXIT_USAGE;
    }
    if (opts.has("--all")) {
        if (std::string(command) != "upgrade" || !opts.positional.empty()) {
            return usageError(self, "--all belongs to \"corvpkg upgrade --all\" alone");
        }
        return upgradeAll(opts);
    }
    if (opts.positional.size() != 1 || !namesStorePackage(opts.positional[0])) {
        return fromFile(args);
    }
    Json::Value steps(Json::arrayValue);
    const int status = installFromStore(opts, opts.positional[0], command, steps);
    if (status != EXIT_OK) {
        return status;
    }
    return printInstalled(opts, steps,
                          (opts.positional[0] + " is installed and up to date").c_str());
}

}  // namespace

int cmdInstallAny(const std::vector<std::string>& args) {
    return byNameOrFile(args, "install", cmdInstall);
}

int cmdUpgradeAny(const std::vector<std::string>& args) {
    return byNameOrFile(args, "upgrade", cmdUpgrade);
}

int cmdDownload(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "download", "package name", opts, {{"-o", true}});
        status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    PackageInfo entry;
    std::string source, error;
    if (!findStoreEntry(name, languageOf(opts), entry, source, error)) {
        return printFailure(opts.json, PKG_ERR_SERVER, error);
    }
    const std::string target =
        opts.has("-o") ? opts.options["-o"] : entry.package + "-" + entry.version + ".cpk";
    StoreDownload download;
    if (!download.fetch(entry, languageOf(opts), error)) {
        return printFailure(opts.json, PKG_ERR_SERVER, error);
    }
    if (VLIBCExec("/bin/mv", "-f", download.path().c_str(), target.c_str(), nullptr) != 0) {
        return printFailure(opts.json, PKG_ERR_SYSTEM, "cannot write " + target);
    }
    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["success"] = true;
        out["package"] = entry.package;
        out["version"] = entry.version;
        out["source"] = source;
        out["path"] = target;
        printf("%s\n", toString(out).c_str());
    } else {
        printf("downloaded %s %s to %s\n", entry.package.c_str(), entry.version.c_str(),
               target.c_str());
    }
    return EXIT_OK;
}

}  // namespace cli
