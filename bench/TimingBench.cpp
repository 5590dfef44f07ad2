#include <benchmark/benchmark.h>

#include <vector>

#include "AllocationCounter.h"
#include "BenchReceivers.h"
#include "FrameTimings.h"
#include "RollingStatistics.h"

namespace android::Interpolation {
namespace {

// Render times around 8 ms with up to 2 ms of jitter, so that the variance never collapses and
// the updates stay on the O(1) path.
std::vector<long> renderTimes() {
    std::vector<long> times(1024);
    uint32_t seed = 12345;
    for (long& t : times) {
        seed = seed * 1664525u + 1013904223u;
        t = 8'000'000 + static_cast<long>(seed >> 8) % 2'000'000;
    }
    return times;
}

void BM_RollingPercentileUpdateFullRing(benchmark::State& state) {
    const std::vector<long> samples = renderTimes();
    MachineLearning::RollingPercentile<long> percentile(50, 0.99f, 0.005f);
    for (size_t i = 0; i < 50; i++)
        percentile.update(samples[i]);
    size_t next = 50;
    AllocationCounter allocations(state);
    for (auto _ : state) {
        benchmark::DoNotOptimize(percentile.update(samples[next++ % samples.size()]));
    }
}
BENCHMARK(BM_RollingPercentileUpdateFullRing);

// One frame's life as the host reports it, through three buffers in turn.
void BM_AggregatorFrameStages(benchmark::State& state) {
    const uint32_t uid = 4242;
    sp<FrameTimingsAggregator> timings = new FrameTimingsAggregator(uid);
    sp<NullReceiver> receiver = new NullReceiver();
    EventDispatcher::subscribe(uid, EventDispatcher::ALL_EVENTS, receiver);
    const auto fence = std::make_shared<FenceTime>(Fence::createSignalled(1));
    nsecs_t now = 1'000'000;
    int slot = 0;
    {
        AllocationCounter allocations(state);
        for (auto _ : state) {
            timings->dequeueTimings(now, slot);
            timings->queueTimings(now + 8'000'000, slot);
            timings->acquireFenceTimings(fence, slot);
            timings->checkFenceTimes(slot);
            timings->releaseBufferTimings(now + 30'000'000, slot);
            now += 16'666'666;
            slot = (slot + 1) % 3;
        }
    }
    EventDispatcher::unsubscribe(uid, EventDispatcher::ALL_EVENTS, receiver);
}
BENCHMARK(BM_AggregatorFrameStages);

}  // namespace
}  // namespace android::Interpolation
