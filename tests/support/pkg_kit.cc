#include "support/pkg_kit.h"

#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include "corv/service.h"
#include "corvpkg/pkgbuild.h"
#include "support/files.h"

namespace testutil {

std::string statusScript(int statusExit, const std::string& logText) {
    return "calls=\"/tmp/${CORVPKG_PKGNAME}.calls\"\n"
           "case \"$1\" in\n"
           "  start|stop) echo \"$1\" >> \"$calls\"; exit 0 ;;\n"
           "  status) exit " +
           std::to_string(statusExit) +
           " ;;\n"
           "  log) printf '%s\\n' '" +
           logText +
           "'; exit 0 ;;\n"
           "esac\n"
           "exit 1\n";
}

std::string infoOf(const TestPackage& pkg) {
    std::string text = "package=\"" + pkg.name + "\"\nversion=\"" + pkg.version + "\"\n";
    for (const auto& [key, value] : pkg.info) {
        text += key + "=\"" + value + "\"\n";
    }
    return text;
}

static void writeParts(const std::string& dir, const TestPackage& pkg) {
    writeFile(dir + "/INFO", infoOf(pkg));
    for (const auto& [name, body] : pkg.scripts) {
        const std::string path = dir + "/scripts/" + name;
        writeFile(path, "#!/bin/sh\n" + body);
        chmod(path.c_str(), 0755);
    }
    for (const auto& [name, content] : pkg.conf) {
        writeFile(dir + "/conf/" + name, content);
    }
    for (const auto& [name, content] : pkg.wizard) {
        const std::string path = dir + "/WIZARD_UIFILES/" + name;
        writeFile(path, content);
        if (name.size() > 3 && name.compare(name.size() - 3, 3, ".sh") == 0) {
            chmod(path.c_str(), 0755);
        }
    }
}

void writePackageDir(const std::string& dir, const TestPackage& pkg) {
    writeParts(dir, pkg);
    for (const auto& [name, content] : pkg.extraFiles) {
        writeFile(dir + "/" + name, content);
    }
    writeFile(dir + "/package/.keep", "");
    for (const auto& [path, content] : pkg.payload) {
        writeFile(dir + "/package/" + path, content);
    }
}

void installFixture(const TestPackage& pkg, bool enabled, const std::string& volume) {
    const std::string registry = "/var/packages/" + pkg.name;
    const std::string target = volume + "/@appstore/" + pkg.name;
    writeParts(registry, pkg);
    writeFile(target + "/.keep", "");
    for (const auto& [path, content] : pkg.payload) {
        writeFile(target + "/" + path, content);
    }
    unlink((registry + "/target").c_str());
    if (symlink(target.c_str(), (registry + "/target").c_str()) != 0) {
        abort();
    }
    if (enabled) {
        writeFile(registry + "/enabled", "");
    }
}

std::string buildPackage(const TestPackage& pkg) {
    const std::string source = "/tmp/kit-src/" + pkg.name;
    removeAll(source);
    writePackageDir(source, pkg);
    const std::string file = "/tmp/" + pkg.name + "-" + pkg.version + ".cpk";
    std::string error;
    if (!CORVPackageTool::PMSBuildPackageFile(source, file, "", error)) {
        fprintf(stderr, "test setup: cannot build %s: %s\n", pkg.name.c_str(), error.c_str());
        abort();
    }
    return file;
}

bool startPackageJob(const std::string& name) {
    writeFile("/etc/init/pkgctl-" + name + ".conf",
              "start on corv.pkgctl.pkgstart\nstop on corv.pkgctl.shutdown\n\n"
              "pre-start script\n\ttrue\nend script\n");
    return VLIBServiceStart(("pkgctl-" + name).c_str(), 0) == 0;
}

bool installRunning(TestPackage pkg, const std::string& volume) {
    if (pkg.scripts.find("start-stop-status") == pkg.scripts.end()) {
        pkg.scripts["start-stop-status"] = statusScript(0);
    }
    installFixture(pkg, true, volume);
    return startPackageJob(pkg.name);
}

}  // namespace testutil
