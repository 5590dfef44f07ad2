#include <benchmark/benchmark.h>
#include <unistd.h>

#include <mutex>

#include "AllocationCounter.h"
#include "BenchReceivers.h"
#include "EventDispatcher.h"
#include "RFPSAgent.h"
#include "RefreshRateDetector.h"

namespace android::Interpolation {
namespace {

// What a per-vsync or per-refresh call of a rate component cannot avoid: its own mutex and one
// read of the monotonic clock for its timer.
void BM_FloorLockAndClockRead(benchmark::State& state) {
    std::mutex mutex;
    AllocationCounter allocations(state);
    for (auto _ : state) {
        std::lock_guard lock(mutex);
        benchmark::DoNotOptimize(systemTime(SYSTEM_TIME_MONOTONIC));
    }
}
BENCHMARK(BM_FloorLockAndClockRead);

// A 120 Hz display with the interval ring full; the once-a-second estimate runs when it is due.
void BM_RefreshRateDetectorAddVsync(benchmark::State& state) {
    constexpr nsecs_t PERIOD = 8'333'333;
    sp<RefreshRateDetector> detector = new RefreshRateDetector(4343);
    nsecs_t vsync = 1'000'000'000;
    for (size_t i = 0; i <= RefreshRateDetector::MAX_INTERVALS; i++)
        detector->addVsync(vsync += PERIOD);
    AllocationCounter allocations(state);
    for (auto _ : state)
        detector->addVsync(vsync += PERIOD);
}
BENCHMARK(BM_RefreshRateDetectorAddVsync);

// A fixed render rate of 1 Hz, so that nearly every refresh falls between two fake vsyncs: with
// a make-up chance in hand it presents (refused = 0), without one it refuses and announces it to
// the ring log (refused = 1).
void BM_RFPSAgentShouldPresentNow(benchmark::State& state) {
    const uint32_t uid = 4344 + static_cast<uint32_t>(state.range(0));
    sp<NullReceiver> ringLog = new NullReceiver();
    EventDispatcher::subscribe(uid, EventDispatcher::ALL_EVENTS, ringLog);
    String8 name("bench");
    sp<RFPSAgent> agent = new RFPSAgent(uid, name);
    Settings s;
    if (state.range(0) == 0) {
        s.rfps = 1000;
        agent->onSettingsChanged(s);
        usleep(2000);
        agent->shouldPresentNow();
        agent->onPresentFail();  // a chance that is never spent: the host reports no success
    }
    s.rfps = 1;
    agent->onSettingsChanged(s);
    {
        AllocationCounter allocations(state);
        for (auto _ : state)
            benchmark::DoNotOptimize(agent->shouldPresentNow());
    }
    EventDispatcher::unsubscribe(uid, EventDispatcher::ALL_EVENTS, ringLog);
}
BENCHMARK(BM_RFPSAgentShouldPresentNow)->ArgName("refused")->Arg(0)->Arg(1);

}  // namespace
}  // namespace android::Interpolation
