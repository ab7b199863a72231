// GPGME with its objects owned by RAII handles, and the few operations the tool needs.
#pragma once

#include <gpgme.h>

#include <memory>
#include <string>
#include <vector>

namespace codesign {

struct ContextFree {
    void operator()(gpgme_ctx_t ctx) const { gpgme_release(ctx); }
};
struct DataFree {
    void operator()(gpgme_data_t data) const { gpgme_data_release(data); }
};
struct KeyFree {
    void operator()(gpgme_key_t key) const { gpgme_key_unref(key); }
};
using Context = std::unique_ptr<gpgme_context, ContextFree>;
using Data = std::unique_ptr<gpgme_data, DataFree>;
using Key = std::unique_ptr<_gpgme_key, KeyFree>;

// Checks the library and the OpenPGP engine once per process.
void initGpgme();

// A context for OpenPGP. With a `home`, it works on that GnuPG home only, with every key
// taken as valid (who is trusted is decided by the key store, not by the web of trust)
// and without network access; without one, on the caller's (GNUPGHOME or ~/.gnupg).
Context newContext(const std::string& home = std::string());

// Data that reads `text`, which must outlive it.
Data dataFrom(const std::string& text);
Data newData();
// The whole content of a memory data object.
std::string dataText(gpgme_data_t data);

// Throws Failure "<what>: <GPGME's message>" when `err` is an error.
void check(gpgme_error_t err, const std::string& what);

// The keys that `pattern` names (all with an empty pattern); secret keys only if asked.
std::vector<Key> listKeys(gpgme_ctx_t ctx, const std::string& pattern, bool secretOnly);

// Fingerprint of the primary key.
std::string primaryFingerprint(gpgme_key_t key);
// First user id, for listings.
std::string firstUserId(gpgme_key_t key);

}  // namespace codesign
