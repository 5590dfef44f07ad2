#include <gtest/gtest.h>

#include "Timer.h"
#include "UniqueLock.h"

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

// The thread's tests cover catching up, with and without catchUp, and the delayer's fireOnce.
TEST_F(TimerTest, slackHonoursAnEarlyDueTimeAndDueTimesSaturateInsteadOfWrapping) {
    mTimer.nextTime = INT64_MAX - 1;
    mTimer.slack = INT64_MAX;
    mTimer.check(PERIOD);
    EXPECT_EQ(1, mCalls);
    EXPECT_EQ(INT64_MAX, mTimer.nextTime);
}

// As a component that changes its own period does, and one that stops itself.
TEST_F(TimerTest, callbackMayReplaceOrDisableItself) {
    mTimer.callback = [this] {
        mCalls++;
        mTimer.arm(
                10 * PERIOD, 5 * PERIOD,
                [this] {
                    mCalls += 100;
                    mTimer.period = 0;
                },
                false);
    };
    mTimer.check(5 * PERIOD);
    EXPECT_EQ(1, mCalls);
    mTimer.check(16 * PERIOD);  // due after 15 periods, and no catching up once disabled
    EXPECT_EQ(101, mCalls);
    mTimer.check(1000 * PERIOD);
    EXPECT_EQ(101, mCalls);
}

struct CountingMutex {
    void lock() { locks++; }
    void unlock() { unlocks++; }
    int locks = 0, unlocks = 0;
};

TEST(UniqueLockTest, unlocksOnlyWhatItStillOwns) {
    CountingMutex mutex;
    UniqueLock<CountingMutex>(mutex).unlock();
    { UniqueLock<CountingMutex> lock(mutex); }
    EXPECT_EQ(2, mutex.locks);
    EXPECT_EQ(2, mutex.unlocks);
}

}  // namespace
}  // namespace android::Interpolation
