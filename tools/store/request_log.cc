#include "request_log.h"

#include <time.h>

#include <json/json.h>

#include "corvpkg/json_util.h"

namespace store {

namespace {

int hexValue(char c) {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

std::string decode(const std::string& text) {
    std::string out;
    for (size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '+') {
            out += ' ';
        } else if (text[i] == '%' && i + 2 < text.size() && hexValue(text[i + 1]) >= 0 &&
                   hexValue(text[i + 2]) >= 0) {
            out += static_cast<char>(hexValue(text[i + 1]) * 16 + hexValue(text[i + 2]));
            i += 2;
        } else {
            out += text[i];
        }
    }
    return out;
}

Json::Value toJson(const Fields& fields) {
    Json::Value out(Json::objectValue);
    for (const auto& field : fields) {
        out[field.first] = field.second;
    }
    return out;
}

}  // namespace

Fields parseFormText(const std::string& text) {
    Fields fields;
    size_t start = 0;
    while (start <= text.size()) {
        size_t end = text.find('&', start);
        if (end == std::string::npos) {
            end = text.size();
        }
        const std::string pair = text.substr(start, end - start);
        if (!pair.empty()) {
            size_t equals = pair.find('=');
            fields[decode(pair.substr(0, equals))] =
                equals == std::string::npos ? "" : decode(pair.substr(equals + 1));
        }
        start = end + 1;
    }
    return fields;
}

RequestLog::RequestLog(const std::string& path)
    : out_(path.empty() ? stdout : fopen(path.c_str(), "ae")), own_(!path.empty()) {}

RequestLog::~RequestLog() {
    if (own_ && out_ != nullptr) {
        fclose(out_);
    }
}

void RequestLog::write(const std::string& method, const std::string& path, const Fields& query,
                       const Fields& form, const std::string& userAgent, int status, bool fault) {
    Json::Value line(Json::objectValue);
    line["time"] = static_cast<Json::Int64>(time(nullptr));
    line["method"] = method;
    line["path"] = path;
    line["query"] = toJson(query);
    line["form"] = toJson(form);
    line["user_agent"] = userAgent;
    line["status"] = status;
    line["fault"] = fault;
    const std::string text = CORVPackageTool::toString(line);
    std::lock_guard<std::mutex> hold(mutex_);
    fprintf(out_, "%s\n", text.c_str());
    fflush(out_);
}

}  // namespace store
