// The packages chosen for automatic update.
#include <fcntl.h>
#include <unistd.h>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgschedule.h"
#include "corvpkg/pkgserver.h"

namespace CORVPackageTool {

namespace {

constexpr int kLockSeconds = 15;
#define PKG_PACKAGES_ETC_DIR "/usr/corv/etc/packages"

// The timed file lock of the list, given back on every way out.
class ListLock {
  public:
    ListLock(bool exclusive)
        : ok_(VLIBCFileLockTimeByFile(PKG_AUTO_UPDATE_FILE, exclusive ? 1 : 0, kLockSeconds,
                                      &fd_) == 0) {}
    ~ListLock() { VLIBCFileUnlockByFile(ok_ ? fd_ : -1); }
    bool ok() const { return ok_; }

  private:
    int fd_ = -1;
    bool ok_;
};

}  // namespace

bool CORVPackageServer::List(Json::Value& names) {
    names = Json::Value(Json::arrayValue);
    if (access(PKG_AUTO_UPDATE_FILE, F_OK) != 0) {
        return true;
    }
    ListLock lock(false);
    Json::Value read;
    if (!lock.ok() || !fromFile(PKG_AUTO_UPDATE_FILE, read)) {
        CORV_LOG_ERR("Fail to load %s, %m", PKG_AUTO_UPDATE_FILE);
        return false;
    }
    names = read;
    return true;
}

bool CORVPackageServer::Save(bool enabled, bool all, const Json::Value& names) {
    if (!enabled) {
        VLIBCINFORemoveKey("pkg_autoupdate_all");
    } else if (VLIBCINFOSetKeyValue("pkg_autoupdate_all", all ? "yes" : "no") < 0) {
        CORV_LOG_ERR("Failed to set pkg_autoupdate_all in corvinfo.conf.");
        return false;
    }
    if (!PMSSavaSchedule(-1, -1, enabled ? 1 : 0)) {
        return false;
    }
    if (!enabled || all || names.isNull() || !names.isArray()) {
        return true;
    }
    if (CORVFSMkdirP(PKG_PACKAGES_ETC_DIR, nullptr, 1, -1, -1, 0755) < 0) {
        CORV_LOG_ERR("Fail to load %s, %m", PKG_AUTO_UPDATE_FILE);
        return false;
    }
    ListLock lock(true);
    int fd =
        lock.ok() ? open(PKG_AUTO_UPDATE_FILE, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644) : -1;
    const std::string text = toString(names);
    bool ok = fd >= 0 && write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    if (fd >= 0) {
        ok = close(fd) == 0 && ok;
    }
    if (!ok) {
        CORV_LOG_ERR("Fail to load %s, %m", PKG_AUTO_UPDATE_FILE);
        return false;
    }
    return true;
}

}  // namespace CORVPackageTool
