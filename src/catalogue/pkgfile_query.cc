// Reading a package file: single members through /bin/tar, never the whole archive.
#include <stdio.h>
#include <string.h>

#include <string>
#include <vector>

#include "catalogue/pkgchecksum.h"
#include "common/md5.h"
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

int extract(const std::string& cpkFile, const std::string& dir,
            const std::vector<std::string>& members, bool keepPermissions,
            CORVUtils::ProcessRunner* keep = nullptr) {
    CORVUtils::ProcessRunner tar("/bin/tar", {"xf", cpkFile, "-C", dir});
    for (const std::string& member : members) {
        tar.addArguments(member);
    }
    tar.addArguments("--no-same-owner");
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
    if (extract(cpkFile, dir, {"INFO"}, true, &infoRun) != 0) {
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
    // conf/ and the scripts are optional, so one tar run takes them all and its verdict
    // does not matter: a member that is missing is simply not there. Every fork costs a
    // pass over the archive's headers, and a query runs on each inspect and install.
    // The scripts are taken even when INFO does not read; they are not looked at then.
    std::vector<std::string> optional{"conf"};
    for (const PKG_SCRIPT_ENTRY& script : g_PackageScripts) {
        optional.push_back(std::string("scripts/") + script.name);
    }
    extract(cpkFile, dir, optional, false);
    // A member that is a link would be read, or a script's target made executable, through it.
    if (!PMSCheckPackageMembers(dir)) {
        return false;
    }
    // A bad INFO is judged by the callers, from what was read.
    bool loaded = PMSLoadPKGInfoFile(dir, info, language, PKG_INFO_MASK_ALL);
    info.script_mask = 0;
    if (!loaded) {
        return true;
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

namespace {

// The MD5 of the member `package.tgz` as /usr/bin/openssl prints it (lower-case hex),
// read from tar's standard output: the payload is read once, hashed while tar reads on,
// and never written to disk. Empty when tar cannot give the member.
std::string payloadChecksum(const std::string& cpkFile) {
    FILE* out = VLIBCPopen("/bin/tar", "rq", "xOf", cpkFile.c_str(), "package.tgz", nullptr);
    if (out == nullptr) {
        return "";
    }
    Md5 md5;
    bool ok = md5.restart();
    std::vector<unsigned char> chunk(256 * 1024);
    size_t n;
    while ((n = fread(chunk.data(), 1, chunk.size(), out)) > 0) {
        md5.update(chunk.data(), n);
    }
    ok = !ferror(out) && VLIBCPclose(out) == 0 && ok;
    std::string hex = md5.hexDigest();
    return ok ? hex : "";
}

}  // namespace

bool PackageManager::verifyPackageTgzFile(const std::string& cpkFile, const char* checksum) {
    if (cpkFile.empty()) {
        CORV_LOG_ERR("Wrong parameters");
        return false;
    }
    if (checksum == nullptr) {
        return true;
    }
    const std::string sum = payloadChecksum(cpkFile);
    if (sum.empty()) {
        CORV_LOG_ERR("Failed to extract the package.tgz in %s", cpkFile.c_str());
        return false;
    }
    // Byte for byte: the INFO key must be in the tool's lower case.
    if (sum != checksum) {
        CORV_LOG_ERR("Failed to verify %s", cpkFile.c_str());
        return false;
    }
    return true;
}

bool PMSCompareCheckSum(const char* path, const char* expected) {
    if (path == nullptr || expected == nullptr) {
        return false;
    }
    PendingChecksum checksum;
    return checksum.start(path) && checksum.matches(expected);
}

}  // namespace CORVPackageTool
