#include <benchmark/benchmark.h>

#include <atomic>
#include <cstdlib>
#include <new>
#include <vector>

#include "FrameTimings.h"
#include "RollingStatistics.h"

// The binary's one replacement of the global allocator: it counts every allocation, so that each
// benchmark can report how many its measured loop made (the timing paths promise none).
namespace {
std::atomic<uint64_t> sAllocations{0};
}  // namespace

// Not inlined: GCC would otherwise see free() meet a pointer from operator new, or a malloc()
// pointer meet operator delete, and warn.
[[gnu::noinline]] void* operator new(size_t size) {
    sAllocations.fetch_add(1, std::memory_order_relaxed);
    if (void* p = std::malloc(size == 0 ? 1 : size)) return p;
    throw std::bad_alloc();
}
[[gnu::noinline]] void operator delete(void* p) noexcept {
    std::free(p);
}
[[gnu::noinline]] void operator delete(void* p, size_t) noexcept {
    std::free(p);
}

namespace android::Interpolation {
namespace {

class AllocationCounter {
public:
    explicit AllocationCounter(benchmark::State& state)
        : mState(state), mStart(sAllocations.load()) {}
    ~AllocationCounter() {
        mState.counters["allocs/iter"] =
                benchmark::Counter(static_cast<double>(sAllocations.load() - mStart),
                                   benchmark::Counter::kAvgIterations);
    }

private:
    benchmark::State& mState;
    const uint64_t mStart;
};

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

// Stands for the layer's ring log: a receiver of every event that does nothing.
class NullReceiver : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {}
};

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
