// Key files as --addserver and --add-maker take them.
#pragma once

#include <string>
#include <vector>

namespace codesign {

// The OpenPGP key blocks of a key file. The file is either OpenPGP data itself (one or
// more ASCII-armored blocks, or binary packets), or a JSON array of strings, each an
// armored key block: the form in which the package engine hands over the "keyrings" that
// a feed sent.
std::vector<std::string> readKeyFile(const std::string& path);

}  // namespace codesign
