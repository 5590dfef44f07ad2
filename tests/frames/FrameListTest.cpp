#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <thread>

#include "FrameList.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"
#include "support/TraceCapture.h"

namespace android {
namespace {

using Interpolation::EventDispatcher;
using test::LogCapture;
using test::makeFrame;
using test::RecordingReceiver;
using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

class FrameListTest : public testing::Test {
protected:
    FrameListTest() { EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents); }
    ~FrameListTest() override {
        EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, mEvents);
    }

    void insert(std::initializer_list<nsecs_t> ids) {
        for (nsecs_t id : ids)
            mList->insertFrame(makeFrame(id));
    }

    std::vector<nsecs_t> queuedIds() {
        std::vector<nsecs_t> ids;
        for (const FrameItem& frame : mList->clearEveryFrame())
            ids.push_back(frame.mID);
        return ids;
    }

    const uint32_t mUid = test::nextTestUid();
    sp<FrameList> mList = new FrameList(mUid);
    sp<RecordingReceiver> mEvents = new RecordingReceiver();
};

TEST_F(FrameListTest, insertionAnnouncesTheFrameAndBothSizes) {
    test::TestClock clock(5000);
    mList->insertFrame(makeFrame(30));
    mList->insertFrame(makeFrame(10));

    const auto events = mEvents->events();
    ASSERT_EQ(6u, events.size());
    EXPECT_EQ(Interpolation::eFrameReceivedEvent, events[3].type);
    EXPECT_EQ(5000, events[3].time);
    EXPECT_EQ(10, std::get<FrameItem>(events[3].data).mID);
    EXPECT_EQ(Interpolation::eFrameListSizeChangedEvent, events[4].type);
    EXPECT_EQ(4999, events[4].time);
    EXPECT_EQ(1, std::get<int>(events[4].data));
    EXPECT_EQ(5000, events[5].time);
    EXPECT_EQ(2, std::get<int>(events[5].data));

    mEvents->clear();
    mList->clearOldestFrameLocking();
    const auto removal = mEvents->events();
    ASSERT_EQ(3u, removal.size());
    EXPECT_EQ(Interpolation::eFrameReleasedEvent, removal[0].type);
    EXPECT_EQ(10, std::get<FrameItem>(removal[0].data).mID);
    EXPECT_EQ(2, std::get<int>(removal[1].data));
    EXPECT_EQ(4999, removal[1].time);
    EXPECT_EQ(1, std::get<int>(removal[2].data));
}

TEST_F(FrameListTest, keepsDisplayTimeOrderAndArrivalOrderForEqualTimes) {
    mList->insertFrame(makeFrame(20, true, Fence::NO_FENCE, /*timestamp=*/1));
    mList->insertFrame(makeFrame(10, true, Fence::NO_FENCE, /*timestamp=*/2));
    mList->insertFrame(makeFrame(20, true, Fence::NO_FENCE, /*timestamp=*/3));
    mList->insertFrame(makeFrame(15, true, Fence::NO_FENCE, /*timestamp=*/4));
    std::vector<nsecs_t> timestamps;
    for (const FrameItem& frame : mList->clearEveryFrame())
        timestamps.push_back(frame.mTimestamp);
    EXPECT_THAT(timestamps, ElementsAre(2, 4, 1, 3));
}

TEST_F(FrameListTest, duplicateTimestampMergesSilentlyAndAcquiredSticks) {
    FrameItem queued = makeFrame(10, /*acquired=*/false, Fence::createPending());
    mList->insertFrame(queued);
    FrameItem acquired = queued;
    acquired.mAcquired = true;
    mList->insertFrame(acquired);
    FrameItem requeued = queued;  // not acquired: must not clear the flag
    LogCapture log(2);
    mEvents->clear();
    mList->insertFrame(requeued);

    EXPECT_THAT(mEvents->types(), IsEmpty());
    EXPECT_EQ(1u, mList->size());
    EXPECT_TRUE(mList->getNewestFrame().mAcquired);
    EXPECT_THAT(log.texts(), ElementsAre("Interpolation::FrameList insertFrame frame 10",
                                         "Interpolation::FrameList attempted to insert duplicate "
                                         "frame 10"));
}

TEST_F(FrameListTest, relativeIndicesAroundADisplayTime) {
    insert({10, 20, 30});
    auto at = [&](nsecs_t t, int index) {
        // getFrameAt with an index expects the caller to hold the list's mutex; nothing else
        // touches the list here.
        return mList->getFrameAt(t, index).mID;
    };
    EXPECT_EQ(20, at(20, -1));
    EXPECT_EQ(10, at(20, -2));
    EXPECT_EQ(30, at(20, 1));
    EXPECT_EQ(0, at(20, 2));
    EXPECT_EQ(0, at(20, -3));
    EXPECT_EQ(10, at(15, -1));
    EXPECT_EQ(20, at(15, 1));
    EXPECT_EQ(10, at(5, 1));
    EXPECT_EQ(0, at(5, -1));
    EXPECT_EQ(30, mList->getFrameBefore(35).mID);
    EXPECT_EQ(0, mList->getFrameAfter(35).mID);

    LogCapture log(1);
    EXPECT_EQ(0, at(20, 0));
    EXPECT_THAT(log.texts(), ElementsAre("FrameList received an invalid index"));
}

