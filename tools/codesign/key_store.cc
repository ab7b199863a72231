#include "key_store.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <set>
#include <sstream>
#include <system_error>

#include "exit_status.h"
#include "file_io.h"
#include "gpg.h"
#include "sha256.h"

namespace codesign {

const char KeyStore::kDefaultRoot[] = "/usr/corv/etc/codesign";

namespace {

constexpr size_t kFeedFileLimit = 64 * 1024;

// Lists the keys of one block without importing it, so that a block that holds a secret
// key is refused before any of it reaches a key store.
void refuseSecretKeys(gpgme_ctx_t ctx, const std::string& block) {
    Data data = dataFrom(block);
    check(gpgme_op_keylist_from_data_start(ctx, data.get(), 0), "cannot read the key file");
    gpgme_error_t err;
    bool secret = false;
    for (;;) {
        gpgme_key_t raw = nullptr;
        err = gpgme_op_keylist_next(ctx, &raw);
        if (err) {
            break;
        }
        Key key(raw);
        secret = secret || key->secret;
    }
    gpgme_op_keylist_end(ctx);
    if (gpgme_err_code(err) != GPG_ERR_EOF) {
        check(err, "cannot read the key file");
    }
    if (secret) {
        throw Failure("the key file holds a secret key; only public keys may be trusted");
    }
}

// Imports the blocks into `home`; returns the primary fingerprints of the keys imported
// or already there.
std::vector<std::string> importKeys(const std::string& home,
                                    const std::vector<std::string>& blocks) {
    Context ctx = newContext(home);
    for (const std::string& block : blocks) {
        refuseSecretKeys(ctx.get(), block);
    }
    std::set<std::string> fingerprints;
    for (const std::string& block : blocks) {
        Data data = dataFrom(block);
        check(gpgme_op_import(ctx.get(), data.get()), "cannot import keys into " + home);
        gpgme_import_result_t result = gpgme_op_import_result(ctx.get());
        for (gpgme_import_status_t st = result ? result->imports : nullptr; st; st = st->next) {
            if (st->result == GPG_ERR_NO_ERROR && st->fpr) {
                fingerprints.insert(st->fpr);
            }
        }
    }
    if (fingerprints.empty()) {
        throw Failure("the key file holds no usable OpenPGP public key");
    }
    return std::vector<std::string>(fingerprints.begin(), fingerprints.end());
}

FeedRecord readFeedFile(const std::string& path) {
    std::istringstream in(readSmallFile(path, kFeedFileLimit));
    FeedRecord record;
    std::string line;
    while (std::getline(in, line)) {
        if (line.compare(0, 4, "url ") == 0 && record.url.empty()) {
            record.url = line.substr(4);
        } else if (line.compare(0, 4, "key ") == 0 && line.size() > 4) {
            record.fingerprints.push_back(line.substr(4));
        } else {
            throw Failure("key store broken: unexpected line in " + path);
        }
    }
    if (record.url.empty()) {
        throw Failure("key store broken: no url line in " + path);
    }
    return record;
}

// The homes hold public keys only, so gpg never needs its agent there; without
// no-autostart an import would leave one running per home.
const char kGnupgConf[] =
    "# Written by corv-codesign: public keys only, trust decided by the key store.\n"
    "no-autostart\n"
    "trust-model always\n";

void makeGnupgHome(const std::string& home) {
    makeDirectory(home, 0700);
    const std::string conf = home + "/gpg.conf";
    if (access(conf.c_str(), F_OK) != 0) {
        PendingFile file(conf, 0600);
        file.write(kGnupgConf);
        file.commit();
    }
}

void lockFile(int fd, int operation, const std::string& path) {
    while (flock(fd, operation) != 0) {
        if (errno != EINTR) {
            throw Failure("cannot lock " + path + ": " + strerror(errno));
        }
    }
}

}  // namespace

KeyStore::KeyStore(Access access, std::string root) : root_(std::move(root)) {
    const std::string lockPath = root_ + "/lock";
    if (access == kRead) {
        lock_.reset(open(lockPath.c_str(), O_RDONLY | O_CLOEXEC));
        if (lock_) {
            lockFile(lock_.get(), LOCK_SH, lockPath);
        } else if (errno != ENOENT) {
            throw Failure("key store broken: cannot open " + lockPath + ": " + strerror(errno));
        }
        return;
    }
    std::error_code ec;
    std::filesystem::create_directories(root_, ec);
    if (ec) {
        throw Failure("cannot create the key store " + root_ + ": " + ec.message());
    }
    lock_.reset(open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (!lock_) {
        throw Failure("cannot open " + lockPath + ": " + strerror(errno));
    }
    lockFile(lock_.get(), LOCK_EX, lockPath);
    // GnuPG wants its homes private.
    makeGnupgHome(makerHome());
    makeGnupgHome(publishersHome());
    makeDirectory(root_ + "/feeds", 0755);
}

std::string KeyStore::feedPath(const std::string& url) const {
    Sha256 sha;
    sha.update(url.data(), url.size());
    return root_ + "/feeds/" + sha.hex();
}

std::vector<std::string> KeyStore::addMakerKeys(const std::vector<std::string>& keyBlocks) {
    return importKeys(makerHome(), keyBlocks);
}

std::vector<std::string> KeyStore::setFeedKeys(const std::string& url,
                                               const std::vector<std::string>& keyBlocks) {
    if (url.empty() || url.find_first_of(std::string("\n\r\0", 3)) != std::string::npos) {
        throw Failure("a feed URL must be one line of text");
    }
    const std::vector<std::string> fingerprints = importKeys(publishersHome(), keyBlocks);
    std::string record = "url " + url + "\n";
    for (const std::string& fpr : fingerprints) {
        record += "key " + fpr + "\n";
    }
    PendingFile file(feedPath(url));
    file.write(record);
    file.commit();
    // Keys that the feed no longer sends go, unless another feed lists them.
    removeUnlistedPublisherKeys();
    return fingerprints;
}

bool KeyStore::removeFeed(const std::string& url) {
    const std::string path = feedPath(url);
    bool had = true;
    if (unlink(path.c_str()) != 0) {
        if (errno != ENOENT) {
            throw Failure("cannot remove " + path + ": " + strerror(errno));
        }
        had = false;
    }
    // Also after a feed file that was already gone: it tidies up after an interrupted run.
    removeUnlistedPublisherKeys();
    return had;
}

std::vector<FeedRecord> KeyStore::feeds() const {
    std::vector<FeedRecord> records;
    const std::string dir = root_ + "/feeds";
    DIR* d = opendir(dir.c_str());
    if (d == nullptr) {
        if (errno == ENOENT) {
            return records;
        }
        throw Failure("key store broken: cannot read " + dir + ": " + strerror(errno));
    }
    std::unique_ptr<DIR, int (*)(DIR*)> closer(d, closedir);
    std::vector<std::string> names;
    while (struct dirent* entry = readdir(d)) {
        // Hidden names are feed files still being written.
        if (entry->d_name[0] != '.') {
            names.push_back(entry->d_name);
        }
    }
    std::sort(names.begin(), names.end());
    for (const std::string& name : names) {
        records.push_back(readFeedFile(dir + "/" + name));
    }
    return records;
}

bool KeyStore::isPublisherKey(const std::string& fingerprint) const {
    for (const FeedRecord& feed : feeds()) {
        for (const std::string& fpr : feed.fingerprints) {
            if (strcasecmp(fpr.c_str(), fingerprint.c_str()) == 0) {
                return true;
            }
        }
    }
    return false;
}

void KeyStore::removeUnlistedPublisherKeys() {
    std::set<std::string> listed;
    for (const FeedRecord& feed : feeds()) {
        listed.insert(feed.fingerprints.begin(), feed.fingerprints.end());
    }
    Context ctx = newContext(publishersHome());
    for (const Key& key : listKeys(ctx.get(), "", false)) {
        if (listed.count(primaryFingerprint(key.get())) == 0) {
            check(
                gpgme_op_delete_ext(ctx.get(), key.get(), GPGME_DELETE_FORCE),
                "cannot remove key " + primaryFingerprint(key.get()) + " from " + publishersHome());
        }
    }
}

}  // namespace codesign
