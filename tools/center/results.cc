#include "results.h"

namespace center {

using namespace CORVPackageTool;

Json::Value describeResult(int code) {
    Json::Value out(Json::objectValue);
    out["code"] = code;
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

Json::Value describeOutcome(PackageManager& pm) {
    Json::Value out = describeResult(pm.getResult());
    for (const char* key : {"deppkg", "oldver", "curver", "services"}) {
        const std::string value = pm.getMapParam(key);
        if (!value.empty()) {
            out[key] = value;
        }
    }
    Json::Value workerMsg = pm.getJsonParam("worker_msg");
    if (!(workerMsg.isString() && workerMsg.asString().empty())) {
        out["worker_msg"] = workerMsg;
    }
    return out;
}

}  // namespace center
