// The icons' base64 and the size rule of a cached image.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/pkgimagetool.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;

TEST(StoreImage, Base64DecodesWhatIconsCarry) {
    struct Case {
        const char* in;
        int outSize;
        int length;  // -1: refused
        const char* out;
    } cases[] = {
        {"aGVsbG8=", 16, 5, "hello"},
        {"aGVs\nbG8=\n", 16, 5, "hello"},  // line breaks as INFO files wrap them
        {"aGVsbG8", 16, 5, "hello"},       // the padding may be missing
        {"", 16, 0, ""},
        {"aGVsbG8=", 4, -1, ""},  // one byte short
        {"aGV*bG8=", 16, -1, ""},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.in);
        unsigned char out[16] = {0};
        const int length =
            VLIBCBase64Decode(c.in, static_cast<int>(std::string(c.in).size()), out, c.outSize);
        EXPECT_EQ(length, c.length);
        if (length >= 0) {
            EXPECT_EQ(std::string(reinterpret_cast<char*>(out), length), c.out);
        }
    }
}

TEST(StoreImage, ACachedImageIsMoreThanTenBytesAndUnderTwoMebibytes) {
    TempDir dir;
    const std::pair<size_t, bool> cases[] = {
        {0, false}, {10, false}, {11, true}, {2097151, true}, {2097152, false}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.first);
        const std::string path = dir.path() + "/icon.png";
        testutil::writeFile(path, std::string(c.first, 'x'));
        EXPECT_EQ(PMSIsValidImageFile(path), c.second);
    }
    EXPECT_FALSE(PMSIsValidImageFile(dir.path())) << "a directory";
    EXPECT_FALSE(PMSIsValidImageFile(dir.path() + "/none.png"));
}
