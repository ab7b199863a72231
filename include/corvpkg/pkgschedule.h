// The scheduled look for package updates: its scheduler job and the settings that decide
// whether it exists.
//
// The settings are "yes"/"no" keys of /etc/corvinfo.conf, compared without regard to case:
// upgrade_pkg_nos_notification, upgrade_pkg_email_notification and
// enable_pkg_autoupdate_all; a missing key is off. The job is the platform scheduler's
// system job "autopkgupgrade", which runs the package tool's update check on some days of
// the week at a time the scheduler picks.
#pragma once

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// One weekly schedule. Zero the whole record before filling it in.
struct CORVSCHEDULE {
    int week;        // bit n set: run on day n (0 Sunday to 6 Saturday); negative is invalid
    char cmd[1024];  // the command the job runs, NUL-terminated
};

// Week patterns of the update check: days 1, 2, 3, 4, 6 and days 0, 1, 2, 3, 5. A device
// takes one of them at random, so that devices do not all ask the stores on the same days.
constexpr int PKG_SCHEDULE_WEEK_A = 0x5e;
constexpr int PKG_SCHEDULE_WEEK_B = 0x2f;

// Saves the "autopkgupgrade" job for `schedule`'s days and command. An existing job is
// kept as it is (true, nothing changed), so a device keeps its days. False for a null
// `schedule`, a negative week flag, or a job the scheduler refuses to save (logged).
CORVPKG_API bool PMSCORVCrondSet(CORVSCHEDULE* schedule);
// Removes the "autopkgupgrade" job; a missing job is success. False when the scheduler
// cannot remove it.
CORVPKG_API bool PMSCORVCrondRemove();
// Stores the update settings and makes the job follow them. Each argument is 1 for on, -1
// to leave the stored value, anything else for off. The job is wanted while any
// notification is on (stored or given) or automatic update is turned on (given 1, or
// stored "yes" when `autoUpdate` is -1); otherwise it is removed. Then each argument that
// is not -1 is written as "yes" or "no". False, logged, when the job cannot be set or
// removed (no setting written then) or when a setting cannot be written (the earlier
// ones stay).
CORVPKG_API bool PMSSavaSchedule(int nosNotify, int emailNotify, int autoUpdate);
// A device that has neither notification setting gets the defaults: desktop notification
// on, mail off, automatic update untouched, and the job. A device with either setting is
// left alone.
CORVPKG_API void PMSSavaDefNotify();

}  // namespace CORVPackageTool
