// pam_corv_log_fail.so (auth, account): reached when every account source failed. Counts
// the failure for the autoblock (auth only), logs it unless "log=no", and fails.
// Arguments: "[<service>]" and optionally "log=no".
#include <security/pam_modules.h>
#include <syslog.h>
#include <time.h>

#include "autoblock.h"
#include "module_common.h"

namespace {

void Report(pam_handle_t* pamh, int argc, const char** argv, const char* what) {
    const corvpam::LoggerArgs args = corvpam::ParseLoggerArgs(argc, argv);
    if (!args.log) {
        return;
    }
    const std::string host = corvpam::RemoteHostOf(pamh);
    corvpam::AuthLog(LOG_WARNING, "User [%s] from [%s] failed to %s [%s]",
                     corvpam::UserOf(pamh).c_str(), host.empty() ? "localhost" : host.c_str(), what,
                     args.service.c_str());
}

}  // namespace

extern "C" {

PAM_EXTERN int pam_sm_authenticate(pam_handle_t* pamh, int /*flags*/, int argc, const char** argv) {
    const std::string user = corvpam::UserOf(pamh);
    const std::string host = corvpam::RemoteHostOf(pamh);
    const corvpam::AutoblockPolicy policy = corvpam::LoadPolicy();
    const time_t now = time(nullptr);
    bool blocked = !user.empty() && corvpam::RecordFailure(corvpam::UserSubject(user), now, policy);
    if (!host.empty() && corvpam::RecordFailure(corvpam::HostSubject(host), now, policy)) {
        blocked = true;
    }
    Report(pamh, argc, argv, "sign in to");
    if (blocked) {
        corvpam::AuthLog(LOG_WARNING, "User [%s] from [%s] blocked after too many failures",
                         user.c_str(), host.empty() ? "localhost" : host.c_str());
    }
    return PAM_AUTH_ERR;
}

PAM_EXTERN int pam_sm_setcred(pam_handle_t* /*pamh*/, int /*flags*/, int /*argc*/,
                              const char** /*argv*/) {
    return PAM_SUCCESS;
}

PAM_EXTERN int pam_sm_acct_mgmt(pam_handle_t* pamh, int /*flags*/, int argc, const char** argv) {
    Report(pamh, argc, argv, "pass the account check of");
    return PAM_PERM_DENIED;
}

}  // extern "C"
