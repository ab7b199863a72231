#include "store/digest_pipe.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

using namespace CORVPackageTool;

// The digest must not depend on how the transfer cuts the bytes, and a restart (a retried
// attempt) must forget what came before.
TEST(DigestPipe, HashesWhatWasFedSinceTheLastRestart) {
    DigestPipe pipe;
    ASSERT_TRUE(pipe.restart());
    EXPECT_EQ(pipe.finish(), "d41d8cd98f00b204e9800998ecf8427e");

    ASSERT_TRUE(pipe.restart());
    pipe.feed("stale bytes of a failed attempt", 31);
    ASSERT_TRUE(pipe.restart());
    pipe.feed("abc", 3);
    EXPECT_EQ(pipe.finish(), "900150983cd24fb0d6963f7d28e17f72");

    // 3 MiB and a bit in pieces that straddle the blocks handed to the hashing thread.
    const std::string big(3 * 1024 * 1024 + 17, 'a');
    for (size_t piece : {size_t(1), size_t(4096), size_t(1000003)}) {
        ASSERT_TRUE(pipe.restart());
        for (size_t at = 0; at < big.size(); at += piece) {
            pipe.feed(big.data() + at, std::min(piece, big.size() - at));
        }
        EXPECT_EQ(pipe.finish(), "3112e9147448d72d800213e0a209052d") << "pieces of " << piece;
    }
}
