// A package source directory to start from, for `corvpkg new`.
#pragma once

#include <string>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Writes a package source for the package `name` into `dir`, which must not exist or be
// empty: INFO, a payload package/bin/<name>-daemon, the seven scripts (start-stop-status
// starts, stops and asks the daemon; the others only say when they run and what they
// get), an empty install wizard and an empty conf/resource, each commented on what goes in
// it. The result lints clean, builds, installs and starts as it stands. False with a
// sentence in `error` (an illegal name, a directory that is not empty, a write failure);
// files already written stay, for the author to look at.
CORVPKG_API bool PMSWritePackageSkeleton(const std::string& name, const std::string& dir,
                                         std::string& error);

}  // namespace CORVPackageTool
