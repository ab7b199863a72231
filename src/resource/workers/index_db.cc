// "indexdb": hands the package's search indexes (its application and its help texts) to
// the system's indexer while the package runs.
#include <unistd.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char* const kIndexKeys[] = {"app-index", "help-index"};
const char kIndexerAdd[] = "/usr/corv/bin/pkgindexer_add";
const char kIndexerDel[] = "/usr/corv/bin/pkgindexer_del";

// The absolute conf and db paths of one index object; false (logged) when either is
// missing. Both must lie inside the package.
bool loadIndex(const std::string& root, const Json::Value& index, std::string& conf,
               std::string& db) {
    const std::string confRel =
        index["conf-relpath"].isString() ? index["conf-relpath"].asString() : "";
    const std::string dbRel = index["db-relpath"].isString() ? index["db-relpath"].asString() : "";
    if (confRel.empty() || dbRel.empty()) {
        CORV_LOG_ERR("Wrong conf format, %s", toString(index).c_str());
        return false;
    }
    conf = root + "/" + confRel;
    db = root + "/" + dbRel;
    if (access(conf.c_str(), F_OK) != 0 || !CORV::PkgUtils::IsLegalRelPath(root, confRel)) {
        CORV_LOG_ERR("conf path:[%s] is not exist", conf.c_str());
        return false;
    }
    if (access(db.c_str(), F_OK) != 0 || !CORV::PkgUtils::IsLegalRelPath(root, dbRel)) {
        CORV_LOG_ERR("db path:[%s] is not exist", db.c_str());
        return false;
    }
    return true;
}

int runIndexer(const char* tool, const std::string& conf, const std::string& db) {
    const char* argv[] = {tool, conf.c_str(), db.c_str(), nullptr};
    const int rc = VLIBCExecv(tool, argv, 1);
    if (rc < 0) {
        CORV_LOG_ERR("Failed to exec %s", tool);
    }
    return rc;
}

class IndexDB : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject()) {
            return 0;
        }
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        for (const char* key : kIndexKeys) {
            if (!request[key].isObject()) {
                continue;
            }
            std::string conf;
            std::string db;
            if (!loadIndex(action.GetRootDir(), request[key], conf, db)) {
                return 1;
            }
            runIndexer(kIndexerAdd, conf, db);
            own[key] = request[key];
        }
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
        const Json::Value& held = own;
        for (const char* key : kIndexKeys) {
            if (!held.isMember(key) || !held[key].isObject()) {
                continue;
            }
            std::string conf;
            std::string db;
            if (!loadIndex(action.GetRootDir(), held[key], conf, db)) {
                return 1;
            }
            runIndexer(kIndexerDel, conf, db);
        }
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewIndexDB() {
    return new (std::nothrow) IndexDB();
}

}  // namespace Resource
}  // namespace CORVPackageTool
