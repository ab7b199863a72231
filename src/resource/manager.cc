// The worker catalogue: which workers run in a phase, in what order, and which single
// worker serves a resource id. Built-in rows come first and can't be replaced; plug-ins
// come from the provider files that the worker-plugin worker writes.
#include <stdlib.h>

#include <memory>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/resource.h"
#include "corvpkg/worker.h"
#include "resource/resource_private.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

// The built-in workers. The order is design: it is the order of Acquire, and reversed the
// order of Release. Each worker class adds its row when it comes into being, at its place
// in this order (id, interval, class):
//
//   "sdk-plugin"          0x0012  SDKPlugin
//   "service-cfg"         0x0012  ServiceCfg
//   "indexdb"             0x0044  IndexDB
//   "pam-config"          0x0088  PAMConfig
//   "syslog-config"       0x0044  SyslogConfig
//   "userdata-collector"  0x0012  UserDataCollector
//   "webapi-desc"         0x0048  WebAPIDesc
//   "webapi-desc"         0x0048  WebAPIDescDaemon
//   "data-share"          0x0021  DataShareRecorder
//   "data-share"          0x0028  DataShare
//   "data-share"          0x0022  DataShare
//   "crontab-job"         0x0044  CrontabJob
//   "port-config"         0x0022  PortConfig
//   "pgsql-db"            0x0011  PgsqlDB
//   "web-config"          0x0048  WebConfig
//   "web-config"          0x0012  WebConfigUserData
//   "poweroff-config"     0x0044  PowerOffConfig
//   "feasibility-config"  0x0012  FeasibilityConfig
//   "worker-plugin"       0x0012  WorkerPlugin
//   "usr-local-linker"    0x0044  UsrLocalLinker
//   "backup-backend"      0x0044  BackupBackend
//   "corvcrond"           0x0044  CorvCrond
//   "csp-rule"            0x0044  CspRule
//   "sysnotify"           0x0044  Sysnotify
//   "media-index"         0x0012  MediaIndex
//   "media-index"         0x0044  MediaIndexInfo
//   "selfcheck"           0x0012  SelfCheck
//   "certificate-config"  0x0012  CertConfig
//
const BuiltinWorker g_BuiltinWorkers[] = {
    {"sdk-plugin", 0x0012, NewSDKPlugin},
    {"service-cfg", 0x0012, NewServiceCfg},
    {"indexdb", 0x0044, NewIndexDB},
    {"pam-config", 0x0088, NewPAMConfig},
    {"syslog-config", 0x0044, NewSyslogConfig},
    {"userdata-collector", 0x0012, NewUserDataCollector},
    {"webapi-desc", 0x0048, NewWebAPIDesc},
    {"webapi-desc", 0x0048, NewWebAPIDescDaemon},
    {"data-share", 0x0021, NewDataShareRecorder},
    {"data-share", 0x0028, NewDataShare},
    {"data-share", 0x0022, NewDataShare},
    {"crontab-job", 0x0044, NewCrontabJob},
    {"port-config", 0x0022, NewPortConfig},
    {"pgsql-db", 0x0011, NewPgsqlDB},
    {"web-config", 0x0048, NewWebConfig},
    {"web-config", 0x0012, NewWebConfigUserData},
    {"poweroff-config", 0x0044, NewPowerOffConfig},
    {"feasibility-config", 0x0012, NewFeasibilityConfig},
    {"worker-plugin", 0x0012, NewWorkerPlugin},
    {"usr-local-linker", 0x0044, NewUsrLocalLinker},
    {"backup-backend", 0x0044, NewBackupBackend},
    {"corvcrond", 0x0044, NewCorvCrond},
    {"csp-rule", 0x0044, NewCspRule},
    {"sysnotify", 0x0044, NewSysnotify},
    {"media-index", 0x0012, NewMediaIndex},
    {"media-index", 0x0044, NewMediaIndexInfo},
    {"selfcheck", 0x0012, NewSelfCheck},
    {"certificate-config", 0x0012, NewCertConfig},
    {nullptr, 0, nullptr},
};

const CatalogueSource& DefaultCatalogue() {
    static const CatalogueSource source = {g_BuiltinWorkers, kProviderDir};
    return source;
}

Collector::Collector(std::vector<std::shared_ptr<WorkerProxy>>& list)
    : target(list), builtinCount(0) {
    target.clear();
}

