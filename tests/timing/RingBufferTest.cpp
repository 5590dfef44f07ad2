#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <climits>

#include "RingBuffer.h"

namespace android::Interpolation {
namespace {

using testing::ElementsAre;

void pushRange(RingBuffer<int>& ring, int from, int to) {
    for (int value = from; value <= to; value++)
        ring.push(value);
}

TEST(RingBufferTest, indexesFromBothEndsModuloItsSizeAndOverwritesTheOldest) {
    RingBuffer<int> ring(50);
    EXPECT_EQ(0, ring.at(0));  // empty: a value-initialised element
    pushRange(ring, 1, 3);
    EXPECT_EQ(3, ring.at(3));   // wraps over the three stored values, not the 50 slots
    EXPECT_EQ(1, ring.at(-4));  // (tail + 4 - 1) mod 3 = 0
    // (0 + 2^31 - 1) mod 3 = 1 and (2 - (2^31 - 2)) mod 3 = 2, in one step each.
    EXPECT_EQ(2, ring.at(INT_MIN));
    EXPECT_EQ(3, ring.at(INT_MAX - 1));
    pushRange(ring, 4, 60);
    EXPECT_EQ(50u, ring.size());
    EXPECT_THAT((std::vector<int>{ring.at(0), ring.at(1), ring.at(-1), ring.at(-2)}),
                ElementsAre(60, 59, 11, 12));
}

TEST(RingBufferTest, serializesTheRequestedRangeNewestFirst) {
    RingBuffer<int> ring(4);
    int out[4] = {-7, -7, -7, -7};
    pushRange(ring, 1, 5);                      // holds 5, 4, 3, 2
    EXPECT_EQ(0u, ring.serialize(out, 10, 4));  // start at size
    EXPECT_EQ(0u, ring.serialize(out, 1, 1));   // end at start
    EXPECT_THAT(out, ElementsAre(-7, -7, -7, -7));
    EXPECT_EQ(2u, ring.serialize(out, 100, 2));
    EXPECT_THAT(out, ElementsAre(3, 2, -7, -7));
    EXPECT_EQ(3u, ring.serialize(out, 3, 0));
    EXPECT_THAT(out, ElementsAre(5, 4, 3, -7));
}

}  // namespace
}  // namespace android::Interpolation
