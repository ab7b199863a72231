#include "key_file.h"

#include <json/json.h>

#include <memory>
#include <sstream>

#include "exit_status.h"
#include "file_io.h"

namespace codesign {

namespace {

// Key files hold a handful of public keys.
constexpr size_t kKeyFileLimit = 4 * 1024 * 1024;

bool looksLikeJson(const std::string& text) {
    const size_t first = text.find_first_not_of(" \t\r\n");
    return first != std::string::npos && text[first] == '[';
}

}  // namespace

std::vector<std::string> readKeyFile(const std::string& path) {
    const std::string content = readSmallFile(path, kKeyFileLimit);
    if (!looksLikeJson(content)) {
        if (content.find_first_not_of(" \t\r\n") == std::string::npos) {
            throw Failure(path + " holds no key");
        }
        return {content};
    }
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value keys;
    std::string errors;
    if (!reader->parse(content.data(), content.data() + content.size(), &keys, &errors)) {
        throw Failure(path + " is neither OpenPGP data nor a JSON array of keys: " + errors);
    }
    std::vector<std::string> blocks;
    for (const Json::Value& key : keys) {
        if (!key.isString()) {
            throw Failure(path + ": the JSON array holds something other than key texts");
        }
        if (!key.asString().empty()) {
            blocks.push_back(key.asString());
        }
    }
    if (blocks.empty()) {
        throw Failure(path + " holds no key");
    }
    return blocks;
}

}  // namespace codesign
