#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
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

    std::vector<FrameItem> queued() {
        std::vector<FrameItem> frames = mList->clearEveryFrame();
        for (const FrameItem& frame : frames)
            mList->insertFrame(frame);
        return frames;
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
    EXPECT_EQ(9000, mEvents->events()[0].time);

    const std::vector<FrameItem> frames = queued();
    ASSERT_EQ(1u, frames.size());
    EXPECT_EQ(1000, frames[0].mTimestamp);
    EXPECT_EQ(1000, frames[0].mID);
    EXPECT_TRUE(frames[0].mAcquired);

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
    acquire(1, 1000);
    queue(3, 3000);
    acquire(3, 3000);
    std::vector<nsecs_t> acquiredTimestamps;
    for (const FrameItem& frame : queued())
        if (frame.mAcquired) acquiredTimestamps.push_back(frame.mTimestamp);
    EXPECT_THAT(acquiredTimestamps, ElementsAre(1000, 50'000, 60'000));
}

TEST_F(FrameInterceptorTest, delaysFramesOnlyInMode0WithApplyDelayToFrames) {
    for (auto [mode, applyDelay] : {std::pair{eRetimeMode, true},
                                    {eRetimeMode, false},
                                    {eFillInMode, true},
                                    {eLatencyReductionMode, true}}) {
        create(mode, applyDelay);
        applyDelayToFrames.store(!applyDelay);  // read at construction only
        const bool hasDelayer = mode == eRetimeMode && applyDelay;
        EXPECT_EQ(hasDelayer, mInterceptor->getDelayer() != nullptr);
        queue(mode, 1000 * MS);
        acquire(mode, 1000 * MS);
        EXPECT_EQ(hasDelayer ? 1064 * MS : 1000 * MS, mList->clearEveryFrame().at(0).mID);
        String8 dump;
        mInterceptor->dumpState(dump, "- ");
        EXPECT_STREQ(hasDelayer ? "- Delay=64ms\n" : "", dump.c_str());
    }
}

TEST_F(FrameInterceptorTest, onlyAcquiredFramesReEstimateTheDelay) {
    test::TestClock clock(100 * MS);
    create(eRetimeMode, true);
    const sp<Delayer>& delayer = mInterceptor->getDelayer();
    Settings settings;
    settings.delayUpdatePeriodSec = 1.0f;
    delayer->onSettingsChanged(settings);  // due after 1.1 s
    for (int i = 0; i < Delayer::IGNORE_AT_START + 100; i++)
        delayer->processFrame(Delayer::eHit);

    clock.set(1200 * MS);
    mEvents->clear();
    queue(1, 1000 * MS);
    EXPECT_EQ(64 * MS, delayer->getDelay());
    acquire(1, 1000 * MS);
    // Every frame a hit: one millisecond less, announced after the frame went in.
    EXPECT_EQ(63 * MS, delayer->getDelay());
    EXPECT_THAT(mEvents->types(),
                ElementsAre(eBufferQueuedEvent, eFrameReceivedEvent, eFrameListSizeChangedEvent,
                            eFrameListSizeChangedEvent, eDelayChangedEvent));
    EXPECT_EQ(1064 * MS, queued()[0].mID);
    queue(2, 1016 * MS);
    EXPECT_EQ(1079 * MS, queued()[1].mID);
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
    static constexpr const char* REESTIMATION =
            "Interpolation rate is high (1.000000), decreasing delay by 1ms to 63ms";
    LogCapture mLog{2};
    std::atomic<bool> mEntered{false};
    std::atomic<bool> mSawReestimation{false};
};

// Real threads: the buffer thread re-estimates and announces the delay while the composition
// thread, holding the bus's mutex, delivers a kind event to the delayer. Announcing under the
// delayer's mutex would deadlock them.
TEST_F(FrameInterceptorTest, delayAnnouncementsDoNotDeadlockWithCompositionEvents) {
    sp<GateReceiver> gate = new GateReceiver();
    EventDispatcher::subscribe(mUid, eBlendedCompositionEvent, gate);  // called before the delayer
    create(eRetimeMode, true);
    Settings settings;
    settings.delayUpdatePeriodSec = 1e-6f;  // due at the acquire call
    mInterceptor->getDelayer()->onSettingsChanged(settings);
    for (int i = 0; i < Delayer::IGNORE_AT_START + 10; i++)
        mInterceptor->getDelayer()->processFrame(Delayer::eHit);
    queue(1, 1000 * MS);
    mEvents->clear();

    std::atomic<int> finished{0};
    std::thread composition([&] {
        EventDispatcher::broadcastEvent(mUid, eBlendedCompositionEvent, 0, 0);
        finished++;
    });
    std::thread buffers([&] {
        while (!gate->mEntered.load())
            std::this_thread::yield();
        acquire(1, 1000 * MS);
        finished++;
    });
    const auto deadline = std::chrono::steady_clock::now() + 5s;
    while (finished.load() < 2 && std::chrono::steady_clock::now() < deadline)
        std::this_thread::sleep_for(1ms);
    if (finished.load() < 2) {
        // Deadlocked threads can be neither joined nor stopped.
        std::fprintf(stderr, "The buffer and composition threads deadlocked\n");
        std::_Exit(1);
    }
    buffers.join();
    composition.join();
    EventDispatcher::unsubscribe(mUid, eBlendedCompositionEvent, gate);
    EXPECT_TRUE(gate->mSawReestimation);
    EXPECT_THAT(mEvents->types(), ElementsAre(eBlendedCompositionEvent, eDelayChangedEvent));
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
