// The system event log: what an administrator reads to learn what happened to the
// machine. The reference platform keeps it as /var/log/corvevents.log, one event a line:
//   <UTC time, ISO 8601>\t<category>\t<level>\t0x<event, 8 hex digits>\t<text>
// The text is the event's sentence with its arguments in place when the event is known
// (the package manager's events 0x13700001-0x13700009), else the non-empty arguments
// separated by blanks. Tabs and newlines in arguments are written as blanks.
#pragma once

// Category 1 system, 2 packages (others are written as numbers); level 1 information,
// 2 warning, 3 error. The four strings may be null. 0, or -1 with ERR_WRITE_FAILED.
int CORVLogSet1(int category, int level, unsigned int event, const char* arg1, const char* arg2,
                const char* arg3, const char* arg4);
