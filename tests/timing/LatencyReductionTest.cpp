#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "LatencyReduction.h"
#include "support/FrameHistory.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"
#include "support/TraceCapture.h"

namespace android::Interpolation::MachineLearning {
namespace {

using test::addSteadyFrames;
using test::LogCapture;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr nsecs_t MS = 1'000'000, NOW = 1000 * MS, RENDER = 5 * MS, MARGIN = 2 * MS;

class DistributionBasedLRDelayerTest : public testing::Test {
protected:
    DistributionBasedLRDelayerTest() { EventDispatcher::subscribe(mUid, eReleaseDelayed, mEvents); }

    // The release-to-dequeue statistics after one more prediction.
    std::string marginLine() {
        LogCapture log(2);
        mDelayer->getDelay(NOW);
        return log.texts().at(2);
    }

    const uint32_t mUid = test::nextTestUid();
    test::TestClock mClock{NOW};
    sp<FrameTimingsAggregator> mTimings = new FrameTimingsAggregator(mUid);
    sp<DistributionBasedLRDelayer> mDelayer = new DistributionBasedLRDelayer(mUid, mTimings);
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
};

TEST_F(DistributionBasedLRDelayerTest,
       delayIsTheSlackBeforeTheDeadlineFromTwentyFramesOnWithTheLastPlausibleRenderTime) {
    addSteadyFrames(*mTimings, 1, 19, RENDER, MARGIN);
    EXPECT_EQ(0, mDelayer->getDelay(NOW + 100 * MS));
    addSteadyFrames(*mTimings, 20, 30, RENDER, MARGIN);
    {
        LogCapture log(2);
        test::TraceCapture trace;
        EXPECT_EQ(13 * MS, mDelayer->getDelay(NOW + 20 * MS));
        const std::vector<std::string> logged = {
                "DistributionBasedLRDelayer getDelay(1000000000, 1020000000) diff 20000000",
                "DistributionBasedLRDelayer render time: 5.000000ms, avg: 5.000000ms, "
                "std:0.000000ms, percentile: 5.000000",
                "DistributionBasedLRDelayer ReleaseToDequeue avg: 2000000.000000 std: 0.000000",
                "DistributionBasedLRDelayer mNumFrames=30, now=1000000000, rendertime 5000000",
                "DistributionBasedLRDelayer delay: 13000000ns"};
        EXPECT_EQ(logged, log.texts());
        EXPECT_THAT(trace.events(), ElementsAre("B|getDelay", "E"));
    }
    // The slack is the deadline less 5 + 2 ms, within 0..16 ms.
    EXPECT_EQ(3 * MS, mDelayer->getDelay(NOW + 10 * MS));
    EXPECT_EQ(0, mDelayer->getDelay(NOW + 7 * MS));
    EXPECT_EQ(1, mDelayer->getDelay(NOW + 7 * MS + 1));
    EXPECT_EQ(16 * MS - 1, mDelayer->getDelay(NOW + 23 * MS - 1));
    EXPECT_EQ(16 * MS, mDelayer->getDelay(INT64_MAX));
    EXPECT_EQ(0, mDelayer->getDelay(INT64_MIN));

    const auto events = mEvents->events();
    ASSERT_EQ(8u, events.size());
    EXPECT_EQ(NOW, events[0].time);
    EXPECT_EQ(0, std::get<nsecs_t>(events[0].data));  // announced during warm-up too
    EXPECT_EQ(3 * MS, std::get<nsecs_t>(events[2].data));

    // A newest frame whose acquire fence has not signalled: the render time estimate is reused.
    mTimings->dequeueTimings(310 * MS, 1);
    mTimings->frameNumberForIndex(31, 1);
    mTimings->acquireFenceTimings(std::make_shared<FenceTime>(Fence::createPending()), 1);
    LogCapture log(2);
    EXPECT_EQ(3 * MS, mDelayer->getDelay(NOW + 10 * MS));
    EXPECT_TRUE(log.contains("DistributionBasedLRDelayer render time: -310.000001ms (impossible)"));
}

TEST_F(DistributionBasedLRDelayerTest, outliersAreNotLearntOnceFiftySamplesAreHeld) {
    // Alternating 1 and 3 ms: mean 2 ms and deviation 1 ms, so the outlier limit is 5 ms.
    auto releaseToDequeue = [](uint64_t n) {
        if (n == 58) return 5 * MS + 1;
        if (n == 59) return 5 * MS;
        return n % 2 == 0 ? 1 * MS : 3 * MS;
    };
    test::addFrames(*mTimings, 1, 53, RENDER, releaseToDequeue);
    mDelayer->getDelay(NOW);  // frames 53 down to 8, paired with 50 down to 5: 46 samples
    test::addFrames(*mTimings, 54, 57, RENDER, releaseToDequeue);
    const std::string learnt =
            "DistributionBasedLRDelayer ReleaseToDequeue avg: 2000000.000000 std: 1000000.000000";
    EXPECT_EQ(learnt, marginLine());
    test::addFrames(*mTimings, 58, 58, RENDER, releaseToDequeue);
    EXPECT_EQ(learnt, marginLine());
    // Exactly at the limit is learnt, in place of the oldest sample (frame 53's 3 ms): the mean
    // moves by 2 ms / 50. Frame 58 is not judged again by the new statistics, which it would pass.
    test::addFrames(*mTimings, 59, 59, RENDER, releaseToDequeue);
    EXPECT_THAT(marginLine(), HasSubstr("avg: 2040000.000000 std:"));
}

TEST_F(DistributionBasedLRDelayerTest, pairsOnlyFetchedFramesThatCapacityBuffersApart) {
    addSteadyFrames(*mTimings, 1, 20, RENDER, MARGIN);
    const std::string nothingLearnt =
            "DistributionBasedLRDelayer ReleaseToDequeue avg: 0.000000 std: 0.000000";
    // 20 frames for 19 buffers: the one pair is skipped. 20 buffers: the walk's bound wraps and
    // no pair qualifies. All ones, kept as 32 bits: the pairing must not wrap to the next frame.
    for (size_t capacity : {size_t{19}, size_t{20}, SIZE_MAX}) {
        mDelayer->setFrameListCapacity(capacity);
        EXPECT_EQ(nothingLearnt, marginLine()) << capacity;
    }
    // The walk stops one pair short: frame 20 is paired with frame 2, and nothing else.
    mDelayer->setFrameListCapacity(18);
    EXPECT_EQ("DistributionBasedLRDelayer ReleaseToDequeue avg: 152000000.000000 std: 0.000000",
              marginLine());

    String8 out;
    mDelayer->dump(out, "  ");
    EXPECT_EQ("  DistributionBasedLRDelayer uid=" + std::to_string(mUid) +
                      " frames=20 capacity=18 renderTime=5000000 releaseToDequeue avg=152000000 "
                      "std=0 samples=1 lastMarginFrame=20\n",
              out.c_str());
}

}  // namespace
}  // namespace android::Interpolation::MachineLearning
