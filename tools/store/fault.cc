#include "fault.h"

#include <stdio.h>

#include <fstream>
#include <sstream>
#include <utility>

#include "corvpkg/json_util.h"

namespace store {

namespace {

bool pathMatches(const std::string& pattern, const std::string& path) {
    if (!pattern.empty() && pattern.back() == '*') {
        return path.compare(0, pattern.size() - 1, pattern, 0, pattern.size() - 1) == 0;
    }
    return pattern == path;
}

Fault faultOf(const Json::Value& rule) {
    Fault fault;
    fault.any = true;
    fault.status = rule.get("status", 0).asInt();
    if (rule.isMember("fill")) {
        fault.replaceBody = true;
        fault.body.assign(rule["fill"].asUInt64(), 'x');
    } else if (rule["body"].isString()) {
        fault.replaceBody = true;
        fault.body = rule["body"].asString();
    }
    fault.contentType = rule.get("content_type", "").asString();
    fault.delayMs = rule.get("delay_ms", 0).asInt();
    fault.stallAfter = rule.get("stall_after", -1).asInt64();
    fault.stallSeconds = rule.get("stall_seconds", 600).asInt();
    fault.cutAfter = rule.get("cut_after", -1).asInt64();
    fault.chunked = rule.get("chunked", false).asBool();
    fault.redirect = rule.get("redirect", "").asString();
    return fault;
}

}  // namespace

FaultFile::FaultFile(std::string path) : path_(std::move(path)) {}

Json::Value FaultFile::readRules() {
    std::ifstream in(path_, std::ios::binary);
    if (!in) {
        return Json::Value(Json::arrayValue);
    }
    std::ostringstream text;
    text << in.rdbuf();
    Json::Value rules;
    if (CORVPackageTool::fromString(text.str(), rules)) {
        if (rules.isObject()) {
            rules = rules["rules"];
        }
        if (rules.isArray()) {
            return rules;
        }
    }
    if (text.str() != lastBadText_) {
        lastBadText_ = text.str();
        fprintf(stderr, "corv-store: %s is not a JSON array of rules; ignored\n", path_.c_str());
    }
    return Json::Value(Json::arrayValue);
}

Fault FaultFile::match(const std::string& method, const std::string& path) {
    std::lock_guard<std::mutex> hold(mutex_);
    for (const Json::Value& rule : readRules()) {
        if (!rule.isObject() || !pathMatches(rule.get("path", "").asString(), path)) {
            continue;
        }
        if (rule.isMember("method") && rule["method"].asString() != method) {
            continue;
        }
        if (rule.isMember("times")) {
            long long& used = used_[CORVPackageTool::toString(rule)];
            if (used >= rule["times"].asInt64()) {
                continue;
            }
            ++used;
        }
        return faultOf(rule);
    }
    return Fault();
}

}  // namespace store
