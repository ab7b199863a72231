// The package file reader: the input is taken as a .cpk (an uncompressed tar) and read as
// an inspection reads it, its INFO, conf/ and scripts through /bin/tar into a fresh
// directory. Each run forks tar about ten times, so this target is slow by nature.
#include <stddef.h>
#include <stdint.h>
#include <sys/stat.h>

#include <string>

#include "corvpkg/pkgfile.h"
#include "fuzz_util.h"

using namespace CORVPackageTool;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const std::string cpk = fuzzutil::scratchDir() + "/input.cpk";
    static const std::string dir = fuzzutil::scratchDir() + "/out";
    static const bool made = mkdir(dir.c_str(), 0700) == 0;
    (void)made;
    fuzzutil::writeWhole(cpk, data, size);
    fuzzutil::clearDir(dir);
    PackageInfo info;
    PMSExtractPackageInfo(dir, cpk, info, "enu");
    return 0;
}
