// Fault requests of the test builds; see corv/fault.h.
#include "corv/fault.h"

#ifdef CORVPKG_FAULT_INJECTION

#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "io_util.h"

namespace {

std::string fillDir() {
    const char* dir = getenv("CORVPKG_FAULT_FILL");
    return dir != nullptr && *dir != '\0' ? dir : "/volume1";
}

void trace(const std::string& entry) {
    const char* path = getenv("CORVPKG_FAULT_TRACE");
    if (path == nullptr || *path == '\0') {
        return;
    }
    struct statvfs fs {};
    const unsigned long long freeBytes =
        statvfs(fillDir().c_str(), &fs) == 0
            ? static_cast<unsigned long long>(fs.f_bavail) * fs.f_frsize
            : 0;
    corvplat::UniqueFd fd(open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
    if (fd.get() >= 0) {
        const std::string line = entry + "\t" + std::to_string(freeBytes) + "\n";
        (void)!write(fd.get(), line.data(), line.size());
    }
}

// Writes zeros until the file system says it is full; what is written stays.
void fillVolume() {
    const std::string path = fillDir() + "/" CORV_FAULT_FILL_FILE;
    corvplat::UniqueFd fd(open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    if (fd.get() < 0) {
        return;
    }
    static char block[1 << 16];
    size_t size = sizeof(block);
    while (size > 0) {
        if (write(fd.get(), block, size) < 0) {
            size /= 2;  // the last blocks go in smaller pieces until not a byte fits
        }
    }
}

}  // namespace

bool CORVFaultAt(const char* road, const char* step) {
    const std::string entry = std::string(road) + ":" + step;
    trace(entry);
    const char* request = getenv("CORVPKG_FAULT");
    if (request == nullptr || strncmp(request, (entry + ":").c_str(), entry.size() + 1) != 0) {
        return false;
    }
    const std::string action = request + entry.size() + 1;
    if (action == "kill") {
        kill(getpid(), SIGKILL);
    } else if (action == "fill") {
        fillVolume();
    } else if (action == "fail") {
        CORV_LOG_ERR("Step %s fails on request", entry.c_str());
        return true;
    }
    return false;
}

int CORVFaultSeconds(const char* name, int seconds) {
    const char* request = getenv("CORVPKG_FAULT_SECONDS");
    const size_t length = strlen(name);
    if (request == nullptr || strncmp(request, name, length) != 0 || request[length] != '=') {
        return seconds;
    }
    return atoi(request + length + 1);
}

#else

bool CORVFaultAt(const char*, const char*) {
    return false;
}

int CORVFaultSeconds(const char*, int seconds) {
    return seconds;
}

#endif
