// "media-index": MediaIndex registers a package with the media indexer (its INFO and
// optional plug-in under /usr/corv/etc/corvindex/packages/<pkg>) and keeps the three
// media services running exactly while some package is registered; MediaIndexInfo
// switches the registration on and off with the package's running state.
#include <unistd.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kInfoRelpath[] = "info-relpath";
const char kPluginRelpath[] = "plugin-relpath";
const char kRegistrationDir[] = "/usr/corv/etc/corvindex/packages/";
const char kIndexMgr[] = "/usr/corv/bin/corvindex_mgr";
const char* const kServices[] = {"corvindexd", "corvmkthumbd", "corvmkflvd"};
constexpr unsigned int kUpgrade = 2;

bool registered(const Json::Value& section) {
    return section.isObject() && section.isMember(kInfoRelpath);
}

// The media services follow the number of media packages: all down with none, all up
// (the indexer restarted when a plug-in came or went) with some.
void syncServices(bool restartIndexer) {
    const int count = VLIBCExecl(kIndexMgr, 0xbb, "--list-package", nullptr);
    if (count < 0) {
        CORV_LOG_ERR("Failed to media package installed count.");
        return;
    }
    if (count == 0) {
        for (const char* service : {"corvmkthumbd", "corvmkflvd"}) {
            if (VLIBServiceIsRunning(service) == 1 && VLIBServiceStop(service, 0) != 0) {
                CORV_LOG_ERR("Failed to stop [%s]", service);
            }
        }
        if (VLIBServiceIsRunning("corvindexd") == 1) {
            VLIBServiceStop("corvindexd", 0);
        }
        VLIBCExecl(kIndexMgr, 0xbb, "--check-indexbit", nullptr);
        return;
    }
    for (const char* service : kServices) {
        const bool restart = restartIndexer && std::string(service) == "corvindexd";
        if (VLIBServiceIsRunning(service) != 1) {
            if (VLIBServiceStart(service, 0) != 0) {
                CORV_LOG_ERR("Failed to start [%s]", service);
            }
        } else if ((restart ? VLIBServiceRestart(service) : VLIBServiceReload(service)) != 0) {
            CORV_LOG_ERR("Failed to reload [%s]", service);
        }
    }
}

std::string registrationOf(const std::string& pkg) {
    return kRegistrationDir + pkg;
}

bool pathInside(const std::string& root, const Json::Value& rel, std::string& out) {
    if (!rel.isString() || !CORV::PkgUtils::IsLegalRelPath(root, rel.asString())) {
        return false;
    }
    out = root + "/" + rel.asString();
    return access(out.c_str(), F_OK) == 0;
}

class MediaIndex : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!registered(request)) {
            return 0;
        }
        const std::string dir = registrationOf(action.GetPkgName());
        if (CORVFSMkdirP(dir.c_str(), nullptr, 1, 0, 0, 0755) < 0) {
            CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", dir.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        std::string source;
        if (!pathInside(action.GetRootDir(), request[kInfoRelpath], source)) {
            CORV_LOG_ERR("File is not exist %s, %m", source.c_str());
            return 1;
        }
        const std::string info = dir + "/INFO";
        const int copied = VLIBCExecl("/bin/cp", 0xbb, "-f", source.c_str(), info.c_str(), nullptr);
        if (copied < 0) {
            CORV_LOG_ERR("Failed to cp -f %s %s, %d", source.c_str(), info.c_str(), copied);
        }
        if (!request.isMember(kPluginRelpath)) {
            syncServices(false);
            return 0;
        }
        std::string plugin;
        if (!pathInside(action.GetRootDir(), request[kPluginRelpath], plugin)) {
            CORV_LOG_ERR("File is not exist %s, %m", plugin.c_str());
            return 1;
        }
        const int linked = VLIBCExecl("/bin/ln", 0xbb, "-sf", plugin.c_str(), dir.c_str(), nullptr);
        if (linked < 0) {
            CORV_LOG_ERR("Failed to ln -sf %s %s, %d", plugin.c_str(), dir.c_str(), linked);
            return 1;
        }
        syncServices(true);
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (action.GetActionType() == kUpgrade || !registered(request)) {
            return 0;
        }
        const std::string dir = registrationOf(action.GetPkgName());
        const int removed = VLIBCExecl("/bin/rm", 0xbb, "-rf", dir.c_str(), nullptr);
        if (removed < 0) {
            CORV_LOG_ERR("Failed to rm -rf %s, %d", dir.c_str(), removed);
            return 1;
        }
        syncServices(request.isMember(kPluginRelpath));
        return 0;
    }
};

class MediaIndexInfo : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        return setEnabled(action, request, "yes");
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        return setEnabled(action, request, "no");
    }

  private:
    static int setEnabled(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                          const char* value) {
        if (!registered(request)) {
            return 0;
        }
        const std::string info = registrationOf(action.GetPkgName()) + "/INFO";
        if (VLIBCFileSetKeyValue(info.c_str(), "ENABLED", value, "%s=\"%s\"\n") == -1) {
            CORV_LOG_ERR("Faild to set %s to %s in file %s[0x%04X %s:%d]", "ENABLED", value,
                         info.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        for (const char* service : kServices) {
            if (VLIBServiceReload(service) != 0) {
                CORV_LOG_ERR("Faild to reload %s[0x%04X %s:%d]", service, VLIBCErrGet(),
                             VLIBCErrorGetFile(), VLIBCErrorGetLine());
            }
        }
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewMediaIndex() {
    return new (std::nothrow) MediaIndex();
}

CORV::PkgUtils::IWorker* NewMediaIndexInfo() {
    return new (std::nothrow) MediaIndexInfo();
}

}  // namespace Resource
}  // namespace CORVPackageTool
