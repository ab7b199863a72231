// Service files: their check, the jobs they stand for, run keys, display names and the
// list of services.
#include <json/json.h>
#include <string.h>

#include <algorithm>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/service.h"
#include "corv/vlibc.h"
#include "init_job.h"
#include "service_cfg.h"

namespace CORVService {

namespace {

constexpr int kInfoKindJobs = 4;

struct ServiceFile {
    std::vector<std::string> jobs;
    std::vector<std::string> required;
    std::string displayName;
};

std::string cfgPath(const std::string& name) {
    return std::string(VLIB_SERVICE_CFG_DIR) + "/" + name + ".cfg";
}

std::string runKeyPath(const std::string& name) {
    return std::string(kOverrideDir) + "/" + name + ".cfg";
}

bool parseJson(const std::string& text, Json::Value* value, std::string* reason) {
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    return reader->parse(text.data(), text.data() + text.size(), value, reason);
}

// The member `key` of an object, or null.
const Json::Value* member(const Json::Value& value, const char* key) {
    return value.isObject() && value.isMember(key) ? &value[key] : nullptr;
}

bool stringArray(const Json::Value& value, std::vector<std::string>* out) {
    if (!value.isArray()) {
        return false;
    }
    for (const Json::Value& item : value) {
        if (!item.isString() || !CORVInit::IsValidJobName(item.asString())) {
            return false;
        }
        out->push_back(item.asString());
    }
    return true;
}

// Reads and checks a service file. 0; -1 with ERR_NO_SUCH_FILE or ERR_MALFORMED, and
// the reason.
int readServiceFile(const std::string& path, ServiceFile* service, std::string* reason) {
    std::string text;
    if (!CORVInit::ReadTextFile(path, &text)) {
        *reason = "cannot be read";
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return -1;
    }
    Json::Value root;
    if (!parseJson(text, &root, reason)) {
        VLIBCErrSet(ERR_MALFORMED);
        return -1;
    }
    const Json::Value* map = member(root, "init_job_map");
    const Json::Value* jobs = map != nullptr ? member(*map, "upstart") : nullptr;
    if (jobs == nullptr || !stringArray(*jobs, &service->jobs) || service->jobs.empty()) {
        *reason = "\"init_job_map\" must be an object with an \"upstart\" array of job names";
        VLIBCErrSet(ERR_MALFORMED);
        return -1;
    }
    if (const Json::Value* required = member(root, "required_corvservice")) {
        if (!stringArray(*required, &service->required)) {
            *reason = "\"required_corvservice\" must be an array of service names";
            VLIBCErrSet(ERR_MALFORMED);
            return -1;
        }
    }
    if (const Json::Value* display = member(root, "display_name")) {
        if (!display->isString()) {
            *reason = "\"display_name\" must be a string";
            VLIBCErrSet(ERR_MALFORMED);
            return -1;
        }
        service->displayName = display->asString();
    }
    return 0;
}

// The service file of `name`: 1 found and valid, 0 none, -1 bad (logged).
int loadService(const std::string& name, ServiceFile* service) {
    if (!CORVInit::IsValidJobName(name)) {
        CORV_LOG_ERR("Bad service name [%s]", name.c_str());
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    const std::string path = cfgPath(name);
    if (!VLIBCFileExist(path.c_str())) {
        return 0;
    }
    std::string reason;
    if (readServiceFile(path, service, &reason) != 0) {
        CORV_LOG_ERR("Invalid service file %s: %s", path.c_str(), reason.c_str());
        return -1;
    }
    return 1;
}

// Appends the jobs of `name` and of what it requires, depth first, each once.
int collectJobs(const std::string& name, std::set<std::string>* visited,
                std::vector<std::string>* jobs) {
    if (!visited->insert(name).second) {
        return 0;  // already collected, or a requirement cycle
    }
    ServiceFile service;
    int found = loadService(name, &service);
    if (found < 0) {
        return -1;
    }
    if (found == 0) {
        if (ServiceJobs(name, &service.jobs) != 0) {
            CORV_LOG_ERR("Unknown service [%s]", name.c_str());
            return -1;
        }
    }
    for (const std::string& job : service.jobs) {
        if (std::find(jobs->begin(), jobs->end(), job) == jobs->end()) {
            jobs->push_back(job);
        }
    }
    for (const std::string& required : service.required) {
        if (collectJobs(required, visited, jobs) != 0) {
            CORV_LOG_ERR("Failed to get the jobs of %s, required by %s", required.c_str(),
                         name.c_str());
            return -1;
        }
    }
    return 0;
}

}  // namespace

int ServiceJobs(const std::string& name, std::vector<std::string>* jobs) {
    jobs->clear();
    ServiceFile service;
    int found = loadService(name, &service);
    if (found < 0) {
        return -1;
    }
    if (found > 0) {
        *jobs = service.jobs;
        return 0;
    }
    if (!VLIBCFileExist(CORVInit::JobFilePath(name).c_str())) {
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return -1;
    }
    jobs->push_back(name);
    return 0;
}

int RunKeyGet(const std::string& name) {
    if (!CORVInit::IsValidJobName(name)) {
        return 0;
    }
    std::string text;
    Json::Value root;
    std::string reason;
    if (!CORVInit::ReadTextFile(runKeyPath(name), &text) || !parseJson(text, &root, &reason) ||
        !root.isObject() || !root["runkey"].isInt()) {
        return 0;
    }
    int key = root["runkey"].asInt();
    return key == 1 || key == 2 ? key : 0;
}

}  // namespace CORVService

using namespace CORVService;

int VLIBServicecfgValidate(const char* path) {
    if (path == nullptr || *path == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    ServiceFile service;
    std::string reason;
    if (readServiceFile(path, &service, &reason) != 0) {
        CORV_LOG_ERR("Invalid service file %s: %s", path, reason.c_str());
        return -1;
    }
    return 0;
}

int VLIBServicecfgRunKeySet(const char* name, int key) {
    if (name == nullptr || (key != 1 && key != 2)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    ServiceFile service;
    int found = loadService(name, &service);
    if (found <= 0) {
        if (found == 0) {
            CORV_LOG_ERR("No service [%s] to set the run key of", name);
            VLIBCErrSet(ERR_NO_SUCH_FILE);
        }
        return -1;
    }
    // Other members of the override file stay as they are.
    Json::Value root(Json::objectValue);
    std::string text;
    std::string reason;
    if (CORVInit::ReadTextFile(runKeyPath(name), &text) &&
        (!parseJson(text, &root, &reason) || !root.isObject())) {
        root = Json::Value(Json::objectValue);
    }
    root["runkey"] = key;
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    if (CORVFSMkdirP(kOverrideDir, nullptr, 1, -1, -1, 0755) != 0 ||
        CORVInit::ReplaceFileText(runKeyPath(name), Json::writeString(writer, root) + "\n", 0644) !=
            0) {
        CORV_LOG_ERR("Failed to set the run key of %s [0x%04X %s:%d]", name, VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return -1;
    }
    return 0;
}

int VLIBServicecfgInfoGet(const char* name, int kind, PVLIBSZLIST* list) {
    if (name == nullptr || list == nullptr || *list == nullptr || kind != kInfoKindJobs) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::set<std::string> visited;
    std::vector<std::string> jobs;
    if (collectJobs(name, &visited, &jobs) != 0) {
        return -1;
    }
    int added = 0;
    for (const std::string& job : jobs) {
        if (VLIBCSzListFind(*list, job.c_str()) >= 0) {
            continue;
        }
        if (VLIBCSzListPush(list, job.c_str()) != 0) {
            VLIBCErrSet(ERR_OUT_OF_MEMORY);
            return -1;
        }
        ++added;
    }
    return added;
}

int VLIBServicecfgDisplayNameGet(const char* name, char* buffer, int size) {
    if (name == nullptr || buffer == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    ServiceFile service;
    int found = loadService(name, &service);
    if (found < 0) {
        return -1;
    }
    if (found == 0 && !VLIBCFileExist(CORVInit::JobFilePath(name).c_str())) {
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return -1;
    }
    const std::string display = service.displayName.empty() ? name : service.displayName;
    if (display.size() + 1 > static_cast<size_t>(size)) {
        VLIBCErrSet(ERR_BUF_TOO_SMALL);
        return -1;
    }
    memcpy(buffer, display.c_str(), display.size() + 1);
    return static_cast<int>(display.size());
}

int VLIBServiceEnum(PVLIBSZLIST* list) {
    if (list == nullptr || *list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    // A machine without any service configuration simply has no services.
    if (!VLIBCFileCheckDir(VLIB_SERVICE_CFG_DIR)) {
        return 0;
    }
    static const char kSuffix[] = ".cfg";
    const size_t suffixLen = sizeof(kSuffix) - 1;
    PVLIBSZLIST files = VLIBCSzListAlloc(64);
    if (files == nullptr) {
        return -1;
    }
    int count = VLIBCFileEnumDir(VLIB_SERVICE_CFG_DIR, kSuffix, &files, 0);
    int added = 0;
    for (int i = 0; i < count; ++i) {
        std::string name(VLIBCSzListGet(files, i));
        name.resize(name.size() - suffixLen);
        if (name.empty()) {
            continue;  // ".cfg" alone names nothing
        }
        if (VLIBCSzListPush(list, name.c_str()) != 0) {
            added = -1;
            break;
        }
        ++added;
    }
    VLIBCSzListFree(files);
    return count < 0 ? -1 : added;
}
