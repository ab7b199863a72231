#include "common/md5.h"

namespace CORVPackageTool {

Md5::Md5() : ctx_(EVP_MD_CTX_new()) {}

Md5::~Md5() {
    EVP_MD_CTX_free(ctx_);
}

bool Md5::restart() {
    ok_ = ctx_ != nullptr && EVP_DigestInit_ex(ctx_, EVP_md5(), nullptr) == 1;
    return ok_;
}

void Md5::update(const void* bytes, size_t size) {
    ok_ = ok_ && EVP_DigestUpdate(ctx_, bytes, size) == 1;
}

std::string Md5::hexDigest() {
    unsigned char bytes[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    const bool ok = ok_ && EVP_DigestFinal_ex(ctx_, bytes, &length) == 1;
    ok_ = false;
    if (!ok) {
        return "";
    }
    static const char kHex[] = "0123456789abcdef";
    std::string hex;
    hex.reserve(2 * length);
    for (unsigned int i = 0; i < length; ++i) {
        hex += kHex[bytes[i] >> 4];
        hex += kHex[bytes[i] & 0xF];
    }
    return hex;
}

}  // namespace CORVPackageTool
