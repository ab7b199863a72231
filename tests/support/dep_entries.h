// Dependency lists as (package, version, operator) triples, for comparisons in tests.
#pragma once

#include <string>
#include <tuple>
#include <vector>

#include "corvpkg/pkginfo.h"

namespace testutil {

using DepEntry = std::tuple<std::string, std::string, int>;

inline std::vector<DepEntry> depEntries(const CORVPackageTool::DepPkgVector& deps) {
    std::vector<DepEntry> out;
    for (const CORVPackageTool::PackageBasicInfo& d : deps) {
        out.emplace_back(d.package, d.version, static_cast<int>(d.compop));
    }
    return out;
}

}  // namespace testutil
