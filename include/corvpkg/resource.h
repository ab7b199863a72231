// Carrying out the resources that a package declares.
//
// A package declares its resources in conf/resource (the request file): one JSON object
// whose members are resource ids, each with the section that the id's workers read. The
// workers of a phase are picked by the catalogue (corvpkg/worker.h), run in order
// (release: in reverse), and record what they really did in conf/resource.own (the
// own-file, mode 0600), which later phases work from.
//
// Both files are <dir>/conf/resource and <dir>/conf/resource.own for a non-empty `dir`
// (an unpacked package), else /var/packages/<pkg>/conf/resource and .../resource.own.
//
// All functions answer true on success. On failure the cause is in the platform's error
// slot when a step of the framework failed; what a worker wants the user to see is in the
// WorkerResp. Nothing here throws.
#pragma once

#include <json/json.h>

#include <map>
#include <string>

#include "corv/pkgutils.h"
#include "corvpkg/pkginfo.h"
#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"
#include "corvpkg/worker.h"

namespace CORVPackageTool {
namespace Resource {

// Runs the workers of `timing` for every resource id of the request that is an object,
// in running order, with `variables` (a JSON object, or null) substituted into the request
// first. True when every worker succeeded. A package without request file is done (true,
// no own-file is made). When a worker fails, the workers run so far in this call are
// rolled back in reverse, starting with the failing one - except at TIMING_POSTINST, where
// the failure is only recorded and the later workers still run. The own-file is written
// in every case that gets as far as running workers; a failed write is a failure.
// Failures: a file that is not a JSON object (0x0A00 unreadable JSON, 0x4000 not an
// object), variables that are not an object (0x0D00), an unreadable provider list.
CORVPKG_API bool Acquire(TIMING timing, const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                         CORV::PkgUtils::WorkerResp& resp, const Json::Value* variables,
                         const std::string& dir);

// Runs the workers of `timing` in reverse running order for every id that the own-file
// has (whatever the request says now; a missing request section reaches the worker as
// null). Best effort: a failing worker makes the result false and the others still run.
// Without own-file there is nothing to release (true). The own-file is written afterwards;
// the ids stay in it.
CORVPKG_API bool Release(TIMING timing, const PackageInfo& info, PKG_INSTALLATION_TYPE type,
                         CORV::PkgUtils::WorkerResp& resp, const Json::Value* variables,
                         const std::string& dir);

// Changes the running resource `id` of an installed package: the one worker that serves
// the id, which must be updatable (else false with 0xD900, decided before the request is
// read), gets its request section with `args` under "@helper-args". True with nothing done
// when the request has no such id. The own-file is written only after a successful update.
CORVPKG_API bool Update(const PackageInfo& info, const std::string& id, const Json::Value& args,
                        CORV::PkgUtils::WorkerResp& resp);

// Makes sure the request file has the member "service-cfg" (an empty object when added),
// creating the file when missing.
CORVPKG_API bool InitRequiredFields(const std::string& pkg, const std::string& dir);

// A copy of member `id` of an installed package's request file or own-file. False: empty
// argument (0x0D00), unreadable file, no such member (0x2000).
CORVPKG_API bool GetRequestObject(const std::string& pkg, const std::string& id, Json::Value& out);
CORVPKG_API bool GetOwnObject(const std::string& pkg, const std::string& id, Json::Value& out);
// Sets member `id` of an installed package's own-file to `value`, creating the file.
CORVPKG_API bool ReplaceOwnObject(const std::string& pkg, const std::string& id,
                                  const Json::Value& value);

// The first half of an upgrade: moves the installed package's own-file to
// /var/tmp/resource.<pkg>.<pid>. No own-file is success.
CORVPKG_API bool BackupResourceFile(const std::string& pkg);
// The second half: writes that backup, unchanged, as <dir>/conf/resource.own of the new
// version's unpacked package, so that its workers see what the old version acquired. No
// backup is success, and nothing is written. The backup file stays.
CORVPKG_API bool RestoreResourceFile(const std::string& pkg, const std::string& dir);

// Parses a whole JSON file. False: no such file (0x0700), unreadable or not JSON (0x0A00,
// logged).
CORVPKG_API bool ReadJsonFile(const std::string& path, Json::Value& out);
// Writes `value` through a temporary file and a rename, then makes it mode 0600 (a failed
// chmod is logged and does not fail the write). False (0x0B00, logged) when it can't be
// written.
CORVPKG_API bool WriteJsonFile(const std::string& path, const Json::Value& value);
// Makes the package's conf directory (mode 0755): <dir>/conf, or /var/packages/<pkg>/conf
// for an empty `dir`. An existing directory is success.
CORVPKG_API bool CreateFolder(const std::string& pkg, const std::string& dir);

// The paths of the two files, as described at the top.
CORVPKG_API std::string RequestFilePath(const std::string& pkg, const std::string& dir);
CORVPKG_API std::string OwnFilePath(const std::string& pkg, const std::string& dir);

}  // namespace Resource

namespace Util {

// One entry of the substitution dictionary: the JSON type of the variable's value
// (Json::stringValue for text and numbers, Json::booleanValue for booleans) and its text.
struct DictValue {
    int type;
    std::string value;
};

// Turns `document` from a template into plain JSON, in place. Every text value that holds
// "{{name}}" placeholders gets the variables' texts; a text that is exactly "{{name}}" of
// a boolean variable becomes that boolean. A text that still holds "{{" or "}}" afterwards
// becomes null, and at the end every null is removed: from objects the member, from
// arrays the element. False with 0x0D00, `document` untouched, when `variables` is not an
// object.
CORVPKG_API bool ReplaceVariables(const Json::Value& variables, Json::Value& document);

}  // namespace Util
}  // namespace CORVPackageTool
