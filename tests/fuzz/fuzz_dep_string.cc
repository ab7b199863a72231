// The one-line dependency form ("a:b>=1.0:c<2"), as INFO and store entries carry it, and
// the JSON that the parsed list turns into and is read back from.
#include <stddef.h>
#include <stdint.h>

#include <string>

#include "corvpkg/pkgtool.h"

using namespace CORVPackageTool;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // The parser takes a C string: the input up to its first NUL.
    const std::string text(reinterpret_cast<const char*>(data), size);
    DepPkgVector parsed;
    PMSExplodeDepPKGString(text.c_str(), parsed);
    Json::Value json;
    parsed.toJSON(json);
    DepPkgVector again;
    PMSParseDepJSON(json, again);
    PMSExplodeString(text, ": ");
    return 0;
}
