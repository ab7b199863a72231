// An MD5 that runs on a thread of its own, fed the bytes of a transfer as they arrive, so
// that hashing a package of many megabytes overlaps its receipt instead of following it.
#pragma once

#include <condition_variable>
#include <deque>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "common/md5.h"

namespace CORVPackageTool {

class DigestPipe {
  public:
    DigestPipe();
    ~DigestPipe();
    DigestPipe(const DigestPipe&) = delete;
    DigestPipe& operator=(const DigestPipe&) = delete;

    // Starts a new digest, dropping what was fed so far. False when the digest can't start.
    bool restart();
    // Hands bytes to the hashing thread; waits while a few blocks are pending already.
    void feed(const char* bytes, size_t size);
    // The lowercase hexadecimal digest of everything fed since the last restart; "" on a
    // failure.
    std::string finish();

  private:
    using Block = std::vector<char>;
    void run();
    void stop();
    void submit();

    Md5 md5_;  // touched by the hashing thread only while it runs
    Block filling_;
    std::vector<Block> spare_;
    std::deque<Block> pending_;
    std::mutex mutex_;
    std::condition_variable changed_;
    bool closing_ = false;
    std::thread thread_;
};

}  // namespace CORVPackageTool
