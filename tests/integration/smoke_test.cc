#include <gtest/gtest.h>
#include <unistd.h>

TEST(Sandbox, RunsAsRootInPrivateRoot) {
    EXPECT_EQ(getuid(), 0u);
}
