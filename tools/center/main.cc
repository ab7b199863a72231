// corv-center: the Package Center, a web page over libcorvpkg for the administrators.
#include <limits.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "server.h"
#include "tasks.h"

namespace {

const char kUsage[] =
    "usage: corv-center [--listen ADDR:PORT] [--www DIR] [--state DIR]\n"
    "                   [--pam-service NAME] [--max-upload MIB] [--session-minutes N]\n"
    "       corv-center --help\n"
    "\n"
    "The Package Center: a web page to install packages from the stores or from a file,\n"
    "answer their wizards, start, stop, upgrade and uninstall them. Only local users in\n"
    "the group \"administrators\" may log in, with their password checked by Linux-PAM.\n"
    "\n"
    "  --listen ADDR:PORT   where to listen (default 127.0.0.1:8490, this machine only;\n"
    "                       port 0 picks a free one). The first line on standard output\n"
    "                       is \"listening on http://ADDR:PORT\".\n"
    "  --www DIR            the page's files (default: those of the installation)\n"
    "  --state DIR          where tasks keep their files (default /var/tmp/corv-center)\n"
    "  --pam-service NAME   the PAM service that checks passwords (default corv-center,\n"
    "                       /etc/pam.d/corv-center)\n"
    "  --max-upload MIB     the largest package file accepted from the page (default 256)\n"
    "  --session-minutes N  a session ends after N minutes without a request (default 30)\n"
    "Exit status: 2 when it cannot start; else it runs until killed.\n";

int usageError(const std::string& message) {
    fprintf(stderr, "corv-center: %s\n\n%s", message.c_str(), kUsage);
    return 2;
}

bool positiveNumber(const std::string& text, unsigned long long& out) {
    char* end = nullptr;
    out = strtoull(text.c_str(), &end, 10);
    return !text.empty() && *end == '\0' && out > 0 && out < (1ULL << 20);
}

std::string selfPath() {
    char path[PATH_MAX];
    ssize_t length = readlink("/proc/self/exe", path, sizeof path - 1);
    return length > 0 ? std::string(path, static_cast<size_t>(length)) : "";
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.size() == 2 && args[0] == "--worker") {
        return center::runWorker(args[1]);
    }
    center::CenterOptions options;
    // Installed, the page lies in the data directory; run from the build tree, in the
    // sources.
    options.www =
        access(CORV_CENTER_WWW "/index.html", R_OK) == 0 ? CORV_CENTER_WWW : CORV_CENTER_SOURCE_WWW;
    options.program = selfPath();
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string& arg = args[i];
        if (arg == "--help") {
            printf("%s", kUsage);
            return 0;
        }
        if (i + 1 >= args.size()) {
            return usageError(arg == "--listen" || arg == "--www" || arg == "--state" ||
                                      arg == "--pam-service" || arg == "--max-upload" ||
                                      arg == "--session-minutes"
                                  ? arg + " needs a value"
                                  : "unknown argument " + arg);
        }
        const std::string value = args[++i];
        unsigned long long number = 0;
        if (arg == "--listen") {
            options.listen = value;
        } else if (arg == "--www") {
            options.www = value;
        } else if (arg == "--state") {
            options.state = value;
        } else if (arg == "--pam-service") {
            options.pamService = value;
        } else if (arg == "--max-upload" && positiveNumber(value, number)) {
            options.maxUpload = number << 20;
        } else if (arg == "--session-minutes" && positiveNumber(value, number)) {
            options.sessionMinutes = static_cast<int>(number);
        } else {
            return usageError("bad argument " + arg + " " + value);
        }
    }
    if (options.program.empty()) {
        return usageError("cannot find this program's own path");
    }
    signal(SIGPIPE, SIG_IGN);
    return center::serveCenter(options);
}
