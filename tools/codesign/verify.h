// --verify: who signed a package file, and does the signature still hold.
#pragma once

#include <string>

#include "exit_status.h"

namespace codesign {

struct Verdict {
    ExitStatus status;
    std::string detail;  // one line for a person: who signed, or what is wrong
};

// `path` names the package file. Throws Failure when the file cannot be read as a tar
// archive or the key store is unusable.
Verdict verifyPackage(const std::string& path);

}  // namespace codesign
