#pragma once

#include <benchmark/benchmark.h>

#include <cstdint>

namespace android::Interpolation {

// Allocations made so far by the whole binary, counted by its one replacement of the global
// operator new.
uint64_t allocationCount();

// Reports, as "allocs/iter", how many allocations the benchmark made between its construction and
// its destruction, averaged over the iterations.
class AllocationCounter {
public:
    explicit AllocationCounter(benchmark::State& state)
        : mState(state), mStart(allocationCount()) {}
    ~AllocationCounter() {
        mState.counters["allocs/iter"] = benchmark::Counter(
                static_cast<double>(allocationCount() - mStart), benchmark::Counter::kAvgIterations);
    }
    AllocationCounter(const AllocationCounter&) = delete;
    AllocationCounter& operator=(const AllocationCounter&) = delete;

private:
    benchmark::State& mState;
    const uint64_t mStart;
};

}  // namespace android::Interpolation
