// The layer under every lifecycle operation: the scripts' environment, running a script
// with its Begin/End lines in the operations log, the progress file, and the hook
// programs run after an operation. The process environment and the memo of extra
// variables are process-wide: call these only under the package lock or from a
// single-threaded caller.
#pragma once

#include <json/json.h>

#include <string>

#include "corv/process_runner.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

constexpr const char* PKG_OPERATIONS_LOG = "/var/log/corvpkg.log";
constexpr const char* PKG_HOOKS_DIR = "/usr/corv/corvpkg";

// Attaches the CORVPKG_* variables of one script run to `runner`, and removes the
// variables that do not apply from this process's environment so the child cannot
// inherit stale values. Optional arguments may be null; status queries pass type 0.
CORVPKG_API void PMSPrepareScriptEnv(const PackageInfo& info, CORVUtils::ProcessRunner& runner,
                                     const char* language, const std::string* logFile,
                                     PKG_INSTALLATION_TYPE type, const Json::Value* extra,
                                     const char* volume, const char* cpkFile, const char* userName);
// The same data set in this process's own environment (for callers outside the library).
CORVPKG_API void PMSPrepareEnv(const PackageInfo& info, const char* language, const char* volume,
                               const char* cpkFile);
// Removes every CORVPKG_* variable and the extra variables of the last run.
CORVPKG_API void CleanAllEnv();

// Runs `runner` with its output appended to the operations log between a Begin and an
// End line; returns the exit value. `mode` -1 is taken as 1.
CORVPKG_API int PMSRunAndWriteScriptLog(const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                                        CORVUtils::ProcessRunner& runner, int mode);
// Appends "<local time>\t<message>" to the operations log; an empty message writes nothing.
CORVPKG_API void PMSWriteSysLog(const char* message);
// The whole file, "" when it cannot be opened.
CORVPKG_API std::string PMSReadPackageLog(const std::string& path);

CORVPKG_API std::string PMSGetProgressPath(const std::string& name);
// The number a script wrote into the progress file, or -1.0.
CORVPKG_API double PMSGetProgress(const std::string& name);

// Runs the hook programs of /usr/corv/corvpkg after an operation. `startFlag`: 1 started,
// 0 stopped, -1 neither. 1, or 0 when the directory cannot be opened.
CORVPKG_API int PMSCheckServiesStatus(const PackageInfo& info, const PackageInfo* oldInfo,
                                      PKG_INSTALLATION_TYPE type, int startFlag);

}  // namespace CORVPackageTool
