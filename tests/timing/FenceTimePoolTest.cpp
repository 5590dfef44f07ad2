#include <gtest/gtest.h>

#include "FenceTimePool.h"
#include "FrameTimings.h"

namespace android::Interpolation {
namespace {

// A wrapper's storage goes back to the pool only once no shared or weak reference is left, and is
// then what the next wrapper gets: the pool stops growing once it holds the wrappers in use.
TEST(FenceTimePoolTest, storageReturnsOnlyWhenTheLastReferenceGoes) {
    sp<FenceTimePool> pool = new FenceTimePool();
    const sp<Fence> signalled = Fence::createSignalled(7);
    std::shared_ptr<FenceTime> held = pool->wrap(signalled);
    std::shared_ptr<FenceTime> dropped = pool->wrap(Fence::createPending());
    const FenceTime* watchedStorage = dropped.get();
    std::weak_ptr<FenceTime> watched = dropped;
    dropped.reset();
    ASSERT_TRUE(watched.expired());

    for (int i = 0; i < 1000; i++) {
        const std::shared_ptr<FenceTime> next = pool->wrap(Fence::NO_FENCE);
        EXPECT_NE(held.get(), next.get());
        EXPECT_NE(watchedStorage, next.get());
    }
    EXPECT_EQ(7, held->getSignalTime());
    watched.reset();
    for (int i = 0; i < 1000; i++)
        held = pool->wrap(signalled);
    EXPECT_EQ(16u, pool->capacity());
}

TEST(FenceTimePoolTest, wrapperOutlivesTheAggregatorWhosePoolMadeIt) {
    sp<FrameTimingsAggregator> timings = new FrameTimingsAggregator(4100);
    std::shared_ptr<FenceTime> wrapper = timings->wrapFence(Fence::createSignalled(3));
    timings.clear();
    EXPECT_EQ(3, wrapper->getSignalTime());
}

}  // namespace
}  // namespace android::Interpolation
