// A streaming reader of tar archives (POSIX ustar and pax, GNU), for archives that may be
// hostile: nothing is ever extracted to disk, every header is checked, sizes are bounded,
// and anything the reader does not fully understand is refused instead of guessed at.
//
// Understood: regular files ('0', NUL, '7'), hard and symbolic links, character and block
// devices, directories, FIFOs; pax extended headers ('x'; 'g' only without path, linkpath
// or size) with the keys path, linkpath and size; GNU long names ('L', 'K'). Refused: GNU
// sparse files, multi-volume and volume headers, dump directories and unknown types.
// The archive ends at the first zero block, as for /bin/tar.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace codesign {

struct TarMember {
    enum Kind { kFile, kHardLink, kSymLink, kCharDevice, kBlockDevice, kDirectory, kFifo };
    Kind kind = kFile;
    std::string name;      // full name: prefix, GNU long name or pax path applied
    std::string linkName;  // target of a link
    unsigned mode = 0;     // permission bits (07777)
    uint64_t size = 0;     // bytes of content
    unsigned devMajor = 0;
    unsigned devMinor = 0;
    // The member's header blocks as they stand in the archive, extended headers included.
    std::string rawHeaders;
};

class TarReader {
  public:
    // Reads from `fd`, which the caller keeps open; `what` names the archive in messages.
    TarReader(int fd, std::string what);

    // The next member; false at the end of the archive. Content of the previous member
    // that was not read is skipped. Throws Failure on a malformed or truncated archive.
    bool next(TarMember& member);
    // Passes the content of the member that next() gave, in pieces, to `sink`. At most
    // once per member.
    void readContent(const std::function<void(const char*, size_t)>& sink);

  private:
    void readBlock(char* block, const char* purpose);
    std::string readExtension(uint64_t size, const char* kind);
    void skipContent();

    int fd_;
    std::string what_;
    uint64_t offset_ = 0;          // bytes consumed
    uint64_t pendingContent_ = 0;  // content bytes (padding included) not read yet
    uint64_t contentSize_ = 0;     // unpadded size of the current member's content
    bool contentRead_ = true;
    bool ended_ = false;
};

}  // namespace codesign
