#include "corvpkg/json_util.h"

#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <sstream>

#include "common/regular_file.h"
#include "corv/file_replace.h"

namespace CORVPackageTool {

std::string toString(const Json::Value& value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    return Json::writeString(builder, value);
}

bool fromString(const std::string& text, Json::Value& value) {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    std::string errors;
    value = Json::Value();
    if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
        value = Json::Value();
        return false;
    }
    return true;
}

// Readers of these files are other users' processes too.
bool toFile(const Json::Value& value, const std::string& path) {
    return CORVFileReplace(path, toString(value), 0644);
}

bool fromFile(const std::string& path, Json::Value& value) {
    value = Json::Value();
    std::string text;
    if (!PMSReadRegularFile(path, text)) {
        return false;
    }
    return fromString(text, value);
}

}  // namespace CORVPackageTool
