// Reading a package file: single members through /bin/tar, never the whole archive.
#include <stdio.h>
#include <string.h>

#include <string>

#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

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

int extract(const std::string& cpkFile, const std::string& dir, const std::string& member,
            bool keepPermissions, CORVUtils::ProcessRunner* keep = nullptr) {
    CORVUtils::ProcessRunner tar("/bin/tar", {"xf", cpkFile, "-C", dir, member, "--no-same-owner"});
    if (!keepPermissions) {
        tar.addArguments("--no-same-permissions");
    }
    int rc = tar.run(true, true);
    if (keep != nullptr) {
        *keep = tar;
    }
    return rc;
}

}  // namespace

bool PMSExtractPackageInfo(const std::string& dir, const std::string& cpkFile, PackageInfo& info,
                           const char* language) {
    CORVUtils::ProcessRunner infoRun("/bin/tar");
    if (extract(cpkFile, dir, "INFO", true, &infoRun) != 0) {
        CORV_LOG_ERR("Failed to extract package INFO to %s", dir.c_str());
        CORV_LOG_ERR("%s", infoRun.toString().c_str());
        if (!infoRun.getCapturedOutput().empty()) {
            CORV_LOG_ERR("stdout: %s", infoRun.getCapturedOutput().c_str());
        }
        if (!infoRun.getCapturedOutputErr().empty()) {
            CORV_LOG_ERR("stderr: %s", infoRun.getCapturedOutputErr().c_str());
        }
        return false;
    }
    // conf/ is optional.
    extract(cpkFile, dir, "conf", true);
    if (!PMSCheckPackageMembers(dir)) {
        return false;
    }
    // A bad INFO is judged by the callers, from what was read.
    bool loaded = PMSLoadPKGInfoFile(dir, info, language, PKG_INFO_MASK_ALL);
    info.script_mask = 0;
    if (!loaded) {
        return true;
    }
    for (const PKG_SCRIPT_ENTRY& script : g_PackageScripts) {
        char member[128];
        snprintf(member, sizeof(member), "scripts/%s", script.name);
        extract(cpkFile, dir, member, false);
    }
    // A script that is a link would have its target made executable here.
    if (!PMSCheckPackageMembers(dir)) {
        return false;
    }
    info.script_mask = PMGetScriptMask(dir + "/scripts");
    return true;
}

bool PackageManager::queryPackageFileInfo(const std::string& cpkFile, PackageInfo& info,
                                          PKG_INSTALLATION_TYPE, const char* language) {
    if (cpkFile.empty()) {
        CORV_LOG_ERR("Wrong parameters");
        return false;
    }
    std::string tmp;
    if (!PMSCreateTmpFolder(tmp)) {
        CORV_LOG_ERR("Failed to generate temp filename");
        return false;
    }
    TempFolder cleanup(tmp);
    if (!PMSExtractPackageInfo(tmp, cpkFile, info, language)) {
        CORV_LOG_ERR("Failed to query info");
        return false;
    }
    return true;
}

bool PackageManager::verifyPackageTgzFile(const std::string& cpkFile, const char* checksum) {
    if (cpkFile.empty()) {
        CORV_LOG_ERR("Wrong parameters");
        return false;
    }
    std::string tmp;
    if (!PMSCreateTmpFolder(tmp)) {
        CORV_LOG_ERR("Failed to generate temp filename");
        return false;
    }
    // The work directory repeats the temporary path under itself. Only that inner
    // directory, which holds the extracted payload, is removed at the end; the empty
    // outer folder stays.
    const std::string work = tmp + "/" + tmp;
    TempFolder inner(work);
    CORVUtils::ProcessRunner mkdirRun("/bin/mkdir", {"-p", work});
    if (mkdirRun.run(true, true) != 0) {
        CORV_LOG_ERR("Failed to mkdir tempdir %s", work.c_str());
        return false;
    }
    if (checksum == nullptr) {
        return true;
    }
    if (extract(cpkFile, work, "package.tgz", true) != 0) {
        CORV_LOG_ERR("Failed to extract the package.tgz in %s", work.c_str());
        PMSExplainFailedUnpack(*this, work, PMSArchiveBytes(cpkFile, false, "package.tgz"));
        return false;
    }
    char path[4096];
    snprintf(path, sizeof(path), "%s/package.tgz", work.c_str());
    if (!PMSCompareCheckSum(path, checksum)) {
        CORV_LOG_ERR("Failed to verify %s", cpkFile.c_str());
        return false;
    }
    return true;
}

bool PMSCompareCheckSum(const char* path, const char* expected) {
    if (path == nullptr || expected == nullptr || !VLIBCFileExist(path)) {
        return false;
    }
    FILE* out = VLIBCPopen("/usr/bin/openssl", "r", "md5", path, nullptr);
    char line[1024] = "";
    bool read = out != nullptr && fgets(line, sizeof(line), out) != nullptr;
    if (out != nullptr) {
        VLIBCPclose(out);
    }
    if (!read) {
        CORV_LOG_ERR("%s failed, path=%s", "/usr/bin/openssl md5", path);
        return false;
    }
    line[strcspn(line, "\n")] = '\0';
    const char* sum = strstr(line, "= ");
    if (sum == nullptr) {
        CORV_LOG_ERR("Invalid output");
        return false;
    }
    // Byte for byte: the INFO key must be in the tool's lower case.
    return strcmp(sum + 2, expected) == 0;
}

}  // namespace CORVPackageTool
