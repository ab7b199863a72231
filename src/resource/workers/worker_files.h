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
// The release of a worker that publishes files into `dir` and lists their names under
// `key` of its own-file: unlinks them and forgets the list. 1 with 0x4000 when the list
// is not an array, else 0.
int WorkerReleaseListed(Json::Value& own, const char* key, const std::string& dir);

}  // namespace Resource
}  // namespace CORVPackageTool
