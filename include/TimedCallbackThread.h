#pragma once

#include <condition_variable>
#include <functional>
#include <mutex>

#include "Timer.h"

namespace android {

// A Timer driven by a thread that sleeps until the timer is due. The library never starts the
// thread: its owner runs threadLoop on a thread of its own and joins it.
//
// Whoever changes the timer (period, due time, callback) or `running` takes `mutex`, changes it
// and notifies `condition`, so that the sleeping loop sees the change.
class TimedCallbackThread {
public:
    TimedCallbackThread() = default;
    TimedCallbackThread(Interpolation::Timer timer, std::function<void()> cycleCallback);
    TimedCallbackThread(const TimedCallbackThread&) = delete;
    TimedCallbackThread& operator=(const TimedCallbackThread&) = delete;

    // Cycles until `running` is cleared or the period is no longer positive, and then returns.
    // Each cycle waits for the timer and fires it (the callback runs with `mutex` held), then
    // calls cycleCallback without the mutex. A period of 0 at the start runs one cycle.
    void threadLoop();

    // Ends the loop without waiting for the timer: clears `running` and disables the timer. The
    // current cycle's cycleCallback still runs.
    void requestExit();

    bool running = true;         // guarded by mutex
    Interpolation::Timer timer;  // guarded by mutex
    std::function<void()> cycleCallback = [] {};
    std::mutex mutex;
    std::condition_variable condition;  // tied to mutex
};

}  // namespace android
