// What an operation shows while it runs, on standard error: one line per phase (checking,
// unpacking, scripts, starting ...), on a terminal redrawn in place with a bar and bytes
// while the payload unpacks; through a pipe the same phases as plain lines. The library
// tells its steps only through the operations log and the package's progress file, so
// those are followed. -v adds the command trace, -q and --json show nothing.
#pragma once

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <set>
#include <string>
#include <thread>

namespace cli {

class ProgressDisplay {
  public:
    // `operation` is the command's name; `unpackBytes` is what unpacking writes in all
    // (0: unknown, no bar).
    ProgressDisplay(std::string operation, unsigned long long unpackBytes = 0);
    ~ProgressDisplay();
    ProgressDisplay(const ProgressDisplay&) = delete;
    ProgressDisplay& operator=(const ProgressDisplay&) = delete;

    // Shows a phase that the command itself runs, such as "checking".
    void phase(const std::string& name);
    // Follows the library's work on `package` from now on, until the object goes.
    void follow(const std::string& package);
    // Stops following and ends the display's line; the destructor does it too.
    void finish();
    // Ends the line being redrawn, so that other text (a question) starts on its own line.
    void breakLine();

  private:
    void loop();
    void poll();
    void readLog();
    void checkLock();
    void show(const std::string& phase, const std::string& detail);
    void redraw();
    void endLine();
    unsigned long long unpackedSoFar() const;

    std::string package_;
    const std::string operation_;
    const unsigned long long unpackBytes_;
    const bool terminal_;
    const bool enabled_;
    const bool trace_;
    std::string progressPath_;
    std::string tmpDir_;
    std::set<std::string> tmpBefore_;
    long long logOffset_ = 0;
    std::string lastProgress_;
    std::string phase_;
    std::string detail_;
    bool lineOpen_ = false;
    bool lockShown_ = false;
    long long followedAt_ = 0;  // monotonic milliseconds
    int lockHolder_ = 0;
    long long lockSince_ = 0;
    std::mutex mutex_;
    std::condition_variable wake_;
    bool stop_ = false;
    std::thread thread_;
};

// What unpacking a package file writes: the file itself, then its payload package.tgz as
// its gzip trailer says. 0 when the file is not an uncompressed tar with that member.
unsigned long long unpackSizeOf(const std::string& cpkFile);

// The process that holds the package lock, and its command line; 0 when none other does.
int packageLockHolder(std::string& command);

}  // namespace cli
