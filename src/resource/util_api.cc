// Variable substitution in a package's request file: wizard answers and other values
// replace "{{name}}" placeholders; whatever stays unresolved is dropped, so that a worker
// sees a member absent rather than a placeholder.
#include <boost/algorithm/string/replace.hpp>

#include <map>
#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/resource.h"

namespace CORVPackageTool {
namespace Util {

namespace {

// Keyed by the whole placeholder, braces included, and so ordered by that text.
typedef std::map<std::string, DictValue> Dictionary;

Dictionary buildDictionary(const Json::Value& variables) {
    Dictionary dict;
    for (const std::string& name : variables.getMemberNames()) {
        const Json::Value& value = variables[name];
        if (value.isNull() || value.isObject() || value.isArray()) {
            continue;
        }
        DictValue entry;
        entry.type = value.isBool() ? Json::booleanValue : Json::stringValue;
        entry.value = value.asString();
        dict.emplace("{{" + name + "}}", entry);
    }
    return dict;
}

bool hasBraces(const std::string& text) {
    return text.find("{{") != std::string::npos || text.find("}}") != std::string::npos;
}

void substitute(const Dictionary& dict, Json::Value& node) {
    if (node.isArray() || node.isObject()) {
        for (Json::Value& child : node) {
            substitute(dict, child);
        }
        return;
    }
    if (!node.isString()) {
        return;
    }
    std::string text = node.asString();
    auto exact = dict.find(text);
    if (exact != dict.end() && exact->second.type == Json::booleanValue) {
        node = Json::Value(exact->second.value == "true");
        return;
    }
    if (!hasBraces(text)) {
        return;
    }
    // Booleans don't substitute inside a text; replace_all doesn't rescan what it
    // inserted, but a later key may match text that an earlier value brought in.
    for (const auto& entry : dict) {
        if (entry.second.type == Json::stringValue) {
            boost::algorithm::replace_all(text, entry.first, entry.second.value);
        }
    }
    node = hasBraces(text) ? Json::Value() : Json::Value(text);
}

void prune(Json::Value& node) {
    if (node.isObject()) {
        for (const std::string& name : node.getMemberNames()) {
            if (node[name].isNull()) {
                node.removeMember(name);
            } else {
                prune(node[name]);
            }
        }
    } else if (node.isArray()) {
        Json::Value kept(Json::arrayValue);
        for (Json::Value& element : node) {
            if (!element.isNull()) {
                prune(element);
                kept.append(element);
            }
        }
        node.swap(kept);
    }
}

}  // namespace

bool ReplaceVariables(const Json::Value& variables, Json::Value& document) {
    if (!variables.isObject()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    const Dictionary dict = buildDictionary(variables);
    substitute(dict, document);
    prune(document);
    return true;
}

}  // namespace Util
}  // namespace CORVPackageTool
