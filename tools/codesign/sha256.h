// SHA-256 in pieces, for hashing member contents as they stream past.
#pragma once

#include <cstddef>
#include <memory>
#include <string>

struct evp_md_ctx_st;

namespace codesign {

class Sha256 {
  public:
    Sha256();
    void update(const char* data, size_t size);
    // Lower-case hexadecimal digest; the object is spent afterwards.
    std::string hex();

  private:
    struct Free {
        void operator()(evp_md_ctx_st* ctx) const;
    };
    std::unique_ptr<evp_md_ctx_st, Free> ctx_;
};

}  // namespace codesign
