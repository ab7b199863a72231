#include "sign.h"

#include <time.h>

#include <vector>

#include "exit_status.h"
#include "file_io.h"
#include "gpg.h"
#include "manifest.h"
#include "tar_reader.h"
#include "tar_writer.h"

namespace codesign {

namespace {

// Copies the kept members into the new archive and counts what was written.
class CopyToFile : public ArchiveCopy {
  public:
    explicit CopyToFile(PendingFile& file) : file_(file) {}
    void write(const char* data, size_t size) override {
        file_.write(data, size);
        written_ += size;
    }
    void write(const std::string& data) { write(data.data(), data.size()); }
    uint64_t written() const { return written_; }

  private:
    PendingFile& file_;
    uint64_t written_ = 0;
};

bool usableForSigning(gpgme_key_t key) {
    return key->can_sign && !key->revoked && !key->expired && !key->disabled && !key->invalid;
}

Key signingKey(gpgme_ctx_t ctx, const std::string& keySpec) {
    std::vector<Key> usable;
    for (Key& key : listKeys(ctx, keySpec, true)) {
        if (usableForSigning(key.get())) {
            usable.push_back(std::move(key));
        }
    }
    if (usable.empty()) {
        throw Failure("no usable secret key for signing matches \"" + keySpec + "\"");
    }
    if (usable.size() > 1) {
        std::string names;
        for (const Key& key : usable) {
            names += " " + primaryFingerprint(key.get());
        }
        throw Failure("\"" + keySpec + "\" matches several secret keys:" + names +
                      "; name one by its fingerprint");
    }
    return std::move(usable.front());
}

std::string detachedSignature(const std::string& keySpec, const std::string& manifest,
                              std::string& fingerprint) {
    Context ctx = newContext();
    Key key = signingKey(ctx.get(), keySpec);
    fingerprint = primaryFingerprint(key.get());
    check(gpgme_signers_add(ctx.get(), key.get()), "cannot use key " + fingerprint);
    gpgme_set_armor(ctx.get(), 1);
    gpgme_set_textmode(ctx.get(), 0);
    Data in = dataFrom(manifest);
    Data out = newData();
    check(gpgme_op_sign(ctx.get(), in.get(), out.get(), GPGME_SIG_MODE_DETACH),
          "cannot sign with key " + fingerprint);
    gpgme_sign_result_t result = gpgme_op_sign_result(ctx.get());
    if (result == nullptr || result->signatures == nullptr || result->invalid_signers != nullptr) {
        throw Failure("cannot sign with key " + fingerprint);
    }
    return dataText(out.get());
}

}  // namespace

std::string signPackage(const std::string& keySpec, const std::string& path) {
    UniqueFd original = openRegularFile(path);
    PendingFile rewritten(path);
    CopyToFile copy(rewritten);
    TarReader reader(original.get(), path);
    const ArchiveScan scan = scanArchive(reader, &copy);

    std::string fingerprint;
    const std::string signature = detachedSignature(keySpec, scan.manifest, fingerprint);
    copy.write(ustarFileHeader(kSignatureMember, signature.size(), time(nullptr)));
    copy.write(signature);
    copy.write(blockPadding(signature.size()));
    copy.write(archiveEnd(copy.written()));

    rewritten.copyAttributes(original.get());
    rewritten.commit();
    return fingerprint;
}

}  // namespace codesign
