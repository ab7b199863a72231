// Paths that a package names, resolved against the package's root so that none leads out
// of it: no absolute paths, no "..", and no symbolic link inside the package whose target
// lies outside.
#include <errno.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <deque>
#include <memory>
#include <string>
#include <vector>

#include "corv/pkgutils.h"
#include "corv/vlibc.h"

namespace CORV {
namespace PkgUtils {

namespace {

// More links than this on one path is a loop, as for the kernel.
constexpr int kMaxLinks = 40;

std::vector<std::string> splitPath(const std::string& path) {
    std::vector<std::string> parts;
    size_t start = 0;
    while (start <= path.size()) {
        size_t slash = path.find('/', start);
        if (slash == std::string::npos) {
            slash = path.size();
        }
        std::string part = path.substr(start, slash - start);
        if (!part.empty() && part != ".") {
            parts.push_back(part);
        }
        start = slash + 1;
    }
    return parts;
}

std::string parentOf(const std::string& path) {
    size_t slash = path.rfind('/');
    if (slash == std::string::npos || slash == 0) {
        return "/";
    }
    return path.substr(0, slash);
}

std::string joinPath(const std::string& dir, const std::string& name) {
    return dir == "/" ? "/" + name : dir + "/" + name;
}

bool isInside(const std::string& path, const std::string& root) {
    if (root == "/") {
        return true;
    }
    return path == root || (path.size() > root.size() && path.compare(0, root.size(), root) == 0 &&
                            path[root.size()] == '/');
}

std::string realPathOf(const std::string& path) {
    std::unique_ptr<char, decltype(&free)> real(realpath(path.c_str(), nullptr), &free);
    return real ? std::string(real.get()) : std::string();
}

// The relative path's own form: not empty, not absolute, no "..", not the root itself.
bool checkRelForm(const std::string& root, const std::string& relative,
                  std::vector<std::string>& cleaned) {
    if (root.empty() || relative.empty()) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    if (relative[0] == '/') {
        VLIBCErrSet(ERR_OUTSIDE_PACKAGE);
        return false;
    }
    cleaned = splitPath(relative);
    for (const std::string& part : cleaned) {
        if (part == "..") {
            VLIBCErrSet(ERR_OUTSIDE_PACKAGE);
            return false;
        }
    }
    if (cleaned.empty()) {  // "." or "./": names the root, not something in it
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    return true;
}

// Walks the path as the kernel would, one component at a time from `resolved`, following
// every link, and leaves in `resolved` where it ends. Once a component is missing, nothing
// after it can be a link, and the rest is taken as written.
bool walkPath(const std::vector<std::string>& cleaned, std::string& resolved, bool& missing) {
    std::deque<std::string> pending(cleaned.begin(), cleaned.end());
    missing = false;
    int links = 0;
    while (!pending.empty()) {
        std::string part = pending.front();
        pending.pop_front();
        if (part == "..") {  // only from a link's target
            resolved = parentOf(resolved);
            continue;
        }
        std::string next = joinPath(resolved, part);
        struct stat lst {};
        if (missing || lstat(next.c_str(), &lst) != 0) {
            if (!missing && errno != ENOENT && errno != ENOTDIR) {
                VLIBCErrSet(ERR_STAT_FAILED);
                return false;
            }
            missing = true;
            resolved = next;
            continue;
        }
        if (!S_ISLNK(lst.st_mode)) {
            resolved = next;
            continue;
        }
        if (++links > kMaxLinks) {
            VLIBCErrSet(ERR_STAT_FAILED);
            return false;
        }
        char target[PATH_MAX];
        ssize_t len = readlink(next.c_str(), target, sizeof(target) - 1);
        if (len < 0) {
            VLIBCErrSet(ERR_STAT_FAILED);
            return false;
        }
        target[len] = '\0';
        if (target[0] == '/') {
            resolved = "/";
        }
        // The target's components come before the rest of the path.
        std::vector<std::string> targetParts = splitPath(target);
        pending.insert(pending.begin(), targetParts.begin(), targetParts.end());
    }
    return true;
}

// The checks shared by both helpers. On success `cleaned` holds the relative path's
// components and `exists` whether the whole path exists. On failure the error is set.
bool checkRelPath(const std::string& root, const std::string& relative,
                  std::vector<std::string>& cleaned, bool& exists) {
    if (!checkRelForm(root, relative, cleaned)) {
        return false;
    }
    const std::string rootReal = realPathOf(root);
    struct stat st {};
    if (rootReal.empty() || stat(rootReal.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return false;
    }
    std::string resolved = rootReal;
    bool missing = false;
    if (!walkPath(cleaned, resolved, missing)) {
        return false;
    }
    if (!isInside(resolved, rootReal)) {
        VLIBCErrSet(ERR_OUTSIDE_PACKAGE);
        return false;
    }
    exists = !missing;
    return true;
}

}  // namespace

bool IsLegalRelPath(const std::string& root, const std::string& relative) {
    std::vector<std::string> cleaned;
    bool exists = false;
    return checkRelPath(root, relative, cleaned, exists);
}

bool ResolveRelPath(const std::string& root, const std::string& relative, std::string& out) {
    std::vector<std::string> cleaned;
    bool exists = false;
    if (!checkRelPath(root, relative, cleaned, exists)) {
        return false;
    }
    if (!exists) {
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return false;
    }
    std::string path = root;
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    for (const std::string& part : cleaned) {
        path = joinPath(path, part);
    }
    out = path;
    return true;
}

}  // namespace PkgUtils
}  // namespace CORV
