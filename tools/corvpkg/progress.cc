#include "progress.h"

#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <system_error>

#include "cli.h"
#include "corvpkg/pkglog.h"
#include "corvpkg/pkgvolume.h"

namespace cli {

namespace fs = std::filesystem;

namespace {

const char kOperationsLog[] = "/var/log/corvpkg.log";
const char kPackageLock[] = "/tmp/lock/lock_pkg";
const long long kLockPatienceMs = 1000;

long long nowMs() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

// Bytes as a person reads them: KiB below one MiB, MiB with one decimal above.
std::string sizeText(unsigned long long bytes) {
    char text[32];
    if (bytes < (1ULL << 20)) {
        snprintf(text, sizeof(text), "%llu KiB", (bytes + 1023) / 1024);
    } else {
        snprintf(text, sizeof(text), "%.1f MiB", static_cast<double>(bytes) / (1024.0 * 1024.0));
    }
    return text;
}

// "install hello 1.0 Begin ..." and "start hello: begin to start ...": the second word names
// the package.
bool concerns(const std::string& message, const std::string& package) {
    std::istringstream words(message);
    std::string type, name;
    words >> type >> name;
    return name == package || name == package + ":";
}

bool endedWell(const std::string& message) {
    static const std::string kOk = " ret=[0]";
    return message.find(" End ") != std::string::npos && message.size() >= kOk.size() &&
           message.compare(message.size() - kOk.size(), kOk.size(), kOk) == 0;
}

std::string baseName(const std::string& path) {
    size_t slash = path.rfind('/');
    return slash == std::string::npos ? path : path.substr(slash + 1);
}

// The phase that a line of the operations log begins, with its detail; false for a line
// that begins none.
bool phaseOf(const std::string& message, const std::string& operation, std::string& phase,
             std::string& detail) {
    detail.clear();
    if (message.find(": begin to start") != std::string::npos) {
        phase = "starting";
        return true;
    }
    if (message.find(": begin to stop") != std::string::npos) {
        phase = "stopping";
        return true;
    }
    size_t begin = message.find(" Begin ");
    if (begin == std::string::npos) {
        return false;
    }
    std::string program = message.substr(begin + 7);
    program = program.substr(0, program.find(' '));
    if (!program.empty() && program.front() == '\'') {
        program = program.substr(1, program.size() - 2);
    }
    if (baseName(program) == "tar") {
        phase = "unpacking";
        return true;
    }
    if (program.find("/scripts/") != std::string::npos) {
        if (baseName(program) == "start-stop-status") {
            return false;
        }
        phase = "running scripts";
        detail = baseName(program);
        return true;
    }
    if (program == "/bin/rm" && operation == "uninstall") {
        phase = "removing files";
        return true;
    }
    return false;
}

// A number of a tar header field: octal digits, or base 256 when its top bit is set.
unsigned long long tarNumber(const unsigned char* field, size_t size) {
    unsigned long long value = 0;
    if (field[0] & 0x80) {
        for (size_t i = 1; i < size; ++i) {
            value = (value << 8) | field[i];
        }
        return value;
    }
    for (size_t i = 0; i < size && field[i]; ++i) {
        if (field[i] >= '0' && field[i] <= '7') {
            value = value * 8 + (field[i] - '0');
        }
    }
    return value;
}

}  // namespace

unsigned long long unpackSizeOf(const std::string& cpkFile) {
    std::ifstream in(cpkFile, std::ios::binary);
    unsigned char header[512];
    std::streamoff offset = 0;
    while (in.seekg(offset) && in.read(reinterpret_cast<char*>(header), sizeof(header))) {
        if (header[0] == 0) {
            return 0;  // the end of the archive
        }
        const std::string name(reinterpret_cast<char*>(header),
                               strnlen(reinterpret_cast<char*>(header), 100));
        const unsigned long long size = tarNumber(header + 124, 12);
        if ((name == "package.tgz" || name == "./package.tgz") && size >= 18) {
            unsigned char trailer[4];
            if (!in.seekg(offset + 512 + static_cast<std::streamoff>(size) - 4) ||
                !in.read(reinterpret_cast<char*>(trailer), sizeof(trailer))) {
                return 0;
            }
            // The unpacked length modulo 2^32, little-endian: payloads stay below that.
            const unsigned long long payload = trailer[0] | (trailer[1] << 8) | (trailer[2] << 16) |
                                               (static_cast<unsigned long long>(trailer[3]) << 24);
            std::error_code ec;
            return fs::file_size(cpkFile, ec) + payload;
        }
        offset += 512 + static_cast<std::streamoff>((size + 511) / 512 * 512);
    }
    return 0;
}

int packageLockHolder(std::string& command) {
    struct stat st {};
    if (stat(kPackageLock, &st) != 0) {
        return 0;
    }
    // "1: POSIX  ADVISORY  WRITE 1234 00:1a:5678 0 EOF": the pid, then device and inode.
    std::ifstream locks("/proc/locks");
    std::string line;
    const std::string inode = ":" + std::to_string(st.st_ino);
    while (std::getline(locks, line)) {
        std::istringstream fields(line);
        std::string id, kind, advisory, mode, pid, where;
        fields >> id >> kind;
        if (kind == "->") {  // a waiter, not a holder
            continue;
        }
        fields >> advisory >> mode >> pid >> where;
        if (where.size() < inode.size() ||
            where.compare(where.size() - inode.size(), inode.size(), inode) != 0) {
            continue;
        }
        const int holder = atoi(pid.c_str());
        if (holder <= 0 || holder == getpid()) {
            continue;
        }
        std::ifstream cmdline("/proc/" + pid + "/cmdline");
        std::string text((std::istreambuf_iterator<char>(cmdline)),
                         std::istreambuf_iterator<char>());
        while (!text.empty() && text.back() == '\0') {
            text.pop_back();
        }
        for (char& c : text) {
            c = c == '\0' ? ' ' : c;
        }
        // Its program by name only: "corvpkg install ..." whatever path it ran from.
        size_t space = text.find(' ');
        size_t slash = text.rfind('/', space);
        command = slash == std::string::npos ? text : text.substr(slash + 1);
        return holder;
    }
    return 0;
}

ProgressDisplay::ProgressDisplay(std::string operation, unsigned long long unpackBytes)
    : operation_(std::move(operation)),
      unpackBytes_(unpackBytes),
      terminal_(isatty(STDERR_FILENO) && !verbosity().verbose),
      enabled_(!verbosity().quiet && (!verbosity().json || verbosity().verbose)),
      trace_(verbosity().verbose) {
    if (!CORVPackageTool::PMSGetTmpDir(0, tmpDir_) &&
        !CORVPackageTool::PMSGetSystemTmpDir(0, tmpDir_)) {
        tmpDir_ = "/tmp";
    }
    std::error_code ec;
    for (const fs::directory_entry& entry : fs::directory_iterator(tmpDir_, ec)) {
        tmpBefore_.insert(entry.path().filename().string());
    }
}

ProgressDisplay::~ProgressDisplay() {
    finish();
}

void ProgressDisplay::finish() {
    if (thread_.joinable()) {
        {
            std::lock_guard<std::mutex> hold(mutex_);
            stop_ = true;
        }
        // Woken at once: the operation is over and must not wait out a polling pause.
        wake_.notify_one();
        thread_.join();
        poll();
    }
    std::lock_guard<std::mutex> hold(mutex_);
    endLine();
}

void ProgressDisplay::phase(const std::string& name) {
    std::lock_guard<std::mutex> hold(mutex_);
    show(name, "");
}

void ProgressDisplay::breakLine() {
    std::lock_guard<std::mutex> hold(mutex_);
    endLine();
}

void ProgressDisplay::follow(const std::string& package) {
    package_ = package;
    progressPath_ = CORVPackageTool::PMSGetProgressPath(package_);
    std::ifstream log(kOperationsLog, std::ios::ate);
    logOffset_ = log ? static_cast<long long>(log.tellg()) : 0;
    followedAt_ = nowMs();
    thread_ = std::thread([this] { loop(); });
}

void ProgressDisplay::loop() {
    std::unique_lock<std::mutex> hold(mutex_);
    while (!stop_) {
        hold.unlock();
        poll();
        hold.lock();
        wake_.wait_for(hold, std::chrono::milliseconds(100), [this] { return stop_; });
    }
}

void ProgressDisplay::poll() {
    readLog();
    std::ifstream file(progressPath_);
    std::stringstream text;
    text << file.rdbuf();
    std::lock_guard<std::mutex> hold(mutex_);
    if (trace_ && file && text.str() != lastProgress_ && !text.str().empty()) {
        lastProgress_ = text.str();
        fprintf(stderr, "  progress: %s\n", lastProgress_.c_str());
    }
    checkLock();
    if (terminal_ && enabled_ && phase_ == "unpacking") {
        redraw();
    }
}

void ProgressDisplay::readLog() {
    std::ifstream log(kOperationsLog);
    if (!log || !log.seekg(logOffset_)) {
        return;
    }
    std::string line;
    while (std::getline(log, line)) {
        logOffset_ += static_cast<long long>(line.size()) + 1;
        // "<time>\t<message>"; only the message says what happens. Other processes
        // write here too: only this operation's lines count.
        size_t tab = line.find('\t');
        const std::string message = tab == std::string::npos ? line : line.substr(tab + 1);
        std::lock_guard<std::mutex> hold(mutex_);
        if (trace_ && enabled_ && !endedWell(message)) {
            endLine();
            fprintf(stderr, "  %s\n", message.c_str());
        }
        std::string phase, detail;
        if (concerns(message, package_) && phaseOf(message, operation_, phase, detail)) {
            show(phase, detail);
        }
    }
}

void ProgressDisplay::checkLock() {
    // Only while nothing of this operation has begun: then the wait is for the lock.
    if (lockShown_ || !enabled_ || (!phase_.empty() && phase_ != "checking")) {
        return;
    }
    std::string command;
    const int holder = packageLockHolder(command);
    const long long now = nowMs();
    if (holder != lockHolder_) {
        lockHolder_ = holder;
        lockSince_ = now;
        return;
    }
    if (holder != 0 && now - lockSince_ >= kLockPatienceMs) {
        lockShown_ = true;
        show("waiting for the package lock (held by process " + std::to_string(holder) + ": " +
                 command + ")",
             "");
    }
}

void ProgressDisplay::show(const std::string& phase, const std::string& detail) {
    if (phase == phase_ && detail == detail_) {
        return;
    }
    if (!enabled_) {
        phase_ = phase;
        detail_ = detail;
        return;
    }
    if (phase != phase_) {
        endLine();
    }
    phase_ = phase;
    detail_ = detail;
    if (terminal_) {
        redraw();
    } else {
        fprintf(stderr, "%s%s%s\n", phase_.c_str(), detail_.empty() ? "" : ": ", detail_.c_str());
    }
}

void ProgressDisplay::redraw() {
    std::string text = phase_ + (detail_.empty() ? "" : ": " + detail_);
    if (phase_ == "unpacking") {
        const unsigned long long done = unpackedSoFar();
        if (unpackBytes_ > 0) {
            const unsigned long long shown = done < unpackBytes_ ? done : unpackBytes_;
            const int width = 24;
            const int filled = static_cast<int>(shown * width / unpackBytes_);
            text += "  [" + std::string(filled, '#') + std::string(width - filled, '.') + "] " +
                    sizeText(shown) + " of " + sizeText(unpackBytes_);
        } else {
            text += "  " + sizeText(done);
        }
    }
    fprintf(stderr, "\r\033[K%s", text.c_str());
    fflush(stderr);
    lineOpen_ = true;
}

void ProgressDisplay::endLine() {
    if (lineOpen_) {
        fputc('\n', stderr);
        lineOpen_ = false;
    }
}

// What the operation has unpacked: the files in the folders that appeared in the library's
// temporary folder since the display began.
unsigned long long ProgressDisplay::unpackedSoFar() const {
    unsigned long long total = 0;
    std::error_code ec;
    for (const fs::directory_entry& top : fs::directory_iterator(tmpDir_, ec)) {
        if (tmpBefore_.count(top.path().filename().string()) != 0) {
            continue;
        }
        std::error_code walk;
        for (fs::recursive_directory_iterator it(top.path(), walk), end; !walk && it != end;
             it.increment(walk)) {
            std::error_code size;
            if (it->is_regular_file(size) && !it->is_symlink(size)) {
                total += it->file_size(size);
            }
        }
    }
    return total;
}

}  // namespace cli
