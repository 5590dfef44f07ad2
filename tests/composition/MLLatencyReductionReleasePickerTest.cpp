#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <thread>

#include "MLLatencyReductionReleasePicker.h"
#include "support/FrameHistory.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"

namespace android::Interpolation {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;
using test::LogCapture;
using test::makeFrame;

constexpr nsecs_t MS = 1'000'000;

RenderState stateOf(std::initializer_list<nsecs_t> ids) {
    RenderState state;
    for (nsecs_t id : ids)
        state.items.push_back({makeFrame(id), 1.0f, 0});
    return state;
}

nsecs_t now() {
    return systemTime(SYSTEM_TIME_MONOTONIC);
}

class MLLatencyReductionReleasePickerTest : public testing::Test {
protected:
    MLLatencyReductionReleasePickerTest() {
        // A game rendering in 1 ms whose buffers come back 2 ms before they are dequeued.
        test::addSteadyFrames(*mTimings, 1, 30, 1 * MS, 2 * MS);
        EventDispatcher::subscribe(mUid, eReleaseDelayed, mDelays);
    }
    ~MLLatencyReductionReleasePickerTest() override {
        EventDispatcher::unsubscribe(mUid, eReleaseDelayed, mDelays);
    }

    void queue(std::initializer_list<nsecs_t> ids) {
        for (nsecs_t id : ids)
            mList->insertFrame(makeFrame(id));
    }
    void broadcast(EventType type, const EventData& data) {
        EventDispatcher::broadcastEvent(mUid, type, now(), data);
    }

    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game#0"};
    sp<FrameList> mList = new FrameList(mUid);
    sp<FrameTimingsAggregator> mTimings = new FrameTimingsAggregator(mUid);
    sp<test::RecordingReceiver> mDelays = new test::RecordingReceiver();
    sp<ReleasePicker> mPicker =
            ReleasePicker::newPickerFromMode(mList, mTimings, mName, mUid, eLatencyReductionMode);
};

TEST_F(MLLatencyReductionReleasePickerTest, frameArrivalsReachTheBaseTwiceUntilTheLastReference) {
    ASSERT_NE(nullptr, dynamic_cast<MLLatencyReductionReleasePicker*>(mPicker.get()));
    LogCapture log(2);
    broadcast(eFrameReceivedEvent, makeFrame(10));
    broadcast(eBufferComposedEvent, stateOf({10}));
    EXPECT_EQ(2, log.count("ReleasePicker::onEvent 1 received"));
    EXPECT_EQ(1, log.count("ReleasePicker::onEvent 1048576 received"));

    // Both entries leave with the picker: no dead entry is met afterwards.
    mPicker.clear();
    log.clear();
    broadcast(eFrameReceivedEvent, makeFrame(20));
    broadcast(eBufferComposedEvent, stateOf({20}));
    EXPECT_THAT(log.texts(), testing::IsEmpty());
}

TEST_F(MLLatencyReductionReleasePickerTest, releasesOnceTheNewestIsOnScreenAfterThePredictedSleep) {
    // Four buffers, also for the delayer: a buffer now comes back 12 ms before its next dequeue.
    mPicker->setFrameListCapacity(4);
    queue({10, 20, 30});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
    mList->insertFrame(makeFrame(40, /*acquired=*/false));
    broadcast(eBufferComposedEvent, stateOf({30, 40}));
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
    mList->insertFrame(makeFrame(40));
    broadcast(eBufferComposedEvent, stateOf({30}));
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
    EXPECT_THAT(mDelays->events(), testing::IsEmpty());  // no sleep either

    // 20 ms ahead, less the 12 ms margin (the first render-time estimate is 0): up to 8 ms.
    broadcast(eBufferComposedEvent, stateOf({30, 40}));
    broadcast(eCompositionEstimateEvent, now() + 20 * MS);
    const auto start = steady_clock::now();
    EXPECT_EQ(10, mPicker->selectFrameForRelease().mID);
    const auto elapsed = steady_clock::now() - start;
    ASSERT_EQ(1u, mDelays->events().size());
    const nsecs_t delay = std::get<nsecs_t>(mDelays->events()[0].data);
    EXPECT_GT(delay, 0);
    EXPECT_LE(delay, 8 * MS);
    EXPECT_GE(elapsed, std::chrono::microseconds(delay / 1000));
    EXPECT_LT(elapsed, std::chrono::nanoseconds(delay) + 100ms);

    // A composition already due: no sleep.
    broadcast(eCompositionEstimateEvent, now() - 1 * MS);
    EXPECT_EQ(10, mPicker->selectFrameForRelease().mID);
    EXPECT_EQ(0, std::get<nsecs_t>(mDelays->events().back().data));
}

TEST_F(MLLatencyReductionReleasePickerTest, compositionDuringTheSleepNeitherWaitsNorIsLost) {
    queue({10, 20, 30});
    broadcast(eBufferComposedEvent, stateOf({30}));
    broadcast(eCompositionEstimateEvent, now() + 100 * MS);  // the longest sleep, 16 ms

    auto selection =
            std::async(std::launch::async, [&] { return mPicker->selectFrameForRelease(); });
    // The delay is announced just before the sleep.
    while (mDelays->events().empty())
        std::this_thread::yield();
    const auto start = steady_clock::now();
    broadcast(eBufferComposedEvent, stateOf({40}));
    EXPECT_LT(steady_clock::now() - start, 8ms);
    ASSERT_EQ(std::future_status::ready, selection.wait_for(1s));
    EXPECT_EQ(10, selection.get().mID);

    // The host lets frame 10 go and queues 40; the picker saw 40 composed.
    mList->clearOldestFrameLocking();
    queue({40});
    broadcast(eCompositionEstimateEvent, nsecs_t{0});
    EXPECT_EQ(20, mPicker->selectFrameForRelease().mID);
}

}  // namespace
}  // namespace android::Interpolation
