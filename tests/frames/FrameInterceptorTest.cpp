#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <thread>

#include "FrameInterceptor.h"
#include "TimestampChecker.h"
#include "Tunables.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using test::makeFrame;
using test::RecordingReceiver;
using testing::ElementsAre;
using namespace std::chrono_literals;

constexpr nsecs_t MS = 1'000'000;

class FrameInterceptorTest : public testing::Test {
protected:
    FrameInterceptorTest() {
        EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
    }
    ~FrameInterceptorTest() override {
        mInterceptor.clear();
        EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
        applyDelayToFrames.store(mApplyDelay);
        defaultDelay.store(mDefaultDelay);
    }

    void create(InterpolationMode mode, bool applyDelay) {
        applyDelayToFrames.store(applyDelay);
        String8 name("SurfaceView[game]");
        mInterceptor = new FrameInterceptor(name, mUid, mode, mList, mTimings);
    }

    void queue(uint64_t frameNumber, nsecs_t timestamp, sp<Fence> fence = Fence::NO_FENCE,
               bool acquired = false) {
        mInterceptor->interceptFrame(frameNumber, static_cast<int>(frameNumber % 64), mBuffer,
                                     timestamp, fence, acquired);
    }
    void acquire(uint64_t frameNumber, nsecs_t timestamp, sp<Fence> fence = Fence::NO_FENCE) {
        queue(frameNumber, timestamp, fence, true);
    }

    const bool mApplyDelay = applyDelayToFrames.load();
    const int32_t mDefaultDelay = defaultDelay.exchange(64);
    const uint32_t mUid = test::nextTestUid();
    sp<FrameList> mList = new FrameList(mUid);
    sp<FrameTimingsAggregator> mTimings = new FrameTimingsAggregator(mUid);
    sp<RecordingReceiver> mEvents = new RecordingReceiver();
    sp<GraphicBuffer> mBuffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    sp<FrameInterceptor> mInterceptor;
};

TEST_F(FrameInterceptorTest, queueAndAcquireCallsOfABufferMakeOneFrameWithTheQueuedTimestamp) {
    create(eFillInMode, true);
    test::TestClock clock(9000);
    mTimings->dequeueTimings(8000, 7);
    mEvents->clear();
    queue(7, 1000, Fence::createSignalled(8500));
    acquire(7, 5000, Fence::createSignalled(8600));

    // Queued, its fence, the new frame with both sizes; the acquire call only polls its own fence.
    EXPECT_THAT(mEvents->types(), ElementsAre(eBufferQueuedEvent, eBufferCompletedEvent,
                                              eFrameReceivedEvent, eFrameListSizeChangedEvent,
                                              eFrameListSizeChangedEvent, eBufferCompletedEvent));

    ASSERT_EQ(1u, mList->size());
    EXPECT_EQ(1000, mList->getNewestFrame().mTimestamp);
    EXPECT_TRUE(mList->getNewestFrame().mAcquired);

    FrameTimings timings;
    ASSERT_EQ(1u, mTimings->getNewestFrameTimings(1, &timings));
    EXPECT_EQ(7u, timings.mFrameNumber);
    EXPECT_EQ(9000, timings.mQueueTime);
    EXPECT_EQ(8600, timings.mAcquireTime);
}

