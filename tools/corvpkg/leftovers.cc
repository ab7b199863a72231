// What the library's own rules leave behind after a command, cleaned by the command: the
// checksum check keeps the empty outer folder of its work directory, and an upgrade keeps
// the resource record it saved for the new version.
#include <unistd.h>

#include <filesystem>
#include <string>
#include <system_error>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgvolume.h"

namespace cli {

namespace fs = std::filesystem;

namespace {

// Whether nothing but directories lies under `dir`.
bool onlyDirectories(const fs::path& dir) {
    std::error_code ec;
    for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
        if (!it->is_directory(ec) || it->is_symlink(ec)) {
            return false;
        }
    }
    return !ec;
}

}  // namespace

TmpLeftovers::TmpLeftovers() {
    // The folder that the library's temporary folders go to, found as the library finds it.
    if (!CORVPackageTool::PMSGetTmpDir(0, dir_) && !CORVPackageTool::PMSGetSystemTmpDir(0, dir_)) {
        dir_ = "/tmp";
    }
    std::error_code ec;
    for (const fs::directory_entry& entry : fs::directory_iterator(dir_, ec)) {
        before_.insert(entry.path().filename().string());
    }
}

TmpLeftovers::~TmpLeftovers() {
    std::error_code ec;
    for (const fs::directory_entry& entry : fs::directory_iterator(dir_, ec)) {
        const std::string name = entry.path().filename().string();
        // Only a new folder that holds no file at all: another process's folder in use
        // holds its files.
        if (before_.count(name) == 0 && entry.is_directory(ec) && !entry.is_symlink(ec) &&
            onlyDirectories(entry.path())) {
            fs::remove_all(entry.path(), ec);
        }
    }
}

void removeResourceBackup(const std::string& name) {
    if (name.empty() || name.find('/') != std::string::npos) {
        return;
    }
    // Named by the package and this process, which did the upgrade.
    unlink(("/var/tmp/resource." + name + "." + std::to_string(getpid())).c_str());
}

}  // namespace cli
