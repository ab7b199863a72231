// Making an unpacked package safe and owned before any of its scripts runs.
#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>

#include <string>

#include "common/registry_paths.h"
#include "common/unique_fd.h"
#include "corv/log.h"
#include "corv/pkgutils.h"
#include "corv/user.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/privilege.h"

namespace CORVPackageTool {
namespace Privilege {

namespace {

// The system group: programs of identity "system" run with it.
constexpr gid_t kSystemGid = 1;
constexpr unsigned kNoId = static_cast<unsigned>(-1);

const char* const kScripts[] = {"start-stop-status", "preupgrade", "postupgrade", "preinst",
                                "postinst",          "preuninst",  "postuninst"};

// Opens a regular file for fchown/fchmod without following it into a fifo or device.
// An invalid UniqueFd (error slot set) when it cannot be opened or is not a regular file.
UniqueFd openRegular(const std::string& path, struct stat& st) {
    UniqueFd fd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    if (!fd) {
        VLIBCErrSet(errno == ENOENT ? ERR_NO_SUCH_FILE : ERR_OPEN_FAILED);
        return UniqueFd();
    }
    if (fstat(fd.get(), &st) != 0) {
        VLIBCErrSet(ERR_STAT_FAILED);
        return UniqueFd();
    }
    if (!S_ISREG(st.st_mode)) {
        VLIBCErrSet(ERR_NOT_APPLICABLE);
        return UniqueFd();
    }
    return fd;
}

// The file an entry names, inside `top`, opened. Invalid (logged) on failure.
UniqueFd openEntryFile(const std::string& top, const std::string& relpath, struct stat& st) {
    std::string path;
    if (!CORV::PkgUtils::ResolveRelPath(top, relpath, path)) {
        CORV_LOG_ERR("Failed to resolve %s [0x%04X %s:%d]", relpath.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return UniqueFd();
    }
    return openRegular(path, st);
}

// "root" or "package" as an id; false with 0x4000 (empty) or 0xD900 (any other name).
bool ownerId(const std::string& text, unsigned packageId, unsigned& id) {
    if (text == "root") {
        id = 0;
        return true;
    }
    if (text == "package") {
        id = packageId;
        return true;
    }
    VLIBCErrSet(text.empty() ? ERR_MALFORMED : ERR_NOT_APPLICABLE);
    return false;
}

std::string stringOr(const Json::Value& conf, const char* key, const std::string& fallback) {
    if (conf.isObject() && conf[key].isString() && !conf[key].asString().empty()) {
        return conf[key].asString();
    }
    return fallback;
}

// Adds `user` to the supplementary members of `group` unless it is one already.
bool joinGroup(const std::string& user, const std::string& group) {
    PCORVGROUP grp = nullptr;
    if (CORVGroupGet(group.c_str(), &grp) < 0) {
        CORV_LOG_ERR("CORVGroupGet [%s] failed [0x%04X %s:%d]", group.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    for (unsigned i = 0; i < grp->nMember; ++i) {
        if (grp->ppszMember[i] != nullptr && user == grp->ppszMember[i]) {
            CORVGroupFree(grp);
            return true;
        }
    }
    char** members =
        static_cast<char**>(realloc(grp->ppszMember, (grp->nMember + 2) * sizeof(char*)));
    if (members == nullptr) {
        CORV_LOG_ERR("Failed to alloc memory");
        CORVGroupFree(grp);
        return false;
    }
    grp->ppszMember = members;
    grp->ppszMember[grp->nMember + 1] = nullptr;
    grp->ppszMember[grp->nMember] = strdup(user.c_str());
    if (grp->ppszMember[grp->nMember] == nullptr) {
        CORV_LOG_ERR("Failed to strdup");
        CORVGroupFree(grp);
        return false;
    }
    ++grp->nMember;
    bool ok = CORVLocalAccountGroupSet(grp->name, grp) >= 0;
    if (!ok) {
        CORV_LOG_ERR("Failed to set '%s' [0x%04X %s:%d]", grp->name, VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
    }
    CORVGroupFree(grp);
    return ok;
}

}  // namespace

ReviseWalker::ReviseWalker(const std::string& top, unsigned pkgUid, unsigned pkgGid)
    : topDir(top), uid(pkgUid), gid(pkgGid) {}
ReviseWalker::~ReviseWalker() = default;

ExeWalker::ExeWalker(const std::string& top, unsigned pkgUid, unsigned pkgGid)
    : ReviseWalker(top, pkgUid, pkgGid) {}
ExeWalker::~ExeWalker() = default;

int ExeWalker::walk(const Json::Value& entry) {
    if (!entry["relpath"].isString() || !entry["run-as"].isString()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 0;
    }
    struct stat st {};
    UniqueFd fd = openEntryFile(topDir, entry["relpath"].asString(), st);
    if (!fd) {
        return 0;
    }
    uid_t owner = 0;
    gid_t group = 0;
    switch (TranslateIdentity(entry["run-as"].asString())) {
        case IDENTITY_PACKAGE:
            owner = uid;
            group = gid;
            break;
        case IDENTITY_SYSTEM:
            owner = uid;
            group = kSystemGid;
            break;
        case IDENTITY_ROOT:
            break;
        default:
            VLIBCErrSet(ERR_MALFORMED);
            return 0;
    }
    if (fchown(fd.get(), owner, group) != 0) {
        VLIBCErrSet(ERR_CHOWN_FAILED);
        return 0;
    }
    return 2;
}

ToolWalker::ToolWalker(const std::string& top, unsigned pkgUid, unsigned pkgGid)
    : ReviseWalker(top, pkgUid, pkgGid) {}
ToolWalker::~ToolWalker() = default;

int ToolWalker::walk(const Json::Value& entry) {
    if (!entry["relpath"].isString() || !entry["user"].isString() || !entry["group"].isString() ||
        !entry["permission"].isString()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 0;
    }
    const std::string relpath = entry["relpath"].asString();
    struct stat st {};
    UniqueFd fd = openEntryFile(topDir, relpath, st);
    if (!fd) {
        return 0;
    }
    unsigned owner = 0;
    unsigned group = 0;
    const std::string permission = entry["permission"].asString();
    char* end = nullptr;
    unsigned long mode = strtoul(permission.c_str(), &end, 8);
    bool ok = ownerId(entry["user"].asString(), uid, owner) &&
              ownerId(entry["group"].asString(), gid, group);
    if (ok && fchown(fd.get(), owner, group) != 0) {
        VLIBCErrSet(ERR_CHOWN_FAILED);
        ok = false;
    }
    if (ok && (permission.size() != 4 || end != permission.c_str() + permission.size())) {
        VLIBCErrSet(ERR_MALFORMED);
        ok = false;
    }
    if (ok && fchmod(fd.get(), static_cast<mode_t>(mode)) != 0) {
        VLIBCErrSet(ERR_CHOWN_FAILED);
        ok = false;
    }
    if (!ok) {
        CORV_LOG_ERR("Failed to revise %s [0x%04X %s:%d]", relpath.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return 0;
    }
    return 2;
}

bool ClearSetUGidBit(const std::string& path) {
    struct stat st {};
    UniqueFd fd = openRegular(path, st);
    if (!fd) {
        return false;
    }
    if (fchmod(fd.get(), st.st_mode & 07777 & ~(S_ISUID | S_ISGID)) != 0) {
        VLIBCErrSet(ERR_CHOWN_FAILED);
        return false;
    }
    return true;
}

namespace {

// A set-id script would run with its owner's rights whoever starts it.
bool clearScriptSetIds(const std::string& name, const std::string& dir) {
    for (const char* script : kScripts) {
        const std::string path = dir + "/scripts/" + script;
        if (VLIBCFileExist(path.c_str()) && !ClearSetUGidBit(path)) {
            CORV_LOG_ERR("Failed to revise scripts of %s [0x%04X %s:%d]", name.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
    }
    return true;
}

// A package must never take over an account of the system. An account that does not
// exist yet has no id: only its name can be reserved.
bool refuseSystemAccounts(const std::string& user, const std::string& group) {
    uid_t uid = kNoId;
    gid_t gid = kNoId;
    if (CORVUserGetUGID(user.c_str(), &uid, nullptr) < 0 && VLIBCErrGet() != ERR_NO_SUCH_USER) {
        CORV_LOG_ERR("Failed to check user %s [0x%04X %s:%d]", user.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (CORVUserIsReserved(user.c_str(), uid)) {
        CORV_LOG_ERR("User %s is reservered for system", user.c_str());
        return false;
    }
    if (CORVGroupGetGID(group.c_str(), &gid) < 0 && VLIBCErrGet() != ERR_NO_SUCH_GROUP) {
        CORV_LOG_ERR("Failed to check groupr %s [0x%04X %s:%d]", group.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (CORVGroupIsReserved(group.c_str(), gid)) {
        CORV_LOG_ERR("Group %s is reservered for system", group.c_str());
        return false;
    }
    return true;
}

// The payload's default owner from conf/privilege: the package's user with its own group
// or with the system group.
bool setDefaultOwner(const std::string& name, const Json::Value& conf, const std::string& user,
                     const std::string& group, const std::string& payload) {
    std::string owner;
    int identity = GetDefaultIdentity(conf);
    if (identity == IDENTITY_PACKAGE) {
        owner = user + ":" + group;
    } else if (identity == IDENTITY_SYSTEM) {
        owner = user + ":system";
    } else if (identity == IDENTITY_INVALID) {
        VLIBCErrSet(ERR_MALFORMED);
    }
    int status = 0;
    if (!owner.empty()) {
        // -h: links of the payload are changed themselves, never what they point at.
        status = VLIBCExec("/bin/chown", "-hR", owner.c_str(), payload.c_str(), nullptr);
    }
    if (identity == IDENTITY_INVALID || status != 0) {
        CORV_LOG_ERR("Failed to set default owner of %s [0x%04X %s:%d]", name.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    return true;
}

}  // namespace

bool ReviseFileAttr(const std::string& name, const std::string& dir) {
    if (name.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (!clearScriptSetIds(name, dir)) {
        return false;
    }
    std::string confPath;
    if (!GetConfPathFrom(dir, confPath)) {
        return true;
    }
    Json::Value conf;
    if (!fromFile(confPath, conf)) {
        CORV_LOG_ERR("Failed to read %s (%m)", confPath.c_str());
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    const std::string user = stringOr(conf, "username", name);
    const std::string group = stringOr(conf, "groupname", name);
    if (!refuseSystemAccounts(user, group)) {
        return false;
    }
    uid_t uid = kNoId;
    gid_t gid = kNoId;
    const std::string home = PMSRegistryEntry(name, kRegistryTarget);
    if (CORVLocalAccountUserPrepareForPkg(user.c_str(), group.c_str(), home.c_str()) < 0) {
        CORV_LOG_ERR("Failed to prepare user for %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    if (CORVUserGetUGID(user.c_str(), &uid, &gid) < 0) {
        CORV_LOG_ERR("Failed to get %s [0x%04X %s:%d]", user.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    const std::string join = stringOr(conf, "join-groupname", "");
    if (!join.empty() && !joinGroup(user, join)) {
        CORV_LOG_ERR("Failed to add package user '%s' to group '%s'", user.c_str(), join.c_str());
        return false;
    }
    const std::string payload = dir + "/package";
    if (!setDefaultOwner(name, conf, user, group, payload)) {
        return false;
    }
    ExeWalker exe(payload, uid, gid);
    ToolWalker tool(payload, uid, gid);
    if (!TraversePrivilege(conf, "executable", exe) || !TraversePrivilege(conf, "tool", tool)) {
        CORV_LOG_ERR("Failed to override default of %s [0x%04X %s:%d]", name.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    return true;
}

}  // namespace Privilege
}  // namespace CORVPackageTool
