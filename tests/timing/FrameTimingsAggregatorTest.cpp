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
using testing::IsEmpty;

std::shared_ptr<FenceTime> signalledAt(nsecs_t t) {
    return std::make_shared<FenceTime>(Fence::createSignalled(t));
}

class CallbackReceiver : public EventDispatcher::EventReceiver {
public:
    explicit CallbackReceiver(std::function<void(nsecs_t)> callback) : mCallback(callback) {}
    void onEvent(const EventType&, const nsecs_t& time, const EventData&) override {
        mCallback(time);
    }

private:
    std::function<void(nsecs_t)> mCallback;
};

class FrameTimingsAggregatorTest : public testing::Test {
protected:
    FrameTimingsAggregatorTest() {
        EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
    }
    ~FrameTimingsAggregatorTest() override {
        EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
    }

    std::vector<nsecs_t> eventTimes() const {
        std::vector<nsecs_t> times;
        for (const auto& event : mEvents->events()) {
            EXPECT_EQ(mSlot, std::get<int>(event.data));
            times.push_back(event.time);
        }
        return times;
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
    int mSlot = 3;
};

TEST_F(FrameTimingsAggregatorTest, recordsEveryStageOfAValidSlotAndAnnouncesItAtItsTime) {
    for (int slot : {-1, 64, INT_MIN}) {
        mTimings->dequeueTimings(1, slot);
        mTimings->queueTimings(2, slot);
        mTimings->acquireFenceTimings(signalledAt(3), slot);
        mTimings->frameNumberForIndex(4, slot);
        mTimings->releaseBufferTimings(5, slot);
    }
    sp<Fence> acquire = Fence::createPending();
    mTimings->requestTiming(100);
    mTimings->dequeueTimings(110, mSlot);
    mTimings->frameNumberForIndex(7, mSlot);
    mTimings->queueTimings(150, mSlot);
    mTimings->acquireFenceTimings(std::make_shared<FenceTime>(acquire), mSlot);
    mTimings->receivedFrameTimings(160, mSlot);
    mTimings->compositionTimings(170, mSlot);
    mTimings->presentFenceTimings(signalledAt(180), mSlot);
    mTimings->releaseFrameTimings(190, mSlot);
    acquire->signal(155);
    mTimings->releaseBufferTimings(200, mSlot);

    EXPECT_THAT(mEvents->types(),
                ElementsAre(eBufferRequestedEvent, eBufferDequeuedEvent, eBufferQueuedEvent,
                            eBufferCompletedEvent, eBufferDisplayedEvent, eBufferReleasedEvent));
    EXPECT_THAT(eventTimes(), ElementsAre(100, 110, 150, 155, 180, 200));

    FrameTimings out[2];
    // Once, from the history: the slot was reset, and nothing else was recorded.
    ASSERT_EQ(1u, mTimings->getNewestFrameTimings(2, out));
    const FrameTimings& t = out[0];
    EXPECT_EQ(7u, t.mFrameNumber);
    EXPECT_THAT((std::vector<nsecs_t>{t.mRequestTime, t.mDequeueTime, t.mQueueTime, t.mAcquireTime,
                                      t.mCompositionTime, t.mPresentTime, t.mReceivedTime,
                                      t.mReleaseFrameTime, t.mReleaseBufferTime}),
                ElementsAre(100, 110, 150, 155, 170, 180, 160, 190, 200));
    EXPECT_EQ(nullptr, t.mAcquireFence);
    EXPECT_EQ(nullptr, t.mPresentFence);
}

TEST_F(FrameTimingsAggregatorTest, keepsPollingPendingAndInvalidFences) {
    sp<Fence> acquire = Fence::createPending();
    mTimings->dequeueTimings(10, mSlot);
    mTimings->acquireFenceTimings(std::make_shared<FenceTime>(acquire), mSlot);
    mTimings->presentFenceTimings(FenceTime::NO_FENCE, mSlot);  // signal time -1
    mEvents->clear();
    test::TraceCapture trace;

    mTimings->checkFenceTimes(mSlot);
    FrameTimings out;
    ASSERT_EQ(1u, mTimings->getNewestFrameTimings(1, &out));
    EXPECT_EQ(-1, out.mAcquireTime);
    EXPECT_NE(nullptr, out.mAcquireFence);

    acquire->signal(40);
    mTimings->checkFenceTimes(mSlot);
    mTimings->checkFenceTimes(mSlot);  // the signalled fence is gone: announced once
    EXPECT_THAT(mEvents->types(), ElementsAre(eBufferCompletedEvent));
    EXPECT_THAT(eventTimes(), ElementsAre(40));
    EXPECT_THAT(trace.events(), ElementsAre("B|checkFenceTimes", "E", "B|checkFenceTimes", "E",
                                            "B|checkFenceTimes", "E"));

    // The invalid fence goes into the history still attached, shared rather than moved.
    mTimings->releaseBufferTimings(50, mSlot);
    ASSERT_EQ(1u, mTimings->getNewestFrameTimings(1, &out));
    EXPECT_EQ(40, out.mAcquireTime);
    EXPECT_EQ(-1, out.mPresentTime);
    EXPECT_EQ(FenceTime::NO_FENCE, out.mPresentFence);
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

TEST_F(FrameTimingsAggregatorTest, countsARecordReleasedWhileItsFenceWasPolled) {
    // The fence is announced with the aggregator's mutex released, so the receiver can read the
    // aggregator while another thread releases the slot; that thread's own announcement waits for
    // this broadcast to end.
    std::thread releaser;
    auto released = [&] {
        String8 state;
        mTimings->dump(state, "");
        return strstr(state.c_str(), "inFlight=0 history=1/100") != nullptr;
    };
    sp<CallbackReceiver> receiver = new CallbackReceiver([&](nsecs_t) {
        releaser = std::thread([&] { mTimings->releaseBufferTimings(90, mSlot); });
        while (!released())
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
    });
    EventDispatcher::subscribe(mUid, eBufferCompletedEvent, receiver);
    mTimings->dequeueTimings(10, mSlot);
    mTimings->acquireFenceTimings(signalledAt(50), mSlot);

    test::LogCapture log(2);
    FrameTimings out[3];
    EXPECT_EQ(2u, mTimings->getNewestFrameTimings(3, out));
    releaser.join();
    EXPECT_FALSE(out[0].isValid());
    EXPECT_EQ(90, out[1].mReleaseBufferTime);
    EXPECT_EQ(1, log.count("DistributionBasedLRDelayer Invalid FrameTimings!"));
    EventDispatcher::unsubscribe(mUid, eBufferCompletedEvent, receiver);
}

}  // namespace
}  // namespace android::Interpolation
