// "sysnotify": a running package's notification texts, known to the system's notification
// tools through a link under /usr/local/share/notification/ and a new aggregate.
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

const char kTextsDirKey[] = "texts_dir";

const char kNotificationDir[] = "/usr/local/share/notification/";
const char kSystemCopyDir[] = "/usr/local/share/notification/nos";
const char kSystemTextsDir[] = "/var/cache/texts/";
const char kAggregateTool[] = "/usr/corv/bin/notification_aggregate";
const char kUtilsTool[] = "/usr/corv/bin/notification_utils";

std::string LinkPath(const std::string& pkg) {
    return kNotificationDir + pkg;
}

// The tools keep their own logs; a failed step leaves the previous aggregate in place,
// which is all the package's texts can lose.
void AggregateNOtifications() {
    VLIBCExec(kAggregateTool, kSystemTextsDir, kNotificationDir, nullptr);
    VLIBCExec(kUtilsTool, "--gen_category_file", "enu", nullptr);
    VLIBCExec(kUtilsTool, "--sync_setting", nullptr);
}

class Sysnotify : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string textsDir = request.isObject() && request[kTextsDirKey].isString()
                                         ? request[kTextsDirKey].asString()
                                         : std::string();
        if (textsDir.empty()) {
            CORV_LOG_ERR("no texts dir path defined");
            VLIBCErrSet(ERR_KEY_NOT_FOUND);
            return 1;
        }
        // The link is followed by tools that run as root: it must stay inside the package.
        if (!CORV::PkgUtils::IsLegalRelPath(action.GetRootDir(), textsDir)) {
            CORV_LOG_ERR("Illegal path %s [0x%04X %s:%d]", textsDir.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return 1;
        }
        const std::string full = action.GetRootDir() + "/" + textsDir;
        const std::string mails = full + "/enu/mails";
        if (VLIBCFileExist(mails.c_str()) != 1) {
            CORV_LOG_ERR("enu/mails file %s not exist", mails.c_str());
            VLIBCErrSet(ERR_KEY_NOT_FOUND);
            return 1;
        }
        if (VLIBCFileCheckDir(kNotificationDir) != 1) {
            VLIBCExec("/bin/mkdir", "-p", kNotificationDir, nullptr);
        }
        if (VLIBCFileCheckDir(kSystemCopyDir) != 1) {
            VLIBCExec("/bin/cp", "-a", kSystemTextsDir, kSystemCopyDir, nullptr);
        }
        // An existing link stays as it is.
        symlink(full.c_str(), LinkPath(action.GetPkgName()).c_str());
        AggregateNOtifications();
        return 0;
    }

    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }

    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        unlink(LinkPath(action.GetPkgName()).c_str());
        AggregateNOtifications();
        return 0;
    }

    bool IsUpdatable() override { return true; }

    bool Update(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Acquire(action, request, own, resp) == 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewSysnotify() {
    return new (std::nothrow) Sysnotify();
}

}  // namespace Resource
}  // namespace CORVPackageTool
