// "webapi-desc" (WebAPIDesc): the package's web API files published by symbolic links in
// the platform's web API directory, with the package's user stamped into their library
// descriptions as the user that runs them.
#include <limits.h>
#include <sys/stat.h>
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

const char kWebApiDir[] = "/usr/corv/corvman/webapi";
const char kApisKey[] = "apis";
const char kTypeKey[] = "type";
const char kAuthKey[] = "auth";
const char kLibKey[] = "lib";
const char kApiDirKey[] = "api-dir";
const char kLinkNameKey[] = "link-name";
const char kRunAsKey[] = "runAs";

bool IsHandledType(const Json::Value& entry) {
    if (!entry.isObject() || !entry[kTypeKey].isString()) {
        return false;
    }
    const std::string type = entry[kTypeKey].asString();
    return type == "cgi" || type == "webapi";
}

std::string BaseName(const std::string& path) {
    const size_t slash = path.rfind('/');
    return slash == std::string::npos ? path : path.substr(slash + 1);
}

// The web API directory is shared by all packages: a name there that is a link into
// another package's files belongs to that package, and this one neither replaces nor
// removes it.
bool IsClaimedByOther(const std::string& path, const std::string& root) {
    char target[PATH_MAX];
    const ssize_t n = readlink(path.c_str(), target, sizeof(target) - 1);
    if (n < 0) {
        struct stat st;
        return lstat(path.c_str(), &st) == 0;  // something else than a link: not ours
    }
    return std::string(target, static_cast<size_t>(n)).rfind(root + "/", 0) != 0;
}

bool Link(const std::string& target, const std::string& name, const std::string& root) {
    if (access(target.c_str(), F_OK) != 0) {
        CORV_LOG_ERR("File is not exist %s, %m", target.c_str());
        return false;
    }
    const std::string link = std::string(kWebApiDir) + "/" + name;
    if (IsClaimedByOther(link, root)) {
        CORV_LOG_ERR("%s belongs to another package, %s not linked", link.c_str(), target.c_str());
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const char* const argv[] = {"/bin/ln", "-sf", target.c_str(), link.c_str(), nullptr};
    const int status = VLIBCExecv("/bin/ln", argv, 1);
    if (status < 0) {
        CORV_LOG_ERR("Failed to ln %s %s, %d", target.c_str(), link.c_str(), status);
    }
    return true;
}

void Remove(const std::string& name, const std::string& root) {
    const std::string path = std::string(kWebApiDir) + "/" + name;
    struct stat st;
    if (name.empty() || lstat(path.c_str(), &st) != 0 || IsClaimedByOther(path, root)) {
        return;
    }
    // Waited for: the link is gone before the own-file says so, and before a new
    // version's Acquire links the same name again.
    const char* const argv[] = {"/bin/rm", "-rf", path.c_str(), nullptr};
    if (VLIBCExecv("/bin/rm", argv, 1) < 0) {
        CORV_LOG_ERR("%s", path.c_str());
    }
}

// Members without a user of their own run as the package's user.
void StampRunAs(const std::string& path, const std::string& user) {
    Json::Value desc;
    if (!fromFile(path, desc)) {
        CORV_LOG_ERR("Failed to load lib desc, %s, %m", path.c_str());
        return;
    }
    if (!desc.isObject()) {
        CORV_LOG_ERR("Lib desc is not json object, %s", path.c_str());
        return;
    }
    for (const std::string& key : desc.getMemberNames()) {
        if (!key.empty() && desc[key].isObject() && !desc[key].isMember(kRunAsKey)) {
            desc[key][kRunAsKey] = user;
        }
    }
    if (!toFile(desc, path)) {
        CORV_LOG_ERR("Failed to save lib desc, %s, %m", path.c_str());
    }
}

bool LinkFiles(const Json::Value& files, const std::string& root, const std::string& user) {
    if (!files.isArray()) {
        CORV_LOG_ERR("%s is not array", toString(files).c_str());
        return false;
    }
    for (const Json::Value& file : files) {
        if (!file.isString()) {
            CORV_LOG_ERR("%s is not string", toString(file).c_str());
            return false;
        }
        std::string path;
        if (!CORV::PkgUtils::ResolveRelPath(root, file.asString(), path)) {
            CORV_LOG_ERR("path is not legal %s %s, %m", root.c_str(), file.asCString());
            return false;
        }
        const std::string name = BaseName(path);
        if (name.empty()) {
            return false;
        }
        if (!user.empty()) {
            StampRunAs(path, user);
        }
        if (!Link(path, name, root)) {
            return false;
        }
    }
    return true;
}

bool LinkEntry(const Json::Value& entry, const std::string& root, const std::string& user) {
    for (const char* key : {kAuthKey, kLibKey}) {
        if (entry.isMember(key) && !LinkFiles(entry[key], root, user)) {
            return false;
        }
    }
    if (!entry.isMember(kApiDirKey) || !entry.isMember(kLinkNameKey)) {
        return true;
    }
    std::string dir;
    const std::string relative = entry[kApiDirKey].asString();
    if (!CORV::PkgUtils::ResolveRelPath(root, relative, dir)) {
        CORV_LOG_ERR("path is not legal %s %s, %m", root.c_str(), relative.c_str());
        return false;
    }
    // The link's name is one entry of the directory, never a path out of it.
    const std::string name = entry[kLinkNameKey].asString();
    if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos) {
        CORV_LOG_ERR("path is not legal %s %s, %m", kWebApiDir, name.c_str());
        VLIBCErrSet(ERR_OUTSIDE_PACKAGE);
        return false;
    }
    return Link(dir, name, root);
}

