// A result code of the engine as the page shows it: the code, its name, the message key
// the desktop words it with, and the English sentence.
#pragma once

#include <json/json.h>

#include "corvpkg/corvpkg.h"

namespace center {

// {"code", "name", "key", "meaning"} of `code`; "key" is the install message key, else the
// installability report's key, else the name.
Json::Value describeResult(int code);

// describeResult of the manager's last result with what the operation left in its
// parameters ("deppkg": the dependents, "worker_msg", the version limits...).
Json::Value describeOutcome(CORVPackageTool::PackageManager& pm);

}  // namespace center
