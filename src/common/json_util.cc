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

namespace {

std::string jsoncppText(const Json::Value& value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    return Json::writeString(builder, value);
}

// A string that jsoncpp writes between quotes as it is, without escapes.
bool isPlain(const char* begin, const char* end) {
    for (const char* c = begin; c != end; ++c) {
        const unsigned char byte = static_cast<unsigned char>(*c);
        if (byte == '\\' || byte == '"' || byte < 0x20 || byte > 0x7F) {
            return false;
        }
    }
    return true;
}

void appendQuoted(const char* begin, const char* end, std::string& out) {
    if (isPlain(begin, end)) {
        out += '"';
        out.append(begin, end);
        out += '"';
    } else {
        out += jsoncppText(Json::Value(begin, end));
    }
}

bool hasComment(const Json::Value& value) {
    return value.hasComment(Json::commentBefore) ||
           value.hasComment(Json::commentAfterOnSameLine) || value.hasComment(Json::commentAfter);
}

// The text that jsoncpp's compact writer gives, written straight into one string: its
// stream writer costs more than the parse for lists of thousands of entries. Escaped
// strings and real numbers, where the formats have their subtleties, are left to jsoncpp
// itself. False for a value with comments, which only jsoncpp lays out.
bool appendCompact(const Json::Value& value, std::string& out) {
    if (hasComment(value)) {
        return false;
    }
    switch (value.type()) {
        case Json::nullValue:
            out += "null";
            return true;
        case Json::intValue:
            out += std::to_string(value.asLargestInt());
            return true;
        case Json::uintValue:
            out += std::to_string(value.asLargestUInt());
            return true;
        case Json::booleanValue:
            out += value.asBool() ? "true" : "false";
            return true;
        case Json::realValue:
            out += jsoncppText(value);
            return true;
        case Json::stringValue: {
            const char* begin = nullptr;
            const char* end = nullptr;
            if (value.getString(&begin, &end)) {
                appendQuoted(begin, end, out);
            }
            return true;
        }
        case Json::arrayValue: {
            // Indices without a member (a sparse array) are written as null, as jsoncpp does.
            out += '[';
            Json::ArrayIndex next = 0;
            for (auto it = value.begin(); it != value.end(); ++it) {
                for (; next < it.index(); ++next) {
                    out += next == 0 ? "null" : ",null";
                }
                if (next++ != 0) {
                    out += ',';
                }
                if (!appendCompact(*it, out)) {
                    return false;
                }
            }
            out += ']';
            return true;
        }
        case Json::objectValue: {
            out += '{';
            for (auto it = value.begin(); it != value.end(); ++it) {
                if (it != value.begin()) {
                    out += ',';
                }
                const char* end = nullptr;
                const char* name = it.memberName(&end);
                appendQuoted(name, end, out);
                out += ':';
                if (!appendCompact(*it, out)) {
                    return false;
                }
            }
            out += '}';
            return true;
        }
    }
    return false;
}

}  // namespace

std::string toString(const Json::Value& value) {
    std::string text;
    if (!appendCompact(value, text)) {
        return jsoncppText(value);
    }
    return text;
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
