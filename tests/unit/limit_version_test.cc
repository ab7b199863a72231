// The component-wise version test of the maker's limits.
#include <gtest/gtest.h>

#include "corvpkg/pkglimit.h"

using namespace CORVPackageTool;

TEST(LimitVersion, NotLess) {
    const struct {
        const char* a;
        const char* b;
        bool notLess;
    } cases[] = {
        {"1.10", "1.9", true},  {"1.9", "1.10", false},  {"1.0", "1.0", true},
        {"1.0-2", "1.0", true}, {"1.0", "1.0-2", false}, {"1.0-2", "1.0-10", false},
        {"2", "1.9.9", true},   {"1.0.0", "1", true},    {"1", "1.0.1", false},
        {"", "1", false},       {"1", "", false},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(PMSVersionNotLess(c.a, c.b), c.notLess) << "[" << c.a << "] >= [" << c.b << "]";
    }
}
