// The values that travel with every worker call, and the defaults of the worker interface.
#include <stdarg.h>

#include <string>

#include "corv/pkgutils.h"
#include "corv/process_runner.h"
#include "corv/vlibc.h"

namespace CORV {
namespace PkgUtils {

ActionInfo::ActionInfo() : actionType_(0) {}
ActionInfo::~ActionInfo() = default;

const std::string& ActionInfo::GetPkgName() const {
    return pkgName_;
}
void ActionInfo::SetPkgName(const std::string& name) {
    pkgName_ = name;
}
const std::string& ActionInfo::GetPkgUserName() const {
    return pkgUserName_;
}
void ActionInfo::SetPkgUserName(const std::string& name) {
    pkgUserName_ = name;
}
unsigned int ActionInfo::GetActionType() const {
    return actionType_;
}
void ActionInfo::SetActionType(unsigned int type) {
    actionType_ = type;
}
const std::string& ActionInfo::GetRootDir() const {
    return rootDir_;
}
void ActionInfo::SetRootDir(const std::string& dir) {
    rootDir_ = dir;
}

WorkerResp::WorkerResp() = default;
WorkerResp::~WorkerResp() = default;

void WorkerResp::SetI18NErrMsg(const std::string& key, const char* argument, ...) {
    if (key.empty()) {
        return;
    }
    Message message;
    size_t colon = key.find(':');
    if (colon == std::string::npos) {
        message.key = key;
    } else {
        message.sec = key.substr(0, colon);
        message.key = key.substr(colon + 1);
    }
    va_list more;
    va_start(more, argument);
    for (const char* arg = argument; arg != nullptr; arg = va_arg(more, const char*)) {
        message.params.push_back(arg);
    }
    va_end(more);
    messages_.push_back(std::move(message));
}

Json::Value WorkerResp::GetErrJsonArray() const {
    Json::Value out(Json::arrayValue);
    for (const Message& message : messages_) {
        Json::Value item(Json::objectValue);
        item["sec"] = message.sec;
        item["key"] = message.key;
        Json::Value params(Json::arrayValue);
        for (const std::string& param : message.params) {
            params.append(param);
        }
        item["params"] = params;
        out.append(item);
    }
    return out;
}

namespace {

bool isShellName(const std::string& name) {
    if (name.empty() || (name[0] >= '0' && name[0] <= '9')) {
        return false;
    }
    for (char c : name) {
        bool ok =
            (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '_';
        if (!ok) {
            return false;
        }
    }
    return true;
}

}  // namespace

bool WorkerResp::SetEnv(const std::string& name, const std::string& value) {
    if (!isShellName(name)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    for (auto& entry : env_) {
        if (entry.first == name) {
            entry.second = value;
            return true;
        }
    }
    env_.emplace_back(name, value);
    return true;
}

void WorkerResp::DumpEnv(CORVUtils::ProcessRunner& runner) const {
    for (const auto& entry : env_) {
        runner.addEnv(entry.first, entry.second);
    }
}

IWorker::~IWorker() = default;

bool IWorker::IsUpdatable() {
    return false;
}

bool IWorker::Update(const ActionInfo&, const Json::Value&, Json::Value&, WorkerResp&) {
    return false;
}

}  // namespace PkgUtils
}  // namespace CORV
