#include "results.h"

#include "message_text.h"

namespace center {

using namespace CORVPackageTool;

Json::Value describeResult(int code, const std::map<std::string, std::string>& params) {
    Json::Value out(Json::objectValue);
    out["code"] = code;
    const corvtext::Text words = corvtext::textForCode(code, params, corvtext::Audience::Desktop);
    out["text"] = words.sentence;
    out["remedy"] = words.remedy;
    const PKG_ERRCODE_INFO* info = PMSGetErrCodeInfo(code);
    if (info == nullptr) {
        out["name"] = "unknown";
        out["key"] = "unknown";
        out["meaning"] = "an unknown result code " + std::to_string(code);
        return out;
    }
    out["name"] = info->name;
    out["key"] =
        info->installMsg ? info->installMsg : (info->checkReport ? info->checkReport : info->name);
    out["meaning"] = info->meaning;
    return out;
}

Json::Value describeOutcome(PackageManager& pm, const std::string& package,
                            const std::string& operation) {
    std::map<std::string, std::string> params{{"package", package}, {"operation", operation}};
    for (const char* key : {"deppkg", "oldver", "curver", "services"}) {
        const std::string value = pm.getMapParam(key);
        if (!value.empty()) {
            params[key] = value;
        }
    }
    Json::Value out = describeResult(pm.getResult(), params);
    for (const auto& param : params) {
        out[param.first] = param.second;
    }
    Json::Value workerMsg = pm.getJsonParam("worker_msg");
    if (!(workerMsg.isString() && workerMsg.asString().empty())) {
        out["worker_msg"] = workerMsg;
    }
    return out;
}

}  // namespace center
