// pam_corv_log_success.so (auth, account): reached when an account source succeeded.
// A sign-in forgets the account's and the host's counted failures and is logged unless
// "log=no"; the account check only passes. Arguments: "[<service>]", optionally "log=no".
#include <security/pam_modules.h>
#include <syslog.h>

#include "autoblock.h"
#include "module_common.h"

extern "C" {

PAM_EXTERN int pam_sm_authenticate(pam_handle_t* pamh, int /*flags*/, int argc, const char** argv) {
    const corvpam::LoggerArgs args = corvpam::ParseLoggerArgs(argc, argv);
    const std::string user = corvpam::UserOf(pamh);
    const std::string host = corvpam::RemoteHostOf(pamh);
    if (!user.empty()) {
        corvpam::ClearFailures(corvpam::UserSubject(user));
    }
    if (!host.empty()) {
        corvpam::ClearFailures(corvpam::HostSubject(host));
    }
    if (args.log) {
        corvpam::AuthLog(LOG_INFO, "User [%s] from [%s] signed in to [%s]", user.c_str(),
                         host.empty() ? "localhost" : host.c_str(), args.service.c_str());
    }
    return PAM_SUCCESS;
}

PAM_EXTERN int pam_sm_setcred(pam_handle_t* /*pamh*/, int /*flags*/, int /*argc*/,
                              const char** /*argv*/) {
    return PAM_SUCCESS;
}

PAM_EXTERN int pam_sm_acct_mgmt(pam_handle_t* /*pamh*/, int /*flags*/, int /*argc*/,
                                const char** /*argv*/) {
    return PAM_SUCCESS;
}

}  // extern "C"
