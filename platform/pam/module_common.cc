#include "module_common.h"

#include <security/pam_ext.h>
#include <stdarg.h>
#include <string.h>
#include <syslog.h>

namespace corvpam {

namespace {

std::string Unbracket(const char* arg) {
    std::string text = arg == nullptr ? "" : arg;
    if (text.size() >= 2 && text.front() == '[' && text.back() == ']') {
        text = text.substr(1, text.size() - 2);
    }
    return text;
}

}  // namespace

LoggerArgs ParseLoggerArgs(int argc, const char** argv) {
    LoggerArgs args;
    for (int i = 0; i < argc; ++i) {
        if (strcmp(argv[i], "log=no") == 0) {
            args.log = false;
        } else if (args.service.empty()) {
            args.service = Unbracket(argv[i]);
        }
    }
    return args;
}

std::string FirstArg(int argc, const char** argv) {
    return argc > 0 ? Unbracket(argv[0]) : "";
}

std::string UserOf(pam_handle_t* pamh) {
    const char* user = nullptr;
    if (pam_get_user(pamh, &user, nullptr) != PAM_SUCCESS || user == nullptr) {
        return "";
    }
    return user;
}

std::string RemoteHostOf(pam_handle_t* pamh) {
    const void* host = nullptr;
    if (pam_get_item(pamh, PAM_RHOST, &host) != PAM_SUCCESS || host == nullptr) {
        return "";
    }
    return static_cast<const char*>(host);
}

void AuthLog(int priority, const char* format, ...) {
    va_list args;
    va_start(args, format);
    vsyslog(LOG_AUTHPRIV | priority, format, args);
    va_end(args);
}

}  // namespace corvpam
