#pragma once

#include <utils/Timers.h>

#include <optional>

namespace verolux::sim {

// The clocks of this process as the library reads them, made a variable. The library reads time
// through systemTime() alone, except for two wall-clock stamps: a watchdog warning's
// (clock_gettime(CLOCK_REALTIME)) and a ring log's creation (time()). A program linked with
// ClockOverride.cpp (and exporting its symbols, -rdynamic) defines those three functions, so that
// they read the time set here while one is set, and the real clocks otherwise.
//
// Process-wide, as the clocks are: one simulated run at a time per process, and no test clock
// while it runs. Every other clock (the steady clock, CLOCK_MONOTONIC, thread CPU clocks) stays
// real, so waits and speed measurements keep working.
class ClockOverride {
public:
    // From now on systemTime() returns `now` for every clock id; -1 hands it back to the real
    // clocks (and the wall clock too).
    static void setNow(nsecs_t now);
    // While a time is set, the wall clock reads that time plus `offset` (ns since the epoch), or
    // stays real when `offset` is empty.
    static void setWallClockOffset(std::optional<nsecs_t> offset);
    static bool isSet();
};

}  // namespace verolux::sim
