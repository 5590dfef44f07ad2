#include <benchmark/benchmark.h>
#include <ui/Fence.h>

#include <algorithm>
#include <mutex>
#include <vector>

#include "BenchReceivers.h"
#include "BenchSupport.h"
#include "Delayer.h"
#include "FrameTimings.h"
#include "JustInTimeReleasePicker.h"
#include "ReleasePicker.h"
#include "RenderStateBuilder.h"
#include "SectionTimer.h"
#include "Settings.h"

namespace android::Interpolation {
namespace {

constexpr nsecs_t FRAME_PERIOD = 33'333'333;    // a 30 FPS game
constexpr nsecs_t REFRESH_PERIOD = 16'666'666;  // on a 60 Hz display
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

// The game's frames, one per FRAME_PERIOD, each with a real fence that has signalled; acquired or
// not as the compositor would have them.
class FrameFeed {
public:
    explicit FrameFeed(bool acquired)
        : mAcquired(acquired),
          mBuffer(new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888)),
          mFences(signalledFences()) {}

    FrameItem next() {
        FrameItem frame;
        frame.mIndex = mNumber;
        frame.mTextureSlot = static_cast<int32_t>(mNumber % 8);
        frame.mGraphicBuffer = mBuffer;
        frame.mID = static_cast<nsecs_t>(mNumber) * FRAME_PERIOD;
        frame.mTimestamp = frame.mID;
        frame.mAcquireFence = mFences[mNumber % mFences.size()];
        frame.mAcquired = mAcquired;
        mNumber++;
        return frame;
    }

private:
    const bool mAcquired;
    const sp<GraphicBuffer> mBuffer;
    const std::vector<sp<Fence>> mFences;
    uint64_t mNumber = 1;
};

// A mode-0 layer's composition side with the receivers a mode-0 layer has: the delayer, the
// release picker and the ring log, plus `extraSubscribers` receivers of every event.
struct RetimeLayer {
    RetimeLayer(uint32_t uid, int64_t extraSubscribers)
        : uid(uid),
          list(new FrameList(uid)),
          timings(new FrameTimingsAggregator(uid)),
          builder(RenderStateBuilder::newBuilderFromMode(name, uid, list, eRetimeMode)),
          picker(ReleasePicker::newPickerFromMode(list, timings, name, uid, eRetimeMode)),
          delayer(new Delayer(uid, name)),
          ringLog(new RingLogStandIn(uid)) {
        for (int64_t i = 0; i < extraSubscribers; i++) {
            extra.push_back(new NullReceiver());
            EventDispatcher::subscribe(uid, EventDispatcher::ALL_EVENTS, extra.back());
        }
        SettingsController::getInstance()->notifyChanges();  // the default alpha curve
    }
    ~RetimeLayer() {
        for (const sp<NullReceiver>& receiver : extra)
            EventDispatcher::unsubscribe(uid, EventDispatcher::ALL_EVENTS, receiver);
    }

    const uint32_t uid;
    String8 name{"SurfaceView[bench]"};
    sp<FrameList> list;
    sp<FrameTimingsAggregator> timings;
    sp<RenderStateBuilder> builder;
    sp<ReleasePicker> picker;
    sp<Delayer> delayer;
    sp<RingLogStandIn> ringLog;
    std::vector<sp<NullReceiver>> extra;
};

// One refresh of a mode-0 layer as the composition thread makes it: the state for the display
// time, then the unlock of its frames once composed. Between refreshes, untimed, the host removes
// the frames no display time can use any more and the game's new frames arrive, so that `frames`
// stay queued: the frame before the display time and those after it. A 30 FPS game on a 60 Hz
// display brings a new frame every other refresh.
void BM_RetimeRefresh(benchmark::State& state) {
    const bool acquired = state.range(0) != 0;
    const auto queued = static_cast<size_t>(state.range(1));
    const uint32_t uid = 5000 + static_cast<uint32_t>(state.range(0) * 1000 + state.range(1) * 50 +
                                                      state.range(2));
    RetimeLayer layer(uid, state.range(2));
    FrameFeed feed(acquired);
    while (layer.list->size() < queued)
        layer.list->insertFrame(feed.next());

    nsecs_t displayTime = FRAME_PERIOD + REFRESH_PERIOD / 2;
    const auto refresh = [&] {
        const RenderState composed = layer.builder->lockStateFor(displayTime);
        for (const RenderItem& item : composed.items)
            layer.list->unlock(item.frame.mID);
    };
    const auto nextRefresh = [&] {
        displayTime += REFRESH_PERIOD;
        while (layer.list->isOldestFrameUnused(displayTime))
            layer.list->clearOldestFrameIfUnusedLocking(displayTime);
        while (layer.list->size() < queued)
            layer.list->insertFrame(feed.next());
    };
    for (int i = 0; i < WARM_UP; i++) {
        refresh();
        nextRefresh();
    }
    SectionTimer section(state);
    for (auto _ : state) {
        section.start();
        refresh();
        section.stop();
        nextRefresh();
    }
}
BENCHMARK(BM_RetimeRefresh)
        ->ArgNames({"acquired", "frames", "subscribers"})
        ->Args({0, 4, 0})
        ->Args({1, 4, 0})
        ->Args({0, 2, 0})
        ->Args({0, 16, 0})
        ->Args({1, 2, 0})
        ->Args({1, 16, 0})
        ->Args({0, 4, 16})
        ->UseManualTime();

// The floor's stand-ins for the receivers of a refresh's two events.
class FloorDelayer : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {
        std::lock_guard lock(mMutex);
        mCounted++;
    }

private:
    std::mutex mMutex;
    uint64_t mCounted = 0;  // guarded by mMutex
};

