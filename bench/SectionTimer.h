#pragma once

#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdint>

#include "AllocationCounter.h"

namespace android::Interpolation {

// Times one section of every iteration on the steady clock and reports it as the iteration's
// manual time, with the heap allocations made inside it as "allocs/iter". The rest of the
// iteration (new frames from the game, removals by the host) is neither timed nor counted.
//
// The machine is shared, so a section the scheduler preempted (one longer than PREEMPTED) counts
// at the mean of the sections measured so far, and "preempted" reports the fraction of such
// sections. Pause/ResumeTiming would keep to CPU time instead, but each of them reads the thread's
// CPU clock, a system call costing more than most of the paths measured here.
class SectionTimer {
public:
    using Clock = std::chrono::steady_clock;
    static constexpr std::chrono::nanoseconds PREEMPTED{20'000};

    explicit SectionTimer(benchmark::State& state);
    ~SectionTimer();
    SectionTimer(const SectionTimer&) = delete;
    SectionTimer& operator=(const SectionTimer&) = delete;

    void start() {
        mAllocationsAtStart = allocationCount();
        mStart = Clock::now();
    }
    void stop();

private:
    benchmark::State& mState;
    // What an empty section measures: the clock read that brackets every section.
    const double mOverheadSeconds;
    Clock::time_point mStart;
    uint64_t mAllocationsAtStart = 0;
    uint64_t mAllocations = 0;
    double mMeasuredSeconds = 0;
    uint64_t mMeasured = 0;
    uint64_t mPreempted = 0;
};

}  // namespace android::Interpolation
