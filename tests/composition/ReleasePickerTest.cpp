#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <future>
#include <limits>
#include <set>
#include <thread>

#include "FillInReleasePicker.h"
#include "JustInTimeReleasePicker.h"
#include "MLLatencyReductionReleasePicker.h"
#include "NoInterpReleasePicker.h"
#include "RetimeReleasePicker.h"
#include "Settings.h"
#include "UnlimitedReleasePicker.h"
#include "support/FrameHistory.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"

namespace android::Interpolation {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;
using test::LogCapture;
using test::makeFrame;
using testing::ElementsAre;

constexpr nsecs_t MS = 1'000'000;

RenderState stateOf(std::initializer_list<nsecs_t> ids) {
    RenderState state;
    for (nsecs_t id : ids)
        state.items.push_back({makeFrame(id), 1.0f, 0});
    return state;
}

class ReleasePickerTest : public testing::Test {
protected:
    sp<ReleasePicker> picker(uint32_t mode) {
        return ReleasePicker::newPickerFromMode(mList, mTimings, mName, mUid,
                                                static_cast<InterpolationMode>(mode));
    }

    void queue(std::initializer_list<nsecs_t> ids) {
        for (nsecs_t id : ids)
            mList->insertFrame(makeFrame(id));
    }

    void broadcast(EventType type, const EventData& data) {
        EventDispatcher::broadcastEvent(mUid, type, systemTime(SYSTEM_TIME_MONOTONIC), data);
    }

    static int policySteps(const LogCapture& log) {
        int steps = 0;
        for (const std::string& text : log.texts())
            steps += text.find("tryRelease: size") != std::string::npos;
        return steps;
    }

    // A selection on another thread, once its first policy step is made: a step holds the picker's
    // mutex, so whatever takes the mutex afterwards comes after the selection has begun to wait.
    static std::future<FrameItem> selectAfterOneStep(ReleasePicker* picker, const LogCapture& log) {
        auto selection = std::async(std::launch::async,
                                    [picker] { return picker->selectFrameForRelease(); });
        while (policySteps(log) == 0)
            std::this_thread::yield();
        return selection;
    }

    static void setMargin(const sp<ReleasePicker>& picker, int32_t marginMs) {
        if (auto* justInTime = dynamic_cast<JustInTimeReleasePicker*>(picker.get())) {
            Settings settings;
            settings.justInTimeMarginMs = static_cast<uint32_t>(marginMs);
            justInTime->onSettingsChanged(settings);
        }
    }

    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game#0"};
    sp<FrameList> mList = new FrameList(mUid);
    sp<FrameTimingsAggregator> mTimings = new FrameTimingsAggregator(mUid);
};

TEST_F(ReleasePickerTest, factoryMapsModesToPolicies) {
    EXPECT_NE(nullptr, dynamic_cast<RetimeReleasePicker*>(picker(0).get()));
    EXPECT_NE(nullptr, dynamic_cast<FillInReleasePicker*>(picker(1).get()));
    EXPECT_NE(nullptr, dynamic_cast<NoInterpReleasePicker*>(picker(2).get()));
    EXPECT_NE(nullptr, dynamic_cast<JustInTimeReleasePicker*>(picker(3).get()));
    EXPECT_NE(nullptr, dynamic_cast<UnlimitedReleasePicker*>(picker(4).get()));
    EXPECT_NE(nullptr, dynamic_cast<MLLatencyReductionReleasePicker*>(picker(5).get()));
    EXPECT_NE(nullptr, dynamic_cast<RetimeReleasePicker*>(picker(6).get()));
}

TEST_F(ReleasePickerTest, displayedPolicyReleasesOnceTheComposedMeanReachesTheOldestFrame) {
    for (uint32_t mode : {eNoInterpMode, eUnlimitedMode}) {
        sp<ReleasePicker> displayed = picker(mode);
        mList->clearEveryFrame();
        queue({8, 20});
        broadcast(eBufferComposedEvent, stateOf({5, 11}));  // 5/2 + 11/2 = 7, not 16/2
        EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, displayed->tryRelease().action);
        broadcast(eBufferComposedEvent, stateOf({5, 12}));  // 2 + 6 = 8
        const ReleaseChoice choice = displayed->tryRelease();
        EXPECT_EQ(ReleaseChoice::RELEASE, choice.action);
        EXPECT_EQ(8, choice.frame.mID);
    }
    mList->clearEveryFrame();
    const auto start = steady_clock::now();  // an empty queue: the empty frame at once
    EXPECT_TRUE(picker(eNoInterpMode)->selectFrameForRelease().isEmpty());
    EXPECT_LT(steady_clock::now() - start, 20ms);
}

