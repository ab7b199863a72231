// Inside the resource framework: error codes that the platform header lacks, and the
// catalogue and orchestration over an explicit source of workers, so that tests can give
// a table of their own and a provider directory of their own.
#pragma once

#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

#include "corv/pkgutils.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"
#include "corvpkg/worker.h"

namespace CORVPackageTool {
namespace Resource {

// Platform error codes of this framework.
constexpr int kErrMissingMember = 0x2000;  // member or symbol missing
constexpr int kErrIdTakenByBuiltin = 0x2100;

// Where workers come from: a table of built-in rows (ended by a null id) and the directory
// of the provider files.
struct CatalogueSource {
    const BuiltinWorker* table;
    std::string providerDir;
};

// g_BuiltinWorkers and kProviderDir.
const CatalogueSource& DefaultCatalogue();

// The provider names of <providerDir>/global, in order of registration. A missing file is
// no provider (true); an unreadable or malformed one is false.
bool EnumProviders(const std::string& providerDir, std::vector<std::string>& out);

// One worker entry of a provider file as a proxy, or null: a bad entry (0x0D00, 0x4000),
// another id than `wantedId` when that is not null (no error), an interval outside `mask`
// or an interface version other than 1.0 (0xD900), or an unusable shared object.
WorkerProxy* LoadPluginWorker(unsigned int mask, const char* wantedId, const std::string& provider,
                              const Json::Value& entry);

bool FindRunnableWorkersIn(const CatalogueSource& source, unsigned int timing,
                           std::vector<std::shared_ptr<WorkerProxy>>& out);
WorkerProxy* FindRunnableWorkerIn(const CatalogueSource& source, const std::string& id);

// Resource::Acquire, Release and Update over `source`.
bool AcquireWith(const CatalogueSource& source, TIMING timing, const PackageInfo& info,
                 PKG_INSTALLATION_TYPE type, CORV::PkgUtils::WorkerResp& resp,
                 const Json::Value* variables, const std::string& dir);
bool ReleaseWith(const CatalogueSource& source, TIMING timing, const PackageInfo& info,
                 PKG_INSTALLATION_TYPE type, CORV::PkgUtils::WorkerResp& resp,
                 const Json::Value* variables, const std::string& dir);
bool UpdateWith(const CatalogueSource& source, const PackageInfo& info, const std::string& id,
                const Json::Value& args, CORV::PkgUtils::WorkerResp& resp);

}  // namespace Resource
}  // namespace CORVPackageTool
