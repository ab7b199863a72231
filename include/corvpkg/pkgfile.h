// Package files and their parts.
#pragma once

#include <string>

#include "corvpkg/pkginfo.h"
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

// Extracts INFO, conf/ and the control scripts of `cpkFile` into `dir` (single members
// through /bin/tar) and reads them into `info`. False only when INFO cannot be extracted;
// an INFO that does not read still gives true, with `info` as the reader left it.
bool PMSExtractPackageInfo(const std::string& dir, const std::string& cpkFile, PackageInfo& info,
                           const char* language);
// Whether everything under `dir`, an unpacked package file or a member of one, is a
// regular file or a directory: a link, pipe, device or socket among the control members
// is refused (logged) before anything reads, writes or runs through it.
bool PMSCheckPackageMembers(const std::string& dir);
// Removes device nodes, pipes and sockets from an unpacked payload (each logged as
// dropped) and clears the set-user-id and set-group-id bits of its files. False (logged)
// when one cannot be removed or changed.
bool PMSDropSpecialFiles(const std::string& payloadDir);
// Whether the MD5 of the file, as /usr/bin/openssl prints it (lower-case hex), is
// exactly `expected`.
CORVPKG_API bool PMSCompareCheckSum(const char* path, const char* expected);

}  // namespace CORVPackageTool
