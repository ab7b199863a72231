// corvpkg info: a package directory's INFO as the engine reads it.
#include <stdio.h>
#include <sys/stat.h>

#include <algorithm>
#include <string>

#include "cli.h"
#include "corvpkg/corvpkg.h"

namespace cli {

namespace {

using namespace CORVPackageTool;

std::string joined(const std::vector<std::string>& items) {
    std::string out;
    for (const std::string& item : items) {
        out += (out.empty() ? "" : " ") + item;
    }
    return out;
}

std::string deps(const DepPkgVector& list) {
    std::string out;
    for (const PackageBasicInfo& dep : list) {
        out += (out.empty() ? "" : ", ") + dep.package;
        if (dep.compop != PKG_COMPOP_NONE) {
            out += std::string(" ") + PMSCompOpToStr(dep.compop) + " " + dep.version;
        }
    }
    return out;
}

void printText(const PackageInfo& info, const Json::Value& json) {
    auto line = [](const char* key, const std::string& value) {
        if (!value.empty()) {
            printf("%-22s %s\n", key, value.c_str());
        }
    };
    line("package:", info.package);
    line("version:", info.version);
    line("displayname:", info.displayname);
    line("description:", info.description);
    line("maintainer:", info.maintainer);
    line("distributor:", info.distributor);
    char arch[16];
    snprintf(arch, sizeof(arch), "0x%08X", info.arch);
    line("arch:", info.arch_list.empty() ? std::string(arch) + " (any)"
                                         : joined(info.arch_list) + " (" + arch + ")");
    line("exclude_arch:", joined(info.exclude_arch_list));
    line("model:", joined(info.model_list));
    line("os_min_ver:", json["os_min_ver"].asString());
    if (json["os_max_ver"].asString() != "0.0-0") {
        line("os_max_ver:", json["os_max_ver"].asString());
    }
    line("depends:", deps(info.dep_packages));
    line("conflicts:", deps(info.conflict_packages));
    if (info.adminport != 0 || !info.adminurl.empty()) {
        line("admin:", joined(info.adminprotocol) + " port " + std::to_string(info.adminport) +
                           " " + info.adminurl);
    }
    line("startable:", info.startable ? "yes" : "no");
    line("beta:", info.beta ? "yes" : "no");
    line("checksum:", info.checksum);
    if (info.extractsize != 0) {
        line("extractsize:", std::to_string(info.extractsize) + " bytes");
    }
    line("install_type:", info.install_type);
}

}  // namespace

int cmdInfo(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "info", "package directory", opts); status >= 0) {
        return status;
    }
    const std::string& dir = opts.positional[0];
    failureContext()["file"] = dir;
    struct stat st {};
    if (stat(dir.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) {
        return printFailure(opts.json, PKG_ERR_BROKEN, dir + " is not a directory");
    }
    if (stat((dir + "/INFO").c_str(), &st) != 0) {
        return printFailure(opts.json, PKG_ERR_BROKEN, dir + " has no INFO file");
    }

    LogCapture log;
    PackageInfo info;
    if (!PMSLoadPKGInfoFile(dir, info, opts.lang.empty() ? nullptr : opts.lang.c_str(),
                            PKG_INFO_MASK_ALL)) {
        std::string why = log.reasons();
        return printFailure(opts.json, PKG_ERR_BROKEN,
                            "INFO of " + dir + " is not valid" + (why.empty() ? "" : ": " + why));
    }
    Json::Value json = PackageInfoToJson(info, false);
    if (opts.json) {
        printf("%s\n", toString(json).c_str());
    } else {
        printText(info, json);
    }
    return EXIT_OK;
}

}  // namespace cli
