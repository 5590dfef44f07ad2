#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <future>
#include <limits>

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
using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

std::vector<nsecs_t> idsOf(const std::vector<FrameItem>& frames) {
    std::vector<nsecs_t> ids;
    for (const FrameItem& frame : frames)
        ids.push_back(frame.mID);
    return ids;
}

template <typename T>
bool finishesWithin(std::future<T>& result, std::chrono::milliseconds timeout) {
    return result.wait_for(timeout) == std::future_status::ready;
}

TEST(FrameItemTest, emptyFramesAreDistinctAndCarryNothing) {
    FrameItem first;
    FrameItem second;
    EXPECT_EQ(first.mTimestamp + 1, second.mTimestamp);
    EXPECT_EQ(std::numeric_limits<uint64_t>::max(), first.mIndex);
    EXPECT_EQ(0, first.mTextureSlot);
    EXPECT_EQ(0, first.mID);
    EXPECT_EQ(nullptr, first.mGraphicBuffer);
    EXPECT_EQ(Fence::NO_FENCE, first.mAcquireFence);
    EXPECT_FALSE(first.mAcquired);
}

TEST(FrameItemTest, updateKeepsAcquiredWhereAssignmentClearsIt) {
    FrameItem stored = makeFrame(10, /*acquired=*/true);
    FrameItem newer = makeFrame(20, /*acquired=*/false, Fence::NO_FENCE, stored.mTimestamp);
    FrameItem merged = stored;
    merged.update(newer);
    EXPECT_TRUE(merged.mAcquired);
    EXPECT_EQ(20, merged.mID);
    EXPECT_EQ(newer.mGraphicBuffer, merged.mGraphicBuffer);
    stored = newer;
    EXPECT_FALSE(stored.mAcquired);
}

TEST(FrameItemTest, validNeedsADisplayTimeAndASignalledFenceOrAcquisition) {
    sp<Fence> fence = Fence::createPending();
    EXPECT_FALSE(makeFrame(10, /*acquired=*/false, fence).isValid());
    EXPECT_TRUE(makeFrame(10, /*acquired=*/true, fence).isValid());
    EXPECT_FALSE(makeFrame(0, /*acquired=*/true).isValid());
    fence->signal(5);
    EXPECT_TRUE(makeFrame(10, /*acquired=*/false, fence).isValid());
}

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

    // The events received since the last call, as "type@time:payload", where the payload is a
    // frame's mID or a size.
    std::vector<std::string> takeEvents() {
        std::vector<std::string> taken;
        for (const auto& [type, time, data] : mEvents->events()) {
            const FrameItem* frame = std::get_if<FrameItem>(&data);
            const nsecs_t payload = frame != nullptr ? frame->mID : std::get<int>(data);
            taken.push_back(String8::format("%u@%ld:%ld", type, time, payload).c_str());
        }
        mEvents->clear();
        return taken;
    }

    const uint32_t mUid = test::nextTestUid();
    sp<FrameList> mList = new FrameList(mUid);
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
};

TEST_F(FrameListTest, insertionAndRemovalAnnounceTheFrameAndTheSizesBeforeAndAfter) {
    test::TestClock clock(5000);
    insert({30, 10});
    EXPECT_THAT(takeEvents(), ElementsAre("1@5000:30", "4@4999:0", "4@5000:1", "1@5000:10",
                                          "4@4999:1", "4@5000:2"));
    mList->clearOldestFrameLocking();
    EXPECT_THAT(takeEvents(), ElementsAre("2@5000:10", "4@4999:2", "4@5000:1"));
}

TEST_F(FrameListTest, keepsDisplayTimeOrderAndArrivalOrderForEqualTimes) {
    for (auto [id, timestamp] : {std::pair<nsecs_t, nsecs_t>{20, 1}, {10, 2}, {20, 3}, {15, 4}})
        mList->insertFrame(makeFrame(id, true, Fence::NO_FENCE, timestamp));
    std::vector<nsecs_t> timestamps;
    for (const FrameItem& frame : mList->clearEveryFrame())
        timestamps.push_back(frame.mTimestamp);
    EXPECT_THAT(timestamps, ElementsAre(2, 4, 1, 3));
}

