// Cost of an installation and an uninstallation of a large package, next to the floor
// that the install road cannot go below: its two tar extractions.
//
//   bench_install [rounds]      (in the sandbox: see bench/install_bench.sh)
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <algorithm>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgbuild.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

constexpr int kFiles = 2000;
constexpr size_t kPayloadBytes = 50u << 20;

double now() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

double median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values[values.size() / 2];
}

// 2,000 files of pseudo-random bytes (they do not compress, as real binaries barely do).
std::string buildBigPackage() {
    testutil::TestPackage pkg("bigpkg", "1.0-0001");
    pkg.scripts["start-stop-status"] = testutil::statusScript(3);
    pkg.scripts["postinst"] = "exit 0\n";
    const std::string source = "/tmp/bench-src/bigpkg";
    testutil::removeAll(source);
    testutil::writePackageDir(source, pkg);
    std::mt19937_64 random(2026);
    std::string noise(kPayloadBytes, '\0');
    for (size_t i = 0; i + 8 <= noise.size(); i += 8) {
        const uint64_t word = random();
        memcpy(&noise[i], &word, sizeof(word));
    }
    const size_t each = kPayloadBytes / kFiles;
    for (int i = 0; i < kFiles; ++i) {
        testutil::writeFile(
            source + "/package/d" + std::to_string(i % 50) + "/f" + std::to_string(i),
            noise.substr(static_cast<size_t>(i) * each, each));
    }
    const std::string file = "/tmp/bigpkg.cpk";
    std::string error;
    if (!PMSBuildPackageFile(source, file, "", error)) {
        fprintf(stderr, "cannot build: %s\n", error.c_str());
        exit(1);
    }
    testutil::removeAll(source);
    return file;
}

double timeTarFloor(const std::string& file) {
    const std::string dir = "/volume1/@tmp/floor";
    testutil::removeAll(dir);
    VLIBCExec("/bin/mkdir", "-p", (dir + "/package").c_str(), nullptr);
    double start = now();
    VLIBCExec("/bin/tar", "xf", file.c_str(), "-C", dir.c_str(), "--no-same-owner", nullptr);
    VLIBCExec("/bin/tar", "xf", (dir + "/package.tgz").c_str(), "-C", (dir + "/package").c_str(),
              "--no-same-owner", nullptr);
    double elapsed = now() - start;
    testutil::removeAll(dir);
    return elapsed;
}

}  // namespace

int main(int argc, char** argv) {
    const int rounds = argc > 1 ? std::max(1, atoi(argv[1])) : 5;
    PackageManager pm;
    if (!pm.init()) {
        fprintf(stderr, "init failed\n");
        return 1;
    }
    const std::string file = buildBigPackage();
    std::vector<double> floor, install, uninstall;
    for (int i = 0; i < rounds; ++i) {
        floor.push_back(timeTarFloor(file));
        double start = now();
        if (pm.install(nullptr, file, "/volume1", false, nullptr, "enu", true, false) != 1) {
            fprintf(stderr, "install failed: %d\n", pm.getResult());
            return 1;
        }
        install.push_back(now() - start);
        start = now();
        if (pm.uninstall("bigpkg", nullptr, "enu", static_cast<PKG_INSTALLATION_TYPE>(4), true,
                         nullptr) != 1) {
            fprintf(stderr, "uninstall failed: %d\n", pm.getResult());
            return 1;
        }
        uninstall.push_back(now() - start);
    }
    printf("package: %d files, %zu MiB payload, %d rounds (medians)\n", kFiles, kPayloadBytes >> 20,
           rounds);
    printf("  two tar extractions (floor)  %7.3f s\n", median(floor));
    printf("  install                      %7.3f s  (%.3f s above the floor)\n", median(install),
           median(install) - median(floor));
    printf("  uninstall                    %7.3f s\n", median(uninstall));
    return 0;
}