TEST_F(FrameListTest, invalidOldestFrameShiftsIndicesToDequePositions) {
    mList->insertFrame(makeFrame(10, /*acquired=*/false, Fence::createPending()));
    insert({20, 30});
    LogCapture log(1);
    EXPECT_EQ(0, mList->getFrameBefore(25).mID);  // -1 reaches position -1
    EXPECT_EQ(20, mList->getFrameAfter(25).mID);  // +1 reaches position 1
    EXPECT_FALSE(mList->isOldestFrameUnused(25));
    EXPECT_EQ(3, log.count("FrameList passed an invalid FrameItem"));
}

TEST_F(FrameListTest, emptyListLooksUpNothing) {
    LogCapture log(1);
    EXPECT_TRUE(mList->getFrameBefore(10).isEmpty());
    EXPECT_TRUE(mList->getNewestFrameAndLock().isEmpty());
    EXPECT_EQ(0, mList->getPresentQueueIndex(10));
    EXPECT_EQ(-1, mList->getFrameIndexBeforeLocked(10));
    EXPECT_THAT(log.texts(), ElementsAre("FrameList is empty"));
}

TEST_F(FrameListTest, beforeAndAfterStopLockingAfterKillLocksButTheOthersDoNot) {
    insert({10, 20, 30});
    EXPECT_EQ(10, mList->getFrameBeforeAndLock(15).mID);
    mList->killLocks();
    EXPECT_EQ(20, mList->getFrameAfterAndLock(15).mID);
    EXPECT_EQ(30, mList->getNewestFrameAndLock().mID);

    String8 dump;
    mList->dump(dump, "  ");
    EXPECT_THAT(std::string(dump.c_str()), testing::HasSubstr("mID 10 "));
    LogCapture log(2);
    mList->unlock(10);
    mList->unlock(20);
    mList->unlock(30);
    EXPECT_THAT(log.texts(), ElementsAre("FrameList attempted to unlock non-locked frame 10",
                                         "FrameList attempted to unlock non-locked frame 20",
                                         "FrameList::unlock unlocking 30"));
}

TEST_F(FrameListTest, lockingLookUpsChooseTheirFrames) {
    mList->insertFrame(makeFrame(10, /*acquired=*/true));
    mList->insertFrame(makeFrame(20, /*acquired=*/false, Fence::createSignalled(1)));
    mList->insertFrame(makeFrame(30, /*acquired=*/false, Fence::createPending()));
    EXPECT_EQ(30, mList->getFrameAfterAndLock(20).mID);  // not ready, so not locked
    {
        LogCapture log(1);
        mList->unlock(30);
        EXPECT_THAT(log.texts(), ElementsAre("FrameList attempted to unlock non-locked frame 30"));
    }
    EXPECT_EQ(20, mList->getLatestValidFrameAndLock().mID);
    EXPECT_EQ(10, mList->getLatestAcquiredFrameAndLock().mID);
    EXPECT_EQ(30, mList->getNewestFrameAndLock().mID);
    EXPECT_EQ(30, mList->getFrameAtAndLock(30).mID);
    EXPECT_TRUE(mList->getFrameAtAndLock(25).isEmpty());

    String8 dump;
    mList->dump(dump, "> ");
    const FrameItem newest = mList->getNewestFrame();
    EXPECT_THAT(std::string(dump.c_str()),
                testing::EndsWith(String8::format("> Frame 2 -- mIndex 30 mTextureSlot=30 "
                                                  "mTimestamp=30 mID 30 mGraphicBuffer=%p "
                                                  "mAcquireFence=%p mAcquired=false locked=true\n",
                                                  newest.mGraphicBuffer.get(),
                                                  newest.mAcquireFence.get())
                                          .c_str()));
}

TEST_F(FrameListTest, oldestFrameIsUnusedOnceTwoFramesAreAtOrBeforeTheTime) {
    insert({10, 20, 30});
    EXPECT_FALSE(mList->isOldestFrameUnused(15));
    EXPECT_TRUE(mList->isOldestFrameUnused(20));
    EXPECT_THAT(mList->clearOldestFrameIfUnusedLocking(15), IsEmpty());
    auto removed = mList->clearOldestFrameIfUnusedLocking(20);
    ASSERT_EQ(1u, removed.size());
    EXPECT_EQ(10, removed[0].mID);
}

TEST_F(FrameListTest, removalsReturnOnlyValidFramesAndTraceTheirSections) {
    mList->insertFrame(makeFrame(10, /*acquired=*/false, Fence::createPending()));
    insert({20});
    test::TraceCapture trace;
    EXPECT_THAT(mList->clearOldestFrameLocking(), IsEmpty());  // removed, but not valid
    EXPECT_EQ(1u, mList->size());
    EXPECT_EQ(20, mList->clearFrameAtLocking(20).mID);
    EXPECT_EQ(0u, mList->size());
    EXPECT_THAT(trace.events(),
                ElementsAre("B|clearOldestFrameLocking", "E", "B|clearFrameAtLocking", "E"));
}