TEST_F(FrameListTest, duplicateTimestampMergesSilentlyAndAcquiredSticks) {
    FrameItem copy = makeFrame(10, /*acquired=*/false, Fence::createPending());
    mList->insertFrame(copy);
    copy.mAcquired = true;
    mList->insertFrame(copy);
    copy.mAcquired = false;  // a later copy that is not acquired must not clear the flag
    mEvents->clear();
    LogCapture log(2);
    mList->insertFrame(copy);
    EXPECT_THAT(mEvents->types(), IsEmpty());
    EXPECT_EQ(1u, mList->size());
    EXPECT_TRUE(mList->getNewestFrame().mAcquired);
    EXPECT_THAT(log.texts(), ElementsAre("Interpolation::FrameList insertFrame frame 10",
                                         "Interpolation::FrameList attempted to insert duplicate "
                                         "frame 10"));
}

TEST_F(FrameListTest, relativeIndicesAroundADisplayTime) {
    insert({10, 20, 30});
    const std::tuple<nsecs_t, int, nsecs_t> cases[] = {
            // {t, index, the mID found}
            {20, -1, 20}, {20, -2, 10}, {20, 1, 30}, {20, 2, 0},   {20, -3, 0}, {15, -1, 10},
            {15, 1, 20},  {5, 1, 10},   {5, -1, 0},  {35, -1, 30}, {35, 1, 0}};
    // getFrameAt with an index expects the caller to hold the list's mutex; nothing else touches
    // the list here.
    for (auto [t, index, id] : cases)
        EXPECT_EQ(id, mList->getFrameAt(t, index).mID) << "t " << t << ", index " << index;

    LogCapture log(1);
    EXPECT_TRUE(mList->getFrameAt(20, 0).isEmpty());
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

// A fence that has signalled stays signalled, so the list polls it only until it has seen the
// signal. Draining the host's eventfd makes a fence poll as pending again: frames the list has
// seen signalled stay valid, in the queue and in the copies it hands out.
TEST_F(FrameListTest, aSignalSeenIsRememberedAndAnotherFenceIsPolledAnew) {
    const sp<Fence> fence = Fence::createPending();
    mList->insertFrame(makeFrame(10, /*acquired=*/false, fence));
    mList->insertFrame(makeFrame(20, /*acquired=*/false, fence));
    EXPECT_FALSE(mList->getNeighbours(15).beforeValid);
    EXPECT_EQ(nullptr, mList->getFrameAfter(15).mSignalledFence);
    fence->signal(5);
    EXPECT_TRUE(mList->getFrameAfter(15).isValid());

    // Both frames share the fence; each remembers the signal the list saw, and is not polled again.
    const FrameItem before = mList->getFrameBeforeAndLock(15);
    EXPECT_EQ(fence.get(), before.mSignalledFence);
    EXPECT_EQ(fence.get(), mList->getFrameAfter(15).mSignalledFence);
    EXPECT_TRUE(before.isValid());
    const FrameList::Neighbours around = mList->getNeighbours(15);
    EXPECT_TRUE(around.beforeValid && around.afterValid);
    EXPECT_EQ(20, mList->getLatestValidFrameAndLock().mID);

    // A copy merged in with another fence brings that fence's state instead.
    mList->insertFrame(makeFrame(20, /*acquired=*/false, Fence::createPending()));
    EXPECT_FALSE(mList->getNeighbours(15).afterValid);
    FrameItem regiven = before;
    regiven.mAcquireFence = Fence::createPending();
    EXPECT_FALSE(regiven.isValid());
}

TEST_F(FrameListTest, neighboursAreWhatTheLookUpsBeforeAndAfterFindWithTheirLogLines) {
    LogCapture log(1);
    EXPECT_EQ(0, mList->getNeighbours(10).beforeID);
    EXPECT_EQ(2, log.count("FrameList is empty"));
    insert({10, 20});
    for (bool oldestReady : {true, false}) {
        if (!oldestReady) {
            mList->insertFrame(makeFrame(5, /*acquired=*/false, Fence::createPending()));
        }
        for (nsecs_t t : {0, 5, 10, 15, 20, 25}) {
            const FrameList::Neighbours around = mList->getNeighbours(t);
            const FrameItem before = mList->getFrameBefore(t);
            const FrameItem after = mList->getFrameAfter(t);
            EXPECT_EQ(before.mID, around.beforeID) << t;
            EXPECT_EQ(before.isValid(), around.beforeValid) << t;
            EXPECT_EQ(after.mID, around.afterID) << t;
            EXPECT_EQ(after.isValid(), around.afterValid) << t;
        }
    }
    // From a pending oldest frame every look-up logs, and the neighbours count as two.
    EXPECT_EQ(6 * 4, log.count("FrameList passed an invalid FrameItem"));

    // A pick locks what the locking look-up would have, and logs as it would.
    log.clear();
    const FrameItem picked = FrameList::NeighbourPick(*mList, 15).lockAfter();
    EXPECT_EQ(3, log.count("FrameList passed an invalid FrameItem"));
    mList->unlock(picked.mID);
    EXPECT_EQ(mList->getFrameAfterAndLock(15).mID, picked.mID);
    EXPECT_EQ(4, log.count("FrameList passed an invalid FrameItem"));
    EXPECT_EQ(10, picked.mID);
    EXPECT_FALSE(log.contains("FrameList attempted to unlock non-locked frame 10"));
}

TEST_F(FrameListTest, lockingLookUpsChooseTheirFramesAndOnlyBeforeAndAfterStopAtKillLocks) {
    mList->insertFrame(makeFrame(10, /*acquired=*/true));
    mList->insertFrame(makeFrame(20, /*acquired=*/false, Fence::createSignalled(1)));
    mList->insertFrame(makeFrame(30, /*acquired=*/false, Fence::createPending()));
    LogCapture log(2);
    EXPECT_EQ(30, mList->getFrameAfterAndLock(20).mID);  // not ready, so not locked
    mList->unlock(30);
    EXPECT_EQ(20, mList->getLatestValidFrameAndLock().mID);
    EXPECT_EQ(10, mList->getLatestAcquiredFrameAndLock().mID);
    EXPECT_EQ(30, mList->getNewestFrameAndLock().mID);
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

    mList->killLocks();  // releases every lock
    EXPECT_EQ(20, mList->getFrameBeforeAndLock(25).mID);
    EXPECT_EQ(20, mList->getFrameAfterAndLock(15).mID);
    EXPECT_EQ(10, mList->getFrameAtAndLock(10).mID);
    EXPECT_EQ(30, mList->getNewestFrameAndLock().mID);
    for (nsecs_t id : {10, 20, 30})
        mList->unlock(id);
    EXPECT_THAT(log.texts(), ElementsAre("FrameList attempted to unlock non-locked frame 30",
                                         "FrameList::unlock unlocking 10",
                                         "FrameList attempted to unlock non-locked frame 20",
                                         "FrameList::unlock unlocking 30"));
}

TEST_F(FrameListTest, oldestFrameIsUnusedOnceTwoFramesAreAtOrBeforeTheTime) {
    insert({10, 20, 30});
    EXPECT_FALSE(mList->isOldestFrameUnused(15));
    EXPECT_TRUE(mList->isOldestFrameUnused(20));
    EXPECT_THAT(mList->clearOldestFrameIfUnusedLocking(15), IsEmpty());
    EXPECT_THAT(idsOf(mList->clearOldestFrameIfUnusedLocking(20)), ElementsAre(10));
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
    mEvents->clear();
    mList->replaceFrame(mList->getNewestFrame(), makeFrame(20, true, Fence::NO_FENCE, 99));
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
    LogCapture log(2);
    EXPECT_THAT(mList->clearEveryFrameButTheNewestOne(), IsEmpty());
    EXPECT_TRUE(log.contains(
            "FrameList::clearEveryFrameButTheNewestOne will leave 3 frames in the queue."));
    mList->insertFrame(makeFrame(5, /*acquired=*/true));
    mList->insertFrame(makeFrame(15, /*acquired=*/true));
    EXPECT_THAT(idsOf(mList->clearEveryFrameButTheNewestOne()), ElementsAre(5, 10));
    EXPECT_THAT(idsOf(mList->clearEveryFrame()), ElementsAre(15, 20));
}

// Waiting removals, with real threads and short waits.
using FrameListWaitTest = FrameListTest;

TEST_F(FrameListWaitTest, removalWaitsForTheUnlockOfItsFrame) {
    insert({10, 20});
    ASSERT_EQ(10, mList->getFrameBeforeAndLock(15).mID);
    auto removal = std::async(std::launch::async, [&] { return mList->clearOldestFrameLocking(); });
    EXPECT_FALSE(finishesWithin(removal, 30ms));
    mList->unlock(999);  // wakes the waiter, which finds its frame still locked
    EXPECT_FALSE(finishesWithin(removal, 20ms));
    mList->unlock(10);
    ASSERT_TRUE(finishesWithin(removal, 1000ms));
    EXPECT_THAT(idsOf(removal.get()), ElementsAre(10));
    EXPECT_THAT(idsOf(mList->clearEveryFrame()), ElementsAre(20));
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
    EXPECT_THAT(idsOf(first.get()), ElementsAre(10));
}

}  // namespace
}  // namespace android
