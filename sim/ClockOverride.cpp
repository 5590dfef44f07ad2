#include "sim/ClockOverride.h"

#include <dlfcn.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <limits>

namespace {

constexpr nsecs_t NONE = -1;
constexpr nsecs_t NO_OFFSET = std::numeric_limits<nsecs_t>::min();
constexpr nsecs_t NS_PER_S = 1'000'000'000;

std::atomic<nsecs_t> sNow{NONE};
std::atomic<nsecs_t> sWallOffset{NO_OFFSET};

using ClockGettime = int (*)(clockid_t, timespec*);

int realClockGettime(clockid_t clock, timespec* ts) {
    // The C library's own, behind the definition below.
    static const auto next = reinterpret_cast<ClockGettime>(dlsym(RTLD_NEXT, "clock_gettime"));
    if (next != nullptr) return next(clock, ts);
    return static_cast<int>(syscall(SYS_clock_gettime, clock, ts));
}

// The wall clock's time while one is set, or NONE.
nsecs_t simulatedWallTime() {
    const nsecs_t now = sNow.load();
    const nsecs_t offset = sWallOffset.load();
    if (now < 0 || offset == NO_OFFSET) return NONE;
    return now + offset;
}

}  // namespace

extern "C" nsecs_t systemTime(int clock) {
    if (const nsecs_t now = sNow.load(); now >= 0) return now;
    static constexpr clockid_t CLOCKS[] = {CLOCK_REALTIME, CLOCK_MONOTONIC, CLOCK_PROCESS_CPUTIME_ID,
                                           CLOCK_THREAD_CPUTIME_ID, CLOCK_BOOTTIME};
    timespec ts{};
    realClockGettime(clock >= 0 && clock < 5 ? CLOCKS[clock] : CLOCK_MONOTONIC, &ts);
    return nsecs_t{ts.tv_sec} * NS_PER_S + ts.tv_nsec;
}

extern "C" int clock_gettime(clockid_t clock, timespec* ts) {
    if (clock == CLOCK_REALTIME) {
        if (const nsecs_t wall = simulatedWallTime(); wall >= 0) {
            ts->tv_sec = static_cast<time_t>(wall / NS_PER_S);
            ts->tv_nsec = static_cast<long>(wall % NS_PER_S);
            return 0;
        }
    }
    return realClockGettime(clock, ts);
}

extern "C" time_t time(time_t* out) {
    timespec ts{};
    clock_gettime(CLOCK_REALTIME, &ts);
    if (out != nullptr) *out = ts.tv_sec;
    return ts.tv_sec;
}

namespace verolux::sim {

void ClockOverride::setNow(nsecs_t now) {
    sNow.store(now < 0 ? NONE : now);
}

void ClockOverride::setWallClockOffset(std::optional<nsecs_t> offset) {
    sWallOffset.store(offset.value_or(NO_OFFSET));
}

bool ClockOverride::isSet() {
    return sNow.load() >= 0;
}

}  // namespace verolux::sim
