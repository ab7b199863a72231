// The package registry /var/packages/<name>: registration of an unpacked package, and the
// gate to its control script.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/user.h"
#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"
#include "lifecycle/lifecycle_private.h"

namespace CORVPackageTool {

namespace {

constexpr int kTargetLinkTries = 60;

bool runLogged(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
               CORVUtils::ProcessRunner& runner) {
    if (PMSRunAndWriteScriptLog(info, type, runner, -1) != 0) {
        CORV_LOG_ERR("Failed to run %s", runner.toString().c_str());
        return false;
    }
    return true;
}

}  // namespace

std::string PMSPackageEtcDir(const std::string& name) {
    return "/usr/corv/etc/packages/" + name;
}

bool PMSCheckPayloadTarget(const std::string& registry) {
    const std::string link = registry + "/target";
    if (PMSReadLink(link).empty() || !VLIBCFileCheckDir(link.c_str())) {
        return false;
    }
    const std::string volume = PMSGetPackageTargetVolByPath(registry.c_str());
    if (volume == PKG_NOT_VOLUME_PATH) {
        return true;
    }
    CORVFSINFO* fs = nullptr;
    int n = FSInfoGet(volume.c_str(), &fs);
    bool ok = n >= 1 && fs != nullptr && (fs->state & CORV_FS_STATE_CRASHED) == 0;
    FSInfoFree(fs);
    return ok;
}

namespace {

// Moves INFO, scripts, wizard files and conf from the unpacked package into the registry.
// The flag goes in right after the directory, before anything can fail half-way, so that
// an interrupted registration always shows as broken.
bool moveControlFiles(const PackageInfo& local, PKG_INSTALLATION_TYPE type,
                      const std::string& workDir, const std::string& registry) {
    CORVUtils::ProcessRunner mkdirRegistry("/bin/mkdir", {"-p", registry});
    CORVUtils::ProcessRunner mvInfo("/bin/mv", {"-f", workDir + "/INFO", registry + "/INFO"});
    CORVUtils::ProcessRunner rmScripts("/bin/rm", {"-rf", registry + "/scripts"});
    CORVUtils::ProcessRunner mvScripts("/bin/mv",
                                       {"-f", workDir + "/scripts", registry + "/scripts"});
    bool ok = runLogged(local, type, mkdirRegistry);
    const std::string flag = registry + "/installing";
    int fd = open(flag.c_str(), O_CREAT | O_TRUNC | O_WRONLY | O_CLOEXEC, 0644);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to create install flag file %s", flag.c_str());
    } else {
        close(fd);
    }
    ok &= runLogged(local, type, mvInfo);
    ok &= runLogged(local, type, rmScripts);
    ok &= runLogged(local, type, mvScripts);
    for (const char* part : {"/WIZARD_UIFILES", "/conf"}) {
        if (!VLIBCFileCheckDir((workDir + part).c_str())) {
            continue;
        }
        // A failed removal shows in the move that follows it.
        CORVUtils::ProcessRunner rm("/bin/rm", {"-rf", registry + part});
        PMSRunAndWriteScriptLog(local, type, rm, -1);
        CORVUtils::ProcessRunner mv("/bin/mv", {"-f", workDir + part, registry + part});
        ok &= runLogged(local, type, mv);
    }
    return ok;
}

// Points <registry>/target at the payload; the volume may be busy for a moment, so it is
// tried for a while before giving up.
bool linkTarget(const PackageInfo& local, PKG_INSTALLATION_TYPE type, const std::string& registry,
                const std::string& target) {
    const std::string link = registry + "/target";
    for (int attempt = 1; attempt <= kTargetLinkTries; ++attempt) {
        CORVUtils::ProcessRunner rmLink("/bin/rm", {"-rf", link});
        PMSRunAndWriteScriptLog(local, type, rmLink, -1);
        if (symlink(target.c_str(), link.c_str()) == 0) {
            return true;
        }
        CORV_LOG_ERR("Failed to symlink %s, %m", link.c_str());
        if (attempt < kTargetLinkTries) {
            sleep(1);
        }
    }
    return false;
}

// Settings survive upgrades and normal uninstalls, so they live apart, owned by the
// package's user.
bool makeEtcDir(const std::string& etcDir, const std::string& package) {
    bool ok = true;
    if (!VLIBCFileCheckDir(etcDir.c_str())) {
        CORVFSMkdirP("/usr/corv/etc/packages", nullptr, 1, -1, -1, 0755);
        if (mkdir(etcDir.c_str(), 0755) != 0) {
            CORV_LOG_ERR("Failed to mkdir [%s], %m", etcDir.c_str());
            ok = false;
        }
    }
    const std::string user = PMSGetPkgUserName(package);
    if (!user.empty()) {
        uid_t uid = 0;
        gid_t gid = 0;
        if (CORVUserGetUGID(user.c_str(), &uid, &gid) < 0) {
            CORV_LOG_ERR("Failed to get ID of %s [0x%04X %s:%d]", user.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
        } else if (chown(etcDir.c_str(), uid, gid) != 0) {
            CORV_LOG_ERR("Failed to chown %s (%m)", etcDir.c_str());
        }
    }
    return ok;
}

// The data must reach the disk even if the caller is killed right after.
void syncSoon() {
    pid_t child = VLIBCProcFork();
    if (child == 0) {
        sleep(1);
        sync();
        _exit(0);
    }
}

}  // namespace

bool PackageManager::registerPackage(PKG_INSTALLATION_TYPE type, PackageInfo& info,
                                     const std::string& workDir, const std::string& target) {
    const std::string registry = PMSRegistryDir(info.package);
    // Nothing has changed yet if the INFO is bad.
    PackageInfo local;
    if (!PMSLoadPKGInfoFile(workDir, local, nullptr, PKG_INFO_MASK_ALL)) {
        CORV_LOG_ERR("Failed to validate package INFO");
        setResult(PKG_ERR_BAD_ARCHIVE);
        syncSoon();
        return false;
    }
    bool ok = moveControlFiles(local, type, workDir, registry);
    if (ok) {
        ok = linkTarget(local, type, registry, target);
    }
    const std::string etcDir = PMSPackageEtcDir(local.package);
    ok = makeEtcDir(etcDir, local.package) && ok;
    bool outcome = false;
    if (ok) {
        const std::string etcLink = registry + "/etc";
        unlink(etcLink.c_str());
        outcome = symlink(etcDir.c_str(), etcLink.c_str()) == 0;
    }
    syncSoon();
    return outcome;
}

std::string PackageManager::getServiceScript(const std::string& name, PackageInfo& info) {
    const std::string registry = PMSRegistryDir(name);
    if (access(registry.c_str(), F_OK) != 0 || access((registry + "/INFO").c_str(), F_OK) != 0) {
        setResult(PKG_ERR_NOT_INSTALLED);
        return "";
    }
    // The target is checked around the read, since a volume can fail in between.
    if (!PMSCheckPayloadTarget(registry) ||
        !PMSLoadPKGInfoFile(registry, info, nullptr, PKG_INFO_MASK_ALL) ||
        !PMSCheckPayloadTarget(registry)) {
        setResult(PKG_ERR_BROKEN);
        return "";
    }
    const std::string script = registry + "/scripts/start-stop-status";
    if (access(script.c_str(), F_OK) != 0) {
        setResult(PKG_ERR_NO_STATUS_SCRIPT);
        return "";
    }
    if (!PMSCheckIsExec(script)) {
        CORV_LOG_ERR("%s can't run", script.c_str());
        setResult(PKG_ERR_BROKEN);
        return "";
    }
    return script;
}

}  // namespace CORVPackageTool
