#include <gtest/gtest.h>

#include <limits>

#include "Timer.h"
#include "UniqueLock.h"
#include "support/TestClock.h"

namespace android::Interpolation {
namespace {

constexpr nsecs_t PERIOD = 1000;

class TimerTest : public testing::Test {
protected:
    TimerTest() {
        mTimer.arm(
                PERIOD, 0, [this] { mCalls++; }, /*once=*/false);
    }

    Timer mTimer;
    int mCalls = 0;
};

TEST_F(TimerTest, catchesUpOncePerMissedPeriodInOneCheck) {
    mTimer.check(PERIOD);  // due only strictly after nextTime
    EXPECT_EQ(0, mCalls);
    mTimer.check(PERIOD + 3 * PERIOD + PERIOD / 2);  // 3.5 periods late
    EXPECT_EQ(4, mCalls);
    EXPECT_EQ(5 * PERIOD, mTimer.nextTime);
    mTimer.slack = 1;  // honours a due time that early
    mTimer.check(5 * PERIOD);
    EXPECT_EQ(5, mCalls);
}

TEST_F(TimerTest, withoutCatchUpOrWithFireOnceCallsOnceAndStaysBehind) {
    for (bool fireOnce : {false, true}) {
        mTimer.arm(
                PERIOD, 0, [this] { mCalls++; }, fireOnce);
        mTimer.catchUp = fireOnce;
        mCalls = 0;
        mTimer.check(4500);
        EXPECT_EQ(1, mCalls);
        EXPECT_EQ(2 * PERIOD, mTimer.nextTime);
    }
}

TEST_F(TimerTest, disabledTimerNeverFires) {
    test::TestClock clock(1'000'000);
    mTimer.period = 0;
    mTimer.check();
    mTimer.check(1'000'000);
    EXPECT_EQ(0, mCalls);

    mTimer.period = PERIOD;
    mTimer.nextTime = clock.now() - 1;
    mTimer.check();  // reads the test clock
    EXPECT_EQ(1, mCalls);
}

TEST_F(TimerTest, callbackMayDisableOrReplaceItself) {
    mTimer.callback = [this] {
        mCalls++;
        mTimer.period = 0;
    };
    mTimer.check(10 * PERIOD);
    EXPECT_EQ(1, mCalls);

    // Re-arming from inside the callback, as a component that changes its own period does.
    mTimer.arm(
            PERIOD, 0,
            [this] {
                mCalls++;
                mTimer.arm(
                        10 * PERIOD, 5 * PERIOD, [this] { mCalls += 100; }, false);
            },
            false);
    mTimer.check(5 * PERIOD);
    EXPECT_EQ(2, mCalls);
    mTimer.check(16 * PERIOD);
    EXPECT_EQ(102, mCalls);
}

TEST_F(TimerTest, dueTimesSaturateInsteadOfWrapping) {
    mTimer.nextTime = std::numeric_limits<nsecs_t>::max() - 1;
    mTimer.slack = std::numeric_limits<nsecs_t>::max();
    mTimer.check(PERIOD);
    EXPECT_EQ(1, mCalls);
    EXPECT_EQ(std::numeric_limits<nsecs_t>::max(), mTimer.nextTime);
}

struct CountingMutex {
    void lock() { locks++; }
    void unlock() { unlocks++; }
    int locks = 0;
    int unlocks = 0;
};

TEST(UniqueLockTest, unlocksOnlyWhatItStillOwns) {
    CountingMutex mutex;
    {
        UniqueLock<CountingMutex> lock(mutex);
        lock.unlock();
    }
    { UniqueLock<CountingMutex> lock(mutex); }
    EXPECT_EQ(2, mutex.locks);
    EXPECT_EQ(2, mutex.unlocks);
}

}  // namespace
}  // namespace android::Interpolation
