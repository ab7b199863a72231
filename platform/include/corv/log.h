// The one logging path of the library and the platform: syslog lines that start with
// "<source file>:<line> " so that a line reads as its own locator.
#pragma once

#include <syslog.h>

#include <functional>
#include <string>

// Formats and sends one line to syslog. When the environment has CORVPKG_LOG_STDERR set
// (to anything), the line is also written to standard error; when a sink is installed
// it also receives the formatted line.
void CORVLog(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));

// Installs (or, with an empty function, removes) a process-wide receiver of every line.
// Tests use it to check what was logged. Not thread-safe against concurrent logging.
void CORVLogSetSink(std::function<void(int priority, const std::string& line)> sink);

#ifdef __FILE_NAME__
#define CORV_SRC_FILE __FILE_NAME__
#else
#define CORV_SRC_FILE __FILE__
#endif

// Failures: priority 3 (error).
#define CORV_LOG_ERR(fmt, ...) CORVLog(LOG_ERR, "%s:%d " fmt, CORV_SRC_FILE, __LINE__, ##__VA_ARGS__)
// Any priority, same prefix.
#define CORV_LOG(prio, fmt, ...) CORVLog((prio), "%s:%d " fmt, CORV_SRC_FILE, __LINE__, ##__VA_ARGS__)
