// Reading members of JSON that came from a store, whose types nobody guarantees: jsoncpp
// throws when a value is read as the wrong type, and a bad reply must never end the
// process.
#pragma once

#include <json/json.h>

#include <string>

namespace CORVPackageTool {

// The member as text: a string as it stands, a number or bool in its JSON text; anything
// else (missing, null, array, object) gives `fallback`.
std::string jsonText(const Json::Value& object, const char* key, const char* fallback);
// A bool as it stands; a number is true when not 0; anything else gives `fallback`.
bool jsonBool(const Json::Value& object, const char* key, bool fallback);
// An unsigned 64-bit number, also from decimal text ("1234"); anything else, and a
// negative number, gives 0.
unsigned long long jsonUInt64(const Json::Value& object, const char* key);
// Whether `object` is an object with a string member `key`.
bool hasText(const Json::Value& object, const char* key);

}  // namespace CORVPackageTool
