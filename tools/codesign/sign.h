// --sign: signs a package file in place.
#pragma once

#include <string>

namespace codesign {

// Signs the package file at `path` with the secret key that `keySpec` names
// (fingerprint, key id or user id) in the caller's GnuPG home. An existing signature is
// replaced. Returns the fingerprint of the key used; throws Failure.
std::string signPackage(const std::string& keySpec, const std::string& path);

}  // namespace codesign
