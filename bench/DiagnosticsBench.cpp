#include <benchmark/benchmark.h>

#include <mutex>

#include "AllocationCounter.h"
#include "LogOutput.h"

namespace android::Interpolation {
namespace {

// What every statistics call on the composition path costs at least: one lock and one clock read.
void BM_LockAndClockReadFloor(benchmark::State& state) {
    std::mutex mutex;
    AllocationCounter allocations(state);
    for (auto _ : state) {
        std::lock_guard lock(mutex);
        benchmark::DoNotOptimize(systemTime(SYSTEM_TIME_MONOTONIC));
    }
}
BENCHMARK(BM_LockAndClockReadFloor);

// After each composition the host records what it showed and calls outputLogs, which between
// ticks only finds that no timer is due. Ticks (every 16.7 ms of real time) are amortised in;
// tocks log nothing at log level 0.
void BM_RecordAndOutputLogsBetweenTicks(benchmark::State& state) {
    sp<EventAggregator> aggregator = new EventAggregator();
    sp<MachineLearning::RealFPSTracker> realFps = new MachineLearning::RealFPSTracker(4245);
    sp<LogOutput> output = new LogOutput(aggregator, realFps);
    AllocationCounter allocations(state);
    for (auto _ : state) {
        aggregator->record(EventAggregator::eInterpolatedFrames, systemTime(SYSTEM_TIME_MONOTONIC));
        output->outputLogs();
    }
}
BENCHMARK(BM_RecordAndOutputLogsBetweenTicks);

}  // namespace
}  // namespace android::Interpolation
