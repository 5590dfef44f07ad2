#include "support/TestClock.h"

#include <time.h>

#include <atomic>

namespace {

std::atomic<bool> sFake{false};
std::atomic<nsecs_t> sNow{0};

}  // namespace

extern "C" nsecs_t systemTime(int clock) {
    if (sFake.load()) return sNow.load();
    static constexpr clockid_t clocks[] = {CLOCK_REALTIME, CLOCK_MONOTONIC, CLOCK_PROCESS_CPUTIME_ID,
                                           CLOCK_THREAD_CPUTIME_ID, CLOCK_BOOTTIME};
    timespec ts{};
    clock_gettime(clock >= 0 && clock < 5 ? clocks[clock] : CLOCK_MONOTONIC, &ts);
    return nsecs_t{ts.tv_sec} * 1'000'000'000 + ts.tv_nsec;
}

namespace android::test {

TestClock::TestClock(nsecs_t now) {
    sNow.store(now);
    sFake.store(true);
}

TestClock::~TestClock() {
    sFake.store(false);
}

nsecs_t TestClock::now() const {
    return sNow.load();
}

void TestClock::set(nsecs_t now) {
    sNow.store(now);
}

void TestClock::advance(nsecs_t duration) {
    sNow.fetch_add(duration);
}

}  // namespace android::test
