// Pieces shared by the install, upgrade and uninstall roads.
#pragma once

#include <json/json.h>

#include <string>
#include <utility>
#include <vector>

#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"

namespace CORVPackageTool {

// The commands of an installation's work area, built once so that every road uses the
// same ones: the work directory WorkDir is <tmpRoot>/pkginstall, the payload goes to
// <WorkDir>/package.
struct InstallCommands {
    InstallCommands(const std::string& cpkPath, const std::string& workDir);
    CORVUtils::ProcessRunner removeWorkDir;
    CORVUtils::ProcessRunner makeWorkDir;
    CORVUtils::ProcessRunner repairExtract;  // INFO and conf only, for a damaged INFO
    CORVUtils::ProcessRunner extractAll;
    CORVUtils::ProcessRunner extractPayload;
};

// The INFO fields an installation reads: all but the icons, which are folded in later.
constexpr unsigned long long kInstallInfoMask = 0xFFFFFFFFF7FFFFFFULL;

// The first steps of an installation and of an upgrade, named as steps of `road`: lock,
// unpack the package file into `workDir`, read and check its INFO into `info`
// (architecture, version limits, the payload archive). False with the result set on `pm`
// (logged). `nameTheDir`: the log line of an unreadable INFO names the work directory (the
// installation's wording).
bool PMSUnpackAndCheck(const char* road, PackageManager& pm, PKG_INSTALLATION_TYPE type,
                       InstallCommands& cmd, const std::string& cpkPath, const std::string& workDir,
                       PackageInfo& info, bool nameTheDir);

// Unpacks <workDir>/package.tgz into <workDir>/package (the road's `extractPayload`) and
// drops what may never be installed from it. When the manager checks the payload while
// unpacking, the archive is hashed beside the tar run and a mismatch with the INFO key
// "checksum" refuses it. False with the result PKG_ERR_BAD_ARCHIVE (logged).
bool PMSUnpackPayload(PackageManager& pm, const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                      InstallCommands& cmd, const std::string& cpkPath,
                      const std::string& workDir);
// What the install scripts of one operation share.
struct ScriptContext {
    const char* language = nullptr;
    std::string logFile;
    const Json::Value* extra = nullptr;
    const char* volume = nullptr;
    const char* cpkPath = nullptr;
    const char* userName = nullptr;
    const CORV::PkgUtils::WorkerResp* resp = nullptr;
    std::vector<std::pair<std::string, std::string>> variables;
};

// PMSRunInstallScript's value when the script's identity could not be set (logged).
constexpr int kScriptIdentityFailed = -1000;

// Runs a command with its command line and exit value in the operations log. True on
// exit 0.
bool PMSRunLogged(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                  CORVUtils::ProcessRunner& runner);
// <workDir>/INFO exists and is not empty.
bool PMSInfoFileUsable(const std::string& workDir);
// Removes an old payload at `target`, or moves it aside on the same volume when it cannot
// be removed. False (logged) when neither works.
bool PMSClearTarget(const PackageInfo& info, PKG_INSTALLATION_TYPE type, const std::string& target);
// Writes the package's icon files into <workDir>/INFO as base64 keys. PKG_OK, or
// PKG_ERR_BAD_ARCHIVE (logged).
PKG_ERRCODE PMSFoldIcons(const std::string& workDir, const std::string& name);
// Runs one install script (preinst, postinst, preupgrade, postupgrade) with the package's
// environment, the context's variables, the resource workers' environment when `dumpEnv`,
// and the action's identity from the privilege file under `identityDir` (the registry when
// empty). The script's exit value, or kScriptIdentityFailed.
int PMSRunInstallScript(const PackageInfo& info, const std::string& script, const char* action,
                        PKG_INSTALLATION_TYPE type, const ScriptContext& ctx, bool dumpEnv,
                        const std::string& identityDir);

}  // namespace CORVPackageTool
