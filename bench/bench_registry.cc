// Listing cost of the registry: one directory walk and one INFO read per package.
#include <benchmark/benchmark.h>

#include <string>

#include "corvpkg/packagemanager.h"
#include "support/files.h"
#include "support/pkg_kit.h"

using namespace CORVPackageTool;

namespace {

constexpr int kPackages = 1000;

// Realistic INFO files: texts in two languages and icons of tens of kilobytes, which the
// listing mask must not pay for.
void populate() {
    static bool done = false;
    if (done) {
        return;
    }
    const std::string icon(24 * 1024, 'A');
    for (int i = 0; i < kPackages; ++i) {
        testutil::TestPackage pkg("bench" + std::to_string(i), "1.2.3-" + std::to_string(i));
        pkg.info["displayname_ger"] = "Paket " + std::to_string(i);
        pkg.info["description_ger"] = "Beschreibung";
        pkg.info["package_icon"] = icon;
        pkg.info["package_icon_256"] = icon + icon;
        pkg.info["install_dep_packages"] = "bench0>=1.0:other";
        pkg.info["adminport"] = "8080";
        testutil::installFixture(pkg);
    }
    done = true;
}

void listWithMask(benchmark::State& state, unsigned long long mask) {
    populate();
    PackageManager pm;
    for (auto _ : state) {
        std::vector<PackageInfo> out;
        pm.enumPackageInfo(out, "ger", mask);
        if (out.size() != kPackages) {
            state.SkipWithError("listing incomplete");
        }
        benchmark::DoNotOptimize(out.data());
    }
    state.counters["us_per_package"] = benchmark::Counter(
        static_cast<double>(kPackages) * state.iterations(),
        benchmark::Counter::kIsRate | benchmark::Counter::kInvert, benchmark::Counter::kIs1000);
}

void BM_ListListingMask(benchmark::State& state) {
    listWithMask(state, 0x11000000ULL);
}
void BM_ListFullMask(benchmark::State& state) {
    listWithMask(state, PKG_INFO_MASK_ALL);
}
void BM_EnumPackageNames(benchmark::State& state) {
    populate();
    PackageManager pm;
    for (auto _ : state) {
        benchmark::DoNotOptimize(pm.enumPackages(static_cast<const char*>(nullptr), 0));
    }
}

}  // namespace

BENCHMARK(BM_ListListingMask)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ListFullMask)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_EnumPackageNames)->Unit(benchmark::kMillisecond);
BENCHMARK_MAIN();
