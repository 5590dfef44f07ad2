#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <future>

#include "JustInTimeReleasePicker.h"
#include "Settings.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/TestClock.h"

namespace android::Interpolation {
namespace {

using namespace std::chrono_literals;
using test::makeFrame;

class JustInTimeReleasePickerTest : public testing::Test {
protected:
    void queue(std::initializer_list<nsecs_t> ids) {
        for (nsecs_t id : ids)
            mList->insertFrame(makeFrame(id));
    }

    void setMargin(int32_t marginMs) {
        Settings settings;
        settings.justInTimeMarginMs = static_cast<uint32_t>(marginMs);
        mPicker->onSettingsChanged(settings);
    }

    void composeAt(nsecs_t compositionTime, std::initializer_list<nsecs_t> shown) {
        RenderState state;
        for (nsecs_t id : shown)
            state.items.push_back({makeFrame(id), 1.0f, 0});
        mPicker->onEvent(eBufferComposedEvent, 0, state);
        mPicker->onEvent(eCompositionEstimateEvent, 0, compositionTime);
    }

    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game#4"};
    sp<FrameList> mList = new FrameList(mUid);
    sp<JustInTimeReleasePicker> mPicker = new JustInTimeReleasePicker(mList, mName, mUid);
};

TEST_F(JustInTimeReleasePickerTest, holdsFramesUntilTheQueueIsFull) {
    setMargin(4);
    queue({10, 20});
    composeAt(0, {20});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
    mPicker->setFrameListCapacity(2);
    EXPECT_EQ(10, mPicker->tryRelease().frame.mID);
}

TEST_F(JustInTimeReleasePickerTest, releasesAtOnceWhenTheNewestFrameIsOnScreen) {
    queue({10, 20, 30});
    composeAt(0, {20, 30});
    const ReleaseChoice choice = mPicker->tryRelease();
    EXPECT_EQ(ReleaseChoice::RELEASE, choice.action);
    EXPECT_EQ(10, choice.frame.mID);

    mList->insertFrame(makeFrame(40, /*acquired=*/false));  // newest not acquired
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);
}

TEST_F(JustInTimeReleasePickerTest, otherwiseWaitsUntilTheMarginBeforeTheComposition) {
    test::TestClock clock(1'000'000'000);
    queue({10, 20, 30});
    composeAt(clock.now() + 10'000'000, {20});
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_EVENT, mPicker->tryRelease().action);  // no margin yet

    setMargin(4);
    const ReleaseChoice wait = mPicker->tryRelease();
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_TIME, wait.action);
    EXPECT_EQ(6'000'000, wait.waitTime);

    clock.advance(7'000'000);  // 3 ms left, inside the margin
    EXPECT_EQ(10, mPicker->tryRelease().frame.mID);
    clock.advance(10'000'000);  // the composition is past
    EXPECT_EQ(10, mPicker->attempEarlyRelease().frame.mID);

    setMargin(-1);  // the field is unsigned on the wire, signed in use: -1 ms
    composeAt(clock.now(), {20});
    const ReleaseChoice late = mPicker->attempEarlyRelease();
    EXPECT_EQ(ReleaseChoice::WAIT_FOR_TIME, late.action);
    EXPECT_EQ(1'000'000, late.waitTime);
}

TEST_F(JustInTimeReleasePickerTest, selectionWakesAtTheMarginBeforeTheComposition) {
    setMargin(5);
    queue({10, 20, 30});
    const auto start = std::chrono::steady_clock::now();
    composeAt(systemTime(SYSTEM_TIME_MONOTONIC) + 20'000'000, {20});
    EXPECT_EQ(10, mPicker->selectFrameForRelease().mID);
    const auto waited = std::chrono::steady_clock::now() - start;
    EXPECT_GE(waited, 15ms);
    EXPECT_LT(waited, 60ms);
}

}  // namespace
}  // namespace android::Interpolation
