#include "support/TestClock.h"

#include <time.h>

#include <atomic>

static std::atomic<nsecs_t> sNow{-1};  // the time of the living TestClock; -1: none lives

extern "C" nsecs_t systemTime(int clock) {
    if (const nsecs_t now = sNow.load(); now >= 0) return now;
    static constexpr clockid_t clocks[] = {CLOCK_REALTIME, CLOCK_MONOTONIC, CLOCK_PROCESS_CPUTIME_ID,
                                           CLOCK_THREAD_CPUTIME_ID, CLOCK_BOOTTIME};
    timespec ts{};
    clock_gettime(clock >= 0 && clock < 5 ? clocks[clock] : CLOCK_MONOTONIC, &ts);
    return nsecs_t{ts.tv_sec} * 1'000'000'000 + ts.tv_nsec;
}

void android::test::TestClock::set(nsecs_t now) {
    sNow.store(now);
}
