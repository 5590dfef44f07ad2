#include "support/TestClock.h"

#include "sim/ClockOverride.h"

// systemTime() itself is interposed by sim/ClockOverride.cpp, linked into the test binary.
void android::test::TestClock::set(nsecs_t now) {
    verolux::sim::ClockOverride::setNow(now);
}
