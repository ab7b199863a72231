#include "store/digest_pipe.h"

#include <utility>

namespace CORVPackageTool {

namespace {

// Blocks of 1 MiB keep the two threads' hand-overs rare; four of them in flight bound the
// memory while the hashing thread catches up.
constexpr size_t kBlockSize = 1 << 20;
constexpr size_t kMaxPending = 4;

}  // namespace

DigestPipe::DigestPipe() : ctx_(EVP_MD_CTX_new()) {}

DigestPipe::~DigestPipe() {
    stop();
    EVP_MD_CTX_free(ctx_);
}

void DigestPipe::stop() {
    if (!thread_.joinable()) {
        return;
    }
    {
        std::lock_guard<std::mutex> lock(mutex_);
        closing_ = true;
    }
    changed_.notify_all();
    thread_.join();
}

bool DigestPipe::restart() {
    stop();
    pending_.clear();
    filling_.clear();
    closing_ = false;
    ok_ = ctx_ != nullptr && EVP_DigestInit_ex(ctx_, EVP_md5(), nullptr) == 1;
    if (ok_) {
        thread_ = std::thread([this] { run(); });
    }
    return ok_;
}

void DigestPipe::run() {
    for (;;) {
        Block block;
        {
            std::unique_lock<std::mutex> lock(mutex_);
            changed_.wait(lock, [this] { return closing_ || !pending_.empty(); });
            if (pending_.empty()) {
                return;
            }
            block = std::move(pending_.front());
            pending_.pop_front();
        }
        changed_.notify_all();
        if (EVP_DigestUpdate(ctx_, block.data(), block.size()) != 1) {
            ok_ = false;
        }
        block.clear();
        std::lock_guard<std::mutex> lock(mutex_);
        spare_.push_back(std::move(block));
    }
}

void DigestPipe::submit() {
    std::unique_lock<std::mutex> lock(mutex_);
    changed_.wait(lock, [this] { return pending_.size() < kMaxPending; });
    pending_.push_back(std::move(filling_));
    if (spare_.empty()) {
        filling_ = Block();
    } else {
        filling_ = std::move(spare_.back());
        spare_.pop_back();
    }
    lock.unlock();
    changed_.notify_all();
}

void DigestPipe::feed(const char* bytes, size_t size) {
    while (size > 0) {
        if (filling_.capacity() < kBlockSize) {
            filling_.reserve(kBlockSize);
        }
        const size_t room = kBlockSize - filling_.size();
        const size_t taken = size < room ? size : room;
        filling_.insert(filling_.end(), bytes, bytes + taken);
        bytes += taken;
        size -= taken;
        if (filling_.size() == kBlockSize) {
            submit();
        }
    }
}

std::string DigestPipe::finish() {
    if (!filling_.empty()) {
        submit();
    }
    stop();
    unsigned char bytes[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    if (!ok_ || EVP_DigestFinal_ex(ctx_, bytes, &length) != 1) {
        ok_ = false;
        return "";
    }
    ok_ = false;
    static const char kHex[] = "0123456789abcdef";
    std::string hex;
    for (unsigned int i = 0; i < length; ++i) {
        hex += kHex[bytes[i] >> 4];
        hex += kHex[bytes[i] & 0xF];
    }
    return hex;
}

}  // namespace CORVPackageTool
