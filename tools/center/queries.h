// What the page reads: the installed packages, one package in full, the stores' offer,
// the available updates, and the questions of package files waiting to be installed. Each
// answer is built from libcorvpkg alone. The library keeps some process-wide state (its
// transport's last result), so the server runs these one at a time (queryLock).
#pragma once

#include <json/json.h>

#include <mutex>
#include <string>

namespace center {

std::mutex& queryLock();

// [{package, version, displayname, description, status, status_word, icon, startable}]
// sorted by name; icon is a data: URL or "".
Json::Value installedPackages();

// One installed package: its record, status, dependencies, dependents, the uninstall
// wizard and its own log. Null when it is not installed.
Json::Value packageDetails(const std::string& name);

// {"packages": [store entries with "installed_version" and "action": "install" |
// "upgrade" | "installed"], "errors": [...]} from the maker store and the feeds.
Json::Value storePackages(bool refresh);

// The store entries newer than what is installed; `refresh` asks the stores again.
Json::Value availableUpdates(bool refresh);

// The store entries to download for `names`: each named entry, after the entries of the
// packages it depends on that are not installed, in install order. False with `why` when
// a name or a dependency is not in the stores.
bool storePlan(const Json::Value& names, Json::Value& plan, std::string& why);

// For each staged file ({package, file}): display name, version, whether it is an
// upgrade, the wizard steps and the signature verdict ("signature": null when trusted).
Json::Value stagedQuestions(const Json::Value& files);

// Reads a package file as the engine does; false when it is not a package file.
bool readPackageFile(const std::string& path, std::string& name, std::string& version);

}  // namespace center
