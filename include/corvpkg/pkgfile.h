// Package files and their parts.
#pragma once

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

struct PKG_SCRIPT_ENTRY {
    const char* name;
    unsigned int bit;
};
constexpr int PKG_SCRIPT_COUNT = 7;
// The control scripts of a package with their bits in script_mask, in their fixed order.
CORVPKG_API extern const PKG_SCRIPT_ENTRY g_PackageScripts[PKG_SCRIPT_COUNT];

// Which control scripts exist in `scriptsDir`; existing scripts without the owner's
// execute bit are made runnable (0700) on the way.
CORVPKG_API unsigned int PMGetScriptMask(const std::string& scriptsDir);

}  // namespace CORVPackageTool
