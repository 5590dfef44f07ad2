#pragma once

#include <utils/Timers.h>

namespace android::test {

// While a TestClock lives, systemTime() returns its time instead of the real clock's. Tests that
// wait on real condition variables must not use one.
class TestClock {
public:
    explicit TestClock(nsecs_t now = 1'000'000'000) { set(now); }
    ~TestClock() { set(-1); }
    TestClock(const TestClock&) = delete;
    TestClock& operator=(const TestClock&) = delete;

    nsecs_t now() const { return systemTime(SYSTEM_TIME_MONOTONIC); }
    void set(nsecs_t now);  // -1 hands systemTime() back to the real clock
    void advance(nsecs_t duration) { set(now() + duration); }
};

}  // namespace android::test
