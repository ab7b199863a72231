// Free functions of the package catalogue: reading INFO files and dependency lists, and
// the architecture of packages and of this machine.
#pragma once

#include <string>
#include <vector>

#include "corvpkg/pkginfo.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

// Reads <dir>/INFO, and <dir>/conf/PKG_DEPS and <dir>/conf/PKG_CONX when the mask asks
// for dependencies or conflicts, into `info`, loading only the keys that `mask` selects.
// `language` (may be null: the system's language is used) picks the language variants
// of the display name and the description.
// True on success. False when `dir` is no directory or has no INFO (no log line), when a
// required key is missing or empty, a name is illegal, or `adminport` is out of range
// (each logged). After a failure `info` is partly filled and must not be used.
CORVPKG_API bool PMSLoadPKGInfoFile(const std::string& dir, PackageInfo& info, const char* language,
                                    unsigned long long mask);

// Maps a package server's entry into `info` without resetting it first: the members
// package, version, dname, desc, maintainer, maintainer_url, distributor, distributor_url,
// silent_install, silent_upgrade, silent_uninstall, link, size, type and md5 each replace
// their field (a missing or mistyped member gives "", false or 0); "depsers" (text) gives
// the install services; "conf_conxpkgs" (JSON form), else "conflictpkgs" (text), adds
// conflicts; "conf_deppkgs" (JSON form) adds dependencies, and so does "deppkgs" only when
// the entry also has a text member "deppgs". Every other field keeps its value.
// False (logged) only when `entry` is not an object.
CORVPKG_API bool PMSMapJsonToPackageInfo(const Json::Value& entry, PackageInfo& info);

// Splits `text` at any character of `separators`; runs collapse, so no element is empty.
CORVPKG_API std::vector<std::string> PMSExplodeString(const std::string& text,
                                                      const std::string& separators);

// Parses the one-line form "a:b>=1.0:c<2" and appends its entries to `out`. An item whose
// operator has nothing after it adds nothing; an item without operator is unbounded.
CORVPKG_API void PMSExplodeDepPKGString(const char* text, DepPkgVector& out);

// Reads a section file of dependencies or conflicts ([name] with pkg_min_ver, pkg_max_ver,
// nos_min_ver, nos_max_ver) into `out`, skipping sections whose OS range excludes this OS.
// Negative on failure; otherwise non-negative (only the sign is meaningful).
CORVPKG_API int PMSLoadDepConfFile(const char* path, DepPkgVector& out);

// The sign of this OS version minus `version` (major, minor, build); 0 for 0.0-0.
CORVPKG_API int PMSCompareOSVersion(const int version[3]);

// Versions. Appends the normal form of `version` (extended with ".0" parts to as many
// dotted parts as `reference`, build number kept, further "-" pieces dropped) to the
// malloc'ed `*buffer`. False when either text has no first piece.
CORVPKG_API bool NormalizeVersion(const char* version, const char* reference, char** buffer,
                                  int* capacity);
CORVPKG_API bool NormalizeVersion(std::string version, std::string reference, std::string& normal);
// 0 when this OS lies within the package's limits, -1 when it is too old, 1 too new.
CORVPKG_API int PMSComparePackageAndOSVersion(PackageInfo& info);
CORVPKG_API bool PMSCheckPackageVersionVaild(PackageInfo& info);

// Dependency lists in JSON: {"name": {} | {"pkg_min_ver": ..., ">=": ..., ...}}. The number
// of members that applied on this OS; 0 for anything that is not an object.
CORVPKG_API int PMSParseDepJSON(const Json::Value& json, DepPkgVector& out);
// The same from text: 0 for an empty text, -1 when it is not JSON.
CORVPKG_API int PMSParseDepJSONString(const std::string& text, DepPkgVector& out);

// The elements of a JSON array as text, joined by `separator`; false (and `out` untouched)
// for anything but an array.
CORVPKG_API bool joinJsonArray(const Json::Value& array, const std::string& separator,
                               std::string& out);

// The mask of an architecture token, exact and case-sensitive; 0 when unknown.
CORVPKG_API int PMSMapSystemArch(const char* token);

// This machine's platform code (the middle part of "unique" in the defaults file), or
// empty when it cannot be read.
CORVPKG_API std::string PMSGetSystemArchString();
// This machine's architecture mask: 0 when the code cannot be read, 1 when the code is
// not in the table, the table's mask otherwise.
CORVPKG_API int PMSGetSystemArch();

}  // namespace CORVPackageTool
