// Feasibility checks of the reference platform: before the system does something drastic
// (power off, reboot, OS upgrade, volume removal), it asks every installed check of that
// type whether it may. A check is a config file in the type's config directory,
// /usr/local/share/feasibilitycheck/<type>.d/<name>.cfg, one JSON object with "plugin"
// (absolute path of a program), "task", "type", "version" and optional "task_i18n".
// Programs conventionally live in the matching /usr/local/bin/feasibilitycheck/<type>.d/.
// The checker, /usr/corv/bin/corv-feasibility-check <type>, runs every plug-in of the
// type with the type as its argument: exit 0 means feasible, anything else not, and its
// first output line is the reason.
#pragma once

// The check types: "poweroff", "reboot", "upgrade", "volume-remove".
// `flags` 2 asks for the config directory of the type, which goes into `buffer`.
// 0 for a valid type; -1 with ERR_BAD_PARAMETERS (unknown type, bad arguments) or
// ERR_BUF_TOO_SMALL.
int CORVFeasibilityCheckTypeValidate(const char* type, int flags, char* buffer, int size);
