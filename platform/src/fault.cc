// Fault requests of the test builds; see corv/fault.h.
#include "corv/fault.h"

#ifdef CORVPKG_FAULT_INJECTION

#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "io_util.h"

namespace {

void trace(const std::string& entry) {
    const char* path = getenv("CORVPKG_FAULT_TRACE");
    if (path == nullptr || *path == '\0') {
        return;
    }
    corvplat::UniqueFd fd(open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
    if (fd.get() >= 0) {
        const std::string line = entry + "\n";
        (void)!write(fd.get(), line.data(), line.size());
    }
}

// Writes zeros until the file system says it is full; what is written stays.
void fillVolume() {
    const char* dir = getenv("CORVPKG_FAULT_FILL");
    const std::string path =
        std::string(dir != nullptr && *dir != '\0' ? dir : "/volume1") + "/" CORV_FAULT_FILL_FILE;
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

#else

bool CORVFaultAt(const char*, const char*) {
    return false;
}

#endif
