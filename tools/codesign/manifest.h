// What a package signature covers: a canonical manifest of the archive, computed the same
// way by the signer and the verifier from the archive's bytes alone.
//
// The manifest is text. Its first line is "corv-codesign manifest 1"; then one line per
// member except the signature member, sorted by name (bytewise), members of the same name
// in archive order:
//
//   <kind> <mode> <digest> <name>[ <link target>]
//
//   kind    f file, h hard link, l symbolic link, d directory, c / b character / block
//           device, p FIFO
//   mode    the permission bits, four octal digits
//   digest  f: SHA-256 of the content, lower-case hex; c, b: "<major>,<minor>"; else "-"
//   name    the member name as stored (after long-name and pax extensions), and for links
//           the target; both with every byte outside '!'..'~' and '%' written as %XX
//
// Owners, times and the header layout play no part: they do not change what an install
// unpacks. Any member added, removed, renamed or changed changes the manifest.
#pragma once

#include <string>
#include <vector>

#include "tar_reader.h"

namespace codesign {

// The name of the member that carries the signature: an ASCII-armored OpenPGP detached
// signature of the manifest. Only a member of exactly this name at the top of the
// archive counts as the signature.
extern const char kSignatureMember[];

struct ArchiveScan {
    std::string manifest;
    // Contents of the signature members, in archive order (normally none or one).
    std::vector<std::string> signatures;
};

// Receives the bytes of every member that is not a signature, headers, content and
// padding, so that the archive can be written again without its signature.
class ArchiveCopy {
  public:
    virtual ~ArchiveCopy() = default;
    virtual void write(const char* data, size_t size) = 0;
};

// Reads the whole archive. Throws Failure when it is not a well-formed tar archive.
ArchiveScan scanArchive(TarReader& reader, ArchiveCopy* copy = nullptr);

}  // namespace codesign