class WebAPIDesc : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!request.isObject() || !request.isMember(kApisKey)) {
            return 0;
        }
        const Json::Value& apis = request[kApisKey];
        if (!apis.isArray()) {
            CORV_LOG_ERR("Format error: %s is not array", toString(apis).c_str());
            return 1;
        }
        const std::string& user = action.GetPkgUserName();
        if (!own[kApisKey].isArray()) {
            own[kApisKey] = Json::Value(Json::arrayValue);
        }
        for (const Json::Value& entry : apis) {
            if (!IsHandledType(entry)) {
                continue;
            }
            own[kApisKey].append(entry);
            if (!LinkEntry(entry, action.GetRootDir(), user)) {
                return 1;
            }
        }
        return 0;
    }
    int Rollback(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                 Json::Value& own, CORV::PkgUtils::WorkerResp& resp) override {
        return Release(action, request, own, resp);
    }
    int Release(const CORV::PkgUtils::ActionInfo& action, const Json::Value& /*request*/,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!own.isObject() || !own.isMember(kApisKey)) {
            return 0;
        }
        if (!own[kApisKey].isArray()) {
            CORV_LOG_ERR("Format error: %s is not array", toString(own[kApisKey]).c_str());
            return 1;
        }
        const std::string& root = action.GetRootDir();
        for (const Json::Value& entry : own[kApisKey]) {
            if (!IsHandledType(entry)) {
                continue;
            }
            for (const char* key : {kAuthKey, kLibKey}) {
                if (!entry.isMember(key)) {
                    continue;
                }
                if (!entry[key].isArray()) {
                    CORV_LOG_ERR("%s is not array", toString(entry[key]).c_str());
                    return 1;
                }
                for (const Json::Value& file : entry[key]) {
                    if (file.isString()) {
                        Remove(BaseName(file.asString()), root);
                    }
                }
            }
            if (entry.isMember(kApiDirKey) && entry.isMember(kLinkNameKey)) {
                const std::string name = entry[kLinkNameKey].asString();
                if (name.find('/') == std::string::npos && name != "..") {
                    Remove(name, root);
                }
            }
        }
        own.removeMember(kApisKey);
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewWebAPIDesc() {
    return new (std::nothrow) WebAPIDesc();
}

}  // namespace Resource
}  // namespace CORVPackageTool
