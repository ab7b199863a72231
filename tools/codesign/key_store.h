// The trusted keys of this machine.
//
// Layout under /usr/corv/etc/codesign/:
//
//   lock          flock(2) file: shared while verifying, exclusive while changing
//   maker/        GnuPG home (0700) with the maker's public keys (--add-maker)
//   publishers/   GnuPG home (0700) with the public keys of all feeds
//   feeds/        one file per feed, named by the SHA-256 of its URL: a line "url <URL>"
//                 and a line "key <fingerprint>" per key the feed brought
//
// The feed files are the truth about publishers: a key in publishers/ counts only while a
// feed file lists it, and every change removes from publishers/ the keys that no feed
// lists any more. The maker's keys are kept apart so that no feed can bring a key that
// passes for the maker's.
#pragma once

#include <string>
#include <vector>

#include "unique_fd.h"

namespace codesign {

struct FeedRecord {
    std::string url;
    std::vector<std::string> fingerprints;
};

class KeyStore {
  public:
    static const char kDefaultRoot[];
    enum Access { kRead, kWrite };

    // Takes the store's lock. For writing, creates whatever is missing of the layout; for
    // reading, a missing store is an empty one.
    explicit KeyStore(Access access, std::string root = kDefaultRoot);

    std::string makerHome() const { return root_ + "/maker"; }
    std::string publishersHome() const { return root_ + "/publishers"; }

    // Imports the maker's keys; returns their fingerprints.
    std::vector<std::string> addMakerKeys(const std::vector<std::string>& keyBlocks);
    // The feed's keys become exactly those of `keyBlocks`; returns their fingerprints.
    std::vector<std::string> setFeedKeys(const std::string& url,
                                         const std::vector<std::string>& keyBlocks);
    // Forgets the feed's keys (those still listed by another feed stay). False when the
    // feed had none.
    bool removeFeed(const std::string& url);

    std::vector<FeedRecord> feeds() const;
    // Whether some feed lists the key of this primary fingerprint.
    bool isPublisherKey(const std::string& fingerprint) const;

  private:
    std::string feedPath(const std::string& url) const;
    void removeUnlistedPublisherKeys();

    std::string root_;
    UniqueFd lock_;
};

}  // namespace codesign
