// Wizard pages: the questions a package asks at install, upgrade or uninstall, as a JSON
// array of steps, each an object with an "items" array. Items may carry "key" and
// "defaultValue"; everything else belongs to the desktop and passes through unread.
#pragma once

#include <json/json.h>

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Reads a wizard file into `wizard`. True when it holds an array of steps whose "items"
// are all arrays. False when the file cannot be opened or is no JSON (then `wizard` is
// left as it was), and when the JSON is no array or a step's "items" is no array (then
// `wizard` keeps what was parsed).
CORVPKG_API bool PMReadUIFileContent(const std::string& path, Json::Value& wizard);

// The default answers of a wizard: for every object anywhere in `ui` that has both "key"
// and "defaultValue", values[key] becomes the text of the default ("1" for 1). A later
// key overwrites an earlier one; `values` is not cleared first. `values` is an object or
// null; any other value is left as it is.
CORVPKG_API void getUIDefaultValues(Json::Value ui, Json::Value& values);

// A text of an installed package's own language file,
// /var/packages/<package>/target/ui/texts/<language>/strings, by section and key. "" when
// the file, the section or the key is missing; no other language is tried.
CORVPKG_API std::string PMSGetText(const std::string& package, const std::string& language,
                                   const std::string& section, const std::string& key);

}  // namespace CORVPackageTool
