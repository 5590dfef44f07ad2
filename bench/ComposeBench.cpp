#include <benchmark/benchmark.h>

#include <chrono>

#include "AllocationCounter.h"
#include "FrameTimings.h"
#include "JustInTimeReleasePicker.h"
#include "ReleasePicker.h"
#include "RenderStateBuilder.h"
#include "Settings.h"

namespace android::Interpolation {
namespace {

using Clock = std::chrono::steady_clock;

constexpr nsecs_t FRAME_PERIOD = 33'333'333;    // a 30 FPS game
constexpr nsecs_t REFRESH_PERIOD = 16'666'666;  // on a 60 Hz display

// Stands for the layer's ring log: a receiver of every event that does nothing.
class NullReceiver : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {}
};

FrameItem acquiredFrame(uint64_t number, nsecs_t id, const sp<GraphicBuffer>& buffer) {
    FrameItem frame;
    frame.mIndex = number;
    frame.mTextureSlot = static_cast<int32_t>(number % 4);
    frame.mGraphicBuffer = buffer;
    frame.mID = id;
    frame.mTimestamp = id;
    frame.mAcquireFence = Fence::NO_FENCE;
    frame.mAcquired = true;
    return frame;
}

// One refresh of a mode-0 layer as the composition thread makes it: the state for the display
// time, then the unlock of its frames once composed. A few frames are queued, the layer's release
// picker and a ring-log stand-in receive the events. Only the refresh is timed and counted; the
// game's new frames and the removal of old ones between refreshes are not.
void BM_RetimeRefresh(benchmark::State& state) {
    const uint32_t uid = 4244;
    String8 name("SurfaceView[bench]");
    sp<FrameList> list = new FrameList(uid);
    sp<FrameTimingsAggregator> timings = new FrameTimingsAggregator(uid);
    sp<RenderStateBuilder> builder =
            RenderStateBuilder::newBuilderFromMode(name, uid, list, eRetimeMode);
    sp<ReleasePicker> picker =
            ReleasePicker::newPickerFromMode(list, timings, name, uid, eRetimeMode);
    sp<NullReceiver> ringLog = new NullReceiver();
    EventDispatcher::subscribe(uid, EventDispatcher::ALL_EVENTS, ringLog);
    SettingsController::getInstance()->notifyChanges();  // the default alpha curve

    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    uint64_t nextFrame = 1;
    nsecs_t nextFrameTime = FRAME_PERIOD;
    for (int i = 0; i < 4; i++) {
        list->insertFrame(acquiredFrame(nextFrame++, nextFrameTime, buffer));
        nextFrameTime += FRAME_PERIOD;
    }

    nsecs_t displayTime = FRAME_PERIOD + REFRESH_PERIOD / 2;
    uint64_t allocations = 0;
    for (auto _ : state) {
        const uint64_t allocationsBefore = allocationCount();
        const Clock::time_point start = Clock::now();
        RenderState composed = builder->lockStateFor(displayTime);
        for (const RenderItem& item : composed.items)
            list->unlock(item.frame.mID);
        composed = RenderState();
        const Clock::time_point end = Clock::now();
        allocations += allocationCount() - allocationsBefore;
        state.SetIterationTime(std::chrono::duration<double>(end - start).count());

        displayTime += REFRESH_PERIOD;
        if (list->isOldestFrameUnused(displayTime)) {
            list->clearOldestFrameLocking();
            list->insertFrame(acquiredFrame(nextFrame++, nextFrameTime, buffer));
            nextFrameTime += FRAME_PERIOD;
        }
    }
    state.counters["allocs/iter"] = benchmark::Counter(static_cast<double>(allocations),
                                                       benchmark::Counter::kAvgIterations);
    EventDispatcher::unsubscribe(uid, EventDispatcher::ALL_EVENTS, ringLog);
}
BENCHMARK(BM_RetimeRefresh)->UseManualTime();

// How late the just-in-time picker's release thread wakes after the margin before the next
// composition: the reported time per iteration is that lateness, not the wait itself.
void BM_JustInTimeWakeLateness(benchmark::State& state) {
    const uint32_t uid = 4245;
    String8 name("SurfaceView[bench]");
    sp<FrameList> list = new FrameList(uid);
    sp<JustInTimeReleasePicker> picker = new JustInTimeReleasePicker(list, name, uid);
    Settings settings;
    settings.justInTimeMarginMs = 2;
    picker->onSettingsChanged(settings);
    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    for (int i = 1; i <= 3; i++)
        list->insertFrame(acquiredFrame(i, i * FRAME_PERIOD, buffer));

    constexpr nsecs_t AHEAD = 5'000'000;
    constexpr nsecs_t MARGIN = 2'000'000;
    for (auto _ : state) {
        const nsecs_t composition = systemTime(SYSTEM_TIME_MONOTONIC) + AHEAD;
        picker->onEvent(eCompositionEstimateEvent, 0, composition);
        const FrameItem released = picker->selectFrameForRelease();
        const nsecs_t lateness = systemTime(SYSTEM_TIME_MONOTONIC) - (composition - MARGIN);
        benchmark::DoNotOptimize(released);
        state.SetIterationTime(static_cast<double>(lateness) / 1e9);
    }
}
BENCHMARK(BM_JustInTimeWakeLateness)->UseManualTime()->Iterations(200);

}  // namespace
}  // namespace android::Interpolation
