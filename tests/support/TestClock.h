#pragma once

#include <utils/Timers.h>

namespace android::test {

// While a TestClock lives, systemTime() returns its time instead of the real clock's. Tests that
// wait on real condition variables must not use one.
class TestClock {
public:
    explicit TestClock(nsecs_t now = 1'000'000'000);
    ~TestClock();
    TestClock(const TestClock&) = delete;
    TestClock& operator=(const TestClock&) = delete;

    nsecs_t now() const;
    void set(nsecs_t now);
    void advance(nsecs_t duration);
};

}  // namespace android::test
