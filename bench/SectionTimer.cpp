#include "SectionTimer.h"

#include <algorithm>

namespace android::Interpolation {

namespace {

double emptySectionSeconds() {
    static const double seconds = [] {
        auto shortest = SectionTimer::Clock::duration::max();
        for (int i = 0; i < 10'000; i++) {
            const auto start = SectionTimer::Clock::now();
            const auto end = SectionTimer::Clock::now();
            shortest = std::min(shortest, end - start);
        }
        return std::chrono::duration<double>(shortest).count();
    }();
    return seconds;
}

}  // namespace

SectionTimer::SectionTimer(benchmark::State& state)
    : mState(state), mOverheadSeconds(emptySectionSeconds()) {}

SectionTimer::~SectionTimer() {
    mState.counters["allocs/iter"] = benchmark::Counter(static_cast<double>(mAllocations),
                                                        benchmark::Counter::kAvgIterations);
    mState.counters["preempted"] =
            benchmark::Counter(static_cast<double>(mPreempted), benchmark::Counter::kAvgIterations);
}

void SectionTimer::stop() {
    const Clock::time_point end = Clock::now();
    mAllocations += allocationCount() - mAllocationsAtStart;
    double seconds;
    if (end - mStart > PREEMPTED) {
        mPreempted++;
        seconds = mMeasured > 0 ? mMeasuredSeconds / static_cast<double>(mMeasured)
                                : std::chrono::duration<double>(PREEMPTED).count();
    } else {
        seconds = std::max(0.0,
                           std::chrono::duration<double>(end - mStart).count() - mOverheadSeconds);
        mMeasuredSeconds += seconds;
        mMeasured++;
    }
    mState.SetIterationTime(seconds);
}

}  // namespace android::Interpolation
