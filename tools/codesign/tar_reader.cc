#include "tar_reader.h"

#include <string.h>

#include <optional>
#include <utility>

#include "exit_status.h"
#include "file_io.h"

namespace codesign {

namespace {

constexpr size_t kBlock = 512;
// Extended headers and long names hold a few names; anything bigger is not a package.
constexpr uint64_t kExtensionLimit = 1 << 20;
// Keeps offset arithmetic far from overflow; no package comes near.
constexpr uint64_t kSizeLimit = uint64_t{1} << 50;
// pax and GNU extension headers that may stand before one member.
constexpr int kHeaderLimit = 16;

// Header fields: offset and length.
struct Field {
    size_t at;
    size_t len;
};
constexpr Field kName{0, 100}, kMode{100, 8}, kSize{124, 12}, kChecksum{148, 8},
    kLinkName{157, 100}, kMagic{257, 6}, kDevMajor{329, 8}, kDevMinor{337, 8}, kPrefix{345, 155};
constexpr size_t kTypeFlag = 156;

bool allZero(const char* block) {
    for (size_t i = 0; i < kBlock; ++i) {
        if (block[i] != 0) {
            return false;
        }
    }
    return true;
}

// A text field: up to the first NUL or the field's end.
std::string text(const char* block, Field f) {
    const char* start = block + f.at;
    const void* nul = memchr(start, 0, f.len);
    return std::string(start, nul ? static_cast<const char*>(nul) - start : f.len);
}

// A numeric field: octal digits between optional blanks and NULs (all of them empty
// means 0), or GNU's base-256 form for big positive values. Nothing else is accepted.
std::optional<uint64_t> number(const char* block, Field f) {
    const unsigned char* p = reinterpret_cast<const unsigned char*>(block + f.at);
    if (p[0] == 0x80) {
        uint64_t value = 0;
        for (size_t i = 1; i < f.len; ++i) {
            if (value > (kSizeLimit >> 8)) {
                return std::nullopt;
            }
            value = (value << 8) | p[i];
        }
        return value;
    }
    size_t i = 0;
    while (i < f.len && p[i] == ' ') {
        ++i;
    }
    uint64_t value = 0;
    for (; i < f.len && p[i] >= '0' && p[i] <= '7'; ++i) {
        if (value > (kSizeLimit >> 3)) {
            return std::nullopt;
        }
        value = value * 8 + (p[i] - '0');
    }
    for (; i < f.len; ++i) {
        if (p[i] != ' ' && p[i] != 0) {
            return std::nullopt;
        }
    }
    return value;
}

// The header checksum: the byte sum with the checksum field read as blanks. Some old
// writers summed signed chars; both sums are accepted, as /bin/tar does.
bool checksumMatches(const char* block) {
    std::optional<uint64_t> stored = number(block, kChecksum);
    if (!stored) {
        return false;
    }
    long unsignedSum = 0;
    long signedSum = 0;
    for (size_t i = 0; i < kBlock; ++i) {
        const bool inField = i >= kChecksum.at && i < kChecksum.at + kChecksum.len;
        const char c = inField ? ' ' : block[i];
        unsignedSum += static_cast<unsigned char>(c);
        signedSum += static_cast<signed char>(c);
    }
    return static_cast<long>(*stored) == unsignedSum || static_cast<long>(*stored) == signedSum;
}

uint64_t padded(uint64_t size) {
    return (size + kBlock - 1) / kBlock * kBlock;
}

struct PaxValues {
    std::optional<std::string> path;
    std::optional<std::string> linkPath;
    std::optional<uint64_t> size;
    bool sparse = false;
};

// Records of the form "<length> <key>=<value>\n", the length counting the whole record.
bool parsePax(const std::string& data, PaxValues& values) {
    size_t pos = 0;
    while (pos < data.size()) {
        size_t len = 0;
        size_t i = pos;
        for (; i < data.size() && data[i] >= '0' && data[i] <= '9'; ++i) {
            len = len * 10 + static_cast<size_t>(data[i] - '0');
            if (len > data.size()) {
                return false;
            }
        }
        if (i == pos || i >= data.size() || data[i] != ' ' || len > data.size() - pos ||
            pos + len <= i + 1 || data[pos + len - 1] != '\n') {
            return false;
        }
        const std::string record = data.substr(i + 1, pos + len - 1 - (i + 1));
        const size_t eq = record.find('=');
        if (eq == std::string::npos || eq == 0) {
            return false;
        }
        const std::string key = record.substr(0, eq);
        const std::string value = record.substr(eq + 1);
        if (key == "path") {
            values.path = value;
        } else if (key == "linkpath") {
            values.linkPath = value;
        } else if (key == "size") {
            if (value.empty() || value.size() > 15 ||
                value.find_first_not_of("0123456789") != std::string::npos) {
                return false;
            }
            values.size = std::stoull(value);
        } else if (key.compare(0, 11, "GNU.sparse.") == 0) {
            values.sparse = true;
        }
        pos += len;
    }
    return true;
}

std::string untilNul(const std::string& data) {
    return data.substr(0, data.find('\0'));
}

// The kind of member a ustar type flag names; none for a type a package never needs.
std::optional<TarMember::Kind> kindOf(char type) {
    switch (type) {
        case '0':
        case '\0':
        case '7':
            return TarMember::kFile;
        case '1':
            return TarMember::kHardLink;
        case '2':
            return TarMember::kSymLink;
        case '3':
            return TarMember::kCharDevice;
        case '4':
            return TarMember::kBlockDevice;
        case '5':
            return TarMember::kDirectory;
        case '6':
            return TarMember::kFifo;
        default:
            return std::nullopt;
    }
}

// Names, mode, size and device numbers of a member header, with what the extended
// headers before it said winning over the header's own fields.
void describeMember(const char* block, uint64_t at, uint64_t size, const PaxValues& pax,
                    const std::optional<std::string>& longName,
                    const std::optional<std::string>& longLink, const std::string& what,
                    TarMember& member) {
    // Only POSIX ustar ("ustar\0") has a name prefix; GNU's header keeps other data there.
    const bool posix = block[kMagic.at + 5] == '\0';
    std::string name = text(block, kName);
    if (posix && block[kPrefix.at] != '\0') {
        name = text(block, kPrefix) + "/" + name;
    }
    member.name = pax.path ? *pax.path : longName ? *longName : name;
    member.linkName = pax.linkPath ? *pax.linkPath : longLink ? *longLink : text(block, kLinkName);
    member.size = pax.size ? *pax.size : size;
    const std::optional<uint64_t> mode = number(block, kMode);
    if (!mode) {
        throw Failure(what + ": bad mode field in the header at offset " + std::to_string(at));
    }
    member.mode = static_cast<unsigned>(*mode & 07777);
    if (member.kind == TarMember::kCharDevice || member.kind == TarMember::kBlockDevice) {
        const std::optional<uint64_t> major = number(block, kDevMajor);
        const std::optional<uint64_t> minor = number(block, kDevMinor);
        if (!major || !minor || *major > 0xffffffff || *minor > 0xffffffff) {
            throw Failure(what + ": bad device numbers at offset " + std::to_string(at));
        }
        member.devMajor = static_cast<unsigned>(*major);
        member.devMinor = static_cast<unsigned>(*minor);
    }
    if (member.name.empty()) {
        throw Failure(what + ": a member without a name at offset " + std::to_string(at));
    }
    if (member.kind != TarMember::kFile && member.size != 0) {
        throw Failure(what + ": member " + member.name + " is not a file but has content");
    }
    if (member.size > kSizeLimit) {
        throw Failure(what + ": member " + member.name + " is impossibly large");
    }
}

}  // namespace

TarReader::TarReader(int fd, std::string what) : fd_(fd), what_(std::move(what)) {}

void TarReader::readBlock(char* block, const char* purpose) {
    const size_t n = readFully(fd_, block, kBlock, what_);
    if (n < kBlock && offset_ == 0) {
        throw Failure(what_ + " is not a tar archive: it is shorter than one header");
    }
    if (n == 0) {
        throw Failure(what_ + " is truncated: it ends at offset " + std::to_string(offset_) +
                      ", where " + purpose + " should follow");
    }
    if (n < kBlock) {
        throw Failure(what_ + " is truncated: it ends inside " + purpose + " at offset " +
                      std::to_string(offset_ + n));
    }
    offset_ += kBlock;
}

std::string TarReader::readExtension(uint64_t size, const char* kind) {
    if (size > kExtensionLimit) {
        throw Failure(what_ + ": " + kind + " of " + std::to_string(size) + " bytes at offset " +
                      std::to_string(offset_) + " is too large");
    }
    std::string data;
    char block[kBlock];
    for (uint64_t left = padded(size); left > 0; left -= kBlock) {
        readBlock(block, kind);
        data.append(block, kBlock);
    }
    return data;
}

void TarReader::skipContent() {
    if (!contentRead_) {
        readContent([](const char*, size_t) {});
    }
}

void TarReader::readContent(const std::function<void(const char*, size_t)>& sink) {
    if (contentRead_) {
        throw Failure("internal error: the content of a member is read twice");
    }
    contentRead_ = true;
    char buffer[64 * 1024];
    uint64_t content = contentSize_;
    uint64_t total = padded(contentSize_);
    while (total > 0) {
        const size_t want = total < sizeof(buffer) ? static_cast<size_t>(total) : sizeof(buffer);
        const size_t n = readFully(fd_, buffer, want, what_);
        if (n < want) {
            throw Failure(what_ +
                          " is truncated: it ends inside the content of a member, at offset " +
                          std::to_string(offset_ + n));
        }
        offset_ += n;
        total -= n;
        const size_t useful = content < n ? static_cast<size_t>(content) : n;
        if (useful > 0) {
            sink(buffer, useful);
            content -= useful;
        }
    }
}

bool TarReader::next(TarMember& member) {
    if (ended_) {
        return false;
    }
    skipContent();
    member = TarMember();
    std::optional<std::string> longName;
    std::optional<std::string> longLink;
    PaxValues pax;
    for (int headers = 0;; ++headers) {
        if (headers > kHeaderLimit) {
            throw Failure(what_ + ": too many extended headers before one member at offset " +
                          std::to_string(offset_));
        }
        const uint64_t at = offset_;
        char block[kBlock];
        readBlock(block, "a header");
        if (allZero(block)) {
            if (!member.rawHeaders.empty()) {
                throw Failure(what_ + ": an extended header is not followed by a member");
            }
            ended_ = true;
            return false;
        }
        if (!checksumMatches(block) || memcmp(block + kMagic.at, "ustar", 5) != 0) {
            if (at == 0) {
                throw Failure(what_ + " is not a tar archive");
            }
            throw Failure(what_ + ": corrupt tar header at offset " + std::to_string(at));
        }
        member.rawHeaders.append(block, kBlock);
        const std::optional<uint64_t> size = number(block, kSize);
        if (!size) {
            throw Failure(what_ + ": bad size field in the header at offset " + std::to_string(at));
        }
        const char type = block[kTypeFlag];
        if (type == 'x' || type == 'g') {
            const std::string data = readExtension(*size, "a pax header");
            member.rawHeaders += data;
            PaxValues values;
            if (!parsePax(data.substr(0, *size), values)) {
                throw Failure(what_ + ": malformed pax header at offset " + std::to_string(at));
            }
            if (values.sparse) {
                throw Failure(what_ + ": sparse members are not supported");
            }
            if (type == 'g') {
                // Defaults for every later member: nothing a package needs, so not
                // worth the ambiguity.
                if (values.path || values.linkPath || values.size) {
                    throw Failure(what_ +
                                  ": global pax headers with names or sizes are not supported");
                }
                continue;
            }
            if (values.path)
                pax.path = values.path;
            if (values.linkPath)
                pax.linkPath = values.linkPath;
            if (values.size)
                pax.size = values.size;
            continue;
        }
        if (type == 'L' || type == 'K') {
            const std::string data = readExtension(*size, "a GNU long name");
            member.rawHeaders += data;
            (type == 'L' ? longName : longLink) = untilNul(data.substr(0, *size));
            continue;
        }
        const std::optional<TarMember::Kind> kind = kindOf(type);
        if (!kind) {
            throw Failure(what_ + ": unsupported member type '" + std::string(1, type) +
                          "' at offset " + std::to_string(at));
        }
        member.kind = *kind;
        describeMember(block, at, *size, pax, longName, longLink, what_, member);
        contentSize_ = member.size;
        contentRead_ = false;
        return true;
    }
}

}  // namespace codesign
