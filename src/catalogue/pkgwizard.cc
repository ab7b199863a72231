// Wizard pages: finding the wizard file of an operation in a package file or in the
// registry, running it when it is a script, and reading the steps it gives.
#include <stdio.h>
#include <unistd.h>

#include <fstream>
#include <string>
#include <vector>

#include "catalogue/pkginfo_private.h"
#include "catalogue/pkgwizard_private.h"
#include "common/regular_file.h"
#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/pkgwizard.h"

namespace CORVPackageTool {

namespace {

constexpr unsigned int kLicenseLimit = 0x100000;

// Removes a temporary folder of ours on every way out.
class TempFolder {
  public:
    explicit TempFolder(std::string path) : path_(std::move(path)) {}
    ~TempFolder() {
        if (!path_.empty() && VLIBCFileCheckDir(path_.c_str())) {
            VLIBCExec("/bin/rm", "-rf", path_.c_str(), nullptr);
        }
    }
    TempFolder(const TempFolder&) = delete;
    TempFolder& operator=(const TempFolder&) = delete;

  private:
    std::string path_;
};

// Unlinks a temporary file of ours on every way out.
class TempFile {
  public:
    TempFile() = default;
    ~TempFile() {
        if (!path_.empty()) {
            unlink(path_.c_str());
        }
    }
    TempFile(const TempFile&) = delete;
    TempFile& operator=(const TempFile&) = delete;
    std::string& path() { return path_; }

