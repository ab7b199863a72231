// The signature kit: signing keys, package files and a trusted key store in a few lines,
// for tests of package signatures. Everything here writes system paths or starts
// gpg-agent: use it in sandboxed tests only.
//
//   ASSERT_TRUE(testutil::installCodesignTool());        // /usr/corv/bin/corv-codesign
//   testutil::SigningKey maker("maker");                  // a fresh GnuPG home and key
//   ASSERT_TRUE(testutil::trustAsMaker(maker));
//   const std::string cpk = testutil::makeCpk("/tmp/demo.cpk");
//   ASSERT_EQ(testutil::signCpk(maker, cpk), 0);
//   EXPECT_EQ(testutil::verifyCpk(cpk), 0);
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "support/run.h"
#include "support/temp_dir.h"

namespace testutil {

// Where the reference platform has the tool.
extern const char kCodesignTool[];
// The member that carries a package file's signature.
extern const char kSignatureMember[];

// Copies the built tool (CORV_CODESIGN_PATH) to kCodesignTool unless one is there.
// False when there is neither.
bool installCodesignTool();

// A GnuPG home of its own under /tmp with one ed25519 signing key, without passphrase.
// Its gpg-agent is stopped and the home removed when the object goes away.
class SigningKey {
  public:
    // `name` makes the user id "<name> <name@example.test>". An `expired` key was made on
    // 2020-01-01 to live one day, and its home keeps signing as of that morning: the
    // signatures are from the key's lifetime, yet the key is expired today.
    explicit SigningKey(const std::string& name, bool expired = false);
    ~SigningKey();
    SigningKey(const SigningKey&) = delete;
    SigningKey& operator=(const SigningKey&) = delete;

    const std::string& home() const { return dir_.path(); }
    const std::string& fingerprint() const { return fingerprint_; }
    const std::string& email() const { return email_; }

    // The public key, ASCII-armored or binary.
    std::string publicKey(bool armor = true) const;
    // Writes the public key to `path` and returns `path`.
    std::string exportPublicKey(const std::string& path, bool armor = true) const;
    // Revokes the key with the revocation certificate GnuPG made with it. It signs no more;
    // export the public key again to hand out the revocation.
    bool revoke();
    // Runs gpg on this home; the status of gpg.
    RunResult gpg(const std::vector<std::string>& args) const;

  private:
    TempDir dir_;
    std::string email_;
    std::string fingerprint_;
};

// Runs the tool with `args`; with a `gnupgHome`, as GNUPGHOME (the signer's keyring).
RunResult codesign(const std::vector<std::string>& args, const std::string& gnupgHome = "");
// --sign with the key's fingerprint, in the key's home; the tool's status.
int signCpk(const SigningKey& key, const std::string& cpk);
// --verify; the tool's status.
int verifyCpk(const std::string& cpk);

// --add-maker with the key's armored public key.
bool trustAsMaker(const SigningKey& key);
// --addserver for `feedUrl` with a key file in the form the package engine writes: a
// JSON array of armored public keys.
bool trustForFeed(const std::vector<const SigningKey*>& keys, const std::string& feedUrl);

// Members of a small package: INFO for `name` and a real package.tgz.
std::vector<std::pair<std::string, std::string>> cpkMembers(const std::string& name = "demo");
// Writes the members (name -> content; names may hold directories) to a scratch directory
// and packs them, in the given order, with /bin/tar into `path` (uncompressed; `format`
// is tar's --format). Returns `path`; aborts the test program when tar fails.
std::string makeCpk(const std::string& path,
                    const std::vector<std::pair<std::string, std::string>>& members = cpkMembers(),
                    const std::string& format = "gnu");
// The member names of a package file as /bin/tar lists them.
std::vector<std::string> tarMembers(const std::string& path);
// The content of one member, read with /bin/tar (empty when missing).
std::string tarMember(const std::string& path, const std::string& member);

}  // namespace testutil
