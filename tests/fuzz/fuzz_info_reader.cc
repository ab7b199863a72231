// The INFO reader with everything a package directory can feed it: the input is split at
// NUL bytes into INFO, conf/PKG_DEPS and conf/PKG_CONX, and read with the full mask, the
// listing mask and mask 0, in a language that has variants and in none.
#include <stddef.h>
#include <stdint.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "corvpkg/pkgtool.h"
#include "fuzz_util.h"

using namespace CORVPackageTool;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const std::string dir = fuzzutil::scratchDir() + "/pkg";
    static const bool made =
        mkdir(dir.c_str(), 0700) == 0 && mkdir((dir + "/conf").c_str(), 0700) == 0;
    (void)made;
    const char* const files[] = {"/INFO", "/conf/PKG_DEPS", "/conf/PKG_CONX"};
    size_t start = 0;
    for (size_t part = 0; part < 3; ++part) {
        const std::string path = dir + files[part];
        if (start > size) {
            unlink(path.c_str());
            continue;
        }
        size_t end = start;
        while (end < size && (part == 2 || data[end] != '\0')) {
            ++end;
        }
        fuzzutil::writeWhole(path, data + start, end - start);
        start = end + 1;
    }
    for (unsigned long long mask : {PKG_INFO_MASK_ALL, 0x11000000ULL, 0ULL}) {
        for (const char* language : {"ger", "enu"}) {
            PackageInfo info;
            PMSLoadPKGInfoFile(dir, info, language, mask);
        }
    }
    return 0;
}
