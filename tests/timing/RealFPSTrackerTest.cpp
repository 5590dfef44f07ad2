#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "CompositionDeadlinePredictor.h"
#include "RealFPSTracker.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"

namespace android::Interpolation::MachineLearning {
namespace {

using testing::ElementsAre;

constexpr nsecs_t MS = 1'000'000, NOW = 20'000 * MS;

class RateEstimatorTest : public testing::Test {
protected:
    RateEstimatorTest() { EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents); }

    // Buffers provided at these times, each recorded with its own time as the reference.
    void provideAt(std::initializer_list<nsecs_t> times) {
        for (nsecs_t t : times) {
            mTracker->setReferenceTime(t);
            mTracker->logBufferProvided(t);
        }
    }

    const uint32_t mUid = test::nextTestUid();
    sp<RealFPSTracker> mTracker = new RealFPSTracker(mUid);
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
};

TEST_F(RateEstimatorTest, realRateCountsBuffersUntilTheirSpanPassesOneSecond) {
    // From the newest: eight gaps of 125 ms reach exactly one second, which goes on; a gap of
    // 250 ms passes it, and the older buffers are not looked at: 9 buffers in 1.25 s.
    provideAt({8'000 * MS, 8'125 * MS, 8'250 * MS, 8'500 * MS, 8'625 * MS, 8'750 * MS, 8'875 * MS,
               9'000 * MS, 9'125 * MS, 9'250 * MS, 9'375 * MS, 9'500 * MS});
    // Recorded at a reference time that is not before now: not counted.
    mTracker->setReferenceTime(NOW);
    mTracker->logBufferProvided(9'600 * MS);
    EXPECT_EQ(7u, mTracker->getRealFPS(NOW));
    ASSERT_EQ(1u, mEvents->events().size());
    EXPECT_EQ(eRealFPSChangedEvent, mEvents->events()[0].type);
    EXPECT_EQ(NOW, mEvents->events()[0].time);
    EXPECT_EQ(7, std::get<int>(mEvents->events()[0].data));

    String8 out;
    mTracker->dump(out, "");
    EXPECT_EQ("RealFPSTracker uid=" + std::to_string(mUid) +
                      " buffers=13/120 referenceTime=20000000000 newest=9600000000\n",
              out.c_str());
}

TEST_F(RateEstimatorTest, realRateIsSinglePrecisionAndSaturates) {
    EXPECT_EQ(0u, mTracker->getRealFPS(NOW));  // 0 / 0
    provideAt({1'000 * MS, 1'000 * MS});
    EXPECT_EQ(2147483647u, mTracker->getRealFPS(NOW));  // 1 / 0

    // 9 buffers in 0.6 s: 15 in double precision, 14.99999 in single.
    mTracker = new RealFPSTracker(mUid);
    provideAt({1'000 * MS, 1'100 * MS, 1'162'500'000, 1'225 * MS, 1'287'500'000, 1'350 * MS,
               1'412'500'000, 1'475 * MS, 1'537'500'000, 1'600 * MS});
    EXPECT_EQ(14u, mTracker->getRealFPS(NOW));

    // Only the newest 120 buffers are kept: 119 in 0.5 s.
    for (int i = 0; i < 200; i++)
        provideAt({1'000 * MS});
    mTracker->setReferenceTime(1'500 * MS);
    mTracker->logBufferProvided(1'000 * MS);
    EXPECT_EQ(238u, mTracker->getRealFPS(NOW));
}

// The first composition only sets the reference: no event, no log, and no interval.
TEST_F(RateEstimatorTest, nextCompositionIsTheMeanIntervalMinusOneDeviationAhead) {
    test::TestClock clock(NOW);
    sp<CompositionDeadlinePredictor> predictor = new CompositionDeadlinePredictor(mUid);
    test::LogCapture log(1);
    predictor->onComposition(1'000 * MS);
    predictor->onComposition(1'016'600'000);
    predictor->onComposition(1'036'600'000);  // intervals of 16.6 and 20 ms: 18.3 +- 1.7 ms
    EXPECT_THAT(log.texts(),
                ElementsAre("CompositionDeadlinePredictor::onComposition composition time: "
                            "1016600000, estimated next composition time: 1000000000 diff 0.016600",
                            "CompositionDeadlinePredictor::onComposition composition time: "
                            "1036600000, estimated next composition time: 1033200000 diff "
                            "0.003400"));
    const auto events = mEvents->events();
    ASSERT_EQ(2u, events.size());
    EXPECT_EQ(eCompositionEstimateEvent, events[1].type);
    EXPECT_EQ(NOW, events[1].time);
    EXPECT_EQ(1'053'200'000, std::get<nsecs_t>(events[1].data));
    String8 out;
    predictor->dump(out, "");
    EXPECT_EQ("CompositionDeadlinePredictor uid=" + std::to_string(mUid) +
                      " interval avg=18300000 std=1700000 samples=2 lastComposition=1036600000 "
                      "next=1053200000\n",
              out.c_str());
}

}  // namespace
}  // namespace android::Interpolation::MachineLearning
