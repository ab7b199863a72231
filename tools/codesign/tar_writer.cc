#include "tar_writer.h"

#include <stdio.h>
#include <string.h>

#include "exit_status.h"

namespace codesign {

namespace {

constexpr size_t kBlock = 512;
constexpr size_t kRecord = 20 * kBlock;

// An octal field of `len` bytes: zero-padded digits and a NUL.
void octal(char* field, size_t len, uint64_t value) {
    char buffer[32];
    snprintf(buffer, sizeof(buffer), "%0*llo", static_cast<int>(len - 1),
             static_cast<unsigned long long>(value));
    if (strlen(buffer) != len - 1) {
        throw Failure("internal error: a value does not fit its tar header field");
    }
    memcpy(field, buffer, len);  // the copy includes the terminating NUL
}

}  // namespace

std::string ustarFileHeader(const std::string& name, uint64_t size, int64_t mtime) {
    if (name.empty() || name.size() > 100) {
        throw Failure("internal error: member name does not fit a ustar header: " + name);
    }
    char block[kBlock] = {};
    memcpy(block, name.data(), name.size());
    octal(block + 100, 8, 0644);
    octal(block + 108, 8, 0);
    octal(block + 116, 8, 0);
    octal(block + 124, 12, size);
    octal(block + 136, 12, mtime < 0 ? 0 : static_cast<uint64_t>(mtime));
    block[156] = '0';
    memcpy(block + 257, "ustar", 6);  // POSIX magic with its NUL
    memcpy(block + 263, "00", 2);
    memcpy(block + 265, "root", 4);
    memcpy(block + 297, "root", 4);
    memset(block + 148, ' ', 8);
    unsigned sum = 0;
    for (unsigned char c : block) {
        sum += c;
    }
    // Six digits, a NUL and a blank, as tar writes it.
    snprintf(block + 148, 8, "%06o", sum);
    block[155] = ' ';
    return std::string(block, kBlock);
}

std::string blockPadding(uint64_t size) {
    return std::string((kBlock - size % kBlock) % kBlock, '\0');
}

std::string archiveEnd(uint64_t written) {
    const uint64_t end = written + 2 * kBlock;
    return std::string(2 * kBlock + (kRecord - end % kRecord) % kRecord, '\0');
}

}  // namespace codesign
