#include "corvpkg/json_util.h"

#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <sstream>

#include "common/regular_file.h"

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

bool toFile(const Json::Value& value, const std::string& path) {
    std::string tmp = path + ".XXXXXX";
    int fd = mkstemp(&tmp[0]);
    if (fd < 0) {
        return false;
    }
    std::string text = toString(value);
    size_t done = 0;
    bool ok = true;
    while (done < text.size()) {
        ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0) {
            ok = false;
            break;
        }
        done += static_cast<size_t>(n);
    }
    // mkstemp creates 0600; these files are read by other users' processes too.
    if (ok && fchmod(fd, 0644) != 0) {
        ok = false;
    }
    if (close(fd) != 0) {
        ok = false;
    }
    if (!ok || rename(tmp.c_str(), path.c_str()) != 0) {
        unlink(tmp.c_str());
        return false;
    }
    return true;
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
