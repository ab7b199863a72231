// A result code of the engine as the page shows it: the code, its name, the message key
// the desktop words it with, and the English sentence.
#pragma once

#include <json/json.h>

#include <map>
#include <string>

#include "corvpkg/corvpkg.h"

namespace center {

// {"code", "name", "key", "meaning", "text", "remedy"} of `code`: "key" is the install
// message key, else the installability report's key, else the name; "text" and "remedy"
// are the English sentences the command line shows too, filled from `params` ("package",
// "operation", "deppkg" ...).
Json::Value describeResult(int code, const std::map<std::string, std::string>& params = {});

// describeResult of the manager's last result for `package` and `operation`, with what
// the operation left in its parameters ("deppkg": the dependents, "worker_msg", the
// version limits...).
Json::Value describeOutcome(CORVPackageTool::PackageManager& pm, const std::string& package,
                            const std::string& operation);

}  // namespace center
