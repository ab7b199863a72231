// MD5 in lowercase hexadecimal, as the system's tools print it (and as INFO and the
// stores write checksums).
#pragma once

#include <openssl/evp.h>

#include <stddef.h>

#include <string>

namespace CORVPackageTool {

class Md5 {
  public:
    Md5();
    ~Md5();
    Md5(const Md5&) = delete;
    Md5& operator=(const Md5&) = delete;

    // Starts a new digest. False when OpenSSL cannot give one.
    bool restart();
    // Adds bytes; a failure shows in hexDigest().
    void update(const void* bytes, size_t size);
    // The digest of everything added since restart(), or "" after any failure. The next
    // digest needs restart() again.
    std::string hexDigest();

  private:
    EVP_MD_CTX* ctx_;
    bool ok_ = false;
};

}  // namespace CORVPackageTool