  private:
    std::string path_;
};

bool isScript(const std::string& name) {
    static const std::string kSuffix = ".sh";
    return name.size() >= kSuffix.size() &&
           name.compare(name.size() - kSuffix.size(), kSuffix.size(), kSuffix) == 0;
}

int extractMembers(const std::string& cpkFile, const std::string& dir,
                   const std::vector<std::string>& members) {
    CORVUtils::ProcessRunner tar("/bin/tar", {"xf", cpkFile, "-C", dir});
    for (const std::string& member : members) {
        tar.addArguments(member);
    }
    tar.addArguments("--no-same-owner");
    return tar.run(true, true);
}

// Reads the wizard file `path` found for `info`; a script is run first.
void readCandidate(const PackageInfo& info, const char* cpkFile, const std::string& path,
                   const char* language, PKG_INSTALLATION_TYPE type, Json::Value& wizard) {
    if (isScript(path)) {
        PMSRunUIScript(info, cpkFile, path, language, type, wizard);
    } else {
        PMReadUIFileContent(path, wizard);
    }
}

}  // namespace

bool PMSExtractUIFile(const char* cpkFile, const char* dir, const std::string& member,
                      std::string& path) {
    if (cpkFile == nullptr || dir == nullptr) {
        return false;
    }
    const std::string extracted = std::string(dir) + "/" + member;
    // A wizard script that is a link would run its target; a pipe would stall the read.
    if (extractMembers(cpkFile, dir, {member}) != 0 || !PMSCheckPackageMembers(dir) ||
        !VLIBCFileExist(extracted.c_str())) {
        return false;
    }
    path = extracted;
    return true;
}

bool PMSRunUIScript(const PackageInfo& info, const char* cpkFile, const std::string& script,
                    const char* language, PKG_INSTALLATION_TYPE type, Json::Value& wizard) {
    // The result file goes on every way out (5).
    CORVUtils::ProcessRunner runner(script);
    TempFile result;
    if (!PMSCreateTmpFile(result.path())) {
        return false;
    }
    const std::string& resultFile = result.path();
    switch (type) {
        case PKG_INSTALL:
            PMSPrepareScriptEnv(info, runner, language, &resultFile, PKG_INSTALL, nullptr, nullptr,
                                cpkFile, nullptr);
            break;
        case PKG_UPGRADE: {
            // The upgrade wizard speaks for the installed package, which it may ask about.
            PackageManager pm;
            PackageInfo installed;
            if (!pm.getInstallPackageInfo(info.package, installed, language, PKG_INFO_MASK_ALL)) {
                CORV_LOG_ERR("Previous %s not installed, upgrade not possible",
                             info.package.c_str());
                return false;
            }
            runner.addEnv("CORVPKG_OLD_PKGVER", installed.version);
            PMSPrepareScriptEnv(installed, runner, language, &resultFile, PKG_UPGRADE, nullptr,
                                nullptr, cpkFile, nullptr);
            break;
        }
        case PKG_UNINSTALL:
            PMSPrepareScriptEnv(info, runner, language, &resultFile, PKG_UNINSTALL, nullptr,
                                nullptr, nullptr, nullptr);
            break;
        default:
            return false;
    }
    // The script's own output is not the wizard; it is captured and dropped.
    if (runner.run(true, true) != 0) {
        CORV_LOG_ERR("Failed to run %s for %s", script.c_str(), info.package.c_str());
        return false;
    }
    // A script that ran has done its part; what it wrote is judged by the caller.
    PMReadUIFileContent(resultFile, wizard);
    return true;
}

bool PMReadUIFileContent(const std::string& path, Json::Value& wizard) {
    std::string text;
    if (!PMSReadRegularFile(path, text)) {
        CORV_LOG_ERR("Fail to read %s", path.c_str());
        return false;
    }
    // Parsed aside: a half-read document must not pass for steps and stop the search
    // for the next wizard file.
    Json::Reader reader;
    Json::Value parsed;
    if (!reader.parse(text, parsed)) {
        CORV_LOG_ERR("%s: %s", path.c_str(), reader.getFormattedErrorMessages().c_str());
        return false;
    }
    wizard = parsed;
    if (!wizard.isArray()) {
        CORV_LOG_ERR("Fail to parse %s", path.c_str());
        return false;
    }
    for (const Json::Value& step : wizard) {
        if (!step.isObject() || !step["items"].isArray()) {
            CORV_LOG_ERR("Fail to parse %s in [items]", path.c_str());
            return false;
        }
    }
    return true;
}

namespace {

// The text of a JSON value as an answer: numbers and booleans in their JSON spelling,
// null as "", arrays and objects as compact JSON.
std::string answerText(const Json::Value& value) {
    if (value.isArray() || value.isObject()) {
        return toString(value);
    }
    return value.asString();
}

void collectDefaults(const Json::Value& node, Json::Value& values) {
    if (node.isArray()) {
        for (const Json::Value& element : node) {
            collectDefaults(element, values);
        }
        return;
    }
    if (!node.isObject()) {
        return;
    }
    if (node.isMember("key") && node.isMember("defaultValue")) {
        values[answerText(node["key"])] = answerText(node["defaultValue"]);
    }
    for (const Json::Value& member : node) {
        if (member.isArray() || member.isObject()) {
            collectDefaults(member, values);
        }
    }
}

}  // namespace

void getUIDefaultValues(Json::Value ui, Json::Value& values) {
    // Answers are members of an object; anything else cannot take them.
    if (!values.isNull() && !values.isObject()) {
        return;
    }
    collectDefaults(ui, values);
}

namespace {

// The first candidate that gives steps wins. With `extracted`, every candidate the file
// has is in `dir` already, and a missing one is not asked of tar again: each tar run
// reads through the whole package file.
void findWizard(const std::string& cpkFile, const std::string& dir, PKG_INSTALLATION_TYPE type,
                PackageInfo& info, const char* language, bool extracted) {
    for (const std::string& candidate : PMSUIFileCandidates(language, type)) {
        // A file that the caller took out already is not extracted a second time.
        std::string path = dir + "/" + candidate;
        if (!VLIBCFileExist(path.c_str()) &&
            (extracted || !PMSExtractUIFile(cpkFile.c_str(), dir.c_str(), candidate, path))) {
            continue;
        }
        readCandidate(info, cpkFile.c_str(), path, language, type, info.wizard);
        if (!info.wizard.empty()) {
            break;
        }
    }
}

}  // namespace

bool PackageManager::parseUIFile(const std::string& cpkFile, const std::string& dir,
                                 PKG_INSTALLATION_TYPE type, PackageInfo& info,
                                 const char* language) {
    findWizard(cpkFile, dir, type, info, language, false);
    // A package without a wizard, or with a broken one, goes on without one.
    return true;
}

bool PackageManager::queryPackageFileInfoWithWizard(const std::string& cpkFile, PackageInfo& info,
                                                    PKG_INSTALLATION_TYPE type,
                                                    const char* language) {
    if (cpkFile.empty()) {
        CORV_LOG_ERR("Wrong parameters");
        return false;
    }
    std::string tmp;
    if (!PMSCreateTmpFolder(tmp)) {
        CORV_LOG_ERR("Failed to generate temp filename");
        return false;
    }
    TempFolder cleanup(tmp);  // the folder goes on every way out
    if (!PMSExtractPackageInfo(tmp, cpkFile, info, language)) {
        CORV_LOG_ERR("Failed to query info");
        return false;
    }
    if (type == 0) {
        type = PMSCheckPackage(info.package) ? PKG_UPGRADE : PKG_INSTALL;
    }
    // The licence and every wizard file this operation may use come out in one tar run;
    // each is optional, so what is missing is simply not there afterwards.
    std::vector<std::string> members{"LICENSE"};
    for (const std::string& candidate : PMSUIFileCandidates(language, type)) {
        members.push_back(candidate);
    }
    extractMembers(cpkFile, tmp, members);
    // A licence or wizard file that is a link would be read through it; a pipe would stall.
    if (!PMSCheckPackageMembers(tmp)) {
        return false;
    }
    // A package need not have a licence; a longer one is cut, not refused.
    const std::string license = tmp + "/LICENSE";
    if (VLIBCFileExist(license.c_str()) &&
        !PMReadFile(license.c_str(), kLicenseLimit, info.license, nullptr)) {
        CORV_LOG_ERR("Failed to read license file LICENSE in %s", cpkFile.c_str());
        return false;
    }
    findWizard(cpkFile, tmp, type, info, language, true);
    return true;
}

bool PackageManager::readUIFile(PKG_INSTALLATION_TYPE type, const std::string& name,
                                PackageInfo& info, const char* language) const {
    if (type == 0) {
        return true;
    }
    for (const std::string& candidate : PMSUIFileCandidates(language, type)) {
        char path[4096];
        snprintf(path, sizeof(path), "/var/packages/%s/%s", name.c_str(), candidate.c_str());
        if (!VLIBCFileExist(path)) {
            continue;
        }
        readCandidate(info, nullptr, path, language, type, info.wizard);
        if (!info.wizard.empty()) {
            return true;
        }
    }
    return false;
}

bool PackageManager::readUIFile(const std::string&, const std::string&, PackageInfo&,
                                const char*) const {
    return false;
}

}  // namespace CORVPackageTool
