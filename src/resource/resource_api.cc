// The file side of the resource framework: reading and writing the request file and the
// own-file, the members that workers fetch and replace, and carrying the own-file across
// an upgrade.
#include <errno.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "corv/file_replace.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"
#include "resource/resource_private.h"

namespace CORVPackageTool {
namespace Resource {

namespace {

constexpr const char kRegistryDir[] = "/var/packages/";
constexpr const char kBackupDir[] = "/var/tmp";

std::string confDir(const std::string& pkg, const std::string& dir) {
    return dir.empty() ? kRegistryDir + pkg + "/conf" : dir + "/conf";
}

// chmod whose failure is worth a line at the highest priority but not a failure.
void chmodOrLog(const std::string& path, mode_t mode) {
    if (chmod(path.c_str(), mode) != 0) {
        CORV_LOG(LOG_EMERG, "chmod error: %m");
    }
}

// A JSON file that must hold an object: false with 0x4000 (logged) when it holds
// something else.
bool requireObject(const std::string& path, const Json::Value& value) {
    if (value.isObject()) {
        return true;
    }
    CORV_LOG_ERR("%s is not a JSON object", path.c_str());
    VLIBCErrSet(ERR_MALFORMED);
    return false;
}

// "/var/tmp/resource.<pkg>.<pid>", with /var/tmp made when missing; "" when it can't be.
std::string backupPath(const std::string& pkg) {
    if (mkdir(kBackupDir, 0777) != 0 && errno != EEXIST) {
        CORV_LOG_ERR("Failed to create temp dir %s (%m)", kBackupDir);
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return "";
    }
    chmodOrLog(kBackupDir, 0777);
    return std::string(kBackupDir) + "/resource." + pkg + "." + std::to_string(getpid());
}

// Member `id` of the request file or own-file of an installed package.
bool getObject(const std::string& path, const std::string& pkg, const std::string& id,
               Json::Value& out) {
    if (pkg.empty() || id.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    Json::Value content;
    if (!ReadJsonFile(path, content)) {
        return false;
    }
    if (!content.isObject() || !content.isMember(id)) {
        VLIBCErrSet(kErrMissingMember);
        return false;
    }
    out = content[id];
    return true;
}

}  // namespace

std::string RequestFilePath(const std::string& pkg, const std::string& dir) {
    return confDir(pkg, dir) + "/resource";
}

std::string OwnFilePath(const std::string& pkg, const std::string& dir) {
    return confDir(pkg, dir) + "/resource.own";
}

bool ReadJsonFile(const std::string& path, Json::Value& out) {
    if (VLIBCFileExist(path.c_str()) != 1) {
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return false;
    }
    if (!fromFile(path, out)) {
        CORV_LOG_ERR("Failed to read %s (%m)", path.c_str());
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    return true;
}

// Created with its final mode: an own-file is never readable by others, not for a moment.
bool WriteJsonFile(const std::string& path, const Json::Value& value) {
    if (!CORVFileReplace(path, toString(value), 0600)) {
        CORV_LOG_ERR("Failed to write %s (%m)", path.c_str());
        VLIBCErrSet(ERR_WRITE_FAILED);
        return false;
    }
    chmodOrLog(path, 0600);
    return true;
}

bool CreateFolder(const std::string& pkg, const std::string& dir) {
    if (dir.empty() && pkg.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string path = confDir(pkg, dir);
    if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
        CORV_LOG_ERR("Failed to crate %s (%m)", path.c_str());
        VLIBCErrSet(ERR_MKDIR_FAILED);
        return false;
    }
    chmodOrLog(path, 0755);
    return true;
}

bool InitRequiredFields(const std::string& pkg, const std::string& dir) {
    const std::string path = RequestFilePath(pkg, dir);
    Json::Value request(Json::objectValue);
    if (!ReadJsonFile(path, request)) {
        if (VLIBCErrGet() != ERR_NO_SUCH_FILE) {
            return false;
        }
        request = Json::Value(Json::objectValue);
    }
    if (!requireObject(path, request)) {
        return false;
    }
    if (request.isMember("service-cfg")) {
        return true;
    }
    request["service-cfg"] = Json::Value(Json::objectValue);
    return CreateFolder(pkg, dir) && WriteJsonFile(path, request);
}

bool GetRequestObject(const std::string& pkg, const std::string& id, Json::Value& out) {
    return getObject(RequestFilePath(pkg, ""), pkg, id, out);
}

bool GetOwnObject(const std::string& pkg, const std::string& id, Json::Value& out) {
    return getObject(OwnFilePath(pkg, ""), pkg, id, out);
}

bool ReplaceOwnObject(const std::string& pkg, const std::string& id, const Json::Value& value) {
    if (pkg.empty() || id.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string path = OwnFilePath(pkg, "");
    Json::Value own(Json::objectValue);
    if (!ReadJsonFile(path, own)) {
        if (VLIBCErrGet() != ERR_NO_SUCH_FILE) {
            return false;
        }
        own = Json::Value(Json::objectValue);
    }
    if (!requireObject(path, own)) {
        return false;
    }
    own[id] = value;
    return CreateFolder(pkg, "") && WriteJsonFile(path, own);
}

bool BackupResourceFile(const std::string& pkg) {
    const std::string backup = backupPath(pkg);
    if (backup.empty()) {
        return false;
    }
    const std::string own = OwnFilePath(pkg, "");
    if (rename(own.c_str(), backup.c_str()) != 0 && errno != ENOENT) {
        CORV_LOG_ERR("Failed to backup %s to %s (%m)", own.c_str(), backup.c_str());
        VLIBCErrSet(ERR_RENAME_FAILED);
        return false;
    }
    return true;
}

bool RestoreResourceFile(const std::string& pkg, const std::string& dir) {
    const std::string backup = backupPath(pkg);
    if (backup.empty()) {
        return false;
    }
    Json::Value content;
    if (!ReadJsonFile(backup, content)) {
        return VLIBCErrGet() == ERR_NO_SUCH_FILE;  // the old version had no own-file
    }
    return CreateFolder(pkg, dir) && WriteJsonFile(OwnFilePath(pkg, dir), content);
}

}  // namespace Resource
}  // namespace CORVPackageTool
