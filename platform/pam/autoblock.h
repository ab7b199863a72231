// The reference platform's autoblock: sign-in failures counted per account and per remote
// host, and a block once too many come too fast. Shared by the platform's PAM modules.
//
// Policy, a key-value file AUTOBLOCK_CONF (every key optional):
//   enable="yes"        "no" turns blocking off; failures are still counted
//   attempts="5"        failures within the window that block the subject
//   within_mins="5"     the window
//   expire_days="0"     how long a block lasts; 0: until it is lifted
// State under AUTOBLOCK_STATE_DIR: fail/<key> holds the times of the subject's recent
// failures, one a line; deny/<key> exists while the subject is blocked and holds the
// subject and the time of the block. <key> is the subject in hexadecimal, so that no name
// can reach outside the directory. All changes happen under an flock of .lock there.
#pragma once

#include <time.h>

#include <string>

#define AUTOBLOCK_CONF "/usr/corv/etc/autoblock.conf"
#define AUTOBLOCK_STATE_DIR "/var/lib/corv-autoblock"

namespace corvpam {

struct AutoblockPolicy {
    bool enabled = true;
    int attempts = 5;
    long withinSeconds = 300;
    long expireSeconds = 0;
};

// The policy of AUTOBLOCK_CONF; the defaults above where the file or a key is missing or
// a number is not a positive one (0 is accepted for expire_days).
AutoblockPolicy LoadPolicy();

// "user:<name>" and "host:<address>": what failures are counted against.
std::string UserSubject(const std::string& user);
std::string HostSubject(const std::string& host);

// Whether `subject` is blocked at `now` (a block past its expiry is lifted here).
bool IsBlocked(const std::string& subject, time_t now, const AutoblockPolicy& policy);
// Counts one failure; true when that blocks the subject. False too when the state can't
// be written: a failure to count must not lock anyone out.
bool RecordFailure(const std::string& subject, time_t now, const AutoblockPolicy& policy);
// Forgets the subject's failures (a sign-in succeeded); a block stays.
void ClearFailures(const std::string& subject);

}  // namespace corvpam