TEST_F(ReleasePickerTest, fillInHoldsFourFramesWhateverTheCapacity) {
    sp<ReleasePicker> fillIn = picker(eFillInMode);
    fillIn->setFrameListCapacity(2);
    queue({10, 20, 30});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, fillIn->tryRelease().action);
    queue({40});
    EXPECT_EQ(10, fillIn->tryRelease().frame.mID);
}

TEST_F(ReleasePickerTest, retimeReleasesOnlyWithTwoFramesAtOrBeforeItsUnadvancedDisplayTime) {
    sp<ReleasePicker> retime = picker(eRetimeMode);
    queue({10, 20, 30});
    broadcast(eBufferComposedEvent, stateOf({20, 30}));
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, retime->tryRelease().action);
    queue({-20, -10});  // the upcoming display time stays 0
    EXPECT_EQ(-20, retime->tryRelease().frame.mID);
}

TEST_F(ReleasePickerTest, logsEachPolicyStepAndEveryEventIssue) {
    sp<ReleasePicker> noInterp = picker(eNoInterpMode);
    queue({10});
    LogCapture log(2);
    noInterp->onEvent(eCompositionEstimateEvent, 0, nsecs_t{500});
    noInterp->onEvent(eBufferComposedEvent, 0, 3);
    noInterp->onEvent(eCompositionEstimateEvent, 0, 3);
    noInterp->onEvent(eDelayChangedEvent, 0, nsecs_t{1});
    noInterp->onEvent(eBufferComposedEvent, 0, stateOf({4, 6}));
    noInterp->tryRelease();
    EXPECT_THAT(log.texts(),
                ElementsAre("ReleasePicker::onEvent 2097152 received",
                            "ReleasePicker::onEvent 1048576 received",
                            "ReleasePicker::onEvent eBufferComposedEvent received with no "
                            "RenderState data",
                            "ReleasePicker::onEvent 2097152 received",
                            "ReleasePicker::onEvent eCompositionEstimateEvent received with no "
                            "nsecs_t data",
                            "ReleasePicker::onEvent 32 received",
                            "ReleasePicker::onEvent EventType 32 not handled",
                            "ReleasePicker::onEvent 1048576 received",
                            "Interpolation::NoInterpReleasePicker: [game#0] tryRelease: size 1 "
                            "upcomingDisplayTime 0 mLatestFrameDisplayedTime 5 "
                            "mUpcomingCompositionTime 500"));
}

// The selection carries out what decideRelease() decides without blocking.
TEST_F(ReleasePickerTest, selectionCarriesOutWhatTheNonBlockingStepDecides) {
    test::addSteadyFrames(*mTimings, 1, 30, 1 * MS, 2 * MS);  // the latency picker predicts 16 ms
    std::set<int32_t> actions;
    for (uint32_t mode = 0; mode <= eLatencyReductionMode; mode++) {
        mList->clearEveryFrame();
        sp<ReleasePicker> stepper = picker(mode), selector = picker(mode);
        for (const sp<ReleasePicker>& each : {stepper, selector})
            setMargin(each, 4);
        // Frames; a composition 20 ms ahead, the middle frame on screen; the newest on screen.
        for (int step = 0; step < 3; step++) {
            if (step == 0) queue({10, 20, 30});
            if (step == 1)
                broadcast(eCompositionEstimateEvent, systemTime(SYSTEM_TIME_MONOTONIC) + 20 * MS);
            if (step == 2) queue({-20, -10, 40});
            if (step > 0) broadcast(eBufferComposedEvent, stateOf({step == 1 ? 20 : 40}));
            const auto start = steady_clock::now();
            const ReleaseChoice choice = stepper->decideRelease();
            const FrameItem selected = selector->selectFrameForRelease();
            const auto took = steady_clock::now() - start;
            SCOPED_TRACE(testing::Message() << "mode " << mode << " action " << choice.action);
            actions.insert(choice.action);
            if (choice.action == ReleaseChoice::RELEASE) {
                EXPECT_EQ(choice.frame.mID, selected.mID);
            } else if (choice.action == ReleaseChoice::WAIT_FOR_EVENT) {
                EXPECT_TRUE(selected.isEmpty());
                EXPECT_GE(took, std::chrono::nanoseconds(ReleasePicker::EVENT_WAIT_TIMEOUT));
            } else {  // a time to wait or to sleep, then the oldest frame
                EXPECT_EQ(stepper->chooseOldestFrame().frame.mID, selected.mID);
                EXPECT_GE(took, std::chrono::nanoseconds(choice.waitTime) - 1us);
            }
        }
    }
    EXPECT_EQ(4u, actions.size());
}

