#include "store/digest_pipe.h"

#include <utility>

namespace CORVPackageTool {

namespace {

// Blocks of 1 MiB keep the two threads' hand-overs rare; four of them in flight bound the
// memory while the hashing thread catches up.
constexpr size_t kBlockSize = 1 << 20;
constexpr size_t kMaxPending = 4;

}  // namespace

DigestPipe::DigestPipe() = default;

DigestPipe::~DigestPipe() {
    stop();
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
    const bool ok = md5_.restart();
    if (ok) {
        thread_ = std::thread([this] { run(); });
    }
    return ok;
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
        md5_.update(block.data(), block.size());
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
    return md5_.hexDigest();
}

}  // namespace CORVPackageTool
