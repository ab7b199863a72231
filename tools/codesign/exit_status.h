// Exit statuses of corv-codesign. The package engine reads nothing but these, so they are
// the tool's whole contract with it: 0..5 are verdicts of --verify, anything from 6 on
// means the tool itself could not do its job.
#pragma once

#include <stdexcept>
#include <string>

namespace codesign {

enum ExitStatus {
    kMakerSigned = 0,      // signed with a key of the maker
    kPublisherSigned = 1,  // signed with a key that a feed brought (--addserver)
    kUnknownSigner = 2,    // signed, but with a key that is not trusted here
    kNoSignature = 3,      // no signature member in the archive
    kKeyExpired = 4,       // the signing key has expired or was revoked
    kBadSignature = 5,     // the archive is not what was signed
    kFailure = 6,          // the tool failed: unreadable file, not a tar, broken key store ...
    kUsage = 64,           // wrong command line (EX_USAGE); also a failure for the engine
};

// A failure that ends the command: main() prints the message and exits with kFailure.
class Failure : public std::runtime_error {
  public:
    explicit Failure(const std::string& message) : std::runtime_error(message) {}
};

// A package whose signature cannot hold (garbled signature member, several of them ...).
// It is a verdict about the file, not a failure of the tool: --verify exits with
// kBadSignature.
class BadSignature : public std::runtime_error {
  public:
    explicit BadSignature(const std::string& message) : std::runtime_error(message) {}
};

}  // namespace codesign