TEST_F(FrameListTest, replaceFrameSwapsByIdentityAndKeepsTheLockOfTheDisplayTime) {
    insert({10, 20});
    mList->getFrameAtAndLock(20);
    FrameItem replacement = makeFrame(20, true, Fence::NO_FENCE, /*timestamp=*/99);
    mEvents->clear();
    mList->replaceFrame(mList->getNewestFrame(), replacement);
    EXPECT_THAT(mEvents->types(), ElementsAre(2u, 4u, 4u, 1u, 4u, 4u));
    EXPECT_EQ(99, mList->getNewestFrame().mTimestamp);

    LogCapture log(2);
    mList->unlock(20);
    mList->replaceFrame(makeFrame(77), makeFrame(78));
    EXPECT_THAT(log.texts(),
                ElementsAre("FrameList::unlock unlocking 20",
                            "Interpolation::FrameList replaceFrame out : 77, in : 78",
                            "Interpolation::FrameList unable to find frame to replace!"));
}

TEST_F(FrameListTest, clearEveryFrameButTheNewestOneKeepsFromTheNewestAcquired) {
    mList->insertFrame(makeFrame(10, /*acquired=*/false));
    mList->insertFrame(makeFrame(20, /*acquired=*/false));
    {
        LogCapture log(2);
        EXPECT_THAT(mList->clearEveryFrameButTheNewestOne(), IsEmpty());
        EXPECT_TRUE(log.contains(
                "FrameList::clearEveryFrameButTheNewestOne will leave 3 frames in the queue."));
    }
    mList->insertFrame(makeFrame(5, /*acquired=*/true));
    mList->insertFrame(makeFrame(15, /*acquired=*/true));
    const auto removed = mList->clearEveryFrameButTheNewestOne();  // keeps 15 and 20
    ASSERT_EQ(2u, removed.size());
    EXPECT_EQ(5, removed[0].mID);
    EXPECT_EQ(10, removed[1].mID);
    EXPECT_THAT(queuedIds(), ElementsAre(15, 20));
}

// Waiting removals, with real threads and short waits.
class FrameListWaitTest : public FrameListTest {
protected:
    template <typename F>
    static bool finishesWithin(std::future<F>& result, std::chrono::milliseconds timeout) {
        return result.wait_for(timeout) == std::future_status::ready;
    }
};

TEST_F(FrameListWaitTest, removalWaitsForTheUnlockOfItsFrame) {
    insert({10, 20});
    ASSERT_EQ(10, mList->getFrameBeforeAndLock(15).mID);
    auto removal = std::async(std::launch::async, [&] { return mList->clearOldestFrameLocking(); });
    EXPECT_FALSE(finishesWithin(removal, 30ms));

    mList->unlock(999);  // wakes the waiter, which finds its frame still locked
    EXPECT_FALSE(finishesWithin(removal, 20ms));

    mList->unlock(10);
    ASSERT_TRUE(finishesWithin(removal, 1000ms));
    const auto removed = removal.get();
    ASSERT_EQ(1u, removed.size());
    EXPECT_EQ(10, removed[0].mID);
    EXPECT_THAT(queuedIds(), ElementsAre(20));
}

TEST_F(FrameListWaitTest, removalEndsWhenItsFrameLeavesByAnotherWay) {
    insert({10, 20});
    mList->getFrameAtAndLock(10);
    auto removal = std::async(std::launch::async, [&] { return mList->clearFrameAtLocking(10); });
    EXPECT_FALSE(finishesWithin(removal, 30ms));

    // The frame leaves through a removal that does not wait; the next unlock lets the waiter see it.
    ASSERT_EQ(1u, mList->clearEveryFrameButTheNewestOne().size());
    mList->unlock(999);
    ASSERT_TRUE(finishesWithin(removal, 1000ms));
    EXPECT_EQ(10, removal.get().mID);
}

TEST_F(FrameListWaitTest, killLocksReleasesEveryWaiter) {
    insert({10, 20});
    mList->getFrameAtAndLock(10);
    auto first = std::async(std::launch::async, [&] { return mList->clearOldestFrameLocking(); });
    auto second = std::async(std::launch::async, [&] { return mList->clearFrameAtLocking(10); });
    EXPECT_FALSE(finishesWithin(first, 30ms));

    mList->killLocks();
    ASSERT_TRUE(finishesWithin(first, 1000ms));
    ASSERT_TRUE(finishesWithin(second, 1000ms));
    EXPECT_EQ(10, second.get().mID);
    const auto removed = first.get();
    ASSERT_EQ(1u, removed.size());
    EXPECT_EQ(10, removed[0].mID);
}

}  // namespace
}  // namespace android
