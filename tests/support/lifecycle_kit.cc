#include "support/lifecycle_kit.h"

#include <unistd.h>

#include <sstream>

#include "support/files.h"

namespace testutil {

const char kStartStopLog[] = "/tmp/startstop.log";

std::string statefulScript(const std::string& name) {
    const std::string state = "/tmp/" + name + ".running";
    return "echo \"" + name + " $1\" >> " + kStartStopLog + "\n" +
           "case \"$1\" in\n"
           "  start) [ -f /tmp/" +
           name + ".failstart ] && exit 1; touch " + state +
           "; exit 0 ;;\n"
           "  stop) rm -f " +
           state +
           "; exit 0 ;;\n"
           "  status) [ -f " +
           state +
           " ] && exit 0; exit 3 ;;\n"
           "  prestart|prestop)\n"
           "    cp /run/corv/task/@administrators/@CORVPKG_STARTSTOP_" +
           name + ".json /tmp/" + name +
           ".task 2>/dev/null\n"
           "    [ -f /tmp/" +
           name + ".pre ] && exit $(cat /tmp/" + name +
           ".pre); exit 0 ;;\n"
           "  log) exit 0 ;;\n"
           "esac\n"
           "exit 1\n";
}

TestPackage recordingPackage(const std::string& name, const std::string& version) {
    TestPackage pkg(name, version);
    pkg.info["displayname"] = "Display " + name;
    pkg.scripts["start-stop-status"] = statefulScript(name);
    for (const char* script :
         {"preinst", "postinst", "preuninst", "postuninst", "preupgrade", "postupgrade"}) {
        pkg.scripts[script] = std::string("echo \"") + script +
                              " user=$(id -un) ver=$CORVPKG_PKGVER old=$CORVPKG_OLD_PKGVER"
                              " tmp=$CORVPKG_TEMP_UPGRADE_FOLDER answer=$answer\" >> /tmp/" +
                              name + ".scripts\n" + "[ -f /tmp/" + name + ".fail-" + script +
                              " ] && exit 1\nexit 0\n";
    }
    pkg.conf["resource"] = R"({"service-cfg":{}})";
    pkg.payload["bin/app"] = "#!/bin/sh\necho app " + version + "\n";
    return pkg;
}

std::vector<std::string> scriptsRan(const std::string& name, bool brief) {
    std::vector<std::string> out;
    std::istringstream lines(readFile("/tmp/" + name + ".scripts"));
    for (std::string line; std::getline(lines, line);) {
        out.push_back(brief ? line.substr(0, line.find(' ')) : line);
    }
    return out;
}

std::string scriptField(const std::string& name, const std::string& script,
                        const std::string& field) {
    for (const std::string& line : scriptsRan(name, false)) {
        if (line.rfind(script + " ", 0) != 0) {
            continue;
        }
        std::istringstream words(line);
        for (std::string word; words >> word;) {
            if (word.rfind(field + "=", 0) == 0) {
                return word.substr(field.size() + 1);
            }
        }
        return "";
    }
    return "<" + script + " did not run>";
}

std::vector<std::string> startStopActions() {
    std::vector<std::string> out;
    std::istringstream lines(readFile(kStartStopLog));
    for (std::string line; std::getline(lines, line);) {
        const std::string action = line.substr(line.find(' ') + 1);
        if (action == "start" || action == "stop" || action == "prestart" || action == "prestop") {
            out.push_back(line);
        }
    }
    return out;
}

void clearRecords(const std::string& name) {
    unlink(("/tmp/" + name + ".scripts").c_str());
    unlink(kStartStopLog);
}

int installBuilt(CORVPackageTool::PackageManager& pm, const TestPackage& pkg, bool start,
                 const Json::Value* answers) {
    const std::string file = buildPackage(pkg);
    return pm.install(nullptr, file, "/volume1", start, answers, "enu", false, false);
}

}  // namespace testutil
