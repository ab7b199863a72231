#include "corv/log.h"

#include <errno.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>

#include <utility>

namespace {
std::function<void(int, const std::string&)>& sink() {
    static std::function<void(int, const std::string&)> s;
    return s;
}
}  // namespace

void CORVLogSetSink(std::function<void(int priority, const std::string& line)> s) {
    sink() = std::move(s);
}

void CORVLog(int priority, const char* format, ...) {
    // %m must see the errno of the failure being reported, before anything else runs.
    int savedErrno = errno;
    char line[4096];
    va_list ap;
    va_start(ap, format);
    errno = savedErrno;
    vsnprintf(line, sizeof(line), format, ap);
    va_end(ap);
    syslog(priority, "%s", line);
    if (getenv("CORVPKG_LOG_STDERR") != nullptr) {
        fprintf(stderr, "%s\n", line);
    }
    if (sink()) {
        sink()(priority, line);
    }
    errno = savedErrno;
}
