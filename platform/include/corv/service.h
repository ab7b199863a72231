// The service manager of the reference platform: init jobs in the upstart syntax under
// /etc/init, their persistent state under /run, and services described by JSON files in
// /usr/corv/etc/corvservice.d. A package runs as the job "pkgctl-<name>" and is also the
// service of that name; system services ("pgsql", "nginx", "ssh-shell", "crond",
// "syslog-ng") are services whose jobs drive the real daemons.
//
// A `name` below is a service name or a job name: a service is started, stopped, paused
// and resumed through the jobs of its "init_job_map" (in their order to start, in reverse
// to stop); a name with no service file but a job file is that job itself. All functions
// return a negative number on failure with the cause in the thread's error slot (vlibc.h),
// and never throw. Common causes: ERR_NO_SUCH_FILE an unknown name, ERR_MALFORMED a job or
// service file that does not parse, ERR_NOT_APPLICABLE a job script that failed (its
// output is in /var/log/corv-init/<job>.log), ERR_TIMEOUT a script or a job's lock that
// took too long.
//
// Job syntax, events and initctl: platform/src/init_job.h, init_events.cc and
// tools/platform/initctl. A job's state (goal, phase, main pid, paused) lives in
// VLIB_SERVICE_STATE_DIR/<job>.state, changed only under the lock file <job>.lock there,
// so that any process may drive any job and two drivers take turns.
#pragma once

#include "corv/vlibc.h"

#define VLIB_INIT_JOB_DIR "/etc/init"
#define VLIB_SERVICE_CFG_DIR "/usr/corv/etc/corvservice.d"
#define VLIB_SERVICE_STATE_DIR "/run/corv/service"

// Job and service states of VLIBServiceStatusGet.
enum {
    VLIB_SERVICE_STATE_UNKNOWN = 0,
    VLIB_SERVICE_STATE_RUNNING = 1,
    VLIB_SERVICE_STATE_STOPPED = 2,  // at rest: stopped, never started, or paused
};

// Starts the jobs of `name` (pre-start, then the main process if the job has one, which
// stays supervised). 0 when running afterwards (also when it already ran); negative when a
// pre-start fails (the job stays stopped, its post-stop having run) or the job is unknown
// or invalid. A service starts whole or not at all: when one of its jobs fails, the jobs
// that this call started are stopped again.
int VLIBServiceStart(const char* name, int flags);
// Stops them (the end of the main process, then post-stop). 0 when stopped afterwards,
// also when post-stop failed (that is logged); negative when a main process survived
// SIGKILL.
int VLIBServiceStop(const char* name, int flags);
// Stops a running job but keeps its goal "start", so that VLIBServiceResume starts it
// again (shutdown and OS upgrade keep what ran). A job at rest is left at rest; 0.
int VLIBServicePause(const char* name);
// Starts a paused job; a job that was not paused is left alone. 0, or negative when the
// start fails.
int VLIBServiceResume(const char* name);
int VLIBServiceRestart(const char* name);
// Tells a running service to reload its configuration (its job's "reload" command, or a
// restart when it has none). A service that is not running is left alone: 0.
int VLIBServiceReload(const char* name);
// `*state` is one of VLIB_SERVICE_STATE_*: RUNNING when every job of the service runs,
// STOPPED otherwise. 0, or negative for an unknown name or an invalid job file.
int VLIBServiceStatusGet(const char* name, int* state);
// 1 running, 0 not (also for a service whose daemon is not installed).
int VLIBServiceIsRunning(const char* name);
// 1 when the job `name` is paused: held at rest by a shutdown or an upgrade that meant to
// bring it back. The pause is kept apart from the job's definition and outlives it. 0 when
// not paused, -1 when its state cannot be read.
int VLIBServiceIsPaused(const char* name);
// 1 when the service is enabled (its run key is 1, or it has none and is running).
int VLIBServiceIsEnabled(const char* name);
// The names of all services: the *.cfg files, sorted. Count, or negative.
int VLIBServiceEnum(PVLIBSZLIST* list);

// Checks a service file: a JSON object whose "init_job_map" is an object with a
// non-empty "upstart" array of job names, whose optional "required_corvservice" is an
// array of names and optional "display_name" a string. 0, or negative with ERR_MALFORMED
// (ERR_NO_SUCH_FILE when it cannot be read).
int VLIBServicecfgValidate(const char* path);
// The run key of a service: 1 enabled (starts with the system), 2 disabled. It is kept in
// /usr/corv/etc/corvservice.override/<name>.cfg ({"runkey": N}), so it outlives reboots.
// The service file must exist. 0 or negative.
int VLIBServicecfgRunKeySet(const char* name, int key);
// What a service needs: with `kind` 4, the init jobs of the service and of every service
// it requires, recursively, appended to `*list` unless already there. The number
// appended, or negative (also when a required service is unknown).
int VLIBServicecfgInfoGet(const char* name, int kind, PVLIBSZLIST* list);
// The display name of a service ("display_name" of its file, else its name). The length,
// or negative for an unknown service.
int VLIBServicecfgDisplayNameGet(const char* name, char* buffer, int size);

// Marks a job to start with its events (enable) or not (disable: `manual` in
// /etc/init/<job>.override). Starting it by name works either way. 0 or negative.
int VLIBServicectlJobEnable(const char* job);
int VLIBServicectlJobDisable(const char* job);
// 1 when a job of the service runs, 0 when not, negative on failure.
int VLIBServicectlIsJobRunning(const char* name, int flags);
