// "web-config": the package's portal fragments in the system's directory of application
// fragments (WebConfig), and the user's part of the portal kept in step with them
// (WebConfigUserData).
#include <errno.h>
#include <unistd.h>

#include <new>
#include <string>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "corv/web.h"
#include "corvpkg/json_util.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

struct FILE_TYPE {
    std::string section;
    std::string relpathKey;
    std::string extension;
    std::string directory;
};

const FILE_TYPE kFileTypes[] = {
    {"app-portal", "json-relpath", "json", "/usr/corv/etc/www/app.d"},
    {"app-portal", "mustache-relpath", "mustache", "/usr/corv/etc/www/app.d"},
    {"", "", "", ""},
};

const char kLinkedKey[] = "linked";
const char kAppPortalSection[] = "app-portal";
const char kJsonRelpathKey[] = "json-relpath";
const char kIdKey[] = "id";
const char kApplicationKey[] = "application";

// A relative path whose last '/' is its first or its last character names no file.
bool HasFileName(const std::string& relpath) {
    const size_t slash = relpath.rfind('/');
    return slash == std::string::npos || (slash != 0 && slash != relpath.size() - 1);
}

std::string FileNameOf(const std::string& relpath) {
    const size_t slash = relpath.rfind('/');
    return slash == std::string::npos ? relpath : relpath.substr(slash + 1);
}

// The text after the last '.', which must be neither missing nor the name's first
// character; "" otherwise.
std::string ExtensionOf(const std::string& fileName) {
    const size_t dot = fileName.rfind('.');
    return dot == std::string::npos || dot == 0 ? std::string() : fileName.substr(dot + 1);
}

std::string AppPortalPath(const std::string& pkg) {
    return "/usr/corv/etc/packages/" + pkg + "/AppPortal.json";
}

class WebConfig : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        for (const FILE_TYPE* row = kFileTypes; !row->section.empty(); ++row) {
            const int status = InstallRow(action, request, *row, own);
            if (status != 0) {
                return status;
            }
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& /*action*/, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value linked =
            own.isObject() ? own.get(kLinkedKey, Json::Value(Json::arrayValue)) : Json::Value();
        if (!linked.isArray()) {
            VLIBCErrSet(ERR_MALFORMED);
            return 1;
        }
        for (const Json::Value& path : linked) {
            if (path.isString() && unlink(path.asCString()) != 0 && errno != ENOENT) {
                CORV_LOG_ERR("Failed to unlink [%s] (%m)", path.asCString());
                VLIBCErrSet(ERR_UNLINK_FAILED);
            }
        }
        own.removeMember(kLinkedKey);
        return 0;
    }

  private:
    // 0 when the row is done or passed over, 1 when the worker fails.
    static int InstallRow(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                          const FILE_TYPE& row, Json::Value& own) {
        const Json::Value sectionObject =
            request.isObject() ? request.get(row.section, Json::Value(Json::objectValue))
                               : Json::Value(Json::objectValue);
        if (!sectionObject.isObject() || !sectionObject[row.relpathKey].isString()) {
            if (sectionObject.isObject() && sectionObject.isMember(row.section)) {
                CORV_LOG_ERR("Illegal format [%s].", row.section.c_str());
                VLIBCErrSet(ERR_MALFORMED);
                return 1;
            }
            return 0;
        }
        const std::string relpath = sectionObject[row.relpathKey].asString();
        if (!HasFileName(relpath)) {
            CORV_LOG_ERR("Error file path [%s].", relpath.c_str());
            return 0;
        }
        const std::string fileName = FileNameOf(relpath);
        if (ExtensionOf(fileName) != row.extension) {
            CORV_LOG_ERR("[%s] is not a valid filename extension of %s-file.", fileName.c_str(),
                         row.extension.c_str());
            return 0;
        }
        std::string source;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), relpath, source)) {
            CORV_LOG_ERR("Illegal path [%s].", relpath.c_str());
            return 0;
        }
        std::string destination = row.directory;
        if (destination.back() != '/') {
            destination += "/";
        }
        destination += action.GetPkgName() + "." + row.extension;
        if (VLIBCFileCheckDir(row.directory.c_str()) != 1) {
            return 1;
        }
        if (VLIBCFileExist(destination.c_str()) != 1 &&
            !CORV::PkgUtils::InstallConfigFile(source, destination, 0644, true)) {
            return 1;
        }
        if (!own[kLinkedKey].isArray()) {
            own[kLinkedKey] = Json::Value(Json::arrayValue);
        }
        own[kLinkedKey].append(destination);
        return 0;
    }
};

class WebConfigUserData : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const Json::Value portal =
            request.isObject() ? request.get(kAppPortalSection, Json::Value(Json::objectValue))
                               : Json::Value(Json::objectValue);
        if (!portal.isObject() || !portal[kJsonRelpathKey].isString()) {
            return 1;
        }
        const std::string relpath = portal[kJsonRelpathKey].asString();
        if (!HasFileName(relpath)) {
            CORV_LOG_ERR("Error file path [%s].", relpath.c_str());
            return 1;
        }
        const std::string& pkg = action.GetPkgName();
        if (FileNameOf(relpath) != pkg + ".json") {
            return 0;
        }
        std::string source;
        if (!CORV::PkgUtils::ResolveRelPath(action.GetRootDir(), relpath, source)) {
            CORV_LOG_ERR("Illegal path [%s].", relpath.c_str());
            return 1;
        }
        Json::Value fragment;
        if (!fromFile(source, fragment) || !fragment.isObject() || !fragment[kIdKey].isString() ||
            !fragment[kApplicationKey].isString()) {
            return 0;
        }
        const std::string userPath = AppPortalPath(pkg);
        if (VLIBCFileExist(userPath.c_str()) != 1) {
            return 0;
        }
        Json::Value user;
        if (!fromFile(userPath, user)) {
            CORV_LOG_ERR("Failed to load '%s' (%m)", userPath.c_str());
            user = Json::Value();
        }
        if (user.isObject() && user[kIdKey].isString() && user[kApplicationKey].isString() &&
            user[kIdKey] == fragment[kIdKey] &&
            user[kApplicationKey] == fragment[kApplicationKey]) {
            return 0;
        }
        if (!user.isObject()) {
            user = Json::Value(Json::objectValue);
        }
        user[kIdKey] = fragment[kIdKey];
        user[kApplicationKey] = fragment[kApplicationKey];
        if (!toFile(user, userPath)) {
            CORV_LOG_ERR("Failed to write '%s' (%m)", userPath.c_str());
            return 0;
        }
        corvw3::Engine engine;
        return engine.W3FwReGenAll() ? 0 : 1;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    // An upgrade keeps the user's part; the new version's Acquire brings it in step.
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& /*own*/, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        const std::string userPath = AppPortalPath(action.GetPkgName());
        if (action.GetActionType() == 2 || VLIBCFileExist(userPath.c_str()) != 1) {
            return 0;
        }
        if (unlink(userPath.c_str()) != 0) {
            CORV_LOG_ERR("Failed to unlink %s, %m", userPath.c_str());
            VLIBCErrSet(ERR_UNLINK_FAILED);
        }
        corvw3::Engine engine;
        if (!engine.W3FwReGenAll()) {
            return 1;
        }
        return engine.HupFirewall() ? 0 : 1;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewWebConfig() {
    return new (std::nothrow) WebConfig();
}

CORV::PkgUtils::IWorker* NewWebConfigUserData() {
    return new (std::nothrow) WebConfigUserData();
}

}  // namespace Resource
}  // namespace CORVPackageTool
