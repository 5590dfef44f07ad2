#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <limits>
#include <thread>

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
                period, now, [this] { mFires++; }, /*once=*/false);
    }

    TimedCallbackThread mThread;
    std::atomic<int> mFires = 0;
    std::atomic<int> mCycles = 0;
};

// Runs on the test's own thread with the test clock: the timer is always due, so nothing waits.
TEST_F(TimedCallbackThreadTest, stalledScheduleCatchesUpAtMostOneSecondAcrossCycles) {
    test::TestClock clock(100'000 * MS);
    for (bool catchUp : {false, true}) {
        arm(100 * MS, clock.now());
        mThread.timer.nextTime = clock.now() - 10'000 * MS;  // ten seconds behind
        mThread.timer.catchUp = catchUp;
        mThread.running = true;
        mFires = 0;
        mCycles = 0;
        mThread.cycleCallback = [&] {
            mCycles++;
            std::lock_guard lock(mThread.mutex);
            if (mThread.timer.nextTime >= clock.now()) mThread.running = false;
        };
        mThread.threadLoop();
        if (catchUp) {
            // Catch-up inside one check is not clamped: every missed period fires.
            EXPECT_EQ(100, mFires);
            EXPECT_EQ(1, mCycles);
        } else {
            // One firing per cycle, and the schedule is pulled up to one second behind.
            EXPECT_EQ(11, mFires);
            EXPECT_EQ(11, mCycles);
        }
    }
}

TEST_F(TimedCallbackThreadTest, runsOneCycleWhenDisabledOrNotRunning) {
    test::TestClock clock(100'000 * MS);
    mThread.cycleCallback = [&] { mCycles++; };
    mThread.timer.period = 0;
    mThread.timer.nextTime = 0;
    mThread.threadLoop();
    EXPECT_EQ(1, mCycles);
    EXPECT_EQ(0, mFires);
    EXPECT_EQ(0, mThread.timer.nextTime);  // a disabled timer's schedule is left alone

    arm(MS, clock.now() - 2 * MS);
    mThread.running = false;
    mThread.threadLoop();
    EXPECT_EQ(2, mCycles);
    EXPECT_EQ(1, mFires);
}

TEST_F(TimedCallbackThreadTest, sleepsUntilEachDueTime) {
    constexpr nsecs_t period = 5 * MS;
    arm(period, systemTime(SYSTEM_TIME_MONOTONIC));
    mThread.cycleCallback = [&] {
        if (++mCycles == 3) mThread.requestExit();
    };
    const auto start = std::chrono::steady_clock::now();
    std::thread thread([&] { mThread.threadLoop(); });
    thread.join();
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::nanoseconds(3 * period));
    EXPECT_EQ(3, mFires);
    EXPECT_EQ(3, mCycles);
}

TEST_F(TimedCallbackThreadTest, waitsUntilNotifiedForNegativeOrUnreachableDueTimes) {
    struct Schedule {
        nsecs_t nextTime;
        nsecs_t slack;
    };
    // A negative due time that the slack keeps from being due, and one whose deadline overflows.
    for (Schedule schedule : {Schedule{-1, std::numeric_limits<nsecs_t>::min()},
                              Schedule{std::numeric_limits<nsecs_t>::max(), 0}}) {
        arm(MS, 0);
        mThread.timer.nextTime = schedule.nextTime;
        mThread.timer.slack = schedule.slack;
        mThread.running = true;
        mCycles = 0;
        mThread.cycleCallback = [&] { mCycles++; };
        auto done = std::async(std::launch::async, [&] { mThread.threadLoop(); });

        EXPECT_EQ(std::future_status::timeout, done.wait_for(30ms));
        EXPECT_EQ(0, mCycles);
        mThread.requestExit();
        EXPECT_EQ(std::future_status::ready, done.wait_for(2s));
        EXPECT_EQ(1, mCycles);
        EXPECT_EQ(0, mFires);
    }
}

}  // namespace
}  // namespace android
