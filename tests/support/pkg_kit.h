// The test-package kit: package directories and registry fixtures in a few lines.
//
//   testutil::TestPackage pkg("demo");
//   pkg.info["adminport"] = "8080";
//   pkg.scripts["start-stop-status"] = testutil::statusScript(0);
//   testutil::installFixture(pkg);            // /var/packages/demo, target on /volume1
//   testutil::writePackageDir("/tmp/src", pkg);  // an unpacked package: INFO, scripts/ ...
#pragma once

#include <map>
#include <string>
#include <utility>

namespace testutil {

struct TestPackage {
    explicit TestPackage(std::string packageName, std::string packageVersion = "1.0-0001")
        : name(std::move(packageName)), version(std::move(packageVersion)) {}

    std::string name;
    std::string version;
    // INFO keys beyond package and version; maintainer and description are preset so that
    // a full read succeeds, and arch is "noarch" unless replaced.
    std::map<std::string, std::string> info = {{"maintainer", "Test Kit"},
                                               {"description", "A package made by the test kit"},
                                               {"displayname", "Test package"},
                                               {"arch", "x86_64 armv7 armv8 x86 broadwell"}};
    // scripts/<name> -> shell body (a "#!/bin/sh" line is prepended; made executable).
    std::map<std::string, std::string> scripts;
    // conf/<name> -> content; WIZARD_UIFILES/<name> -> content (a name ending in ".sh" is
    // made executable and gets no "#!" line: write one); package/<path> -> content.
    std::map<std::string, std::string> conf;
    std::map<std::string, std::string> wizard;
    std::map<std::string, std::string> payload;
    // Further members at the top of the package, such as "LICENSE" -> content.
    std::map<std::string, std::string> extraFiles;
};

// A start-stop-status body: "status" exits with `statusExit`, "log" prints `logText`, and
// start and stop append their name to /tmp/<package>.calls.
std::string statusScript(int statusExit, const std::string& logText = "log of the package");

// The INFO text of a package.
std::string infoOf(const TestPackage& pkg);
// Writes an unpacked package: <dir>/INFO, scripts/, conf/, WIZARD_UIFILES/, the extra
// files, package/.
void writePackageDir(const std::string& dir, const TestPackage& pkg);
// Writes the registry of an installed package: /var/packages/<name> with INFO, scripts,
// conf and wizard files, the `target` link to <volume>/@appstore/<name> (made, with the
// payload in it), and the `enabled` flag when asked.
void installFixture(const TestPackage& pkg, bool enabled = false,
                    const std::string& volume = "/volume1");

// Builds a package file from `pkg` with the package builder: the source goes to
// /tmp/kit-src/<name>, the file to /tmp/<name>-<version>.cpk, whose path is returned.
// Aborts the test program when the build fails.
std::string buildPackage(const TestPackage& pkg);

// Gives an installed package a plain job "pkgctl-<name>" and starts it in the service
// manager, so that its status can say "running". (The package's real job adapter comes
// from service integration; status only needs the job to run.) False when it did not start.
bool startPackageJob(const std::string& name);
// An installed package that runs: fixture with `enabled`, a status script answering 0,
// and its job started.
bool installRunning(TestPackage pkg, const std::string& volume = "/volume1");

}  // namespace testutil
