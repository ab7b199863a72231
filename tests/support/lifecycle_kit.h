// Packages whose scripts record what ran, for the lifecycle scenario tests.
//
// Every script of a recording package appends one line to /tmp/<name>.scripts:
//   "<script> user=<id -un> ver=<CORVPKG_PKGVER> old=<CORVPKG_OLD_PKGVER>
//    tmp=<CORVPKG_TEMP_UPGRADE_FOLDER> answer=<CORVPKG_TEST_ANSWER or wizard key "answer">"
// and its start-stop-status keeps a running marker, appending "<name> <action>" to the
// shared /tmp/startstop.log. Files under /tmp/<name>.fail-<script> make that script exit 1
// (start-stop-status: /tmp/<name>.failstart for "start", /tmp/<name>.pre for prestart and
// prestop, with the exit value as content).
#pragma once

#include <string>
#include <vector>

#include "corvpkg/packagemanager.h"
#include "support/pkg_kit.h"

namespace testutil {

extern const char kStartStopLog[];

std::string statefulScript(const std::string& name);
// A package with every install script recording, a payload file bin/app, a stateful
// control script and a generated job (conf/resource service-cfg).
TestPackage recordingPackage(const std::string& name, const std::string& version = "1.0-0001");
// The lines of /tmp/<name>.scripts, each cut to its first word (the script) when `brief`.
std::vector<std::string> scriptsRan(const std::string& name, bool brief = true);
// The value of `field` ("user", "ver", "tmp", ...) in the first line of `script`.
std::string scriptField(const std::string& name, const std::string& script,
                        const std::string& field);
// The start and stop actions in /tmp/startstop.log, in order.
std::vector<std::string> startStopActions();
void clearRecords(const std::string& name);

// Builds `pkg` and installs it through the dispatcher, not verifying signatures. The
// manager's result stays for the caller; returns the outcome.
int installBuilt(CORVPackageTool::PackageManager& pm, const TestPackage& pkg, bool start = true,
                 const Json::Value* answers = nullptr);

}  // namespace testutil