class FloorPicker : public EventDispatcher::EventReceiver {
public:
    FloorPicker() { mLastComposed.reserve(2); }
    void onEvent(const EventType&, const nsecs_t&, const EventData& data) override {
        std::lock_guard lock(mMutex);
        mLastComposed = std::get<RenderState>(data).items;
    }

private:
    std::mutex mMutex;
    std::vector<RenderItem> mLastComposed;  // guarded by mMutex
};

// What one refresh of BM_RetimeRefresh cannot avoid, done with the plainest means: the builder's
// mutex; the list's mutex once to copy the two neighbours into the state (its one allocation) and
// lock them, and once for each unlock; one poll of a composed frame's fence the first time that
// frame is composed (every other refresh), none for acquired frames; a clock read for each of the
// two events (the composition kind, then the composed state) and for each the bus's mutex and, per
// receiver, a weak-pointer promotion and a virtual call: the delayer counts the kind under its
// mutex, the picker keeps the composed state under its mutex, the ring log records both.
void BM_RetimeRefreshFloor(benchmark::State& state) {
    const bool acquired = state.range(0) != 0;
    const std::vector<sp<Fence>> fences = signalledFences();
    FrameFeed feed(acquired);
    const FrameItem queue[2] = {feed.next(), feed.next()};
    std::mutex builderMutex;
    std::mutex listMutex;
    std::vector<nsecs_t> locks;
    locks.reserve(8);
    std::condition_variable unlocked;

    sp<FloorDelayer> delayer = new FloorDelayer();
    sp<FloorPicker> picker = new FloorPicker();
    sp<RingLogStandIn> ringLog = new RingLogStandIn(5999);
    FloorBus bus;
    bus.subscribe(Delayer::EVENT_FLAGS, delayer);
    bus.subscribe(eBufferComposedEvent, picker);
    bus.subscribe(EventDispatcher::ALL_EVENTS, ringLog);

    uint64_t refresh = 0;
    SectionTimer section(state);
    for (auto _ : state) {
        section.start();
        {
            std::unique_lock builderLock(builderMutex);
            RenderState composed;
            composed.items.reserve(2);
            {
                std::lock_guard lock(listMutex);
                for (const FrameItem& frame : queue) {
                    composed.items.push_back(RenderItem{frame, 0.0f, 0});
                    locks.insert(std::upper_bound(locks.begin(), locks.end(), frame.mID), frame.mID);
                }
            }
            if (!acquired && refresh % 2 == 0)
                benchmark::DoNotOptimize(fences[refresh / 2 % fences.size()]->wait(0));
            EventData data(std::move(composed));
            bus.broadcast(eBlendedCompositionEvent, systemTime(SYSTEM_TIME_MONOTONIC), data);
            builderLock.unlock();
            bus.broadcast(eBufferComposedEvent, systemTime(SYSTEM_TIME_MONOTONIC), data);
            for (const RenderItem& item : std::get<RenderState>(data).items) {
                {
                    std::lock_guard lock(listMutex);
                    locks.erase(std::lower_bound(locks.begin(), locks.end(), item.frame.mID));
                }
                unlocked.notify_all();
            }
        }
        section.stop();
        refresh++;
    }
}
BENCHMARK(BM_RetimeRefreshFloor)->ArgName("acquired")->Arg(0)->Arg(1)->UseManualTime();

// What each extra receiver of an event cannot avoid: a weak-pointer promotion, a virtual call and
// the release of the strong reference.
void BM_FloorPromoteAndCall(benchmark::State& state) {
    sp<EventDispatcher::EventReceiver> receiver = new NullReceiver();
    const wp<EventDispatcher::EventReceiver> weak = receiver;
    const EventData data(0);
    for (auto _ : state) {
        sp<EventDispatcher::EventReceiver> strong = weak.promote();
        strong->onEvent(eBufferComposedEvent, 0, data);
        benchmark::DoNotOptimize(strong);
    }
}
BENCHMARK(BM_FloorPromoteAndCall);

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
