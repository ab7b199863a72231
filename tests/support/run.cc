#include "support/run.h"

#include "corv/process_runner.h"

namespace testutil {

RunResult run(const std::string& program, const std::vector<std::string>& args) {
    CORVUtils::ProcessRunner runner(program, args);
    runner.setTimeout(60);
    RunResult result;
    result.status = runner.run(true, true);
    result.out = runner.getCapturedOutput();
    result.err = runner.getCapturedOutputErr();
    return result;
}

}  // namespace testutil
