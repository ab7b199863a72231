// Runs a command a number of times and reports its median wall time and its peak memory
// (maximum resident set size), measured from outside with wait4(2):
//   bench_store ROUNDS LABEL PROGRAM [ARGS...]
// The command's standard output goes to /dev/null; a failing round ends the benchmark.
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

namespace {

double nowMs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return ts.tv_sec * 1e3 + ts.tv_nsec / 1e6;
}

// One run: false when it could not start or did not exit 0.
bool runOnce(char** argv, double& ms, long& maxRssKiB) {
    const double start = nowMs();
    pid_t pid = fork();
    if (pid == 0) {
        int null = open("/dev/null", O_WRONLY);
        dup2(null, 1);
        execv(argv[0], argv);
        _exit(127);
    }
    int status = 0;
    struct rusage usage {};
    if (pid < 0 || wait4(pid, &status, 0, &usage) != pid) {
        return false;
    }
    ms = nowMs() - start;
    maxRssKiB = usage.ru_maxrss;
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 4) {
        fprintf(stderr, "usage: bench_store ROUNDS LABEL PROGRAM [ARGS...]\n");
        return 2;
    }
    const int rounds = atoi(argv[1]);
    std::vector<double> times;
    long peak = 0;
    for (int round = 0; round < rounds; ++round) {
        double ms = 0;
        long rss = 0;
        if (!runOnce(argv + 3, ms, rss)) {
            fprintf(stderr, "bench_store: %s failed in round %d\n", argv[2], round + 1);
            return 1;
        }
        times.push_back(ms);
        peak = std::max(peak, rss);
    }
    std::sort(times.begin(), times.end());
    printf(
        "%-40s median %8.1f ms  min %8.1f ms  max %8.1f ms  peak memory %6.1f MiB  (%d rounds)\n",
        argv[2], times[times.size() / 2], times.front(), times.back(), peak / 1024.0, rounds);
    return 0;
}
