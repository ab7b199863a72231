// Service integration: the init jobs and service files that put a package under the
// platform's init system and service layer, and the one-shot hand-over of a caller's
// context to the job that starts or stops the package.
//
// Every function leaves the cause of a failure in the thread's error slot (VLIBCErrGet).
#pragma once

#include <json/json.h>

#include <iosfwd>
#include <set>
#include <string>
#include <vector>

#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {
namespace Service {

// The package's own jobs: the names <job> of /var/packages/<name>/conf/upstart/<job>.conf
// that start with "pkg-" and are longer than that. A package without the directory has
// none (true, `jobs` empty).
CORVPKG_API bool EnumAvailableJobs(const std::string& name, std::vector<std::string>& jobs);
// Copies the package's jobs into /etc/init with the package's cgroup lines added. An
// installed job is left alone unless `force`. On failure no job of this call remains.
CORVPKG_API bool InstallJobs(const std::string& name, const std::vector<std::string>& jobs,
                             bool force);
// Removes pkgctl-<name> (non-empty name) and each prefixed job of `jobs` from /etc/init,
// with their overrides. Absent files are not an error; nothing is reported.
CORVPKG_API void UnlinkAllJobs(const std::string& name, const std::vector<std::string>& jobs);
// Removes pkgctl-<name>.cfg from the service directories; absent files are fine.
CORVPKG_API void UnlinkServiceCfg(const std::string& name);
// Whether the init system knows `job` (initctl status succeeds).
CORVPKG_API bool ValidateJob(const std::string& job);
// The packages that `name` depends on (itself excluded), through `convert` when given.
CORVPKG_API bool GetDependentPkg(const std::string& name, std::set<std::string>& out,
                                 std::string (*convert)(const std::string&));
// The system services that `name` needs to start.
CORVPKG_API bool GetDependentService(const std::string& name, std::set<std::string>& out);
// The init jobs of those services and of the services they require.
CORVPKG_API bool GetDependentJob(const std::string& name, std::set<std::string>& out);

// "pkgctl-<name>": the job of a package, and its service's name.
CORVPKG_API std::string PackageJobName(const std::string& name);
// Where the generated files of a package live.
CORVPKG_API std::string JobAdapterPath(const std::string& name);
CORVPKG_API std::string ServiceCfgPath(const std::string& name);

// The generated init job of a package. Its text is an interface of the init system.
class CORVPKG_API JobAdapter {
  public:
    enum StartOn { START_ON_NOS_START = 0, START_ON_PKG_START = 1 };
    enum ControlledBy {
        CONTROLLED_BY_NONE = 0,
        CONTROLLED_BY_DEFAULT = 1,
        CONTROLLED_BY_EVENT = 2
    };

    std::string name;
    int startOn = START_ON_PKG_START;
    int controlledBy = CONTROLLED_BY_DEFAULT;
    std::set<std::string> dependentPkgs;
    std::set<std::string> dependentJobs;

    void Write(std::ostream& out) const;
    // Writes the text to a temporary file beside `path` and renames it over `path`, so the
    // old text stays when the new one cannot be written.
    bool ToFile(const std::string& path) const;
};

// A fresh, closed temporary file named `path` + ".XXXXXX"; its name goes into `buffer`.
CORVPKG_API bool CreateTmpFile(const std::string& path, char* buffer, unsigned size);

// Writes /etc/init/pkgctl-<name>.conf from the package's "service-cfg" section (a job
// that the init system accepts and `force` is false is kept), checks it with the init
// system and sets its enable state from the package's "enabled" flag.
CORVPKG_API bool GenJobAdapter(const std::string& name, const Json::Value& conf, bool force);
// Writes the package's service file (kept unless `force` when it exists) and sets the
// service's run key from the "enabled" flag. `conf` is not read.
CORVPKG_API bool GenServiceCfg(const std::string& name, const Json::Value& conf, bool force);

// The hand-over file /tmp/corvpkgctl.tmp-<name>: written just before the job is driven,
// read and removed by the package control tool. Null language or user are left out.
CORVPKG_API bool DumpExtraEnv(const std::string& name, PKG_INSTALLATION_TYPE type,
                              const char* language, const char* userName);
// Reads and removes the hand-over file; a missing file gives type 0. `language` and
// `userName` may be null; otherwise they must point at null and receive a strdup'ed copy
// (when the file has the key) that the caller frees.
CORVPKG_API bool LoadExtraEnv(const std::string& name, PKG_INSTALLATION_TYPE* type, char** language,
                              char** userName);
CORVPKG_API std::string ExtraEnvPath(const std::string& name);

}  // namespace Service

namespace Resource {
// Publishes the package's jobs, job adapter and service file again from its stored
// "service-cfg" request (an empty one when there is none), keeping files that are still
// valid, and records the jobs in the own-file.
CORVPKG_API bool RestoreServiceCfg(const std::string& pkg);
}  // namespace Resource

}  // namespace CORVPackageTool