bool Collector::AddBuiltinWorker(WorkerProxy* proxy) {
    if (proxy == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    // A later row of the same id keeps the first one's entry: all rows stay in the list,
    // and any of them keeps a plug-in away from the id.
    indexById.emplace(proxy->GetResourceID(), builtinCount);
    ++builtinCount;
    target.emplace_back(proxy);
    return true;
}

bool Collector::AddPluginWorker(WorkerProxy* proxy) {
    if (proxy == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    auto found = indexById.find(proxy->GetResourceID());
    if (found == indexById.end()) {
        indexById.emplace(proxy->GetResourceID(), static_cast<unsigned int>(target.size()));
        target.emplace_back(proxy);
        return true;
    }
    if (found->second < builtinCount) {
        VLIBCErrSet(kErrIdTakenByBuiltin);
        return false;
    }
    // The later provider wins and keeps the earlier one's place.
    target[found->second].reset(proxy);
    return true;
}

bool EnumProviders(const std::string& providerDir, std::vector<std::string>& out) {
    out.clear();
    Json::Value global;
    if (!ReadJsonFile(providerDir + "/global", global)) {
        return VLIBCErrGet() == ERR_NO_SUCH_FILE;
    }
    if (!global.isObject()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    if (!global.isMember("providers")) {
        return true;
    }
    const Json::Value& providers = global["providers"];
    if (!providers.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    for (const Json::Value& provider : providers) {
        if (provider.isString() && !provider.asString().empty()) {
            out.push_back(provider.asString());
        }
    }
    return true;
}

WorkerProxy* LoadPluginWorker(unsigned int mask, const char* wantedId, const std::string& provider,
                              const Json::Value& entry) {
    if (provider.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return nullptr;
    }
    if (!entry.isObject() || !entry["id"].isString() || !entry["interval"].isString() ||
        !entry["major"].isInt() || !entry["minor"].isInt() || !entry["path"].isString()) {
        VLIBCErrSet(ERR_MALFORMED);
        return nullptr;
    }
    const std::string id = entry["id"].asString();
    if (id.empty()) {
        VLIBCErrSet(ERR_MALFORMED);
        return nullptr;
    }
    if (wantedId != nullptr && id != wantedId) {
        return nullptr;
    }
    const unsigned int interval =
        static_cast<unsigned int>(strtol(entry["interval"].asCString(), nullptr, 16));
    if ((mask & interval) == 0) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return nullptr;
    }
    // Only plug-ins built against interface version 1.0 load.
    if (entry["major"].asInt() != 1 || entry["minor"].asInt() >= 1) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return nullptr;
    }
    std::unique_ptr<DSOBackend> backend(new DSOBackend(entry["path"].asString()));
    if (!backend->IsReady()) {
        return nullptr;
    }
    WorkerProxy* proxy = new WorkerProxy(backend.release());
    proxy->SetResourceID(id);
    proxy->SetInterval(interval);
    proxy->SetProvider(provider);
    return proxy;
}

namespace {

// The "workers" array of a provider's file, or null (logged) when the file can't be read
// or has the wrong form.
bool loadProviderWorkers(const std::string& providerDir, const std::string& provider,
                         Json::Value& workers) {
    const std::string path = providerDir + "/" + provider;
    Json::Value conf;
    if (!ReadJsonFile(path, conf)) {
        CORV_LOG_ERR("Failed to load conf of %s [0x%04X %s:%d]", provider.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (!conf.isObject() || !conf.isMember("workers") || !conf["workers"].isArray()) {
        CORV_LOG_ERR("%s is in wrong format, ignore it", path.c_str());
        return false;
    }
    workers = conf["workers"];
    return true;
}

}  // namespace

bool FindRunnableWorkersIn(const CatalogueSource& source, unsigned int timing,
                           std::vector<std::shared_ptr<WorkerProxy>>& out) {
    Collector collector(out);
    for (const BuiltinWorker* row = source.table; row != nullptr && row->id != nullptr; ++row) {
        // Errors of skipped rows are of no consequence: the result is the list.
        if (row->id[0] == '\0') {
            VLIBCErrSet(ERR_MALFORMED);
            continue;
        }
        if ((timing & row->interval) == 0) {
            VLIBCErrSet(ERR_NOT_APPLICABLE);
            continue;
        }
        std::unique_ptr<BuiltinBackend> backend(new BuiltinBackend(row->factory));
        if (!backend->IsReady()) {
            continue;
        }
        std::unique_ptr<WorkerProxy> proxy(new WorkerProxy(backend.release()));
        proxy->SetResourceID(row->id);
        proxy->SetInterval(row->interval);
        if (collector.AddBuiltinWorker(proxy.get())) {
            proxy.release();
        }
    }

    std::vector<std::string> providers;
    if (!EnumProviders(source.providerDir, providers)) {
        CORV_LOG_ERR("Failed to enum plugin providers [0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    for (const std::string& provider : providers) {
        Json::Value workers;
        if (!loadProviderWorkers(source.providerDir, provider, workers)) {
            continue;
        }
        for (const Json::Value& entry : workers) {
            std::unique_ptr<WorkerProxy> proxy(LoadPluginWorker(timing, nullptr, provider, entry));
            if (proxy && collector.AddPluginWorker(proxy.get())) {
                proxy.release();
            }
        }
    }
    return true;
}

WorkerProxy* FindRunnableWorkerIn(const CatalogueSource& source, const std::string& id) {
    if (id.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return nullptr;
    }
    for (const BuiltinWorker* row = source.table; row != nullptr && row->id != nullptr; ++row) {
        if (id != row->id) {
            continue;
        }
        // The first row of an id serves it, whatever the phase.
        std::unique_ptr<BuiltinBackend> backend(new BuiltinBackend(row->factory));
        if (!backend->IsReady()) {
            return nullptr;
        }
        WorkerProxy* proxy = new WorkerProxy(backend.release());
        proxy->SetResourceID(row->id);
        proxy->SetInterval(row->interval);
        return proxy;
    }

    std::vector<std::string> providers;
    if (!EnumProviders(source.providerDir, providers)) {
        CORV_LOG_ERR("Failed to enum plugin providers [0x%04X %s:%d]", VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return nullptr;
    }
    // The latest registration wins, as it does in a phase's list.
    for (auto provider = providers.rbegin(); provider != providers.rend(); ++provider) {
        Json::Value workers;
        if (!loadProviderWorkers(source.providerDir, *provider, workers)) {
            continue;
        }
        for (Json::ArrayIndex i = workers.size(); i > 0; --i) {
            WorkerProxy* proxy = LoadPluginWorker(0xFFFF, id.c_str(), *provider, workers[i - 1]);
            if (proxy != nullptr) {
                return proxy;
            }
        }
    }
    return nullptr;
}

bool FindRunnableWorkers(TIMING timing, std::vector<std::shared_ptr<WorkerProxy>>& out) {
    return FindRunnableWorkersIn(DefaultCatalogue(), timing, out);
}

WorkerProxy* FindRunnableWorker(const std::string& id) {
    return FindRunnableWorkerIn(DefaultCatalogue(), id);
}

}  // namespace Resource
}  // namespace CORVPackageTool
