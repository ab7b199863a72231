// Locked, whole-file updates of small JSON documents.
#include "json_store.h"

#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <utility>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "io_util.h"

namespace corvplat {

namespace {

// Far above any record or store written here; a larger file is damaged or not ours.
constexpr off_t kMaxJsonFile = 4 * 1024 * 1024;

class Fd {
  public:
    explicit Fd(int fd) : fd_(fd) {}
    ~Fd() {
        if (fd_ >= 0) {
            close(fd_);
        }
    }
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    int get() const { return fd_; }
    // Closes now: close(2) can report the first sign of a full disk.
    int reset() {
        int rc = fd_ >= 0 ? close(fd_) : 0;
        fd_ = -1;
        return rc;
    }

  private:
    int fd_;
};

class Unlinker {
  public:
    explicit Unlinker(std::string path) : path_(std::move(path)) {}
    ~Unlinker() {
        if (!path_.empty()) {
            unlink(path_.c_str());
        }
    }
    Unlinker(const Unlinker&) = delete;
    Unlinker& operator=(const Unlinker&) = delete;
    void release() { path_.clear(); }

  private:
    std::string path_;
};

int spaceOr(int err, int otherwise) {
    return (err == ENOSPC || err == EDQUOT) ? ERR_NO_SPACE : otherwise;
}

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
    Fd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (fd.get() < 0) {
        if (errno == ENOENT) {
            return JsonRead::kMissing;
        }
        CORV_LOG_ERR("Failed to open %s, %m", path.c_str());
        VLIBCErrSet(ERR_OPEN_FAILED);
        return JsonRead::kBad;
    }
    struct stat st {};
    if (fstat(fd.get(), &st) != 0 || !S_ISREG(st.st_mode) || st.st_size > kMaxJsonFile) {
        CORV_LOG_ERR("%s is no readable JSON file", path.c_str());
        VLIBCErrSet(ERR_READ_FAILED);
        return JsonRead::kBad;
    }
    std::string text;
    char buffer[8192];
    for (;;) {
        ssize_t n = VLIBCRead(fd.get(), buffer, sizeof(buffer));
        if (n < 0) {
            CORV_LOG_ERR("Failed to read %s, %m", path.c_str());
            VLIBCErrSet(ERR_READ_FAILED);
            return JsonRead::kBad;
        }
        if (n == 0) {
            break;
        }
        text.append(buffer, static_cast<size_t>(n));
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

    // A hidden name that no reader of the directory takes for a document.
    const size_t slash = path.rfind('/');
    std::string tmp = slash == std::string::npos
                          ? "." + path
                          : path.substr(0, slash + 1) + "." + path.substr(slash + 1);
    tmp += ".XXXXXX";
    Fd fd(mkostemp(&tmp[0], O_CLOEXEC));
    if (fd.get() < 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to create a temporary file for %s, %m", path.c_str());
        VLIBCErrSet(spaceOr(err, ERR_CREATE_FAILED));
        return false;
    }
    Unlinker cleanup(tmp);
    if (!writeAll(fd.get(), text.data(), text.size())) {
        int err = errno;
        CORV_LOG_ERR("Failed to write %s, %m", tmp.c_str());
        VLIBCErrSet(spaceOr(err, ERR_WRITE_FAILED));
        return false;
    }
    if (fchmod(fd.get(), mode) != 0) {
        CORV_LOG_ERR("Failed to chmod %s, %m", tmp.c_str());
        VLIBCErrSet(ERR_CHOWN_FAILED);
        return false;
    }
    if (fd.reset() != 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to close %s, %m", tmp.c_str());
        VLIBCErrSet(spaceOr(err, ERR_WRITE_FAILED));
        return false;
    }
    if (rename(tmp.c_str(), path.c_str()) != 0) {
        CORV_LOG_ERR("Failed to rename %s to %s, %m", tmp.c_str(), path.c_str());
        VLIBCErrSet(ERR_RENAME_FAILED);
        return false;
    }
    cleanup.release();
    return true;
}

}  // namespace corvplat
