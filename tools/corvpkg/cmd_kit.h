// The package author's commands: lint, new, and the lint that build runs first.
#pragma once

#include <string>
#include <vector>

#include "cli.h"

namespace cli {

int cmdLint(const std::vector<std::string>& args);
int cmdNew(const std::vector<std::string>& args);

// Lints a package source for build: prints the findings (standard error, or into `json`
// as "lint" when it is an object) and says whether the build may go on: no errors, or
// `force`. Warnings never stop it.
bool lintBeforeBuild(const std::string& source, bool force, Json::Value* json);

}  // namespace cli
