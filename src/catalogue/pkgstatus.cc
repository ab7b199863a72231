// The state of an installed package, asked of its registry, its control script and the
// service manager; and the package's own log.
#include <unistd.h>

#include <map>
#include <string>

#include "catalogue/pkginfo_private.h"
#include "corv/fault.h"
#include "corv/log.h"
#include "corv/process_runner.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "corv/volume.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgtool.h"
#include "corvpkg/pkgvolume.h"
#include "corvpkg/privilege.h"

namespace CORVPackageTool {

namespace {

constexpr const char* kRegistry = "/var/packages/";
constexpr const char* kThirdPartyUI = "/usr/corv/corvman/webui/3rdparty/";
// A status or log script that hangs must not hang its caller.
constexpr int kScriptTimeoutSeconds = 60;

const std::map<int, const char*> kUIFileMapping = {
    {PKG_INSTALL, "install_uifile"},
    {PKG_UPGRADE, "upgrade_uifile"},
    {PKG_UNINSTALL, "uninstall_uifile"},
};

}  // namespace

const char* PMSPkgStatusWord(int status) {
    switch (status) {
        case 0:
            return "running";
        case 1:
        case 2:
        case 3:
            return "stopped";
        case 4:
            return "no status script";
        case 150:
            return "broken";
        case 255:
            return "not installed";
        case 256:
            return "stopped: below version limit";
        case 257:
            return "stopped: prohibited";
        case 258:
            return "stopped: blocked";
        case 259:
            return "unknown: system error";
        default:
            return "unknown";
    }
}

std::vector<std::string> PMSUIFileCandidates(const char* language, PKG_INSTALLATION_TYPE type) {
    std::vector<std::string> candidates;
    auto base = kUIFileMapping.find(type);
    if (base == kUIFileMapping.end()) {
        return candidates;
    }
    std::string lang;
    if (language != nullptr) {
        lang = language;
    } else {
        char buf[256] = "";
        if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "language", buf, sizeof(buf), 0) > 0) {
            lang = buf;
        } else {
            CORV_LOG_ERR("Failed to get value '%s' from '%s'", "language", VLIBC_INFO_PATH);
        }
    }
    const std::string stem = std::string("WIZARD_UIFILES/") + base->second;
    if (!lang.empty()) {
        candidates.push_back(stem + "_" + lang + ".sh");
    }
    candidates.push_back(stem + ".sh");
    if (!lang.empty()) {
        candidates.push_back(stem + "_" + lang);
    }
    candidates.push_back(stem);
    return candidates;
}

bool PMSCheckPackage(const std::string& name) {
    const std::string registry = kRegistry + name;
    if (access(registry.c_str(), F_OK) != 0 || access((registry + "/INFO").c_str(), F_OK) != 0 ||
        !VLIBCFileCheckDir((registry + "/target").c_str())) {
        return false;
    }
    const std::string volume = PMSGetPackageTargetVolByPath(registry.c_str());
    if (volume == PKG_NOT_VOLUME_PATH) {
        return true;
    }
    CORVFSINFO* fs = nullptr;
    bool usable = FSInfoGet(volume.c_str(), &fs) >= 1 && fs != nullptr &&
                  (fs->state & CORV_FS_STATE_CRASHED) == 0;
    FSInfoFree(fs);
    return usable;
}

