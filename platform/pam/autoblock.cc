// The autoblock state: small files under one lock.
#include "autoblock.h"

#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace corvpam {

namespace {

const char kHex[] = "0123456789abcdef";

std::string KeyOf(const std::string& subject) {
    std::string key;
    for (unsigned char c : subject) {
        key += kHex[c >> 4];
        key += kHex[c & 0x0F];
    }
    return key;
}

std::string FailPath(const std::string& subject) {
    return std::string(AUTOBLOCK_STATE_DIR) + "/fail/" + KeyOf(subject);
}
std::string DenyPath(const std::string& subject) {
    return std::string(AUTOBLOCK_STATE_DIR) + "/deny/" + KeyOf(subject);
}

// Holds the state's lock while alive; `ok` is false when the state directory can't be made.
class StateLock {
  public:
    StateLock() : fd_(-1) {
        const std::string dir = AUTOBLOCK_STATE_DIR;
        for (const std::string& path : {dir, dir + "/fail", dir + "/deny"}) {
            if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
                return;
            }
        }
        fd_ = open((dir + "/.lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        if (fd_ >= 0 && flock(fd_, LOCK_EX) != 0) {
            close(fd_);
            fd_ = -1;
        }
    }
    ~StateLock() {
        if (fd_ >= 0) {
            close(fd_);
        }
    }
    StateLock(const StateLock&) = delete;
    StateLock& operator=(const StateLock&) = delete;
    bool ok() const { return fd_ >= 0; }

  private:
    int fd_;
};

// The value of `key` in a key="value" file; "" when missing.
std::string ConfValue(const std::string& text, const std::string& key) {
    std::istringstream lines(text);
    std::string line;
    std::string value;
    while (std::getline(lines, line)) {
        const size_t eq = line.find('=');
        if (eq == std::string::npos || line.compare(0, eq, key) != 0) {
            continue;
        }
        value = line.substr(eq + 1);
        if (value.size() >= 2 && value.front() == '"' && value.back() == '"') {
            value = value.substr(1, value.size() - 2);
        }
    }
    return value;
}

long Number(const std::string& text, long fallback, bool zeroAllowed) {
    char* end = nullptr;
    const long value = strtol(text.c_str(), &end, 10);
    if (text.empty() || *end != '\0' || value < 0 || (value == 0 && !zeroAllowed)) {
        return fallback;
    }
    return value;
}

bool WriteWhole(const std::string& path, const std::string& content) {
    const std::string tmp = path + ".new";
    {
        std::ofstream out(tmp, std::ios::trunc);
        out << content;
        if (!out.flush()) {
            return false;
        }
    }
    return rename(tmp.c_str(), path.c_str()) == 0;
}

}  // namespace

AutoblockPolicy LoadPolicy() {
    AutoblockPolicy policy;
    std::ifstream in(AUTOBLOCK_CONF);
    if (!in) {
        return policy;
    }
    std::stringstream text;
    text << in.rdbuf();
    policy.enabled = ConfValue(text.str(), "enable") != "no";
    policy.attempts = static_cast<int>(Number(ConfValue(text.str(), "attempts"), 5, false));
    policy.withinSeconds = 60 * Number(ConfValue(text.str(), "within_mins"), 5, false);
    policy.expireSeconds = 86400 * Number(ConfValue(text.str(), "expire_days"), 0, true);
    return policy;
}

std::string UserSubject(const std::string& user) {
    return "user:" + user;
}
std::string HostSubject(const std::string& host) {
    return "host:" + host;
}

bool IsBlocked(const std::string& subject, time_t now, const AutoblockPolicy& policy) {
    if (!policy.enabled) {
        return false;
    }
    std::ifstream in(DenyPath(subject));
    if (!in) {
        return false;
    }
    std::string name;
    long since = 0;
    std::getline(in, name);
    in >> since;
    if (policy.expireSeconds > 0 && now - since >= policy.expireSeconds) {
        StateLock lock;
        unlink(DenyPath(subject).c_str());
        return false;
    }
    return true;
}

bool RecordFailure(const std::string& subject, time_t now, const AutoblockPolicy& policy) {
    StateLock lock;
    if (!lock.ok()) {
        return false;
    }
    std::vector<long> recent;
    {
        std::ifstream in(FailPath(subject));
        for (long at = 0; in >> at;) {
            if (now - at < policy.withinSeconds) {
                recent.push_back(at);
            }
        }
    }
    recent.push_back(now);
    std::string content;
    for (long at : recent) {
        content += std::to_string(at) + "\n";
    }
    if (!WriteWhole(FailPath(subject), content)) {
        return false;
    }
    if (!policy.enabled || static_cast<int>(recent.size()) < policy.attempts) {
        return false;
    }
    return WriteWhole(DenyPath(subject), subject + "\n" + std::to_string(now) + "\n");
}

void ClearFailures(const std::string& subject) {
    StateLock lock;
    unlink(FailPath(subject).c_str());
}

}  // namespace corvpam
