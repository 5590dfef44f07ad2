#include "TimedCallbackThread.h"

#include <chrono>
#include <limits>

#include "UniqueLock.h"

namespace android {

namespace {

// A stalled thread catches up on at most this much of its schedule.
constexpr nsecs_t MAX_CATCH_UP = 1'000'000'000;

nsecs_t saturatingSub(nsecs_t a, nsecs_t b) {
    nsecs_t difference;
    if (!__builtin_sub_overflow(a, b, &difference)) return difference;
    return b < 0 ? std::numeric_limits<nsecs_t>::max() : std::numeric_limits<nsecs_t>::min();
}

// The deadline `remaining` (> 0) from now on the system clock, saturated at the largest time
// point rather than wrapping into the past.
std::chrono::system_clock::time_point deadlineAfter(nsecs_t remaining) {
    using Clock = std::chrono::system_clock;
    const Clock::time_point now = Clock::now();
    const std::chrono::nanoseconds wait(remaining);
    if (wait >= Clock::time_point::max() - now) return Clock::time_point::max();
    return now + std::chrono::duration_cast<Clock::duration>(wait);
}

}  // namespace

TimedCallbackThread::TimedCallbackThread(Interpolation::Timer timer,
                                         std::function<void()> cycleCallback)
    : timer(std::move(timer)), cycleCallback(std::move(cycleCallback)) {}

void TimedCallbackThread::threadLoop() {
    for (;;) {
        {
            Interpolation::UniqueLock<std::mutex> lock(mutex);
            bool clockRead = false;
            nsecs_t now = 0;
            while (timer.period >= 1) {
                now = systemTime(SYSTEM_TIME_MONOTONIC);
                clockRead = true;
                if (timer.isDue(now)) {
                    timer.check(now);
                    break;
                }
                if (timer.nextTime < 0 || timer.period < 0) {
                    condition.wait(lock);
                } else {
                    const nsecs_t remaining =
                            saturatingSub(timer.nextTime, systemTime(SYSTEM_TIME_MONOTONIC));
                    if (remaining >= 1) condition.wait_until(lock, deadlineAfter(remaining));
                }
                // Every wake-up, spurious or not, re-reads the period and the due time.
                if (timer.period <= 0) break;
            }
            if (clockRead) {
                const nsecs_t oldest = saturatingSub(now, MAX_CATCH_UP);
                if (timer.nextTime < oldest) timer.nextTime = oldest;
            }
        }

        cycleCallback();

        Interpolation::UniqueLock<std::mutex> lock(mutex);
        if (!running) return;
        const nsecs_t period = timer.period;
        lock.unlock();
        if (period <= 0) return;
    }
}

void TimedCallbackThread::requestExit() {
    {
        std::lock_guard lock(mutex);
        running = false;
        // Without this a sleeping loop would wake, find the timer not yet due and sleep again.
        timer.period = 0;
    }
    condition.notify_all();
}

}  // namespace android
