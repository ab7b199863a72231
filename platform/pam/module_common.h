// What the platform's PAM modules share: their arguments and who is signing in.
#pragma once

#include <security/pam_modules.h>

#include <string>

namespace corvpam {

// The arguments of a logger rule: "[<service>]" (or the service alone: PAM takes the
// brackets off) and optionally "log=no".
struct LoggerArgs {
    std::string service;
    bool log = true;
};
LoggerArgs ParseLoggerArgs(int argc, const char** argv);

// The first argument without its brackets; "" when there is none.
std::string FirstArg(int argc, const char** argv);

// The user signing in ("" when PAM has none) and the remote host ("" for a local sign-in).
std::string UserOf(pam_handle_t* pamh);
std::string RemoteHostOf(pam_handle_t* pamh);

// One line to the auth facility, tagged with the service that PAM runs for.
void AuthLog(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));

}  // namespace corvpam