TEST_F(FrameInterceptorTest, reusedTimestampSwitchesTheLayerToClockTimeForGood) {
    create(eRetimeMode, false);
    test::TestClock clock(50'000);
    queue(1, 1000);
    queue(2, 1000);  // a second frame with the first one's timestamp
    clock.set(60'000);
    acquire(2, 1000);
    acquire(1, 1000);  // its record from before the switch still holds
    queue(3, 3000);
    acquire(3, 3000);
    std::vector<nsecs_t> timestamps;
    for (const FrameItem& frame : mList->clearEveryFrame())
        timestamps.push_back(frame.mTimestamp);
    EXPECT_THAT(timestamps, ElementsAre(1000, 50'000, 60'000));
}

TEST_F(FrameInterceptorTest, delaysFramesOnlyInMode0WithApplyDelayToFrames) {
    for (auto [mode, applyDelay] : {std::pair{eRetimeMode, true},
                                    {eRetimeMode, false},
                                    {eFillInMode, true},
                                    {eLatencyReductionMode, true}}) {
        create(mode, applyDelay);
        applyDelayToFrames.store(!applyDelay);  // read at construction only
        const bool hasDelayer = mode == eRetimeMode && applyDelay;
        queue(mode, 1000 * MS);
        acquire(mode, 1000 * MS);
        EXPECT_EQ(hasDelayer ? 1064 * MS : 1000 * MS, mList->clearEveryFrame().at(0).mID);
        String8 dump;
        mInterceptor->dumpState(dump, "- ");
        EXPECT_STREQ(hasDelayer ? "- Delay=64ms\n" : "", dump.c_str());
    }
}

// Takes a composition event the way the composition thread delivers it, under the bus's mutex,
// and holds the mutex until the buffer thread is inside the delayer's re-estimation, which logs
// under the delayer's mutex.
class GateReceiver : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {
        mEntered = true;
        const auto deadline = std::chrono::steady_clock::now() + 2s;
        while (!(mSawReestimation = mLog.contains(REESTIMATION)) &&
               std::chrono::steady_clock::now() < deadline)
            std::this_thread::sleep_for(100us);
    }
    // Every frame a hit: one millisecond less.
    static constexpr const char* REESTIMATION =
            "Interpolation rate is high (1.000000), decreasing delay by 1ms to 63ms";
    LogCapture mLog{2};
    std::atomic<bool> mEntered{false};
    std::atomic<bool> mSawReestimation{false};
};

// Real threads: the buffer thread re-estimates and announces the delay while the composition
// thread, holding the bus's mutex, delivers a kind event to the delayer. Announcing under the
// delayer's mutex would deadlock them.
TEST_F(FrameInterceptorTest, onlyAcquiredFramesReEstimateTheDelayAndAnnounceItWithoutDeadlock) {
    sp<GateReceiver> gate = new GateReceiver();
    EventDispatcher::subscribe(mUid, eBlendedCompositionEvent, gate);  // called before the delayer
    create(eRetimeMode, true);
    const sp<Delayer>& delayer = mInterceptor->getDelayer();
    Settings settings;
    settings.delayUpdatePeriodSec = 1e-6f;  // due at every poll
    delayer->onSettingsChanged(settings);
    for (int i = 0; i < Delayer::IGNORE_AT_START + 10; i++)
        delayer->processFrame(Delayer::eHit);
    mEvents->clear();
    queue(1, 1000 * MS);
    EXPECT_EQ(64 * MS, delayer->getDelay());

    auto composition = std::async(std::launch::async, [&] {
        EventDispatcher::broadcastEvent(mUid, eBlendedCompositionEvent, 0, 0);
    });
    auto buffers = std::async(std::launch::async, [&] {
        while (!gate->mEntered.load())
            std::this_thread::yield();
        acquire(1, 1000 * MS);
    });
    if (composition.wait_for(5s) != std::future_status::ready ||
        buffers.wait_for(5s) != std::future_status::ready) {
        std::fprintf(stderr, "The buffer and composition threads deadlocked\n");
        std::_Exit(1);  // deadlocked threads can be neither joined nor stopped
    }
    EventDispatcher::unsubscribe(mUid, eBlendedCompositionEvent, gate);
    EXPECT_TRUE(gate->mSawReestimation);
    EXPECT_EQ(63 * MS, delayer->getDelay());
    EXPECT_THAT(mEvents->types(), ElementsAre(eBufferQueuedEvent, eFrameReceivedEvent,
                                              eFrameListSizeChangedEvent, eFrameListSizeChangedEvent,
                                              eBlendedCompositionEvent, eDelayChangedEvent));
    EXPECT_EQ(1064 * MS, mList->getNewestFrame().mID);
    queue(2, 1016 * MS);
    EXPECT_EQ(1079 * MS, mList->getNewestFrame().mID);
}

TEST_F(FrameInterceptorTest, checkerPassesUnknownAcquiredTimestampsAndCatchesCollisions) {
    test::TestClock clock(77'000);
    TimestampChecker checker(mList);
    EXPECT_EQ(1000, checker.sanitize(5, 1000, true));  // matches nothing queued

    // The same frame again: no record of it, so a warning, and its timestamp is kept.
    mList->insertFrame(makeFrame(2000));  // frame number 2000, acquired
    mList->insertFrame(makeFrame(3000, false, Fence::createPending()));
    LogCapture log(1);
    EXPECT_EQ(2000, checker.sanitize(2000, 2000, true));
    EXPECT_THAT(log.texts(), ElementsAre("Warning: FrameItem with timestamp 2000 is present in "
                                         "FrameList with no record of being checked by "
                                         "TimestampChecker"));
    // A frame that is not ready yet is no collision either.
    EXPECT_EQ(3000, checker.sanitize(4, 3000, true));

    // Another ready frame's timestamp: clock time from now on, but for unknown acquired ones.
    EXPECT_EQ(77'000, checker.sanitize(6, 2000, true));
    EXPECT_EQ(77'000, checker.sanitize(UINT64_MAX, 9000, false));
    EXPECT_EQ(77'000, checker.sanitize(UINT64_MAX, 1234, true));
    EXPECT_EQ(1234, checker.sanitize(UINT64_MAX, 1234, true));  // its record is gone
}

}  // namespace
}  // namespace android::Interpolation
