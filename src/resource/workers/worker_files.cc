#include "resource/workers/worker_files.h"

#include <errno.h>
#include <unistd.h>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace CORVPackageTool {
namespace Resource {

std::string WorkerBaseName(const std::string& path) {
    const size_t slash = path.rfind('/');
    if (slash == std::string::npos || slash == 0) {
        return "";
    }
    return path.substr(slash + 1);
}

std::string WorkerLastPart(const std::string& name) {
    const size_t slash = name.rfind('/');
    return slash == std::string::npos ? name : name.substr(slash + 1);
}

Json::Value WorkerArrayOf(const Json::Value& section, const char* key) {
    return section.isObject() && section.isMember(key) ? section[key]
                                                       : Json::Value(Json::arrayValue);
}

void WorkerUnlinkAll(const std::string& dir, const Json::Value& names) {
    for (const Json::Value& name : names) {
        // Only names that the worker itself made: never a path that climbs out.
        if (!name.isString() || name.asString().empty() ||
            name.asString().find('/') != std::string::npos || name.asString() == "..") {
            continue;
        }
        const std::string path = dir + "/" + name.asString();
        if (unlink(path.c_str()) != 0 && errno != ENOENT) {
            CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
            VLIBCErrSet(ERR_UNLINK_FAILED);
        }
    }
}

int WorkerReleaseListed(Json::Value& own, const char* key, const std::string& dir) {
    const Json::Value names = WorkerArrayOf(own, key);
    if (!names.isArray()) {
        VLIBCErrSet(ERR_MALFORMED);
        return 1;
    }
    WorkerUnlinkAll(dir, names);
    own.removeMember(key);
    return 0;
}

}  // namespace Resource
}  // namespace CORVPackageTool
