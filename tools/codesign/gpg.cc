#include "gpg.h"

#include <locale.h>

#include "exit_status.h"

namespace codesign {

void initGpgme() {
    static bool done = false;
    if (done) {
        return;
    }
    if (gpgme_check_version(nullptr) == nullptr) {
        throw Failure("GPGME is not usable");
    }
    gpgme_set_locale(nullptr, LC_CTYPE, setlocale(LC_CTYPE, nullptr));
    check(gpgme_engine_check_version(GPGME_PROTOCOL_OpenPGP),
          "GnuPG (gpg) is not installed or too old");
    done = true;
}

Context newContext(const std::string& home) {
    initGpgme();
    gpgme_ctx_t raw = nullptr;
    check(gpgme_new(&raw), "cannot create a GPGME context");
    Context ctx(raw);
    check(gpgme_set_protocol(raw, GPGME_PROTOCOL_OpenPGP), "cannot select OpenPGP");
    if (!home.empty()) {
        check(gpgme_ctx_set_engine_info(raw, GPGME_PROTOCOL_OpenPGP, nullptr, home.c_str()),
              "cannot use the GnuPG home " + home);
        check(gpgme_set_ctx_flag(raw, "trust-model", "always"), "cannot set the trust model");
        gpgme_set_offline(raw, 1);
    }
    return ctx;
}

Data dataFrom(const std::string& text) {
    gpgme_data_t raw = nullptr;
    check(gpgme_data_new_from_mem(&raw, text.data(), text.size(), 0), "out of memory");
    return Data(raw);
}

Data newData() {
    gpgme_data_t raw = nullptr;
    check(gpgme_data_new(&raw), "out of memory");
    return Data(raw);
}

std::string dataText(gpgme_data_t data) {
    check(gpgme_data_seek(data, 0, SEEK_SET) < 0 ? gpgme_error_from_syserror() : 0,
          "cannot rewind a GPGME data object");
    std::string text;
    char buffer[4096];
    ssize_t n;
    while ((n = gpgme_data_read(data, buffer, sizeof(buffer))) > 0) {
        text.append(buffer, static_cast<size_t>(n));
    }
    if (n < 0) {
        check(gpgme_error_from_syserror(), "cannot read a GPGME data object");
    }
    return text;
}

void check(gpgme_error_t err, const std::string& what) {
    if (gpgme_err_code(err) != GPG_ERR_NO_ERROR) {
        throw Failure(what + ": " + gpgme_strerror(err));
    }
}

std::vector<Key> listKeys(gpgme_ctx_t ctx, const std::string& pattern, bool secretOnly) {
    check(gpgme_op_keylist_start(ctx, pattern.empty() ? nullptr : pattern.c_str(), secretOnly),
          "cannot list keys");
    std::vector<Key> keys;
    for (;;) {
        gpgme_key_t key = nullptr;
        const gpgme_error_t err = gpgme_op_keylist_next(ctx, &key);
        if (gpgme_err_code(err) == GPG_ERR_EOF) {
            break;
        }
        if (err) {
            gpgme_op_keylist_end(ctx);
            check(err, "cannot list keys");
        }
        keys.emplace_back(key);
    }
    check(gpgme_op_keylist_end(ctx), "cannot list keys");
    return keys;
}

std::string primaryFingerprint(gpgme_key_t key) {
    if (key->fpr) {
        return key->fpr;
    }
    return key->subkeys && key->subkeys->fpr ? key->subkeys->fpr : "";
}

std::string firstUserId(gpgme_key_t key) {
    return key->uids && key->uids->uid ? key->uids->uid : "";
}

}  // namespace codesign
