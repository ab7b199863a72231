// Package content-security rules and the header they become.
#include "corv/csp_rule.h"

#include <errno.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corv/web.h"
#include "json_store.h"

namespace CORV {
namespace NOS {

namespace {

bool IsDirectiveName(const std::string& name) {
    if (name.empty() || name.front() == '-' || name.back() == '-') {
        return false;
    }
    for (char c : name) {
        if (!((c >= 'a' && c <= 'z') || c == '-')) {
            return false;
        }
    }
    return true;
}

// A single quote only as the pair around a keyword ('self', 'nonce-...').
bool IsSource(const std::string& source) {
    if (source.empty()) {
        return false;
    }
    for (size_t i = 0; i < source.size(); ++i) {
        const char c = source[i];
        if (c <= ' ' || c > '~' || c == '"' || c == ';' || c == ',' || c == '\\' || c == '{' ||
            c == '}') {
            return false;
        }
        if (c == '\'' && i != 0 && i != source.size() - 1) {
            return false;
        }
    }
    return source.front() != '\'' || (source.size() >= 3 && source.back() == '\'');
}

bool AppendSources(const Json::Value& value, std::string& out) {
    std::string list;
    auto add = [&list](const std::string& source) {
        if (!IsSource(source)) {
            return false;
        }
        list += " " + source;
        return true;
    };
    if (value.isString()) {
        const std::string text = value.asString();
        size_t at = 0;
        while (at < text.size()) {
            const size_t end = text.find(' ', at);
            const std::string word = text.substr(at, end == std::string::npos ? end : end - at);
            if (!word.empty() && !add(word)) {
                return false;
            }
            at = end == std::string::npos ? text.size() : end + 1;
        }
    } else if (value.isArray()) {
        for (const Json::Value& source : value) {
            if (!source.isString() || !add(source.asString())) {
                return false;
            }
        }
    } else {
        return false;
    }
    out += list.empty() ? " 'none'" : list;
    return true;
}

bool Regenerate() {
    corvw3::Engine engine;
    return engine.W3FwReGenAll();
}

}  // namespace

CspRule::CspRule(const std::string& name, int type) : name_(name), type_(type) {}

const char* CspRule::Dir() {
    return "/usr/corv/etc/www/csp.d";
}

bool CspRule::HeaderValue(const Json::Value& rules, std::string& out) {
    if (!rules.isObject()) {
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    std::string header;
    for (const std::string& directive : rules.getMemberNames()) {
        std::string part = directive;
        if (!IsDirectiveName(directive) || !AppendSources(rules[directive], part)) {
            CORV_LOG_ERR("Bad content-security directive [%s]", directive.c_str());
            VLIBCErrSet(ERR_MALFORMED);
            return false;
        }
        header += (header.empty() ? "" : "; ") + part;
    }
    out = header;
    return true;
}

std::string CspRule::HeaderOf(const std::string& name) {
    Json::Value rules;
    std::string header;
    const std::string path = std::string(Dir()) + "/" + name + ".json";
    if (corvplat::readJsonFile(path, rules) != corvplat::JsonRead::kOk ||
        !HeaderValue(rules, header)) {
        return "";
    }
    return header;
}

bool CspRule::Save(const Json::Value& rules) {
    if (type_ != 1 || name_.empty() || name_.find('/') != std::string::npos || name_[0] == '.') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    std::string header;
    if (!HeaderValue(rules, header)) {
        return false;
    }
    if (CORVFSMkdirP(Dir(), nullptr, 1, -1, -1, 0755) != 0 ||
        !corvplat::writeJsonFile(std::string(Dir()) + "/" + name_ + ".json", rules, 0644)) {
        return false;
    }
    return Regenerate();
}

bool CspRule::Delete() {
    if (type_ != 1 || name_.empty() || name_.find('/') != std::string::npos || name_[0] == '.') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const std::string path = std::string(Dir()) + "/" + name_ + ".json";
    if (unlink(path.c_str()) != 0) {
        if (errno == ENOENT) {
            return true;
        }
        CORV_LOG_ERR("Failed to unlink %s (%m)", path.c_str());
        VLIBCErrSet(ERR_UNLINK_FAILED);
        return false;
    }
    return Regenerate();
}

}  // namespace NOS
}  // namespace CORV
