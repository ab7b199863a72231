// "crontab-job": the package user's crontab, where Debian's cron reads it.
#include <errno.h>
#include <unistd.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kCrontabDir[] = "/var/spool/cron/crontabs/";

class CrontabJob : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string& user = action.GetPkgUserName();
        if (user.empty()) {
            VLIBCErrSet(ERR_NOT_APPLICABLE);
            return 1;
        }
        if (!request.isObject() || !request["relpath"].isString()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        const std::string relpath = request["relpath"].asString();
        std::string source;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), relpath, source)) {
            CORV_LOG_ERR("Illegal path %s, ignore it [0x%04X %s:%d]", relpath.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        const std::string destination = kCrontabDir + user;
        // cron refuses a crontab that others can write; 0644 is what it accepts.
        if (!CORV::PkgUtils::InstallConfigFile(source, destination, 0644, true)) {
            CORV_LOG_ERR("Failed to install %s [0x%04X %s:%d]", destination.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string& user = action.GetPkgUserName();
        if (user.empty()) {
            VLIBCErrSet(ERR_NOT_APPLICABLE);
            return 1;
        }
        const std::string destination = kCrontabDir + user;
        if (unlink(destination.c_str()) != 0 && errno != ENOENT) {
            CORV_LOG_ERR("Failed to unlink %s (%m)", destination.c_str());
            VLIBCErrSet(ERR_UNLINK_FAILED);
        }
        return 0;
    }
    bool IsUpdatable() override { return true; }
};

}  // namespace

CORV::PkgUtils::IWorker* NewCrontabJob() {
    return new (std::nothrow) CrontabJob();
}

}  // namespace Resource
}  // namespace CORVPackageTool
