#include "manifest.h"

#include <stdio.h>

#include <algorithm>
#include <utility>

#include "sha256.h"
#include "tar_writer.h"

namespace codesign {

const char kSignatureMember[] = "corv-signature.asc";

namespace {

// A signature is a few hundred bytes; more is not a signature made by this tool.
constexpr size_t kSignatureLimit = 64 * 1024;

std::string escaped(const std::string& name) {
    std::string out;
    for (unsigned char c : name) {
        if (c <= ' ' || c >= 0x7f || c == '%') {
            char hex[4];
            snprintf(hex, sizeof(hex), "%%%02X", c);
            out += hex;
        } else {
            out += static_cast<char>(c);
        }
    }
    return out;
}

char kindLetter(TarMember::Kind kind) {
    switch (kind) {
        case TarMember::kFile:
            return 'f';
        case TarMember::kHardLink:
            return 'h';
        case TarMember::kSymLink:
            return 'l';
        case TarMember::kCharDevice:
            return 'c';
        case TarMember::kBlockDevice:
            return 'b';
        case TarMember::kDirectory:
            return 'd';
        case TarMember::kFifo:
            return 'p';
    }
    return '?';
}

}  // namespace

ArchiveScan scanArchive(TarReader& reader, ArchiveCopy* copy) {
    ArchiveScan scan;
    // (escaped name, line); a stable sort keeps members of one name in archive order.
    std::vector<std::pair<std::string, std::string>> lines;
    TarMember member;
    while (reader.next(member)) {
        if (member.name == kSignatureMember) {
            std::string signature;
            reader.readContent([&](const char* data, size_t size) {
                if (signature.size() + size <= kSignatureLimit) {
                    signature.append(data, size);
                }
            });
            // Not one of ours: an empty text fails to verify, as a bad signature.
            if (member.size > kSignatureLimit) {
                signature.clear();
            }
            scan.signatures.push_back(std::move(signature));
            continue;
        }
        if (copy) {
            copy->write(member.rawHeaders.data(), member.rawHeaders.size());
        }
        std::string digest = "-";
        if (member.kind == TarMember::kFile) {
            Sha256 sha;
            reader.readContent([&](const char* data, size_t size) {
                sha.update(data, size);
                if (copy) {
                    copy->write(data, size);
                }
            });
            if (copy) {
                const std::string padding = blockPadding(member.size);
                copy->write(padding.data(), padding.size());
            }
            digest = sha.hex();
        } else if (member.kind == TarMember::kCharDevice ||
                   member.kind == TarMember::kBlockDevice) {
            digest = std::to_string(member.devMajor) + "," + std::to_string(member.devMinor);
        }
        char mode[8];
        snprintf(mode, sizeof(mode), "%04o", member.mode);
        const std::string name = escaped(member.name);
        std::string line =
            std::string(1, kindLetter(member.kind)) + " " + mode + " " + digest + " " + name;
        if (member.kind == TarMember::kHardLink || member.kind == TarMember::kSymLink) {
            line += " " + escaped(member.linkName);
        }
        lines.emplace_back(name, line + "\n");
    }
    std::stable_sort(lines.begin(), lines.end(),
                     [](const auto& a, const auto& b) { return a.first < b.first; });
    scan.manifest = "corv-codesign manifest 1\n";
    for (const auto& entry : lines) {
        scan.manifest += entry.second;
    }
    return scan;
}

}  // namespace codesign
