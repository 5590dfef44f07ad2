#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <climits>
#include <cstring>
#include <functional>
#include <thread>

#include "FrameTimings.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TraceCapture.h"

namespace android::Interpolation {
namespace {

using testing::ElementsAre;

std::shared_ptr<FenceTime> fenceTime(sp<Fence> fence) {
    return std::make_shared<FenceTime>(fence);
}

class CallbackReceiver : public EventDispatcher::EventReceiver {
public:
    explicit CallbackReceiver(std::function<void()> callback) : mCallback(callback) {}
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override { mCallback(); }

private:
    std::function<void()> mCallback;
};

class FrameTimingsAggregatorTest : public testing::Test {
protected:
    FrameTimingsAggregatorTest() {
        EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
    }

    std::vector<FrameTimings> newest(uint32_t count) {
        std::vector<FrameTimings> out(count);
        out.resize(mTimings->getNewestFrameTimings(count, out.data()));
        return out;
    }

    std::vector<nsecs_t> newestDequeueTimes(uint32_t count) {
        std::vector<nsecs_t> times;
        for (const FrameTimings& timings : newest(count))
            times.push_back(timings.mDequeueTime);
        return times;
    }

    const uint32_t mUid = test::nextTestUid();
    sp<FrameTimingsAggregator> mTimings = new FrameTimingsAggregator(mUid);
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
};

TEST_F(FrameTimingsAggregatorTest, recordsEveryStageOfAValidSlotAndAnnouncesItAtItsTime) {
    for (int slot : {-1, 64, INT_MIN}) {
        mTimings->dequeueTimings(1, slot);
        mTimings->queueTimings(2, slot);
        mTimings->acquireFenceTimings(fenceTime(Fence::createSignalled(3)), slot);
        mTimings->frameNumberForIndex(4, slot);
        mTimings->releaseBufferTimings(5, slot);
    }
    sp<Fence> acquire = Fence::createPending();
    mTimings->requestTiming(100);
    mTimings->dequeueTimings(110, 3);
    mTimings->frameNumberForIndex(7, 3);
    mTimings->queueTimings(150, 3);
    mTimings->acquireFenceTimings(fenceTime(acquire), 3);
    mTimings->receivedFrameTimings(160, 3);
    mTimings->compositionTimings(170, 3);
    mTimings->presentFenceTimings(FenceTime::NO_FENCE, 3);  // signal time -1
    mTimings->releaseFrameTimings(190, 3);
    {
        // Pending and invalid fences stay attached; a signalled one is taken, and announced, once.
        test::TraceCapture trace;
        mTimings->checkFenceTimes(3);
        EXPECT_EQ(-1, newest(1).at(0).mAcquireTime);
        acquire->signal(155);
        mTimings->checkFenceTimes(3);
        mTimings->checkFenceTimes(3);
        EXPECT_THAT(trace.events(), ElementsAre("B|checkFenceTimes", "E", "B|checkFenceTimes", "E",
                                                "B|checkFenceTimes", "E"));
    }
    EXPECT_EQ(FenceTime::NO_FENCE, newest(1).at(0).mPresentFence);
    mTimings->presentFenceTimings(fenceTime(Fence::createSignalled(180)), 3);
    mTimings->releaseBufferTimings(200, 3);  // polls the fences first

    EXPECT_THAT(mEvents->types(),
                ElementsAre(eBufferRequestedEvent, eBufferDequeuedEvent, eBufferQueuedEvent,
                            eBufferCompletedEvent, eBufferDisplayedEvent, eBufferReleasedEvent));
    std::vector<nsecs_t> times;
    for (const auto& event : mEvents->events()) {
        EXPECT_EQ(3, std::get<int>(event.data));
        times.push_back(event.time);
    }
    EXPECT_THAT(times, ElementsAre(100, 110, 150, 155, 180, 200));
    // Once, from the history: the slot was reset, and nothing else was recorded.
    const std::vector<FrameTimings> all = newest(2);
    ASSERT_EQ(1u, all.size());
    const FrameTimings& t = all[0];
    EXPECT_EQ(7u, t.mFrameNumber);
    EXPECT_THAT((std::vector<nsecs_t>{t.mRequestTime, t.mDequeueTime, t.mQueueTime, t.mAcquireTime,
                                      t.mCompositionTime, t.mPresentTime, t.mReceivedTime,
                                      t.mReleaseFrameTime, t.mReleaseBufferTime}),
                ElementsAre(100, 110, 150, 155, 170, 180, 160, 190, 200));
    EXPECT_EQ(nullptr, t.mAcquireFence);
    EXPECT_EQ(nullptr, t.mPresentFence);
}

TEST_F(FrameTimingsAggregatorTest, reportsFramesInFlightByNewestDequeueThenTheNewestFinished) {
    mTimings->dequeueTimings(10, 0);
    mTimings->dequeueTimings(20, 1);
    mTimings->dequeueTimings(30, 2);
    mTimings->releaseBufferTimings(35, 0);
    mTimings->dequeueTimings(40, 0);
    EXPECT_THAT(newestDequeueTimes(8), ElementsAre(40, 30, 20, 10));
    EXPECT_THAT(newestDequeueTimes(2), ElementsAre(40, 30));
    FrameTimings untouched;
    EXPECT_EQ(0u, mTimings->getNewestFrameTimings(0, &untouched));
    EXPECT_FALSE(untouched.isValid());

    // The walk ends where the newest slot recurs, which hides slots 1 and 2 behind a repeat.
    mTimings->dequeueTimings(50, 0);
    EXPECT_THAT(newestDequeueTimes(8), ElementsAre(50, 10));

    // A hundred more finished frames push the first one out of the history.
    for (nsecs_t t = 100; t < 200; t++)
        mTimings->releaseBufferTimings(t, 5);
    const std::vector<FrameTimings> all = newest(1000);
    ASSERT_EQ(101u, all.size());
    EXPECT_EQ(199, all[1].mReleaseBufferTime);
    EXPECT_EQ(100, all[100].mReleaseBufferTime);
}

// The fence is announced with the mutex released, so the receiver can read the aggregator while
// another thread releases the slot; that thread's own announcement waits for this broadcast.
TEST_F(FrameTimingsAggregatorTest, countsARecordReleasedWhileItsFenceWasPolled) {
    std::thread releaser;
    sp<CallbackReceiver> receiver = new CallbackReceiver([&] {
        releaser = std::thread([&] { mTimings->releaseBufferTimings(90, 3); });
        String8 state;
        while (!strstr(state.c_str(), "inFlight=0 history=1/100")) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
            state.clear();
            mTimings->dump(state, "");
        }
    });
    EventDispatcher::subscribe(mUid, eBufferCompletedEvent, receiver);
    mTimings->dequeueTimings(10, 3);
    mTimings->acquireFenceTimings(fenceTime(Fence::createSignalled(50)), 3);

    test::LogCapture log(2);
    FrameTimings out[3];
    EXPECT_EQ(2u, mTimings->getNewestFrameTimings(3, out));
    releaser.join();
    EXPECT_FALSE(out[0].isValid());
    EXPECT_EQ(90, out[1].mReleaseBufferTime);
    EXPECT_EQ(1, log.count("DistributionBasedLRDelayer Invalid FrameTimings!"));
}

}  // namespace
}  // namespace android::Interpolation
