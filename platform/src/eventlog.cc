// The system event log as a text file.
#include "corv/eventlog.h"

#include <fcntl.h>
#include <stdio.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"
#include "corv/vlibc.h"

namespace {

constexpr const char* kEventLog = "/var/log/corvevents.log";

struct EventText {
    unsigned int event;
    const char* text;  // %1..%4 stand for the arguments
};

const EventText kEvents[] = {
    {0x13700001, "Package [%1] was installed."},
    {0x13700002, "Failed to install package [%1]."},
    {0x13700003, "Package [%1] was upgraded."},
    {0x13700004, "Failed to upgrade package [%1]."},
    {0x13700005, "Package [%1] was repaired."},
    {0x13700006, "Failed to repair package [%1]."},
    {0x13700007, "Package [%1] was uninstalled."},
    {0x13700008, "Failed to uninstall package [%1]."},
    {0x13700009, "Shared folder [%1] was created for package [%2]."},
};

std::string flat(const char* arg) {
    std::string out = arg != nullptr ? arg : "";
    for (char& c : out) {
        if (c == '\t' || c == '\n' || c == '\r') {
            c = ' ';
        }
    }
    return out;
}

std::string eventText(unsigned int event, const std::string (&args)[4]) {
    for (const EventText& known : kEvents) {
        if (known.event != event) {
            continue;
        }
        std::string out;
        for (const char* p = known.text; *p != '\0'; ++p) {
            if (p[0] == '%' && p[1] >= '1' && p[1] <= '4') {
                out += args[p[1] - '1'];
                ++p;
            } else {
                out += *p;
            }
        }
        return out;
    }
    std::string out;
    for (const std::string& arg : args) {
        if (!arg.empty()) {
            out += out.empty() ? "" : " ";
            out += arg;
        }
    }
    return out;
}

std::string name(int value, const char* one, const char* two, const char* three) {
    switch (value) {
        case 1:
            return one;
        case 2:
            return two;
        case 3:
            return three;
        default:
            return std::to_string(value);
    }
}

}  // namespace

int CORVLogSet1(int category, int level, unsigned int event, const char* arg1, const char* arg2,
                const char* arg3, const char* arg4) {
    const std::string args[4] = {flat(arg1), flat(arg2), flat(arg3), flat(arg4)};
    char when[32] = "";
    time_t now = time(nullptr);
    struct tm tm {};
    if (gmtime_r(&now, &tm) != nullptr) {
        strftime(when, sizeof(when), "%Y-%m-%dT%H:%M:%SZ", &tm);
    }
    char code[16];
    snprintf(code, sizeof(code), "0x%08X", event);
    std::string line = std::string(when) + "\t" + name(category, "system", "package", "3") + "\t" +
                       name(level, "info", "warning", "error") + "\t" + code + "\t" +
                       eventText(event, args) + "\n";
    // One write of the whole line on an O_APPEND descriptor keeps lines of concurrent
    // writers whole.
    int fd = open(kEventLog, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to open %s, %m", kEventLog);
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    ssize_t written = write(fd, line.data(), line.size());
    close(fd);
    if (written != static_cast<ssize_t>(line.size())) {
        CORV_LOG_ERR("Failed to write %s, %m", kEventLog);
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    return 0;
}
