// Locked, whole-file updates of small JSON documents.
#include "json_store.h"

#include <memory>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "io_util.h"

namespace corvplat {

namespace {

// Far above any record or store written here; a larger file is damaged or not ours.
constexpr size_t kMaxJsonFile = 4 * 1024 * 1024;

}  // namespace

FileLock::FileLock(const std::string& path, int seconds) {
    if (VLIBCFileLockTimeByFile(path.c_str(), 1, seconds, &fd_) != 0) {
        fd_ = -1;
    }
}

FileLock::~FileLock() {
    VLIBCFileUnlockByFile(fd_);
}

JsonRead readJsonFile(const std::string& path, Json::Value& value) {
    value = Json::Value();
    std::string text;
    bool missing = false;
    if (!readWhole(path.c_str(), kMaxJsonFile, text, &missing)) {
        return JsonRead::kBad;
    }
    if (missing) {
        return JsonRead::kMissing;
    }
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    std::string errors;
    if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
        CORV_LOG_ERR("Failed to parse %s: %s", path.c_str(), errors.c_str());
        VLIBCErrSet(ERR_READ_FAILED);
        value = Json::Value();
        return JsonRead::kBad;
    }
    return JsonRead::kOk;
}

bool writeJsonFile(const std::string& path, const Json::Value& value, mode_t mode) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "\t";
    const std::string text = Json::writeString(builder, value) + "\n";

    return replaceWhole(path, text, mode, nullptr);
}

}  // namespace corvplat
