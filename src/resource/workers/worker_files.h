// Small file steps that several workers of published fragments share.
#pragma once

#include <json/json.h>

#include <string>

namespace CORVPackageTool {
namespace Resource {

// The text after the last "/" of `path`; empty when there is no "/" or it is the first
// character.
std::string WorkerBaseName(const std::string& path);
// The text after the last "/" of `name`, or all of it when it has none.
std::string WorkerLastPart(const std::string& name);
// `section[key]` when present, else an empty array.
Json::Value WorkerArrayOf(const Json::Value& section, const char* key);
// Unlinks <dir>/<name> for each non-empty string of `names` that is a plain file name;
// a failure other than ENOENT is logged ("Failed to unlink %s (%m)") and sets 0x3900.
void WorkerUnlinkAll(const std::string& dir, const Json::Value& names);

}  // namespace Resource
}  // namespace CORVPackageTool
