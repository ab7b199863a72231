#include "store/json_value.h"

#include <stdlib.h>
#include <string.h>

namespace CORVPackageTool {

namespace {

const Json::Value* member(const Json::Value& object, const char* key) {
    return object.isObject() ? object.find(key, key + strlen(key)) : nullptr;
}

}  // namespace

std::string jsonText(const Json::Value& object, const char* key, const char* fallback) {
    const Json::Value* value = member(object, key);
    if (value == nullptr) {
        return fallback;
    }
    if (value->isString()) {
        return value->asString();
    }
    if (value->isBool() || value->isNumeric()) {
        return value->asString();
    }
    return fallback;
}

bool jsonBool(const Json::Value& object, const char* key, bool fallback) {
    const Json::Value* value = member(object, key);
    if (value == nullptr) {
        return fallback;
    }
    if (value->isBool() || value->isNumeric()) {
        return value->asBool();
    }
    return fallback;
}

unsigned long long jsonUInt64(const Json::Value& object, const char* key) {
    const Json::Value* value = member(object, key);
    if (value == nullptr) {
        return 0;
    }
    if (value->isUInt64()) {
        return value->asUInt64();
    }
    if (value->isString()) {
        const std::string text = value->asString();
        char* end = nullptr;
        unsigned long long number = strtoull(text.c_str(), &end, 10);
        return (text.empty() || text[0] == '-' || *end != '\0') ? 0 : number;
    }
    return 0;
}

bool hasText(const Json::Value& object, const char* key) {
    const Json::Value* value = member(object, key);
    return value != nullptr && value->isString();
}

}  // namespace CORVPackageTool
