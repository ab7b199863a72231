// "port-config": the package's protocol file, installed once as
// /usr/local/etc/services.d/<pkg>.sc, where the port-conflict test and the firewall read
// it. An upgrade keeps the installed copy and only moves an older base name to today's.
#include <stdio.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/service_conf.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kProtocolFile[] = "protocol-file";
const char kServicesDir[] = "/usr/local/etc/services.d/";
constexpr int kPackageType = 2;
constexpr unsigned int kUpgrade = 2;

std::string baseName(const std::string& path) {
    const size_t slash = path.rfind('/');
    return slash == std::string::npos ? path : path.substr(slash + 1);
}

class PortConfig : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject() || !request[kProtocolFile].isString()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        const std::string relpath = request[kProtocolFile].asString();
        const std::string ownName = action.GetPkgName() + ".sc";
        const std::string installed = kServicesDir + ownName;
        // An earlier version may have installed the file under its own base name.
        const std::string shipped = baseName(relpath);
        if (!shipped.empty() && shipped != ownName && shipped != "." && shipped != ".." &&
            VLIBCFileExist((kServicesDir + shipped).c_str()) == 1) {
            rename((kServicesDir + shipped).c_str(), installed.c_str());
        }
        if (action.GetActionType() == kUpgrade) {
            return 0;
        }
        std::string path;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), relpath, path)) {
            CORV_LOG_ERR("FAILED, conf-file=%s in port-config not exist", relpath.c_str());
            return 1;
        }
        PCORVSERVICECONFPORTS ports = nullptr;
        if (VLIBCFileExist(installed.c_str()) != 1) {
            CORVServiceConfInstallBaseName(ownName.c_str(), path.c_str(), kPackageType, &ports);
        }
        CORVServiceConfPortsFree(ports);
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (action.GetActionType() == kUpgrade) {
            return 0;
        }
        const std::string ownName = action.GetPkgName() + ".sc";
        if (VLIBServiceConfRemoveBaseName(ownName.c_str(), kPackageType) < 0) {
            CORV_LOG_ERR("remove configure file fail! file=%s, error=[0x%04X %s:%d]",
                         ownName.c_str(), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        return 0;
    }
    bool IsUpdatable() override { return true; }
    bool Update(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject() || !request[kProtocolFile].isString()) {
            CORV_LOG_ERR("FAILED, %s not exist in jreq", kProtocolFile);
            VLIBCErrSet(ERR_MALFORMED);
            return false;
        }
        const std::string relpath = request[kProtocolFile].asString();
        std::string path;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), relpath, path)) {
            CORV_LOG_ERR("FAILED, conf-file=%s in port-config not exist", relpath.c_str());
            return false;
        }
        PCORVSERVICECONFPORTS ports = nullptr;
        const std::string ownName = action.GetPkgName() + ".sc";
        CORVServiceConfUpdateBaseName(ownName.c_str(), path.c_str(), kPackageType, &ports);
        CORVServiceConfPortsFree(ports);
        return true;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewPortConfig() {
    return new (std::nothrow) PortConfig();
}

}  // namespace Resource
}  // namespace CORVPackageTool
