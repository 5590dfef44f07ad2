#include <benchmark/benchmark.h>

#include <chrono>

#include "AllocationCounter.h"
#include "FrameInterceptor.h"
#include "Tunables.h"

namespace android::Interpolation {
namespace {

// Stands for the layer's ring log: a receiver of every event that does nothing.
class NullReceiver : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {}
};

// One buffer's queue call and acquire call, in mode 0 with a delayer, as the buffer thread makes
// them at 60 FPS. Only the pair is timed and counted; the host's removal of an old frame between
// pairs, which keeps the queue at three frames, is not.
void BM_InterceptFramePair(benchmark::State& state) {
    using Clock = std::chrono::steady_clock;
    const uint32_t uid = 4243;
    String8 name("SurfaceView[bench]");
    sp<FrameList> list = new FrameList(uid);
    sp<FrameTimingsAggregator> timings = new FrameTimingsAggregator(uid);
    const bool applyDelay = applyDelayToFrames.exchange(true);
    sp<FrameInterceptor> interceptor = new FrameInterceptor(name, uid, eRetimeMode, list, timings);
    applyDelayToFrames.store(applyDelay);
    sp<NullReceiver> ringLog = new NullReceiver();
    EventDispatcher::subscribe(uid, EventDispatcher::ALL_EVENTS, ringLog);

    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    const sp<Fence> fence = Fence::createSignalled(1);
    uint64_t frameNumber = 1;
    nsecs_t timestamp = 1'000'000'000;
    uint64_t allocations = 0;
    for (auto _ : state) {
        const int slot = static_cast<int>(frameNumber % 3);
        const uint64_t allocationsBefore = allocationCount();
        const Clock::time_point start = Clock::now();
        interceptor->interceptFrame(frameNumber, slot, buffer, timestamp, fence, false);
        interceptor->interceptFrame(frameNumber, slot, buffer, timestamp, fence, true);
        const Clock::time_point end = Clock::now();
        allocations += allocationCount() - allocationsBefore;
        state.SetIterationTime(std::chrono::duration<double>(end - start).count());

        if (list->size() > 3) list->clearOldestFrameLocking();
        frameNumber++;
        timestamp += 16'666'666;
    }
    state.counters["allocs/iter"] = benchmark::Counter(static_cast<double>(allocations),
                                                       benchmark::Counter::kAvgIterations);
    EventDispatcher::unsubscribe(uid, EventDispatcher::ALL_EVENTS, ringLog);
}
BENCHMARK(BM_InterceptFramePair)->UseManualTime();

}  // namespace
}  // namespace android::Interpolation
