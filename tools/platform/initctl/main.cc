// initctl: the command line of the reference platform's init system, installed as
// /sbin/initctl. Jobs are /etc/init/<job>.conf; see platform/src/init_job.h for their
// syntax and platform/src/init_events.cc for what events do.
//
//   initctl status JOB          "JOB start/running, process N", "JOB stop/waiting" ...
//   initctl start JOB           starts it (pre-start, then the main process) and shows
//                               its status
//   initctl stop JOB            stops it (the main process, then post-stop)
//   initctl restart JOB         stop, then start
//   initctl reload JOB          its reload command, or a restart when it has none
//   initctl emit [--no-wait] EVENT [NAME=value]...
//                               records the event and starts and stops the jobs whose
//                               conditions it completes; --no-wait leaves that to
//                               processes of their own and returns at once
//   initctl check-config FILE   checks a job file (what /usr/bin/init-check.sh runs)
//   initctl list                every job and its status
//
// Exit status: 0 success; 1 failure (unknown job, invalid job file, failed transition),
// with the reason on standard error; 2 a usage error.
#include <stdio.h>
#include <string.h>

#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "init_job.h"

using namespace CORVInit;

namespace {

constexpr int kFailure = 1;
constexpr int kUsage = 2;

int usage() {
    fprintf(stderr,
            "usage: initctl status|start|stop|restart|reload JOB\n"
            "       initctl emit [--no-wait] EVENT [NAME=value]...\n"
            "       initctl check-config FILE\n"
            "       initctl list\n");
    return kUsage;
}

int failure(const std::string& message) {
    fprintf(stderr, "initctl: %s\n", message.c_str());
    return kFailure;
}

std::string errorText() {
    char text[64];
    snprintf(text, sizeof text, "error 0x%04X", VLIBCErrGet());
    return text;
}

// Loads the job for its message: a job file that does not parse is named with the line.
bool checkJob(const std::string& name, std::string* message) {
    Job job;
    bool manual = false;
    return LoadJob(name, &job, &manual, message) == 0;
}

int showStatus(const std::string& name) {
    std::string message;
    if (!checkJob(name, &message)) {
        return failure(message);
    }
    JobStatus status;
    if (JobStatusGet(name, &status) != 0) {
        return failure(name + ": cannot read its state (" + errorText() + ")");
    }
    printf("%s %s\n", name.c_str(), DescribeStatus(status).c_str());
    return 0;
}

int control(const std::string& verb, const std::string& name) {
    std::string message;
    if (!checkJob(name, &message)) {
        return failure(message);
    }
    int rc = 0;
    if (verb == "start") {
        rc = JobStart(name);
    } else if (verb == "stop") {
        rc = JobStop(name);
    } else if (verb == "restart") {
        rc = JobStop(name) == 0 ? JobStart(name) : -1;
    } else {
        rc = JobReload(name);
    }
    if (rc != 0) {
        return failure(name + ": failed to " + verb + " (" + errorText() + "); see " + kLogDir +
                       "/" + name + ".log");
    }
    return showStatus(name);
}

int emit(const std::vector<std::string>& args) {
    size_t first = 0;
    bool wait = true;
    if (!args.empty() && args[0] == "--no-wait") {
        wait = false;
        first = 1;
    }
    Event event;
    std::string message;
    if (!ParseEventWords(std::vector<std::string>(args.begin() + first, args.end()), &event,
                         &message)) {
        failure(message);
        return usage();
    }
    if (EmitEvent(event, wait) != 0) {
        return failure("event " + event.name + " failed (" + errorText() + ")");
    }
    return 0;
}

int list() {
    for (const std::string& name : ListJobs()) {
        std::string message;
        JobStatus status;
        if (!checkJob(name, &message)) {
            printf("%s invalid: %s\n", name.c_str(), message.c_str());
        } else if (JobStatusGet(name, &status) == 0) {
            printf("%s %s\n", name.c_str(), DescribeStatus(status).c_str());
        }
    }
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) {
        return usage();
    }
    const std::string command = argv[1];
    const std::vector<std::string> args(argv + 2, argv + argc);
    if (command == "status" && args.size() == 1) {
        return showStatus(args[0]);
    }
    if ((command == "start" || command == "stop" || command == "restart" || command == "reload") &&
        args.size() == 1) {
        return control(command, args[0]);
    }
    if (command == "emit" && !args.empty()) {
        return emit(args);
    }
    if (command == "check-config" && args.size() == 1) {
        std::string message;
        return CheckJobFile(args[0], &message) ? 0 : failure(message);
    }
    if (command == "list" && args.empty()) {
        return list();
    }
    return usage();
}
