#include "support/files.h"

#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <system_error>

namespace testutil {

void writeFile(const std::string& path, const std::string& content) {
    std::error_code ec;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ec);
    // A link is replaced, never written through: the platform links tools such as
    // /usr/corv/sbin/corvpkgctl into the build tree, which a sandbox may share read-write.
    if (std::filesystem::is_symlink(std::filesystem::symlink_status(path, ec))) {
        std::filesystem::remove(path, ec);
    }
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << content;
    if (!out) {
        fprintf(stderr, "test setup: cannot write %s\n", path.c_str());
        abort();
    }
}

std::string readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

bool exists(const std::string& path) {
    std::error_code ec;
    return std::filesystem::exists(std::filesystem::symlink_status(path, ec));
}

void removeAll(const std::string& path) {
    std::error_code ec;
    std::filesystem::remove_all(path, ec);
}

std::string infoText(const std::vector<std::pair<std::string, std::string>>& keys) {
    std::string text;
    for (const auto& [key, value] : keys) {
        text += key + "=\"" + value + "\"\n";
    }
    return text;
}

mode_t modeOf(const std::string& path) {
    struct stat st {};
    return lstat(path.c_str(), &st) == 0 ? (st.st_mode & 07777) : 0;
}

std::string ownerOf(const std::string& path) {
    struct stat st {};
    if (lstat(path.c_str(), &st) != 0) {
        return "";
    }
    return std::to_string(st.st_uid) + ":" + std::to_string(st.st_gid);
}

}  // namespace testutil
