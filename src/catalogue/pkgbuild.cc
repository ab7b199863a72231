// The package builder: a source tree in, an uncompressed tar with INFO and package.tgz out.
#include "corvpkg/pkgbuild.h"

#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/codesign.h"
#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgtool.h"

namespace CORVPackageTool {

namespace {

const char* const kOptionalParts[] = {
    "scripts", "conf", "WIZARD_UIFILES", "LICENSE", "PACKAGE_ICON.PNG", "PACKAGE_ICON_256.PNG"};

class Staging {
  public:
    Staging() {
        char tmpl[] = "/tmp/corvpkg-build.XXXXXX";
        if (mkdtemp(tmpl) != nullptr) {
            path_ = tmpl;
        }
    }
    ~Staging() {
        if (!path_.empty()) {
            VLIBCExec("/bin/rm", "-rf", path_.c_str(), nullptr);
        }
    }
    Staging(const Staging&) = delete;
    Staging& operator=(const Staging&) = delete;
    const std::string& path() const { return path_; }

  private:
    std::string path_;
};

bool run(CORVUtils::ProcessRunner runner, std::string& error) {
    if (runner.run(true, true) != 0) {
        error = runner.toString() + " failed: " + runner.getCapturedOutputErr();
        while (!error.empty() && error.back() == '\n') {
            error.pop_back();
        }
        return false;
    }
    return true;
}

bool md5Of(const std::string& path, std::string& sum) {
    FILE* out = VLIBCPopen("/usr/bin/openssl", "r", "md5", path.c_str(), nullptr);
    if (out == nullptr) {
        return false;
    }
    char line[1024] = "";
    bool read = fgets(line, sizeof(line), out) != nullptr;
    VLIBCPclose(out);
    const char* found = read ? strstr(line, "= ") : nullptr;
    if (found == nullptr) {
        return false;
    }
    sum.assign(found + 2, strcspn(found + 2, "\n"));
    return !sum.empty();
}

std::string absolute(const std::string& path) {
    if (!path.empty() && path[0] == '/') {
        return path;
    }
    char cwd[4096];
    return getcwd(cwd, sizeof(cwd)) ? std::string(cwd) + "/" + path : path;
}

}  // namespace

bool PMSBuildPackageFile(const std::string& sourceDir, const std::string& output,
                         const std::string& signKey, std::string& error) {
    // The INFO must be one that the engine accepts, or the package could never install.
    PackageInfo info;
    if (!PMSLoadPKGInfoFile(sourceDir, info, "enu", PKG_INFO_MASK_ALL)) {
        error = sourceDir +
                "/INFO is missing or does not read (package, version, maintainer "
                "and description are required)";
        return false;
    }
    if (!VLIBCFileCheckDir((sourceDir + "/package").c_str())) {
        error = sourceDir + "/package/ (the payload) is missing";
        return false;
    }
    Staging staging;
    if (staging.path().empty()) {
        error = "cannot make a temporary directory";
        return false;
    }
    const std::string stage = staging.path();
    // The payload, with neutral ownership so that it unpacks the same everywhere.
    if (!run(CORVUtils::ProcessRunner("/bin/tar",
                                      {"czf", stage + "/package.tgz", "--owner=0", "--group=0",
                                       "--numeric-owner", "-C", sourceDir + "/package", "."}),
             error)) {
        return false;
    }
    std::string sum;
    if (!md5Of(stage + "/package.tgz", sum)) {
        error = "cannot compute the checksum of package.tgz";
        return false;
    }
    if (!run(CORVUtils::ProcessRunner("/bin/cp", {sourceDir + "/INFO", stage + "/INFO"}), error)) {
        return false;
    }
    if (VLIBCFileSetKeyValue((stage + "/INFO").c_str(), "checksum", sum.c_str(), "%s=\"%s\"\n") !=
        0) {
        error = "cannot write the checksum into INFO";
        return false;
    }
    std::vector<std::string> members = {"INFO", "package.tgz"};
    for (const char* part : kOptionalParts) {
        const std::string from = sourceDir + "/" + part;
        if (access(from.c_str(), F_OK) != 0) {
            continue;
        }
        if (!run(CORVUtils::ProcessRunner("/bin/cp", {"-a", from, stage + "/" + part}), error)) {
            return false;
        }
        members.push_back(part);
    }
    // Uncompressed outer archive, written beside its final name and renamed into place.
    const std::string target = absolute(output);
    const std::string partial = target + ".partial";
    CORVUtils::ProcessRunner tar(
        "/bin/tar", {"cf", partial, "--owner=0", "--group=0", "--numeric-owner", "-C", stage});
    for (const std::string& member : members) {
        tar.addArguments(member);
    }
    if (!run(tar, error)) {
        unlink(partial.c_str());
        return false;
    }
    if (!signKey.empty()) {
        CORVUtils::ProcessRunner sign(CORVCodesignCommand()[0]);
        for (const char* const* part = CORVCodesignCommand() + 1; *part != nullptr; ++part) {
            sign.addArguments(*part);
        }
        sign.addArguments("--sign", signKey, partial);
        if (!run(sign, error)) {
            unlink(partial.c_str());
            return false;
        }
    }
    if (rename(partial.c_str(), target.c_str()) != 0) {
        error = "cannot write " + target + ": " + strerror(errno);
        unlink(partial.c_str());
        return false;
    }
    return true;
}

}  // namespace CORVPackageTool
