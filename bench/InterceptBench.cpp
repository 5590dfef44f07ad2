#include <benchmark/benchmark.h>

#include <mutex>
#include <new>
#include <optional>
#include <vector>

#include "BenchReceivers.h"
#include "BenchSupport.h"
#include "FrameInterceptor.h"
#include "ReleasePicker.h"
#include "SectionTimer.h"
#include "Tunables.h"

namespace android::Interpolation {
namespace {

constexpr nsecs_t FRAME_PERIOD = 16'666'666;  // a 60 FPS game
constexpr int SLOTS = 8;
// One buffer's queue call and acquire call, in mode 0 with a delayer, as the buffer thread makes
// them at 60 FPS, with the receivers a mode-0 layer has: the delayer, the release picker and the
// ring log. Each buffer comes with a real fence that has signalled. Only the pair is timed and
// counted; the host's removal of old frames between pairs, which keeps `frames` queued, is not.
void BM_InterceptFramePair(benchmark::State& state) {
    const auto queued = static_cast<size_t>(state.range(0));
    const uint32_t uid = 4243 + static_cast<uint32_t>(queued) * 10;
    String8 name("SurfaceView[bench]");
    sp<FrameList> list = new FrameList(uid);
    sp<FrameTimingsAggregator> timings = new FrameTimingsAggregator(uid);
    const bool applyDelay = applyDelayToFrames.exchange(true);
    sp<FrameInterceptor> interceptor = new FrameInterceptor(name, uid, eRetimeMode, list, timings);
    applyDelayToFrames.store(applyDelay);
    sp<ReleasePicker> picker =
            ReleasePicker::newPickerFromMode(list, timings, name, uid, eRetimeMode);
    sp<RingLogStandIn> ringLog = new RingLogStandIn(uid);

    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    const std::vector<sp<Fence>> fences = signalledFences();
    uint64_t frameNumber = 1;
    nsecs_t timestamp = 1'000'000'000;
    const auto intercept = [&] {
        const int slot = static_cast<int>(frameNumber % SLOTS);
        const sp<Fence>& fence = fences[frameNumber % fences.size()];
        interceptor->interceptFrame(frameNumber, slot, buffer, timestamp, fence, false);
        interceptor->interceptFrame(frameNumber, slot, buffer, timestamp, fence, true);
    };
    const auto nextFrame = [&] {
        while (list->size() > queued)
            list->clearOldestFrameLocking();
        frameNumber++;
        timestamp += FRAME_PERIOD;
    };
    for (int i = 0; i < WARM_UP; i++) {
        intercept();
        nextFrame();
    }
    SectionTimer section(state);
    for (auto _ : state) {
        section.start();
        intercept();
        section.stop();
        nextFrame();
    }
}
BENCHMARK(BM_InterceptFramePair)->ArgName("frames")->Arg(4)->Arg(2)->Arg(16)->UseManualTime();

// Fixed storage for fence wrappers, taken and given back under a mutex.
class FloorFenceTimePool {
public:
    FenceTime* take(const sp<Fence>& fence) {
        void* storage;
        {
            std::lock_guard lock(mMutex);
            storage = mFree.back();
            mFree.pop_back();
        }
        return new (storage) FenceTime(fence);
    }
    void give(FenceTime* fenceTime) {
        fenceTime->~FenceTime();
        std::lock_guard lock(mMutex);
        mFree.push_back(fenceTime);
    }

