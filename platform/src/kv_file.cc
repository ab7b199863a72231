// Key-value and section files: one `key=value` a line, read whole, replaced whole.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "io_util.h"

namespace {

constexpr const char kBlanks[] = " \t\r\v\f";
constexpr const char kDefaultFormat[] = "%s=\"%s\"\n";
constexpr mode_t kNewFileMode = 0644;

std::string_view trim(std::string_view s) {
    size_t b = s.find_first_not_of(kBlanks);
    if (b == std::string_view::npos) {
        return {};
    }
    size_t e = s.find_last_not_of(kBlanks);
    return s.substr(b, e - b + 1);
}

struct Line {
    enum Kind { kOther, kPair, kSection };
    Kind kind = kOther;
    size_t begin = 0;  // raw bytes of the line, its newline included
    size_t end = 0;
    std::string_view key;  // the section's name for kSection
    std::string_view value;
};

Line parseLine(std::string_view text, size_t begin, std::string_view sep) {
    Line line;
    line.begin = begin;
    size_t nl = text.find('\n', begin);
    size_t stop = nl == std::string_view::npos ? text.size() : nl;
    line.end = nl == std::string_view::npos ? text.size() : nl + 1;
    std::string_view content = text.substr(begin, stop - begin);
    content = content.substr(0, content.find('\0'));
    content = trim(content);
    if (content.empty() || content.front() == '#') {
        return line;
    }
    if (content.size() >= 2 && content.front() == '[' && content.back() == ']') {
        line.kind = Line::kSection;
        line.key = trim(content.substr(1, content.size() - 2));
        return line;
    }
    size_t at = content.find(sep);
    if (at == std::string_view::npos) {
        return line;
    }
    line.key = trim(content.substr(0, at));
    if (line.key.empty()) {
        return line;
    }
    line.value = trim(content.substr(at + sep.size()));
    if (line.value.size() >= 2 && line.value.front() == '"' && line.value.back() == '"') {
        line.value = line.value.substr(1, line.value.size() - 2);
    }
    line.kind = Line::kPair;
    return line;
}

template <typename F>
void forEachLine(std::string_view text, std::string_view sep, F&& f) {
    for (size_t pos = 0; pos < text.size();) {
        Line line = parseLine(text, pos, sep);
        pos = line.end;
        f(line);
    }
}

std::string_view separatorOf(const char* separator) {
    return separator != nullptr && separator[0] != '\0' ? separator : "=";
}

// The whole file in one buffer. With `missing`, an absent file is an empty text and
// *missing says so; without, it is a failure.
bool readWhole(const char* path, std::string& text, bool* missing = nullptr) {
    return corvplat::readWhole(path, VLIBC_KV_MAX_FILE, text, missing);
}

using corvplat::spaceOr;
using corvplat::UniqueFd;
using corvplat::writeAll;

// Replaces `path` by `content`: written beside it and renamed over it, so that a reader
// sees the old file or the new one and never a part. A symbolic link is kept: its
// target is what gets replaced.
bool replaceFile(const char* path, const std::string& content) {
    std::string target(path);
    struct stat st {};
    if (lstat(path, &st) == 0 && S_ISLNK(st.st_mode)) {
        char resolved[PATH_MAX];
        if (realpath(path, resolved) != nullptr) {
            target = resolved;
        }
    }
    const bool existed = stat(target.c_str(), &st) == 0;
    return corvplat::replaceWhole(target, content, existed ? (st.st_mode & 07777) : kNewFileMode,
                                  existed ? &st : nullptr);
}

// Keys and values that would not read back as written are refused: a newline would
// split the entry, and blanks around a key, '=', '#' or '[' would change its meaning.
bool validKey(const char* key) {
    if (key == nullptr || key[0] == '\0' || key[0] == '#' || key[0] == '[') {
        return false;
    }
    std::string_view k(key);
    return k.find_first_of("=\n\r") == std::string_view::npos && trim(k).size() == k.size();
}

bool validValue(const char* value) {
    return value != nullptr && strpbrk(value, "\n\r") == nullptr;
}

// `format` holds two "%s", for the key and for the value, and may hold "%%". Anything
// else is refused rather than handed to printf.
bool formatLine(const char* format, const char* key, const char* value, std::string& out) {
    const char* fields[] = {key, value};
    size_t used = 0;
    out.clear();
    for (const char* p = format; *p != '\0'; ++p) {
        if (*p != '%') {
            out += *p;
        } else if (p[1] == '%') {
            out += '%';
            ++p;
        } else if (p[1] == 's' && used < 2) {
            out += fields[used++];
            ++p;
        } else {
            return false;
        }
    }
    if (used != 2) {
        return false;
    }
    if (out.empty() || out.back() != '\n') {
        out += '\n';
    }
    return true;
}

template <typename Map>
int storeFound(const Map& found, PVLIBSZHASH* hash) {
    for (const auto& [key, value] : found) {
        if (VLIBCSzHashSetValue(hash, std::string(key).c_str(), std::string(value).c_str()) != 0) {
            return -1;
        }
    }
    return static_cast<int>(found.size());
}

}  // namespace

