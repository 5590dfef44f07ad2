#pragma once

#include <utils/Timers.h>

#include <functional>

namespace android::Interpolation {

// Periodic work without a thread of its own: the owner polls the timer from code that runs anyway,
// holding the lock that guards the timer, and the callback runs under that lock.
struct Timer {
    nsecs_t period = 0;  // 0 or less disables the timer
    nsecs_t nextTime = 0;
    bool fireOnce = false;  // at most one call per check
    nsecs_t slack = 0;      // due when now + slack > nextTime
    std::function<void()> callback = [] {};
    bool catchUp = true;  // one check calls once per missed period

    // Arms it the way every owner does: first due one period from now, no slack, catching up.
    void arm(nsecs_t newPeriod, nsecs_t now, std::function<void()> newCallback, bool once);

    bool isDue(nsecs_t now) const;

    // A new period that keeps the next firing in place relative to it: nextTime moves by the
    // change of period.
    void changePeriod(nsecs_t newPeriod);

    // The timer check, reading the clock once and only when the timer is enabled.
    void check();
    // The timer check at `now`: while due, advances nextTime by a period and calls the callback;
    // stops after one call when fireOnce is set, catchUp is clear or the period is no longer
    // positive.
    void check(nsecs_t now);
};

}  // namespace android::Interpolation
