// Service files of the reference platform, as the control functions of service_api.cc
// need them.
//
// A service is /usr/corv/etc/corvservice.d/<name>.cfg, a JSON object:
//   "init_job_map": {"upstart": ["job", ...]}   its init jobs, started in this order
//   "required_corvservice": ["service", ...]    optional: services it needs
//   "display_name": "text"                      optional: its name for people
//   any other member (e.g. "auto_start", "is_package") is kept but not read.
// Its run key (1 enabled, 2 disabled) is the member "runkey" of the JSON object in
// /usr/corv/etc/corvservice.override/<name>.cfg: set by the user, it outlives reboots,
// and goes with the service's other files when the service is removed.
#pragma once

#include <string>
#include <vector>

namespace CORVService {

constexpr char kOverrideDir[] = "/usr/corv/etc/corvservice.override";

// The init jobs that `name` stands for: those of its service file, or else the job of
// that name. 0, or -1 with ERR_NO_SUCH_FILE (neither exists), ERR_MALFORMED (the service
// file is bad) or ERR_BAD_PARAMETERS (not a possible name).
int ServiceJobs(const std::string& name, std::vector<std::string>* jobs);
// The run key of a service: 1, 2, or 0 when none was set (or it cannot be read).
int RunKeyGet(const std::string& name);

}  // namespace CORVService
