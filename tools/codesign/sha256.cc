#include "sha256.h"

#include <openssl/evp.h>

#include "exit_status.h"

namespace codesign {

void Sha256::Free::operator()(evp_md_ctx_st* ctx) const {
    EVP_MD_CTX_free(ctx);
}

Sha256::Sha256() : ctx_(EVP_MD_CTX_new()) {
    if (!ctx_ || EVP_DigestInit_ex(ctx_.get(), EVP_sha256(), nullptr) != 1) {
        throw Failure("cannot set up SHA-256");
    }
}

void Sha256::update(const char* data, size_t size) {
    if (EVP_DigestUpdate(ctx_.get(), data, size) != 1) {
        throw Failure("SHA-256 failed");
    }
}

std::string Sha256::hex() {
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int len = 0;
    if (EVP_DigestFinal_ex(ctx_.get(), digest, &len) != 1) {
        throw Failure("SHA-256 failed");
    }
    static const char kDigits[] = "0123456789abcdef";
    std::string out;
    for (unsigned int i = 0; i < len; ++i) {
        out += kDigits[digest[i] >> 4];
        out += kDigits[digest[i] & 15];
    }
    return out;
}

}  // namespace codesign
