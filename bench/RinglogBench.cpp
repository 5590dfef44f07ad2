#include <benchmark/benchmark.h>

#include <array>
#include <mutex>

#include "AllocationCounter.h"
#include "Ringlog.h"

namespace android::Interpolation {
namespace {

// The cheapest a ring of records under a lock can be: lock, one 16-byte store, unlock. What
// Ringlog::onEvent costs above it is the flattening.
void BM_LockedRecordStoreFloor(benchmark::State& state) {
    std::mutex mutex;
    std::array<SerializableEvent, 1024> ring{};
    size_t next = 0;
    nsecs_t time = 0;
    AllocationCounter allocations(state);
    for (auto _ : state) {
        std::lock_guard lock(mutex);
        ring[next++ % ring.size()] = {eBufferComposedEvent, 3, time++};
        benchmark::ClobberMemory();
    }
}
BENCHMARK(BM_LockedRecordStoreFloor);

// The most frequent events of a layer: per refresh a composed state of two frames, which
// flattens into two records, and a queue length, which gives one.
void BM_RinglogOnEvent(benchmark::State& state) {
    String8 name("SurfaceView[bench]");
    sp<Ringlog> ring = new Ringlog(name, eRetimeMode, 4245);
    RenderState composed;
    for (int32_t slot : {1, 2}) {
        FrameItem frame;
        frame.mTextureSlot = slot;
        composed.items.push_back({frame, 0.5f, 1});
    }
    const bool twoItems = state.range(0) == 2;
    const EventType type = twoItems ? eBufferComposedEvent : eFrameListSizeChangedEvent;
    const EventData data = twoItems ? EventData(composed) : EventData(2);
    nsecs_t time = 0;
    AllocationCounter allocations(state);
    for (auto _ : state)
        ring->onEvent(type, time++, data);
}
BENCHMARK(BM_RinglogOnEvent)->Arg(1)->Arg(2)->ArgName("records");

}  // namespace
}  // namespace android::Interpolation