bool PackageManager::getServiceStatus(const std::string& name, bool& running, bool askScript) {
    setResult(PKG_ERR_SYSTEM);
    running = false;
    PackageInfo info;
    const std::string script = getServiceScript(name, info);
    if (script.empty()) {
        return false;
    }
    if (!PMSCheckPackageArchModelMatched(info)) {
        setResult(PKG_ERR_ARCH_MISMATCH);
        return false;
    }
    if (!CanPackageStartInThisFirmware(info)) {
        return false;
    }
    // An interrupted install wins over whatever the script would say.
    if (access((kRegistry + name + "/installing").c_str(), F_OK) == 0) {
        setResult(PKG_ERR_BROKEN);
        CORV_LOG_ERR("Package is broken: incomplete installation, %s", name.c_str());
        return false;
    }
    if (askScript) {
        CORVUtils::ProcessRunner runner(script, {"status"});
        runner.setTimeout(CORVFaultSeconds("status-script", kScriptTimeoutSeconds));
        PMSPrepareScriptEnv(info, runner, nullptr, nullptr, static_cast<PKG_INSTALLATION_TYPE>(0),
                            nullptr, nullptr, nullptr, nullptr);
        if (!Privilege::SetIdentity(runner, name, "status", "")) {
            CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", name.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            setResult(PKG_ERR_BAD_ARCHIVE);
            return false;
        }
        int exitValue = runner.run(true, true);
        if (exitValue == -1) {
            CORV_LOG_ERR("Failed to query package status, %s", name.c_str());
            setResult(PKG_ERR_SYSTEM);
            return false;
        }
        setResult(static_cast<PKG_ERRCODE>(exitValue));
        if (exitValue == PKG_ERR_BROKEN) {
            CORV_LOG_ERR("Package is broken, %s, [%d]", name.c_str(), exitValue);
        }
        running = exitValue == 0;
    } else {
        running = true;
    }
    if (info.startable) {
        if (!info.nosuidir.empty() && access((kThirdPartyUI + name).c_str(), F_OK) != 0) {
            running = false;
        }
        if (access((kRegistry + name + "/enabled").c_str(), F_OK) != 0) {
            running = false;
        }
    }
    const std::string job = "pkgctl-" + name;
    int state = 0;
    if (VLIBServiceStatusGet(job.c_str(), &state) < 0) {
        CORV_LOG_ERR("Failed to get status of %s [0x%04X %s:%d]", job.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    running = running && state == VLIB_SERVICE_STATE_RUNNING;
    return true;
}

int PackageManager::getPkgStatus(const std::string& name) {
    bool running = false;
    if (getServiceStatus(name, running, true)) {
        if (running) {
            return 0;
        }
        switch (getResult()) {
            case 1:
            case 2:
            case PKG_ERR_BROKEN:
                return getResult();
            default:
                return 3;
        }
    }
    switch (getResult()) {
        case PKG_ERR_NOT_INSTALLED:
            return 255;
        case PKG_ERR_NO_STATUS_SCRIPT:
            return 4;
        case PKG_ERR_BROKEN:
        case PKG_ERR_ARCH_MISMATCH:
            return 150;
        case PKG_ERR_BELOW_VERSION_LIMIT:
            return 256;
        case PKG_ERR_SYSTEM:
            return 259;
        case PKG_ERR_LIMIT_BLOCKED:
            return 258;
        case PKG_ERR_LIMIT_PROHIBITED:
            return 257;
        default:
            return 3;
    }
}

bool PackageManager::getPkgRoughStatus(const std::string& name, int& rough) {
    switch (getPkgStatus(name)) {
        case 0:
            rough = 3;
            return true;
        case 1:
        case 2:
        case 3:
            rough = 1;
            return true;
        case 150:
        case 256:
        case 257:
        case 258:
            rough = 5;
            return true;
        case 255:
            rough = 0;
            return true;
        case 259:
            CORV_LOG_ERR("system error, can't get status of pkg: [%s]", name.c_str());
            return false;
        default:
            CORV_LOG_ERR("unknown status: [%s]", name.c_str());
            return false;
    }
}

bool PackageManager::isStarted(const std::string& name) {
    bool running = false;
    if (getServiceStatus(name, running, true) && running) {
        return true;
    }
    // Without a status script nothing could have stopped the package.
    return getResult() == PKG_ERR_NO_STATUS_SCRIPT;
}

std::string PackageManager::getPackageLog(const std::string& name, bool quiet) {
    PackageInfo info;
    const std::string script = getServiceScript(name, info);
    if (script.empty()) {
        return "";
    }
    CORVUtils::ProcessRunner runner(script, {"log"});
    runner.setTimeout(CORVFaultSeconds("status-script", kScriptTimeoutSeconds));
    PMSPrepareScriptEnv(info, runner, nullptr, nullptr, static_cast<PKG_INSTALLATION_TYPE>(0),
                        nullptr, nullptr, nullptr, nullptr);
    if (!Privilege::SetIdentity(runner, name, "log", "")) {
        CORV_LOG_ERR("Failed to set identity for %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        setResult(PKG_ERR_BAD_ARCHIVE);
        return "";
    }
    std::string text;
    if (runner.run(true, true) == 0) {
        text = runner.getCapturedOutput();
        if (!text.empty() && text.back() == '\n') {
            text.pop_back();
        }
    } else if (!quiet) {
        CORV_LOG_ERR("Failed to query package status, %s", name.c_str());
        setResult(PKG_ERR_SYSTEM);
        return "";
    }
    setResult(PKG_OK);
    return text;
}

std::string PackageManager::getPackageLog(const std::string& name) {
    return getPackageLog(name, false);
}

}  // namespace CORVPackageTool
