// Dependency declarations in JSON, as a store reply's "conf_deppkgs" carries them, and the
// list they give written back as JSON.
#include <stddef.h>
#include <stdint.h>

#include <string>

#include "corvpkg/pkgtool.h"

using namespace CORVPackageTool;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string text(reinterpret_cast<const char*>(data), size);
    DepPkgVector parsed;
    if (PMSParseDepJSONString(text, parsed) < 0) {
        return 0;
    }
    Json::Value json;
    parsed.toJSON(json);
    DepPkgVector again;
    PMSParseDepJSON(json, again);
    return 0;
}
