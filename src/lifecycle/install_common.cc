// What the installation and the upgrade share: the work area's commands, the unpack and
// check of a package file, the payload target, the icons and the install scripts.
#include <openssl/evp.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/pkgchecksum.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "lifecycle/install_private.h"
#include "lifecycle/road.h"

namespace CORVPackageTool {

InstallCommands::InstallCommands(const std::string& cpkPath, const std::string& workDir)
    : removeWorkDir("/bin/rm", {"-rf", workDir}),
      makeWorkDir("/bin/mkdir", {"-p", workDir + "/package"}),
      repairExtract("/bin/tar", {"xf", cpkPath, "-C", workDir, "INFO", "conf", "--no-same-owner"}),
      extractAll("/bin/tar", {"xf", cpkPath, "-C", workDir, "--no-same-owner"}),
      extractPayload("/bin/tar", {"xf", workDir + "/package.tgz", "-C", workDir + "/package",
                                  "--no-same-owner"}) {}

bool PMSRunLogged(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                  CORVUtils::ProcessRunner& runner) {
    return PMSRunAndWriteScriptLog(info, type, runner, -1) == 0;
}

bool PMSUnpackPayload(PackageManager& pm, const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                      InstallCommands& cmd, const std::string& cpkPath,
                      const std::string& workDir) {
    const std::string archive = workDir + "/package.tgz";
    PendingChecksum checksum;
    const bool verify = pm.checksumWhileUnpacking() && !info.checksum.empty();
    // Both read the same archive from the page cache; the hash takes the other core while
    // tar and its decompressor take this one.
    if (verify) {
        checksum.start(archive.c_str());
    }
    if (!PMSRunLogged(info, type, cmd.extractPayload) ||
        !PMSDropSpecialFiles(workDir + "/package")) {
        CORV_LOG_ERR("Failed to unpack package.tgz, %s", cpkPath.c_str());
        PMSExplainFailedUnpack(pm, workDir + "/package", PMSPayloadSize(info, workDir));
        pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    if (verify && !checksum.matches(info.checksum.c_str())) {
        CORV_LOG_ERR("Failed to verify %s", cpkPath.c_str());
        pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
}

namespace {

// What the first steps of an installation or an upgrade work on.
struct UnpackRoad {
    PackageManager& pm;
    PKG_INSTALLATION_TYPE type;
    InstallCommands& cmd;
    const std::string& cpkPath;
    const std::string& workDir;
    PackageInfo& info;
    bool nameTheDir;
};

bool lock(UnpackRoad& r) {
    if (!PackageManager::ExLock(180)) {
        r.pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    return true;
}

// A work directory left by an earlier road that was cut short must not mix in.
bool makeWorkDir(UnpackRoad& r) {
    PMSRunLogged(r.info, r.type, r.cmd.removeWorkDir);
    if (!PMSRunLogged(r.info, r.type, r.cmd.makeWorkDir)) {
        CORV_LOG_ERR("Failed to create install dir %s", r.workDir.c_str());
        r.pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    return true;
}

bool extractPackage(UnpackRoad& r) {
    if (!PMSRunLogged(r.info, r.type, r.cmd.extractAll) || !PMSCheckPackageMembers(r.workDir)) {
        CORV_LOG_ERR("Failed to extract package, %s", r.cpkPath.c_str());
        PMSExplainFailedUnpack(r.pm, r.workDir, PMSFileBytes(r.cpkPath));
        r.pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
}

bool readInfo(UnpackRoad& r) {
    if (!PMSLoadPKGInfoFile(r.workDir, r.info, nullptr, kInstallInfoMask)) {
        if (r.nameTheDir) {
            CORV_LOG_ERR("Failed to validate package INFO in %s", r.workDir.c_str());
        } else {
            CORV_LOG_ERR("Failed to validate package INFO");
        }
        r.pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
}

bool checkArch(UnpackRoad& r) {
    if (!PMSCheckPackageArchModelMatched(r.info)) {
        CORV_LOG_ERR("Unsupported system arch");
        r.pm.setResult(PKG_ERR_ARCH_MISMATCH);
        return false;
    }
    return true;
}

// The firmware's version limits; the check sets its own result.
bool checkVersionLimits(UnpackRoad& r) {
    if (!r.pm.CanPackageStartInThisFirmware(r.info)) {
        CORV_LOG_ERR("Cannot start package [%s], version %s in this NOS version",
                     r.info.package.c_str(), r.info.version.c_str());
        return false;
    }
    return true;
}

bool findPayloadArchive(UnpackRoad& r) {
    if (access((r.workDir + "/package.tgz").c_str(), F_OK) != 0) {
        CORV_LOG_ERR("Failed to locate %s/package.tgz", r.workDir.c_str());
        r.pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
}

constexpr RoadStep<UnpackRoad> kUnpackSteps[] = {
    {"lock", lock},
    {"make-work-dir", makeWorkDir},
    {"extract-package", extractPackage},
    {"read-info", readInfo},
    {"check-arch", checkArch},
    {"check-version-limits", checkVersionLimits},
    {"find-payload-archive", findPayloadArchive},
};

}  // namespace

bool PMSUnpackAndCheck(const char* road, PackageManager& pm, PKG_INSTALLATION_TYPE type,
                       InstallCommands& cmd, const std::string& cpkPath, const std::string& workDir,
                       PackageInfo& info, bool nameTheDir) {
    UnpackRoad r{pm, type, cmd, cpkPath, workDir, info, nameTheDir};
    return PMSRunRoad(road, r, kUnpackSteps);
}

bool PMSInfoFileUsable(const std::string& workDir) {
    struct stat st {};
    return stat((workDir + "/INFO").c_str(), &st) == 0 && st.st_size > 0;
}

bool PMSClearTarget(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                    const std::string& target) {
    if (access(target.c_str(), F_OK) != 0) {
        return true;
    }
    CORVUtils::ProcessRunner rm("/bin/rm", {"-rf", target});
    if (PMSRunLogged(info, type, rm)) {
        return true;
    }
    // What cannot be removed (busy files, a read-only subtree) is moved out of the way on
    // the same volume, so that the new payload gets a clean place.
    std::string tmp;
    if (!PMSGetTmpDir(0, target.c_str(), tmp) && !PMSGetSystemTmpDir(0, tmp)) {
        tmp = "/tmp";
    }
    std::string templ = tmp + "/pkg_XXXXXX";
    std::vector<char> buffer(templ.begin(), templ.end());
    buffer.push_back('\0');
    if (mkdtemp(buffer.data()) == nullptr) {
        CORV_LOG_ERR("Failed to create a temp directory in %s.", tmp.c_str());
        return false;
    }
    CORVUtils::ProcessRunner mv("/bin/mv", {"-f", target, buffer.data()});
    if (!PMSRunLogged(info, type, mv)) {
        CORV_LOG_ERR("Failed to run %s for %s", mv.toString().c_str(), info.package.c_str());
        return false;
    }
    return true;
}

namespace {

// The icon file in base64, or "" when it cannot be read or encoded.
std::string encodeIcon(const std::string& path) {
    std::string raw;
    if (!PMReadFile(path.c_str(), 0x4000000, raw, nullptr)) {
        return "";
    }
    std::string encoded(4 * ((raw.size() + 2) / 3) + 1, '\0');
    int n = EVP_EncodeBlock(reinterpret_cast<unsigned char*>(&encoded[0]),
                            reinterpret_cast<const unsigned char*>(raw.data()),
                            static_cast<int>(raw.size()));
    encoded.resize(n < 0 ? 0 : static_cast<size_t>(n));
    return encoded;
}

}  // namespace

PKG_ERRCODE PMSFoldIcons(const std::string& workDir, const std::string& name) {
    const std::string infoPath = workDir + "/INFO";
    const std::string small = workDir + "/PACKAGE_ICON.PNG";
    if (access(small.c_str(), F_OK) == 0) {
        const std::string data = encodeIcon(small);
        if (data.empty()) {
            CORV_LOG_ERR("Failed to encode package 72x72 icon, PACKAGE_ICON.PNG for %s",
                         name.c_str());
            return PKG_ERR_BAD_ARCHIVE;
        }
        if (VLIBCFileSetKeyValue(infoPath.c_str(), "package_icon", data.c_str(), "%s=\"%s\"\n") ==
            -1) {
            CORV_LOG_ERR("Failed to save 72x72 icon data for %s", name.c_str());
            return PKG_ERR_BAD_ARCHIVE;
        }
    }
    const std::string big = workDir + "/PACKAGE_ICON_256.PNG";
    if (access(big.c_str(), F_OK) == 0) {
        const std::string data = encodeIcon(big);
        if (data.empty()) {
            CORV_LOG_ERR("Failed to encode package 256x256 icon, PACKAGE_ICON_256.PNG for %s",
                         name.c_str());
            return PKG_ERR_BAD_ARCHIVE;
        }
        if (VLIBCFileSetKeyValue(infoPath.c_str(), "package_icon_256", data.c_str(),
                                 "%s=\"%s\"\n") == -1) {
            CORV_LOG_ERR("Failed to save 256x256 icon data for %s", name.c_str());
            return PKG_ERR_BAD_ARCHIVE;
        }
    }
    return PKG_OK;
}

int PMSRunInstallScript(const PackageInfo& info, const std::string& script, const char* action,
                        PKG_INSTALLATION_TYPE type, const ScriptContext& ctx, bool dumpEnv,
                        const std::string& identityDir) {
    CORVUtils::ProcessRunner runner(script, {});
    runner.setArgZero(action);
    for (const auto& [name, value] : ctx.variables) {
        runner.addEnv(name, value);
    }
    PMSPrepareScriptEnv(info, runner, ctx.language, &ctx.logFile, type, ctx.extra, ctx.volume,
                        ctx.cpkPath, ctx.userName);
    if (dumpEnv && ctx.resp != nullptr) {
        ctx.resp->DumpEnv(runner);
    }
    if (!Privilege::SetIdentity(runner, info.package, action, identityDir)) {
        CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", info.package.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return kScriptIdentityFailed;
    }
    return PMSRunAndWriteScriptLog(info, type, runner, 0x90);
}

}  // namespace CORVPackageTool