TEST_F(ReleasePickerTest, stopEndsASelectionInAnyWaitWhateverTheMargin) {
    test::addSteadyFrames(*mTimings, 1, 30, 1 * MS, 2 * MS);
    queue({10, 20, 30});
    for (uint32_t mode = 0; mode <= eLatencyReductionMode; mode++) {
        // The latency picker sleeps 16 ms with the newest frame on screen, and its release stands;
        // the just-in-time one waits as long as its margin says, the others for an event: those
        // waits end at once, with nothing released.
        sp<ReleasePicker> waiting = picker(mode);
        setMargin(waiting, std::numeric_limits<int32_t>::min());
        broadcast(eBufferComposedEvent,
                  mode == eLatencyReductionMode ? stateOf({30}) : RenderState{});
        broadcast(eCompositionEstimateEvent, systemTime(SYSTEM_TIME_MONOTONIC) + 10'000 * MS);
        LogCapture log(2);
        auto selection = selectAfterOneStep(waiting.get(), log);
        mode % 2 ? waiting.clear() : waiting->stop();  // the last reference stops it too
        EXPECT_TRUE(waiting == nullptr || waiting->decideRelease().frame.isEmpty());
        ASSERT_EQ(std::future_status::ready, selection.wait_for(1s)) << mode;
        EXPECT_EQ(mode == eLatencyReductionMode ? 10 : 0, selection.get().mID) << mode;
        EXPECT_FALSE(log.contains("Interpolation::ReleasePicker timed out. mContinue = 0"));
    }
}

TEST_F(ReleasePickerTest, eventsThePolicyDoesNotReadNeverWakeTheSelection) {
    queue({10});
    for (uint32_t mode : {eRetimeMode, eFillInMode, eNoInterpMode, eUnlimitedMode}) {
        sp<ReleasePicker> waiting = picker(mode);
        LogCapture log(2);
        auto selection = selectAfterOneStep(waiting.get(), log);
        if (mode <= eFillInMode) broadcast(eBufferComposedEvent, stateOf({5}));  // read by neither
        broadcast(eCompositionEstimateEvent, nsecs_t{1});
        EXPECT_TRUE(selection.get().isEmpty());
        EXPECT_EQ(1, policySteps(log)) << mode;
    }
}

// A policy scripted by the test, to drive the waits of the selection.
class ScriptedPicker : public ReleasePicker {
public:
    using Policy = std::function<ReleaseChoice(ScriptedPicker& self, int step)>;

    ScriptedPicker(sp<FrameList>& list, String8& name, uint32_t uid, Policy policy)
        : ReleasePicker(list, name, uid), mPolicy(std::move(policy)) {}
    ReleaseChoice tryRelease() override { return mPolicy(*this, mSteps++); }
    using ReleasePicker::chooseOldestFrame;

    std::atomic<int> mSteps{0};

private:
    Policy mPolicy;
};

class ReleasePickerWaitTest : public ReleasePickerTest {
protected:
    sp<ScriptedPicker> script(ScriptedPicker::Policy policy) {
        return new ScriptedPicker(mList, mName, mUid, std::move(policy));
    }

    // Waits for an event, then releases frame 10.
    sp<ScriptedPicker> waitThenRelease() {
        return script([](ScriptedPicker&, int step) {
            return step == 0 ? ReleaseChoice{} : release(10);
        });
    }

    static std::future<FrameItem> selectAsync(ScriptedPicker* picker) {
        auto selection = std::async(std::launch::async,
                                    [picker] { return picker->selectFrameForRelease(); });
        while (picker->mSteps == 0)
            std::this_thread::yield();
        return selection;
    }

    static ReleaseChoice release(nsecs_t id) { return {ReleaseChoice::RELEASE, makeFrame(id), 0}; }
};

TEST_F(ReleasePickerWaitTest, eventWaitTimesOutAfterThirtyMillisecondsWithTheEmptyFrame) {
    sp<ScriptedPicker> picker = waitThenRelease();
    LogCapture log(2);
    const auto start = steady_clock::now();
    auto selection = selectAsync(picker.get());
    picker->onEvent(eDelayChangedEvent, 0, nsecs_t{1});  // not handled: no wake-up
    EXPECT_TRUE(selection.get().isEmpty());
    const auto elapsed = steady_clock::now() - start;
    EXPECT_GE(elapsed, 30ms);
    EXPECT_LT(elapsed, 300ms);
    EXPECT_EQ(1, picker->mSteps);
    EXPECT_TRUE(log.contains("Interpolation::ReleasePicker timed out. mContinue = 1"));
}

TEST_F(ReleasePickerWaitTest, handledEventsWakeTheWaiter) {
    for (EventType wakeUp : {eFrameReceivedEvent, eBufferComposedEvent, eCompositionEstimateEvent}) {
        sp<ScriptedPicker> picker = waitThenRelease();
        auto selection = selectAsync(picker.get());
        broadcast(wakeUp, RenderState{});  // the payload may be the wrong one
        EXPECT_EQ(10, selection.get().mID) << wakeUp;
    }
}

TEST_F(ReleasePickerWaitTest, eventDuringAPolicyStepIsNotMissed) {
    // The frame arrives while the step runs, after it read the queue: the selection must ask again
    // at once instead of sleeping through the event wait.
    sp<ScriptedPicker> picker = script([this](ScriptedPicker& self, int step) {
        if (step == 0) {
            mList->insertFrame(makeFrame(10));
            return ReleaseChoice{};
        }
        return self.chooseOldestFrame();
    });
    const auto start = steady_clock::now();
    EXPECT_EQ(10, picker->selectFrameForRelease().mID);
    EXPECT_LT(steady_clock::now() - start, 25ms);
}

TEST_F(ReleasePickerWaitTest, timedWaitEndsAtItsDeadline) {
    sp<ScriptedPicker> picker = script([](ScriptedPicker&, int step) {
        return step == 0 ? ReleaseChoice{ReleaseChoice::WAIT_FOR_TIME, FrameItem(), 15'000'000}
                         : release(10);
    });
    const auto start = steady_clock::now();
    EXPECT_EQ(10, picker->selectFrameForRelease().mID);
    const auto elapsed = steady_clock::now() - start;
    EXPECT_GE(elapsed, 15ms);
    EXPECT_LT(elapsed, 200ms);
}

class JustInTimeReleasePickerTest : public ReleasePickerTest {
protected:
    void setMargin(int32_t marginMs) { ReleasePickerTest::setMargin(mPicker, marginMs); }

    void composeAt(nsecs_t compositionTime, std::initializer_list<nsecs_t> shown) {
        mPicker->onEvent(eBufferComposedEvent, 0, stateOf(shown));
        mPicker->onEvent(eCompositionEstimateEvent, 0, compositionTime);
    }

    sp<JustInTimeReleasePicker> mPicker = new JustInTimeReleasePicker(mList, mName, mUid);
};

TEST_F(JustInTimeReleasePickerTest, releasesAtOnceWhenTheQueueIsFullAndTheNewestFrameIsOnScreen) {
    queue({10, 20});
    composeAt(0, {20});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
    mPicker->setFrameListCapacity(2);
    const ReleaseChoice choice = mPicker->tryRelease();
    EXPECT_EQ(ReleaseChoice::RELEASE, choice.action);
    EXPECT_EQ(10, choice.frame.mID);

    setMargin(4);  // with the composition past, only a newest frame not acquired holds the queue
    mList->insertFrame(makeFrame(30, /*acquired=*/false));
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
}

TEST_F(JustInTimeReleasePickerTest, otherwiseWaitsUntilTheMarginBeforeTheComposition) {
    test::TestClock clock(1'000'000'000);
    queue({10, 20, 30});
    composeAt(clock.now() + 10 * MS, {20});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);  // no margin yet

    setMargin(4);
    const ReleaseChoice wait = mPicker->tryRelease();
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_TIME, wait.action);
    EXPECT_EQ(6 * MS, wait.waitTime);

    clock.advance(7 * MS);  // 3 ms left, inside the margin
    EXPECT_EQ(10, mPicker->tryRelease().frame.mID);
    clock.advance(10 * MS);  // the composition is past
    EXPECT_EQ(10, mPicker->attempEarlyRelease().frame.mID);

    setMargin(-1);  // the field is unsigned on the wire, signed in use: -1 ms
    composeAt(clock.now(), {20});
    const ReleaseChoice late = mPicker->attempEarlyRelease();
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_TIME, late.action);
    EXPECT_EQ(1 * MS, late.waitTime);

    // 25 days after the composition, as the policy asks, bounded to 50 ms after it.
    setMargin(std::numeric_limits<int32_t>::min());
    composeAt(clock.now() + 10 * MS, {20});
    EXPECT_EQ(2'147'483'658 * MS, mPicker->attempEarlyRelease().waitTime);
    LogCapture log(1);
    EXPECT_EQ(60 * MS, mPicker->decideRelease().waitTime);
    EXPECT_THAT(log.texts(), ElementsAre("Interpolation::ReleasePicker [game#0] wait of "
                                         "2147483658000000 ns bounded to 60000000 ns"));
}

