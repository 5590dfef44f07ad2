#include "Timer.h"

#include <limits>

namespace android::Interpolation {

namespace {

nsecs_t saturatingAdd(nsecs_t a, nsecs_t b) {
    nsecs_t sum;
    if (!__builtin_add_overflow(a, b, &sum)) return sum;
    return b > 0 ? std::numeric_limits<nsecs_t>::max() : std::numeric_limits<nsecs_t>::min();
}

}  // namespace

void Timer::arm(nsecs_t newPeriod, nsecs_t now, std::function<void()> newCallback, bool once) {
    period = newPeriod;
    nextTime = saturatingAdd(now, newPeriod);
    fireOnce = once;
    slack = 0;
    callback = std::move(newCallback);
    catchUp = true;
}

bool Timer::isDue(nsecs_t now) const {
    return saturatingAdd(now, slack) > nextTime;
}

void Timer::changePeriod(nsecs_t newPeriod) {
    nextTime = saturatingAdd(nextTime, newPeriod - period);
    period = newPeriod;
}

void Timer::check() {
    if (period >= 1) check(systemTime(SYSTEM_TIME_MONOTONIC));
}

void Timer::check(nsecs_t now) {
    if (period < 1) return;
    while (isDue(now)) {
        nextTime = saturatingAdd(nextTime, period);
        // The callback may replace itself (re-arming the timer, or switching itself off), so it
        // runs from a local and is put back only when it was not replaced.
        std::function<void()> current;
        current.swap(callback);
        current();
        if (!callback) callback.swap(current);
        if (fireOnce || period < 1 || !catchUp) break;
    }
}

}  // namespace android::Interpolation
