// pam_corv_autoblock.so (auth): refuses an account or a remote host that the autoblock
// has blocked, before any password is asked for. Takes no arguments.
#include <security/pam_modules.h>
#include <syslog.h>
#include <time.h>

#include "autoblock.h"
#include "module_common.h"

extern "C" {

PAM_EXTERN int pam_sm_authenticate(pam_handle_t* pamh, int /*flags*/, int /*argc*/,
                                   const char** /*argv*/) {
    const std::string user = corvpam::UserOf(pamh);
    if (user.empty()) {
        return PAM_USER_UNKNOWN;
    }
    const std::string host = corvpam::RemoteHostOf(pamh);
    const corvpam::AutoblockPolicy policy = corvpam::LoadPolicy();
    const time_t now = time(nullptr);
    const bool blocked =
        corvpam::IsBlocked(corvpam::UserSubject(user), now, policy) ||
        (!host.empty() && corvpam::IsBlocked(corvpam::HostSubject(host), now, policy));
    if (blocked) {
        corvpam::AuthLog(LOG_WARNING, "User [%s] from [%s] is blocked", user.c_str(),
                         host.empty() ? "localhost" : host.c_str());
        return PAM_MAXTRIES;
    }
    return PAM_SUCCESS;
}

PAM_EXTERN int pam_sm_setcred(pam_handle_t* /*pamh*/, int /*flags*/, int /*argc*/,
                              const char** /*argv*/) {
    return PAM_SUCCESS;
}

}  // extern "C"
