#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <future>
#include <limits>

#include "FillInReleasePicker.h"
#include "FrameTimings.h"
#include "JustInTimeReleasePicker.h"
#include "NoInterpReleasePicker.h"
#include "RetimeReleasePicker.h"
#include "UnlimitedReleasePicker.h"
#include "support/Frames.h"
#include "support/LogCapture.h"

namespace android::Interpolation {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;
using test::LogCapture;
using test::makeFrame;
using testing::ElementsAre;

RenderState stateOf(std::initializer_list<nsecs_t> ids) {
    RenderState state;
    for (nsecs_t id : ids)
        state.items.push_back({makeFrame(id), 1.0f, 0});
    return state;
}

class ReleasePickerTest : public testing::Test {
protected:
    template <typename Picker>
    sp<ReleasePicker> make() {
        return new Picker(mList, mName, mUid);
    }

    void queue(std::initializer_list<nsecs_t> ids) {
        for (nsecs_t id : ids)
            mList->insertFrame(makeFrame(id));
    }

    void compose(const sp<ReleasePicker>& picker, std::initializer_list<nsecs_t> ids) {
        picker->onEvent(eBufferComposedEvent, 0, stateOf(ids));
    }

    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game#0"};
    sp<FrameList> mList = new FrameList(mUid);
    sp<FrameTimingsAggregator> mTimings = new FrameTimingsAggregator(mUid);
};

TEST_F(ReleasePickerTest, factoryMapsModesToPolicies) {
    auto pickerFor = [&](uint32_t mode) {
        return ReleasePicker::newPickerFromMode(mList, mTimings, mName, mUid,
                                                static_cast<InterpolationMode>(mode));
    };
    EXPECT_NE(nullptr, dynamic_cast<RetimeReleasePicker*>(pickerFor(0).get()));
    EXPECT_NE(nullptr, dynamic_cast<FillInReleasePicker*>(pickerFor(1).get()));
    EXPECT_NE(nullptr, dynamic_cast<NoInterpReleasePicker*>(pickerFor(2).get()));
    EXPECT_NE(nullptr, dynamic_cast<JustInTimeReleasePicker*>(pickerFor(3).get()));
    EXPECT_NE(nullptr, dynamic_cast<UnlimitedReleasePicker*>(pickerFor(4).get()));
    EXPECT_NE(nullptr, dynamic_cast<RetimeReleasePicker*>(pickerFor(6).get()));
}

TEST_F(ReleasePickerTest, displayedPolicyReleasesOnceTheComposedMeanReachesTheOldestFrame) {
    for (sp<ReleasePicker> picker :
         {make<NoInterpReleasePicker>(), make<UnlimitedReleasePicker>()}) {
        mList->clearEveryFrame();
        queue({7, 20});
        compose(picker, {5, 8});  // mean 2 + 4 = 6
        EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, picker->tryRelease().action);
        compose(picker, {5, 10});  // mean 2 + 5 = 7
        const ReleaseChoice choice = picker->tryRelease();
        EXPECT_EQ(ReleaseChoice::RELEASE, choice.action);
        EXPECT_EQ(7, choice.frame.mID);
    }
}

TEST_F(ReleasePickerTest, displayedPolicyOnAnEmptyQueueReturnsTheEmptyFrameAtOnce) {
    sp<ReleasePicker> picker = make<NoInterpReleasePicker>();
    const auto start = steady_clock::now();
    EXPECT_TRUE(picker->selectFrameForRelease().isEmpty());
    EXPECT_LT(steady_clock::now() - start, 20ms);
}

TEST_F(ReleasePickerTest, fillInHoldsFourFramesWhateverTheCapacity) {
    sp<ReleasePicker> picker = make<FillInReleasePicker>();
    picker->setFrameListCapacity(2);
    queue({10, 20, 30});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, picker->tryRelease().action);
    queue({40});
    EXPECT_EQ(10, picker->tryRelease().frame.mID);
}

TEST_F(ReleasePickerTest, retimeReleasesOnlyWithTwoFramesAtOrBeforeItsUnadvancedDisplayTime) {
    sp<ReleasePicker> picker = make<RetimeReleasePicker>();
    queue({10, 20, 30});
    compose(picker, {20, 30});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, picker->tryRelease().action);
    queue({-20, -10});  // the upcoming display time stays 0
    EXPECT_EQ(-20, picker->tryRelease().frame.mID);
}

TEST_F(ReleasePickerTest, logsEachPolicyStepAndEveryEventIssue) {
    sp<ReleasePicker> picker = make<NoInterpReleasePicker>();
    queue({10});
    LogCapture log(2);
    picker->onEvent(eCompositionEstimateEvent, 0, nsecs_t{500});
    picker->onEvent(eBufferComposedEvent, 0, 3);
    picker->onEvent(eCompositionEstimateEvent, 0, 3);
    picker->onEvent(eDelayChangedEvent, 0, nsecs_t{1});
    compose(picker, {4, 6});
    picker->tryRelease();
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
        EventDispatcher::broadcastEvent(mUid, wakeUp, 0, RenderState{});  // payload may be wrong
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

TEST_F(ReleasePickerWaitTest, tearDownReleasesAWaiterWithTheEmptyFrame) {
    // The farthest deadline there is: only the tear-down can end this wait.
    sp<ScriptedPicker> picker = script([](ScriptedPicker&, int) {
        return ReleaseChoice{ReleaseChoice::WAIT_FOR_TIME, FrameItem(),
                             std::numeric_limits<nsecs_t>::max()};
    });
    auto selection = selectAsync(picker.get());
    EXPECT_EQ(std::future_status::timeout, selection.wait_for(10ms));

    const auto start = steady_clock::now();
    picker.clear();  // the last reference: stops, and waits for the selection to leave
    EXPECT_LT(steady_clock::now() - start, 100ms);
    // The selection has left the picker; its result reaches the future a moment later.
    ASSERT_EQ(std::future_status::ready, selection.wait_for(100ms));
    EXPECT_TRUE(selection.get().isEmpty());
}

}  // namespace
}  // namespace android::Interpolation
