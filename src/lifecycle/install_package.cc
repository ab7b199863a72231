// Fresh installation of a package file: unpack, check, run preinst, move the payload to its
// volume, register, run postinst and start. The road has no rollback of its own; what each
// failure leaves behind is what the next install call (a repair) expects to find.
#include <fcntl.h>
#include <openssl/evp.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "catalogue/packagemanager_private.h"
#include "corv/app_priv.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/user.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgfile.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgschedule.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "corvpkg/resource.h"
#include "lifecycle/install_private.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kGuestGroup = "CorvelGuests";
constexpr unsigned long long kInstallInfoMask = 0xFFFFFFFFF7FFFFFFULL;

// Closes the package's desktop applications to guests. Failures are logged: they never
// fail an installation.
void denyGuestAccess(const PackageInfo& info) {
    PCORVGROUP group = nullptr;
    bool ok = true;
    if (CORVGroupGet(kGuestGroup, &group) < 0) {
        if (VLIBCErrGet() == ERR_NO_SUCH_GROUP) {
            return;
        }
        CORV_LOG_ERR("Failed to check existence of group '%s' [0x%04X %s:%d]", kGuestGroup,
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        ok = false;
    } else if (CORVGroupIsReserved(group->name, group->gid)) {
        for (const std::string& app : PMSExplodeString(info.nosappname, " ")) {
            if (VLIBAppPrivGroupDenyOne(kGuestGroup, app.c_str()) < 0) {
                CORV_LOG_ERR("VLIBAppPrivGroupDenyOne failed for %s[0x%04X %s:%d]", app.c_str(),
                             VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            }
        }
    }
    CORVGroupFree(group);
    if (!ok) {
        CORV_LOG_ERR("DenyGroupAccess failed for '%s'", info.package.c_str());
    }
}

}  // namespace

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

bool PMSUnpackAndCheck(PackageManager& pm, PKG_INSTALLATION_TYPE type, InstallCommands& cmd,
                       const std::string& cpkPath, const std::string& workDir, PackageInfo& info,
                       bool nameTheDir) {
    // 2.
    if (!PackageManager::ExLock(180)) {
        pm.setResult(PKG_ERR_LOCKED);
        return false;
    }
    // 3.
    PMSRunLogged(info, type, cmd.removeWorkDir);
    if (!PMSRunLogged(info, type, cmd.makeWorkDir)) {
        CORV_LOG_ERR("Failed to create install dir %s", workDir.c_str());
        pm.setResult(PKG_ERR_SYSTEM);
        return false;
    }
    // 4.
    if (!PMSRunLogged(info, type, cmd.extractAll) || !PMSCheckPackageMembers(workDir)) {
        CORV_LOG_ERR("Failed to extract package, %s", cpkPath.c_str());
        PMSExplainFailedUnpack(pm, workDir, PMSFileBytes(cpkPath));
        pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    // 5.
    if (!PMSLoadPKGInfoFile(workDir, info, nullptr, kInstallInfoMask)) {
        if (nameTheDir) {
            CORV_LOG_ERR("Failed to validate package INFO in %s", workDir.c_str());
        } else {
            CORV_LOG_ERR("Failed to validate package INFO");
        }
        pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    // 6.
    if (!PMSCheckPackageArchModelMatched(info)) {
        CORV_LOG_ERR("Unsupported system arch");
        pm.setResult(PKG_ERR_ARCH_MISMATCH);
        return false;
    }
    // 7.
    if (!pm.CanPackageStartInThisFirmware(info)) {
        CORV_LOG_ERR("Cannot start package [%s], version %s in this NOS version",
                     info.package.c_str(), info.version.c_str());
        return false;
    }
    // 8.
    if (access((workDir + "/package.tgz").c_str(), F_OK) != 0) {
        CORV_LOG_ERR("Failed to locate %s/package.tgz", workDir.c_str());
        pm.setResult(PKG_ERR_BAD_ARCHIVE);
        return false;
    }
    return true;
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

int PackageManager::install_package(const std::string& cpkPath, const std::string& volume,
                                    const std::string& storeRoot, const std::string& tmpRoot,
                                    bool startAfterInstall, const Json::Value* extra,
                                    const char* language, const char* userName) {
    const PKG_INSTALLATION_TYPE type = static_cast<PKG_INSTALLATION_TYPE>(1);
    PackageInfo& info = d->packageInfo;
    const std::string workDir = tmpRoot + "/pkginstall";
    int outcome = 0;
    bool running = false;
    bool postinstAcquireFailed = false;
    unsigned long long restartMask = 0;
    std::string target;
    std::string registry;
    std::string progressPath;
    std::string logFile;
    CORV::PkgUtils::WorkerResp resp;
    ScriptContext ctx;

    // 1.
    InstallCommands cmd(cpkPath, workDir);
    // 2-8.
    if (!PMSUnpackAndCheck(*this, type, cmd, cpkPath, workDir, info, true)) {
        goto final;
    }
    // 9.
    getServiceStatus(info.package, running, true);
    if (getResult() != PKG_ERR_NOT_INSTALLED) {
        CORV_LOG_ERR("Package %s already installed", info.package.c_str());
        setResult(PKG_ERR_ALREADY_INSTALLED);
        goto final;
    }
    // 10.
    if (!PMSRunLogged(info, type, cmd.extractPayload) ||
        !PMSDropSpecialFiles(workDir + "/package")) {
        CORV_LOG_ERR("Failed to unpack package.tgz, %s", cpkPath.c_str());
        PMSExplainFailedUnpack(*this, workDir + "/package", PMSPayloadSize(info, workDir));
        setResult(PKG_ERR_BAD_ARCHIVE);
        goto final;
    }
    // 11.
    logFile = getFixedLogFilePath(info.package);
    progressPath = PMSGetProgressPath(info.package);
    unlink(progressPath.c_str());
    // 12.
    if (!Privilege::ReviseFileAttr(info.package, workDir) ||
        !Resource::InitRequiredFields(info.package, workDir)) {
        goto final;
    }
    // 13.
    if (!Resource::Acquire(Resource::TIMING_PREINST, info, type, resp, extra, workDir)) {
        CORV_LOG_ERR("Failed to acquire resource before install %s [0x%04X %s:%d]",
                     info.package.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        insertJsonParam("worker_msg", resp.GetErrJsonArray());
        setResult(PKG_ERR_INSTALL_FAILED);
        goto final;
    }
    // 14. The script runs from the work directory, before anything is registered.
    ctx = ScriptContext{
        language,        logFile,  extra, volume.c_str(),
        cpkPath.c_str(), userName, &resp, {{"CORVPKG_PKGINST_TEMP_DIR", workDir + "/package"}}};
    if (PMSCheckIsExec(workDir + "/scripts/preinst")) {
        int ret = PMSRunInstallScript(info, workDir + "/scripts/preinst", "preinst", type, ctx,
                                      true, workDir);
        if (ret == kScriptIdentityFailed) {
            setResult(PKG_ERR_SYSTEM);
            goto final;
        }
        if (ret != 0) {
            CORV_LOG_ERR("Failed to run preinst script for %s, [%d]", info.package.c_str(), ret);
            setResult(PKG_ERR_SYSTEM);
            goto final;
        }
    }
    // 15.
    target = storeRoot + "/" + info.package;
    if (!PMSClearTarget(info, type, target)) {
        goto final;
    }
    // 16.
    {
        CORVUtils::ProcessRunner mv("/bin/mv", {"-f", workDir + "/package", target});
        if (!PMSRunLogged(info, type, mv)) {
            CORV_LOG_ERR("Failed to move package files, %s", target.c_str());
            setResult(PKG_ERR_SYSTEM);
            goto final;
        }
    }
    // 17. A registry left over from an earlier, failed road would mix with the new one.
    registry = PMSRegistryDir(info.package);
    if (!info.package.empty()) {
        CORVUtils::ProcessRunner rm("/bin/rm", {"-rf", registry});
        PMSRunLogged(info, type, rm);
    }
    if (!ExLock(180)) {
        CORV_LOG_ERR("Failed to lock, %s", info.package.c_str());
        setResult(PKG_ERR_LOCKED);
        goto final;
    }
    // 18. A preinst may have damaged the INFO it was unpacked with.
    if (!PMSInfoFileUsable(workDir)) {
        if (!PMSLoadPKGInfoFile(workDir, info, nullptr, kInstallInfoMask)) {
            CORV_LOG_ERR("Failed to validate package INFO in %s", workDir.c_str());
            PMSRunLogged(info, type, cmd.repairExtract);
            if (!PMSLoadPKGInfoFile(workDir, info, nullptr, kInstallInfoMask)) {
                CORV_LOG_ERR("Failed to validate package INFO");
                setResult(PKG_ERR_BAD_ARCHIVE);
                goto final;
            }
        }
    }
    // 19.
    if (PKG_ERRCODE icons = PMSFoldIcons(workDir, info.package); icons != PKG_OK) {
        setResult(icons);
        goto final;
    }
    // 20.
    if (!registerPackage(type, info, workDir, target)) {
        CORV_LOG_ERR("Failed to register package for %s", info.package.c_str());
        setResult(PKG_ERR_SYSTEM);
        goto final;
    }
    // 21. postinst still runs: the package is there and may need its own cleanup.
    if (!Resource::Acquire(Resource::TIMING_POSTINST, info, type, resp, extra, "")) {
        postinstAcquireFailed = true;
        CORV_LOG_ERR("Failed to acquire resource after install %s [0x%04X %s:%d]",
                     info.package.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        insertJsonParam("worker_msg", resp.GetErrJsonArray());
    }
    // 22-24.
    denyGuestAccess(info);
    // 25.
    restartMask = info.instuninst_restart_services;
    // 26.
    if (PMSCheckIsExec(registry + "/scripts/postinst")) {
        int ret = PMSRunInstallScript(info, registry + "/scripts/postinst", "postinst", type, ctx,
                                      true, "");
        if (ret != 0) {
            if (ret != kScriptIdentityFailed) {
                CORV_LOG_ERR("Failed to run postinst script for %s, %d", info.package.c_str(), ret);
            }
            setResult(PKG_ERR_SYSTEM);
            goto restart;
        }
    }
    // 27. The registry keeps `installing`: the package shows as broken until repaired.
    if (postinstAcquireFailed) {
        setResult(PKG_ERR_INSTALL_FAILED);
        goto restart;
    }
    // 28.
    post_install(info);
    unlink(progressPath.c_str());
    unlink((registry + "/installing").c_str());
    outcome = 1;
    if (startAfterInstall || !info.startable) {
        std::vector<std::string> order;
        if (!getDependencyOrder(info.package.c_str(), order, false)) {
            order = {info.package};
        }
        restartMask |= findRestartServices(order);
        const std::string name = info.package;
        serviceControl(type, name, true, language, userName, nullptr, true, false);
    }
restart:
    // 29.
    if (restartMask != 0) {
        RestartServicesAction(restartMask);
    }
final:
    // 30.
    if (getResult() != PKG_ERR_LOCKED && VLIBCFileCheckDir(workDir.c_str())) {
        PMSRunLogged(info, type, cmd.removeWorkDir);
    }
    PMSWriteSysLogf("%s %s %s %s", "install", info.package.c_str(), info.version.c_str(),
                    outcome ? "successfully" : "failed");
    PMSCheckServiesStatus(info, nullptr, type, -1);
    return outcome;
}

bool PackageManager::post_install(const PackageInfo& info) {
    (void)info;
    PMSSavaDefNotify();
    return true;
}

}  // namespace CORVPackageTool