    FloorFenceTimePool() {
        for (auto& storage : mStorage)
            mFree.push_back(&storage);
    }

private:
    struct alignas(FenceTime) Storage {
        unsigned char bytes[sizeof(FenceTime)];
    };
    Storage mStorage[4];
    std::mutex mMutex;
    std::vector<void*> mFree;  // guarded by mMutex
};

// What the pair of BM_InterceptFramePair cannot avoid, done with the plainest means. Each call:
// the interceptor's mutex; the timestamp kept from the queue call to the acquire call (a store and
// a load); the timings' mutex once, to record the frame and a fence wrapper from a pool (its mutex)
// whose signal time is read and which goes back to the pool once signalled, announced by an event;
// the delayer's mutex to read the delay; the list's mutex once, to check the timestamp and insert
// the frame (a copy taking two references) or mark it acquired. The queue call also reads the
// clock for the queue time, announces it, and announces the frame's arrival with the queue's size
// before and after, read from the clock once; the acquire call polls the delayer's timer, reading
// the clock. Each event costs the bus's mutex and, per receiver, a weak-pointer promotion and a
// virtual call: the ring log records every event under its mutex, the picker hears of arrivals.
void BM_InterceptFramePairFloor(benchmark::State& state) {
    const auto queued = static_cast<size_t>(state.range(0));
    std::mutex interceptorMutex;
    nsecs_t timestamps[SLOTS] = {};
    std::mutex timingsMutex;
    struct {
        uint64_t frameNumber;
        nsecs_t queueTime;
        FenceTime* acquireFence;
        nsecs_t acquireTime;
    } slots[SLOTS] = {};
    FloorFenceTimePool fenceTimes;
    std::mutex delayerMutex;
    const nsecs_t delay = 50'000'000;
    std::mutex listMutex;
    std::vector<std::optional<FrameItem>> queue(queued);

    sp<NullReceiver> picker = new NullReceiver();
    sp<RingLogStandIn> ringLog = new RingLogStandIn(4299);
    FloorBus bus;
    bus.subscribe(eFrameReceivedEvent, picker);
    bus.subscribe(EventDispatcher::ALL_EVENTS, ringLog);

    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    const std::vector<sp<Fence>> fences = signalledFences();
    uint64_t frameNumber = 1;
    nsecs_t timestamp = 1'000'000'000;

    const auto recordFence = [&](int slot, const sp<Fence>& fence) {
        nsecs_t signalTime;
        {
            std::lock_guard lock(timingsMutex);
            slots[slot].frameNumber = frameNumber;
            slots[slot].acquireFence = fenceTimes.take(fence);
            signalTime = slots[slot].acquireFence->getSignalTime();
            fenceTimes.give(slots[slot].acquireFence);
            slots[slot].acquireFence = nullptr;
            slots[slot].acquireTime = signalTime;
        }
        bus.broadcast(eBufferCompletedEvent, signalTime, slot);
    };

    SectionTimer section(state);
    for (auto _ : state) {
        const int slot = static_cast<int>(frameNumber % SLOTS);
        const sp<Fence>& fence = fences[frameNumber % fences.size()];
        std::optional<FrameItem>& entry = queue[frameNumber % queued];
        section.start();
        {  // queued
            std::lock_guard interceptorLock(interceptorMutex);
            timestamps[slot] = timestamp;
            const nsecs_t queueTime = systemTime(SYSTEM_TIME_MONOTONIC);
            {
                std::lock_guard lock(timingsMutex);
                slots[slot].queueTime = queueTime;
            }
            bus.broadcast(eBufferQueuedEvent, queueTime, slot);
            recordFence(slot, fence);
            nsecs_t frameDelay;
            {
                std::lock_guard lock(delayerMutex);
                frameDelay = delay;
            }
            std::lock_guard lock(listMutex);
            for (const std::optional<FrameItem>& frame : queue)
                benchmark::DoNotOptimize(frame && frame->mTimestamp == timestamp);
            entry.emplace();
            entry->mIndex = frameNumber;
            entry->mTextureSlot = slot;
            entry->mGraphicBuffer = buffer;
            entry->mID = timestamp + frameDelay;
            entry->mTimestamp = timestamp;
            entry->mAcquireFence = fence;
            entry->mAcquired = false;
            const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
            EventData data(std::move(*entry));
            bus.broadcast(eFrameReceivedEvent, now, data);
            bus.broadcast(eFrameListSizeChangedEvent, now - 1, static_cast<int>(queued) - 1);
            bus.broadcast(eFrameListSizeChangedEvent, now, static_cast<int>(queued));
            *entry = std::move(std::get<FrameItem>(data));
        }
        {  // acquired
            std::lock_guard interceptorLock(interceptorMutex);
            benchmark::DoNotOptimize(timestamps[slot]);
            recordFence(slot, fence);
            {
                std::lock_guard lock(delayerMutex);
                benchmark::DoNotOptimize(delay);
            }
            {
                std::lock_guard lock(listMutex);
                for (std::optional<FrameItem>& frame : queue) {
                    if (frame && frame->mTimestamp == timestamp) frame->mAcquired = true;
                }
            }
            std::lock_guard lock(delayerMutex);
            benchmark::DoNotOptimize(systemTime(SYSTEM_TIME_MONOTONIC));
        }
        section.stop();

        entry.reset();
        frameNumber++;
        timestamp += FRAME_PERIOD;
    }
}
BENCHMARK(BM_InterceptFramePairFloor)->ArgName("frames")->Arg(4)->UseManualTime();

}  // namespace
}  // namespace android::Interpolation