class MLLatencyReductionReleasePickerTest : public ReleasePickerTest {
protected:
    MLLatencyReductionReleasePickerTest() {
        // A game rendering in 1 ms whose buffers come back 2 ms before they are dequeued.
        test::addSteadyFrames(*mTimings, 1, 30, 1 * MS, 2 * MS);
        EventDispatcher::subscribe(mUid, eReleaseDelayed, mDelays);
    }
    ~MLLatencyReductionReleasePickerTest() override {
        EventDispatcher::unsubscribe(mUid, eReleaseDelayed, mDelays);
    }

    sp<test::RecordingReceiver> mDelays = new test::RecordingReceiver();
    sp<ReleasePicker> mPicker = picker(eLatencyReductionMode);
};

TEST_F(MLLatencyReductionReleasePickerTest, frameArrivalsReachTheBaseTwiceUntilTheLastReference) {
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

    // 100 ms ahead, less the 12 ms margin (the first render-time estimate is 0): the longest sleep,
    // 16 ms, unless a slow machine holds this thread up for over 70 ms.
    broadcast(eBufferComposedEvent, stateOf({30, 40}));
    broadcast(eCompositionEstimateEvent, systemTime(SYSTEM_TIME_MONOTONIC) + 100 * MS);
    const auto start = steady_clock::now();
    EXPECT_EQ(10, mPicker->selectFrameForRelease().mID);
    const auto elapsed = steady_clock::now() - start;
    ASSERT_EQ(1u, mDelays->events().size());
    const nsecs_t delay = std::get<nsecs_t>(mDelays->events()[0].data);
    EXPECT_GT(delay, 0);
    EXPECT_LE(delay, 16 * MS);
    EXPECT_GE(elapsed, std::chrono::microseconds(delay / 1000));
    EXPECT_LT(elapsed, std::chrono::nanoseconds(delay) + 100ms);

    // A composition already due: no sleep.
    broadcast(eCompositionEstimateEvent, systemTime(SYSTEM_TIME_MONOTONIC) - 1 * MS);
    EXPECT_EQ(10, mPicker->selectFrameForRelease().mID);
    EXPECT_EQ(0, std::get<nsecs_t>(mDelays->events().back().data));
}

TEST_F(MLLatencyReductionReleasePickerTest, compositionDuringTheSleepNeitherWaitsNorIsLost) {
    queue({10, 20, 30});
    broadcast(eBufferComposedEvent, stateOf({30}));
    // The longest sleep, 16 ms.
    broadcast(eCompositionEstimateEvent, systemTime(SYSTEM_TIME_MONOTONIC) + 100 * MS);

    auto selection =
            std::async(std::launch::async, [&] { return mPicker->selectFrameForRelease(); });
    while (mDelays->events().empty())  // the delay is announced just before the sleep
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
