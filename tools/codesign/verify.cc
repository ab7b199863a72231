#include "verify.h"

#include "file_io.h"
#include "gpg.h"
#include "key_store.h"
#include "manifest.h"
#include "tar_reader.h"

namespace codesign {

namespace {

// What one GnuPG home says about the signature.
struct Check {
    enum State { kGood, kExpired, kBad, kNoKey } state;
    std::string fingerprint;  // primary key of the signer, when the home has it
};

Check checkIn(const std::string& home, const std::string& manifest, const std::string& signature) {
    Context ctx = newContext(home);
    Data sig = dataFrom(signature);
    Data text = dataFrom(manifest);
    const gpgme_error_t err = gpgme_op_verify(ctx.get(), sig.get(), text.get(), nullptr);
    switch (gpgme_err_code(err)) {
        case GPG_ERR_NO_ERROR:
            break;
        case GPG_ERR_NO_DATA:
        case GPG_ERR_BAD_DATA:
        case GPG_ERR_INV_PACKET:
        case GPG_ERR_BAD_SIGNATURE:
        case GPG_ERR_UNKNOWN_PACKET:
            throw BadSignature(std::string("the signature member is not a valid signature: ") +
                               gpgme_strerror(err));
        default:
            check(err, "cannot check the signature with the keys of " + home);
    }
    gpgme_verify_result_t result = gpgme_op_verify_result(ctx.get());
    gpgme_signature_t s = result ? result->signatures : nullptr;
    if (s == nullptr) {
        throw BadSignature("the signature member holds no signature");
    }
    if (s->next != nullptr) {
        throw BadSignature("the signature member holds more than one signature");
    }
    Check check{Check::kGood, s->fpr ? s->fpr : ""};
    const unsigned expiry =
        GPGME_SIGSUM_KEY_REVOKED | GPGME_SIGSUM_KEY_EXPIRED | GPGME_SIGSUM_SIG_EXPIRED;
    switch (gpgme_err_code(s->status)) {
        case GPG_ERR_NO_ERROR:
            check.state = (s->summary & expiry) ? Check::kExpired : Check::kGood;
            break;
        case GPG_ERR_KEY_EXPIRED:
        case GPG_ERR_SIG_EXPIRED:
        case GPG_ERR_CERT_REVOKED:
            check.state = Check::kExpired;
            break;
        case GPG_ERR_BAD_SIGNATURE:
            check.state = Check::kBad;
            break;
        case GPG_ERR_NO_PUBKEY:
            check.state = Check::kNoKey;
            return check;
        default:
            throw Failure(std::string("cannot check the signature: ") + gpgme_strerror(s->status));
    }
    // The signature names the signing (sub)key; trust is recorded for primary keys.
    gpgme_key_t raw = nullptr;
    if (s->fpr && gpgme_get_key(ctx.get(), s->fpr, &raw, 0) == GPG_ERR_NO_ERROR && raw) {
        Key key(raw);
        check.fingerprint = primaryFingerprint(key.get());
    }
    return check;
}

}  // namespace

Verdict verifyPackage(const std::string& path) {
    UniqueFd fd = openRegularFile(path);
    TarReader reader(fd.get(), path);
    const ArchiveScan scan = scanArchive(reader);
    if (scan.signatures.empty()) {
        return {kNoSignature, "no signature"};
    }
    if (scan.signatures.size() > 1) {
        return {kBadSignature, "more than one signature member"};
    }
    const std::string& signature = scan.signatures.front();

    KeyStore store(KeyStore::kRead);
    bool looked = false;
    try {
        if (isDirectory(store.makerHome())) {
            looked = true;
            const Check maker = checkIn(store.makerHome(), scan.manifest, signature);
            switch (maker.state) {
                case Check::kGood:
                    return {kMakerSigned, "signed by the maker's key " + maker.fingerprint};
                case Check::kExpired:
                    return {kKeyExpired,
                            "the maker's key " + maker.fingerprint + " has expired or was revoked"};
                case Check::kBad:
                    return {kBadSignature, "the package changed after it was signed"};
                case Check::kNoKey:
                    break;
            }
        }
        if (isDirectory(store.publishersHome())) {
            looked = true;
            const Check publisher = checkIn(store.publishersHome(), scan.manifest, signature);
            if (publisher.state != Check::kNoKey && store.isPublisherKey(publisher.fingerprint)) {
                switch (publisher.state) {
                    case Check::kGood:
                        return {kPublisherSigned,
                                "signed by the publisher key " + publisher.fingerprint};
                    case Check::kExpired:
                        return {kKeyExpired, "the publisher key " + publisher.fingerprint +
                                                 " has expired or was revoked"};
                    default:
                        return {kBadSignature, "the package changed after it was signed"};
                }
            }
        }
        if (!looked) {
            // No key store at all: an empty home still tells a garbled signature member
            // from a sound signature by a key nobody trusts here.
            TempDirectory empty;
            checkIn(empty.path(), scan.manifest, signature);
        }
    } catch (const BadSignature& bad) {
        return {kBadSignature, bad.what()};
    }
    return {kUnknownSigner, "signed by a key that is not trusted here"};
}

}  // namespace codesign
