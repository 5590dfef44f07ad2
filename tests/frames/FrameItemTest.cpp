#include <gtest/gtest.h>

#include <limits>

#include "FrameItem.h"
#include "support/Frames.h"

namespace android {
namespace {

using Interpolation::RenderItem;
using Interpolation::RenderState;
using test::makeFrame;

TEST(FrameItemTest, emptyFramesAreDistinctAndCarryNothing) {
    FrameItem first;
    FrameItem second;
    EXPECT_EQ(first.mTimestamp + 1, second.mTimestamp);
    EXPECT_EQ(std::numeric_limits<uint64_t>::max(), first.mIndex);
    EXPECT_EQ(0, first.mTextureSlot);
    EXPECT_EQ(0, first.mID);
    EXPECT_EQ(nullptr, first.mGraphicBuffer);
    EXPECT_EQ(Fence::NO_FENCE, first.mAcquireFence);
    EXPECT_FALSE(first.mAcquired);
    EXPECT_TRUE(first.isEmpty());
    EXPECT_FALSE(first.isValid());
}

TEST(FrameItemTest, updateKeepsAcquiredWhereAssignmentClearsIt) {
    FrameItem stored = makeFrame(10, /*acquired=*/true);
    FrameItem newer = makeFrame(20, /*acquired=*/false, Fence::NO_FENCE, stored.mTimestamp);

    FrameItem merged = stored;
    merged.update(newer);
    EXPECT_TRUE(merged.mAcquired);
    EXPECT_EQ(20, merged.mID);
    EXPECT_EQ(newer.mGraphicBuffer, merged.mGraphicBuffer);

    FrameItem assigned = stored;
    assigned = newer;
    EXPECT_FALSE(assigned.mAcquired);
}

TEST(FrameItemTest, validNeedsADisplayTimeAndASignalledFenceOrAcquisition) {
    sp<Fence> fence = Fence::createPending();
    EXPECT_FALSE(makeFrame(10, /*acquired=*/false, fence).isValid());
    EXPECT_TRUE(makeFrame(10, /*acquired=*/true, fence).isValid());
    EXPECT_FALSE(makeFrame(0, /*acquired=*/true).isValid());
    fence->signal(5);
    EXPECT_TRUE(makeFrame(10, /*acquired=*/false, fence).isValid());
}

TEST(RenderStateTest, meanFrameIdTruncatesEveryTerm) {
    RenderState state;
    EXPECT_EQ(0, state.meanFrameID());
    state.items.push_back(RenderItem{makeFrame(5)});
    state.items.push_back(RenderItem{makeFrame(10)});
    EXPECT_EQ(7, state.meanFrameID());  // 5/2 + 10/2, not 15/2
}

}  // namespace
}  // namespace android
