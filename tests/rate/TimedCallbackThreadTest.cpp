#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <thread>
#include <tuple>

#include "TimedCallbackThread.h"
#include "support/TestClock.h"

namespace android {
namespace {

using namespace std::chrono_literals;

constexpr nsecs_t MS = 1'000'000;

class TimedCallbackThreadTest : public testing::Test {
protected:
    void arm(nsecs_t period, nsecs_t now) {
        mThread.timer.arm(
                period, now, [this] { mFires++; }, false);
    }

    TimedCallbackThread mThread;
    std::atomic<int> mFires = 0;
    std::atomic<int> mCycles = 0;
};

// Runs on the test's own thread with the test clock: the timer is always due, so nothing waits.
TEST_F(TimedCallbackThreadTest, stalledScheduleCatchesUpAtMostOneSecondAcrossCycles) {
    test::TestClock clock(100'000 * MS);
    mThread.cycleCallback = [&] {
        mCycles++;
        std::lock_guard lock(mThread.mutex);
        if (mThread.timer.nextTime >= clock.now()) mThread.running = false;
    };
    // Ten seconds behind. Without catch-up one firing per cycle, the schedule pulled up to one
    // second behind; with it every missed period fires in the one check, before the clamp.
    for (auto [catchUp, fires, cycles] : {std::tuple{false, 11, 11}, std::tuple{true, 100, 1}}) {
        arm(100 * MS, clock.now() - 10'100 * MS);
        mThread.timer.catchUp = catchUp;
        mThread.running = true;
        mFires = mCycles = 0;
        mThread.threadLoop();
        EXPECT_EQ(fires, mFires);
        EXPECT_EQ(cycles, mCycles);
    }
    // A disabled timer runs one cycle and leaves its schedule alone.
    mThread.timer.period = 0;
    mThread.timer.nextTime = 0;
    mThread.running = true;
    mThread.threadLoop();
    EXPECT_EQ(2, mCycles);
    EXPECT_EQ(100, mFires);
    EXPECT_EQ(0, mThread.timer.nextTime);
}

TEST_F(TimedCallbackThreadTest, sleepsUntilEachDueTimeAndUntilNotifiedWhenNoneIsReachable) {
    arm(5 * MS, systemTime(SYSTEM_TIME_MONOTONIC));
    // One firing per wake-up even when a loaded machine wakes the loop a period late.
    mThread.timer.catchUp = false;
    mThread.cycleCallback = [&] {
        std::lock_guard lock(mThread.mutex);
        if (++mCycles == 3) mThread.timer.nextTime = INT64_MAX;  // its deadline would overflow
    };
    auto done = std::async(std::launch::async, [&] { mThread.threadLoop(); });
    while (mCycles < 3)
        std::this_thread::sleep_for(1ms);
    EXPECT_EQ(std::future_status::timeout, done.wait_for(30ms));
    {
        // A negative due time, which the slack keeps from being due.
        std::lock_guard lock(mThread.mutex);
        mThread.timer.nextTime = -1;
        mThread.timer.slack = INT64_MIN;
    }
    mThread.condition.notify_all();
    EXPECT_EQ(std::future_status::timeout, done.wait_for(30ms));
    EXPECT_EQ(3, mCycles);
    mThread.requestExit();
    EXPECT_EQ(std::future_status::ready, done.wait_for(2s));
    EXPECT_EQ(3, mFires);
    EXPECT_EQ(4, mCycles);
}

}  // namespace
}  // namespace android