int VLIBCFileGetKeyValue(const char* path, const char* key, char* buffer, int size, int) {
    if (path == nullptr || key == nullptr || buffer == nullptr || size <= 0) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    if (!readWhole(path, text)) {
        return -1;
    }
    std::string_view value;
    forEachLine(text, "=", [&](const Line& line) {
        if (line.kind == Line::kPair && line.key == key) {
            value = line.value;
        }
    });
    size_t n = value.size() < static_cast<size_t>(size) ? value.size() : size - 1;
    value.copy(buffer, n);  // an absent key has no data pointer at all
    buffer[n] = '\0';
    return static_cast<int>(n);
}

int VLIBCFileGetKeys(const char* path, PVLIBSZLIST keys, PVLIBSZHASH* hash, const char* separator) {
    if (path == nullptr || keys == nullptr || hash == nullptr || *hash == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    if (!readWhole(path, text)) {
        return -1;
    }
    std::unordered_set<std::string_view> wanted(keys->items.begin(), keys->items.end());
    std::unordered_map<std::string_view, std::string_view> found;
    forEachLine(text, separatorOf(separator), [&](const Line& line) {
        if (line.kind == Line::kPair && wanted.count(line.key) != 0) {
            found[line.key] = line.value;
        }
    });
    return storeFound(found, hash);
}

int VLIBCFileGetPair(const char* path, PVLIBSZHASH* hash) {
    if (path == nullptr || hash == nullptr || *hash == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    if (!readWhole(path, text)) {
        return -1;
    }
    std::unordered_map<std::string_view, std::string_view> found;
    forEachLine(text, "=", [&](const Line& line) {
        if (line.kind == Line::kPair) {
            found[line.key] = line.value;
        }
    });
    return storeFound(found, hash);
}

int VLIBCFileEnumSection(const char* path, PVLIBSZLIST* list) {
    if (path == nullptr || list == nullptr || *list == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    if (!readWhole(path, text)) {
        return -1;
    }
    std::vector<std::string> names;
    std::unordered_set<std::string_view> seen;
    forEachLine(text, "=", [&](const Line& line) {
        if (line.kind == Line::kSection && seen.insert(line.key).second) {
            names.emplace_back(line.key);
        }
    });
    for (const std::string& name : names) {
        if (VLIBCSzListPush(list, name.c_str()) != 0) {
            return -1;
        }
    }
    return static_cast<int>(names.size());
}

int VLIBCFileGetSection(const char* path, const char* section, PVLIBSZHASH* hash) {
    if (path == nullptr || section == nullptr || hash == nullptr || *hash == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    if (!readWhole(path, text)) {
        return -1;
    }
    bool seen = false;
    bool inside = false;
    std::unordered_map<std::string_view, std::string_view> found;
    forEachLine(text, "=", [&](const Line& line) {
        if (line.kind == Line::kSection) {
            inside = line.key == section;
            seen = seen || inside;
        } else if (line.kind == Line::kPair && inside) {
            found[line.key] = line.value;
        }
    });
    if (!seen) {
        VLIBCErrSet(ERR_KEY_NOT_FOUND);
        return -1;
    }
    return storeFound(found, hash);
}

int VLIBCFileSetKeyValue(const char* path, const char* key, const char* value, const char* format) {
    std::string entry;
    if (path == nullptr || !validKey(key) || !validValue(value) ||
        !formatLine(format ? format : kDefaultFormat, key, value, entry)) {
        CORV_LOG_ERR("Refused to write key [%s] to %s", key ? key : "(null)",
                     path ? path : "(null)");
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    bool missing = false;
    if (!readWhole(path, text, &missing)) {
        return -1;
    }
    // The first line of the key takes the new entry, so that the file keeps its order;
    // later lines of the key would override it when read, and go.
    std::string out;
    out.reserve(text.size() + entry.size() + 1);
    bool placed = false;
    forEachLine(text, "=", [&](const Line& line) {
        if (line.kind == Line::kPair && line.key == key) {
            if (!placed) {
                out += entry;
                placed = true;
            }
            return;
        }
        out.append(text, line.begin, line.end - line.begin);
    });
    if (!placed) {
        if (!out.empty() && out.back() != '\n') {
            out += '\n';
        }
        out += entry;
    }
    return replaceFile(path, out) ? 0 : -1;
}

int VLIBCFileRemoveKey(const char* path, const char* key) {
    if (path == nullptr || key == nullptr || key[0] == '\0') {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string text;
    bool missing = false;
    if (!readWhole(path, text, &missing)) {
        return -1;
    }
    std::string out;
    out.reserve(text.size());
    bool removed = false;
    forEachLine(text, "=", [&](const Line& line) {
        if (line.kind == Line::kPair && line.key == key) {
            removed = true;
            return;
        }
        out.append(text, line.begin, line.end - line.begin);
    });
    if (!removed) {
        return 0;
    }
    return replaceFile(path, out) ? 0 : -1;
}

int VLIBCFileSetPair(const char* path, PVLIBSZHASH hash, int) {
    if (path == nullptr || hash == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    std::string out;
    std::string entry;
    for (const auto& [key, value] : hash->values) {
        if (!validKey(key.c_str()) || !validValue(value.c_str()) ||
            !formatLine(kDefaultFormat, key.c_str(), value.c_str(), entry)) {
            CORV_LOG_ERR("Refused to write key [%s] to %s", key.c_str(), path);
            VLIBCErrSet(ERR_BAD_PARAMETERS);
            return -1;
        }
        out += entry;
    }
    return replaceFile(path, out) ? 0 : -1;
}

int VLIBCFileAddLine(const char* path, int, const char* text, int) {
    if (path == nullptr || text == nullptr) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    UniqueFd fd(open(path, O_RDWR | O_CREAT | O_APPEND | O_CLOEXEC, kNewFileMode));
    if (fd.get() < 0) {
        int err = errno;
        CORV_LOG_ERR("Failed to open %s, %m", path);
        VLIBCErrSet(spaceOr(err, ERR_OPEN_FAILED));
        return -1;
    }
    // A last line without its newline would swallow the new one.
    std::string line;
    struct stat st {};
    char last = '\n';
    if (fstat(fd.get(), &st) == 0 && st.st_size > 0 &&
        pread(fd.get(), &last, 1, st.st_size - 1) == 1 && last != '\n') {
        line += '\n';
    }
    line += text;
    if (line.empty() || line.back() != '\n') {
        line += '\n';
    }
    if (!writeAll(fd.get(), line.data(), line.size())) {
        int err = errno;
        CORV_LOG_ERR("Failed to append to %s, %m", path);
        VLIBCErrSet(spaceOr(err, ERR_WRITE_FAILED));
        return -1;
    }
    return 0;
}

int VLIBCINFOSetKeyValue(const char* key, const char* value) {
    return VLIBCFileSetKeyValue(VLIBC_INFO_PATH, key, value, kDefaultFormat);
}

int VLIBCINFORemoveKey(const char* key) {
    return VLIBCFileRemoveKey(VLIBC_INFO_PATH, key);
}
