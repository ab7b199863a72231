// The JSON conveniences of the system over jsoncpp.
#pragma once

#include <json/json.h>

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Compact one-line text of `value` (no trailing newline); "null" for a null value.
CORVPKG_API std::string toString(const Json::Value& value);
// Parses `text` into `value`. False, with `value` null, when the text is not JSON.
CORVPKG_API bool fromString(const std::string& text, Json::Value& value);
// Writes the compact text through a temporary file in the same directory and renames it
// into place, so readers see the old or the new file, never a part. False on failure.
CORVPKG_API bool toFile(const Json::Value& value, const std::string& path);
// Reads and parses a whole file. False, with `value` null, when it cannot be read or is
// not JSON.
CORVPKG_API bool fromFile(const std::string& path, Json::Value& value);

}  // namespace CORVPackageTool
