// corvpkg system: what this machine offers packages.
#include <stdio.h>
#include <stdlib.h>

#include <string>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkgvolume.h"

namespace cli {

namespace {

std::string humanBytes(unsigned long long bytes) {
    const char* units[] = {"B", "KiB", "MiB", "GiB", "TiB"};
    double value = static_cast<double>(bytes);
    int unit = 0;
    while (value >= 1024 && unit < 4) {
        value /= 1024;
        ++unit;
    }
    char buf[32];
    snprintf(buf, sizeof(buf), unit == 0 ? "%.0f %s" : "%.1f %s", value, units[unit]);
    return buf;
}

std::string joined(const Json::Value& list) {
    std::string out;
    for (const Json::Value& item : list) {
        out += (out.empty() ? "" : ",") + item.asString();
    }
    return out.empty() ? "-" : out;
}

void printShares(const Json::Value& shares) {
    printf("shares:\n");
    if (shares.empty()) {
        printf("  (none)\n");
    }
    for (const Json::Value& s : shares) {
        printf("  %-16s %s  rw: %s  ro: %s\n", s["name"].asCString(), s["path"].asCString(),
               joined(s["rw"]).c_str(), joined(s["ro"]).c_str());
    }
}

}  // namespace

int cmdSystem(const std::vector<std::string>& args) {
    const Command& self = findCommand("system");
    CommonOptions opts;
    if (!parseCommon(args, self, opts, {{"--size", true}})) {
        return EXIT_USAGE;
    }
    if (!opts.positional.empty()) {
        return usageError(self, "unexpected argument " + opts.positional[0]);
    }
    unsigned long long size = 0;
    if (opts.has("--size")) {
        const std::string& text = opts.options["--size"];
        char* end = nullptr;
        size = strtoull(text.c_str(), &end, 10);
        if (text.empty() || text[0] == '-' || *end != '\0') {
            return usageError(self, "--size takes a number of bytes");
        }
    }
    Json::Value info = CORVPackageTool::PMSGetSystemInfo(size);
    if (opts.json) {
        printf("%s\n", CORVPackageTool::toString(info).c_str());
        return EXIT_OK;
    }
    printf("%-16s %s\n", "os version:", info["os_version"].asCString());
    printf("%-16s %s (arch %s)\n", "platform:", info["platform"].asCString(),
           info["arch"].asCString());
    printf("%-16s %s%s\n", "model:", info["model"].asCString(),
           info["small_box"].asBool() ? " (small box)" : "");
    printf("volumes:\n");
    if (info["volumes"].empty()) {
        printf("  (none)\n");
    }
    for (const Json::Value& v : info["volumes"]) {
        printf("  %-12s %12s free  %s\n", v["path"].asCString(),
               humanBytes(v["free_bytes"].asUInt64()).c_str(),
               v["ready"].asBool()
                   ? "ready"
                   : (v["read_only"].asBool() ? "crashed (read-only)" : "not ready"));
    }
    std::string defVol = info["default_volume"].asString();
    printf("%-16s %s\n", "default volume:",
           defVol.empty()
               ? "(none)"
               : (defVol + (info["default_volume_usable"].asBool() ? "" : " (unusable)")).c_str());
    const Json::Value& tmp = info["temporary"];
    printf("%-16s %s for %s\n", "temporary dir:",
           tmp["dir"].asString().empty() ? ("(none, error " + tmp["error"].asString() + ")").c_str()
                                         : tmp["dir"].asCString(),
           humanBytes(tmp["install_size"].asUInt64()).c_str());
    printShares(info["shares"]);
    return EXIT_OK;
}

}  // namespace cli
