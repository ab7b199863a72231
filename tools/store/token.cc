#include "token.h"

#include <openssl/evp.h>
#include <stdio.h>

namespace store {

std::string md5Hex(const std::string& text) {
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    if (EVP_Digest(text.data(), text.size(), digest, &length, EVP_md5(), nullptr) != 1) {
        return "";
    }
    std::string hex;
    char piece[3];
    for (unsigned int i = 0; i < length; ++i) {
        snprintf(piece, sizeof piece, "%02x", digest[i]);
        hex += piece;
    }
    return hex;
}

std::string expectedToken(const std::string& nsTime) {
    const std::string first = md5Hex(nsTime);
    if (first.empty()) {
        return "";
    }
    const char digit = first[0];
    const int rounds = 1 + (digit <= '9' ? digit - '0' : digit - 'a' + 10);
    std::string work = nsTime;
    for (int round = 0; round < rounds; ++round) {
        work = md5Hex(work + md5Hex(work));
    }
    return work.substr(0, 32);
}

}  // namespace store
