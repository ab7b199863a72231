// "usr-local-linker": links from /usr/local/bin, lib and etc to the package's files while
// it runs, so that its programs are found on PATH. Only the links it made are removed.
#include <errno.h>
#include <glob.h>
#include <string.h>
#include <unistd.h>

#include <new>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/vlibc.h"
#include "resource/workers/builtin_workers.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

const char kLinks[] = "links";
const char* const kKinds[] = {"bin", "lib", "etc"};

// Every pattern's matches relative to the root; a pattern without match stands for itself.
bool expand(const std::string& root, const Json::Value& patterns, std::vector<std::string>& out) {
    for (const Json::Value& pattern : patterns) {
        if (!pattern.isString() || pattern.asString().empty()) {
            continue;
        }
        const std::string full = root + "/" + pattern.asString();
        glob64_t found;
        const int rc = glob64(full.c_str(), GLOB_NOCHECK, nullptr, &found);
        if (rc != 0) {
            CORV_LOG_ERR("Failed to glob %s [%m]", full.c_str());
            globfree64(&found);
            return false;
        }
        for (size_t i = 0; i < found.gl_pathc; ++i) {
            const std::string match = found.gl_pathv[i];
            if (match.compare(0, root.size() + 1, root + "/") == 0) {
                out.push_back(match.substr(root.size() + 1));
            }
        }
        globfree64(&found);
    }
    return true;
}

// One link /usr/local/<kind>/<base name of rel> to root/rel, over whatever file was there.
bool linkOne(const std::string& root, const std::string& dir, const std::string& rel,
             std::string& link) {
    const size_t slash = rel.rfind('/');
    link = dir + (slash == std::string::npos ? "/" + rel : rel.substr(slash));
    if (unlink(link.c_str()) != 0 && errno != ENOENT) {
        VLIBCErrSet(errno == EISDIR ? ERR_IS_DIRECTORY : ERR_UNLINK_FAILED);
        return false;
    }
    if (symlink((root + "/" + rel).c_str(), link.c_str()) != 0) {
        VLIBCErrSet(ERR_CREATE_FAILED);
        return false;
    }
    return true;
}

bool linkKind(const std::string& root, const char* kind, const Json::Value& patterns,
              Json::Value& links) {
    if (!patterns.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    if (patterns.empty()) {
        return true;
    }
    const std::string dir = std::string("/usr/local/") + kind;
    if (CORVFSMkdirP(dir.c_str(), nullptr, 1, 0, 0, 0755) < 0) {
        CORV_LOG_ERR("Failed to create %s [0x%04X %s:%d]", dir.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    std::vector<std::string> relpaths;
    if (!expand(root, patterns, relpaths)) {
        return false;
    }
    for (const std::string& rel : relpaths) {
        if (!CORV::PkgUtils::IsLegalRelPath(root, rel)) {
            continue;
        }
        std::string link;
        if (!linkOne(root, dir, rel, link)) {
            CORV_LOG_ERR("Failed to create link to %s [0x%04X %s:%d]", rel.c_str(), VLIBCErrGet(),
                         VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
        links.append(link);
    }
    return true;
}

bool isOurPlace(const std::string& path) {
    for (const char* prefix : {"/usr/local/bin/", "/usr/local/lib/", "/usr/local/etc/"}) {
        if (path.compare(0, strlen(prefix), prefix) == 0 && path.size() > strlen(prefix) &&
            path.find("/..") == std::string::npos) {
            return true;
        }
    }
    return false;
}

class UsrLocalLinker : public CORV::PkgUtils::IWorker {
  public:
    int Acquire(const CORV::PkgUtils::ActionInfo& action, const Json::Value& request,
                Json::Value& own, CORV::PkgUtils::WorkerResp& /*resp*/) override {
        if (!own.isObject()) {
            own = Json::Value(Json::objectValue);
        }
        own[kLinks] = Json::Value(Json::arrayValue);
        for (const char* kind : kKinds) {
            const Json::Value patterns = request.isObject() && request.isMember(kind)
                                             ? request[kind]
                                             : Json::Value(Json::arrayValue);
            if (!linkKind(action.GetRootDir(), kind, patterns, own[kLinks])) {
                return 1;
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
        if (!own.isObject() || !own[kLinks].isArray()) {
            return 0;
        }
        for (const Json::Value& link : own[kLinks]) {
            if (!link.isString() || !isOurPlace(link.asString())) {
                continue;
            }
            if (unlink(link.asCString()) != 0 && errno != ENOENT) {
                CORV_LOG_ERR("Failed to unlink %s (%m)", link.asCString());
            }
        }
        own.removeMember(kLinks);
        return 0;
    }
};

}  // namespace

CORV::PkgUtils::IWorker* NewUsrLocalLinker() {
    return new (std::nothrow) UsrLocalLinker();
}

}  // namespace Resource
}  // namespace CORVPackageTool
