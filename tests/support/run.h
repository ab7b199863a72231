// Runs a program and collects what it printed, for tests of the command line.
#pragma once

#include <string>
#include <vector>

namespace testutil {

struct RunResult {
    int status = -1;  // exit status, 128 + signal when killed, -1 when it did not start
    std::string out;
    std::string err;
};

RunResult run(const std::string& program, const std::vector<std::string>& args);

}  // namespace testutil
