#include <benchmark/benchmark.h>
#include <pthread.h>
#include <sys/prctl.h>
#include <time.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>
#include <vector>

#include "BenchSupport.h"
#include "host/LayerHost.h"

namespace android::Interpolation {
namespace {

using Clock = std::chrono::steady_clock;
using verolux::host::LayerHost;

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t REFRESH_PERIOD = 16'666'667;  // a 60 Hz display
constexpr nsecs_t FRAME_PERIOD = 33'333'333;    // a 30 FPS game
constexpr nsecs_t RENDER_TIME = 4 * MS;
// The host composes what was queued this long before the refresh: both neighbours of the display
// time are in the queue.
constexpr nsecs_t DISPLAY_LAG = 2 * FRAME_PERIOD;
constexpr int BUFFERS = 8;

nsecs_t threadCpuTime() {
    timespec ts{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return nsecs_t{ts.tv_sec} * 1'000'000'000 + ts.tv_nsec;
}

void sleepUntil(nsecs_t time) {
    const timespec ts{static_cast<time_t>(time / 1'000'000'000),
                      static_cast<long>(time % 1'000'000'000)};
    while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &ts, nullptr) != 0) {
    }
}

// Reports the samples' median and 99th percentile, in microseconds.
void reportPercentiles(benchmark::State& state, std::vector<nsecs_t>& samples) {
    if (samples.empty()) return;
    std::sort(samples.begin(), samples.end());
    const auto at = [&](double q) {
        return static_cast<double>(samples[static_cast<size_t>(q * (samples.size() - 1))]) / 1e3;
    };
    state.counters["p50_us"] = at(0.5);
    state.counters["p99_us"] = at(0.99);
}

// A game at 30 FPS on its own thread: each frame is queued with a real (eventfd) fence that its
// GPU signals RENDER_TIME later, and then acquired.
class Game {
public:
    explicit Game(LayerHost& host) : mHost(host) {
        for (int slot = 0; slot < BUFFERS; slot++)
            mBuffers.push_back(new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888));
        mThread = std::thread([this] { run(); });
    }
    ~Game() {
        mStopping = true;
        mThread.join();
    }

private:
    void run() {
        nsecs_t frameStart = systemTime(SYSTEM_TIME_MONOTONIC);
        for (uint64_t number = 1; !mStopping; number++) {
            const int slot = static_cast<int>(number % BUFFERS);
            const nsecs_t queueTime = systemTime(SYSTEM_TIME_MONOTONIC);
            mHost.onBufferDequeued(slot, frameStart, queueTime);
            const sp<Fence> fence = withDescriptor(Fence::createPending());
            mHost.onBufferQueued(number, slot, mBuffers[slot], queueTime, fence);
            sleepUntil(queueTime + RENDER_TIME);
            fence->signal(systemTime(SYSTEM_TIME_MONOTONIC));
            mHost.onBufferAcquired(number, slot, mBuffers[slot], queueTime, fence);
            frameStart += FRAME_PERIOD;
            sleepUntil(frameStart);
        }
    }

    LayerHost& mHost;
    std::vector<sp<GraphicBuffer>> mBuffers;
    std::atomic<bool> mStopping{false};
    std::thread mThread;
};

// The composition thread of the reference host at 60 Hz, with a 30 FPS game and the layer's
// release thread running: the CPU time the thread spends per refresh in the host's calls, onVsync,
// compose and onCompositionDone. Each refresh starts from a sleep until its vsync, as a
// compositor's does, with what that does to caches. The reported time is that CPU time.
void BM_HostCompositionCpu(benchmark::State& state) {
    LayerHost::Config config;
    config.name = String8("SurfaceView[bench]");
    config.uid = 4246 + static_cast<uint32_t>(state.range(0));
    config.mode = static_cast<InterpolationMode>(state.range(0));
    LayerHost host(config, [](const FrameItem&) {});
    host.start();
    Game game(host);
    sleepUntil(systemTime(SYSTEM_TIME_MONOTONIC) + DISPLAY_LAG + FRAME_PERIOD);

    const RenderState nothing;
    std::vector<nsecs_t> samples;
    nsecs_t vsync = systemTime(SYSTEM_TIME_MONOTONIC) + REFRESH_PERIOD;
    for (auto _ : state) {
        sleepUntil(vsync);
        const auto presentFence = std::make_shared<FenceTime>(Fence::createSignalled(vsync));
        const nsecs_t before = threadCpuTime();
        const bool presents = host.onVsync(vsync);
        const RenderState& composed = presents ? host.compose(vsync - DISPLAY_LAG) : nothing;
        host.onCompositionDone(composed, vsync - DISPLAY_LAG, presentFence);
        const nsecs_t cpu = threadCpuTime() - before;
        samples.push_back(cpu);
        state.SetIterationTime(static_cast<double>(cpu) / 1e9);
        vsync += REFRESH_PERIOD;
    }
    reportPercentiles(state, samples);
    host.stop();
}
BENCHMARK(BM_HostCompositionCpu)->ArgName("mode")->Arg(0)->Arg(3)->UseManualTime()->Iterations(240);

// Stands for the layer's event receivers in the floor.
class NullReceiver : public EventDispatcher::EventReceiver {
public:
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {}
};

// The floor of BM_HostCompositionCpu: what a refresh of a paced composition thread cannot avoid,
// in the same rhythm and from the same sleep. The queue's lock, one poll of each composed frame's
// fence, a clock read for the timings, and the composed state announced on the bus to one
// receiver.
void BM_HostCompositionCpuFloor(benchmark::State& state) {
    const uint32_t uid = 4252;
    sp<NullReceiver> receiver = new NullReceiver();
    EventDispatcher::subscribe(uid, eBufferComposedEvent, receiver);
    std::mutex queueMutex;
    const sp<Fence> fences[] = {withDescriptor(Fence::createSignalled(0)),
                                withDescriptor(Fence::createSignalled(0))};
    const EventData composed = RenderState();

    std::vector<nsecs_t> samples;
    nsecs_t vsync = systemTime(SYSTEM_TIME_MONOTONIC) + REFRESH_PERIOD;
    for (auto _ : state) {
        sleepUntil(vsync);
        const nsecs_t before = threadCpuTime();
        {
            std::lock_guard lock(queueMutex);
            for (const sp<Fence>& fence : fences)
                benchmark::DoNotOptimize(fence->wait(0));
        }
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        EventDispatcher::broadcastEvent(uid, eBufferComposedEvent, now, composed);
        const nsecs_t cpu = threadCpuTime() - before;
        samples.push_back(cpu);
        state.SetIterationTime(static_cast<double>(cpu) / 1e9);
        vsync += REFRESH_PERIOD;
    }
    reportPercentiles(state, samples);
    EventDispatcher::unsubscribe(uid, eBufferComposedEvent, receiver);
}
BENCHMARK(BM_HostCompositionCpuFloor)->UseManualTime()->Iterations(240);

// Sets the benchmark thread up as the host's release thread, and puts it back as it was
// afterwards.
class ReleaseThreadSetup {
public:
    ReleaseThreadSetup()
        : mSlack(static_cast<unsigned long>(prctl(PR_GET_TIMERSLACK, 0UL, 0UL, 0UL, 0UL))) {
        pthread_getname_np(pthread_self(), mName, sizeof(mName));
        verolux::host::configureReleaseThread();
    }
    ~ReleaseThreadSetup() {
        prctl(PR_SET_TIMERSLACK, mSlack, 0UL, 0UL, 0UL);
        pthread_setname_np(pthread_self(), mName);
    }

private:
    const unsigned long mSlack;
    char mName[16] = {};
};

constexpr nsecs_t COMPOSITION_AHEAD = 5 * MS;
constexpr int32_t MARGIN_MS = 2;

// How late the host's release thread lets a frame go after the just-in-time margin before the next
// composition: the time the frame leaves the queue, less the composition estimate and the margin.
// Each iteration announces a composition ahead and queues and acquires a third frame, which the
// layer's picker (the frame not on screen yet) lets go the margin before that composition. The
// reported time per iteration is that lateness.
void BM_JustInTimeReleaseLateness(benchmark::State& state) {
    constexpr int32_t JUST_IN_TIME_MARGIN_ID = 22;
    LayerHost::Config config;
    config.name = String8("SurfaceView[bench]");
    config.uid = 4253;
    config.mode = eJustInTimeMode;
    std::atomic<nsecs_t> released{0};
    LayerHost host(config, [&](const FrameItem&) { released = systemTime(SYSTEM_TIME_MONOTONIC); });
    verolux::host::deliverSettings(config.uid, {{JUST_IN_TIME_MARGIN_ID, MARGIN_MS}});
    host.start();
    const sp<GraphicBuffer> buffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    uint64_t number = 0;
    const auto queueFrame = [&] {
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        const sp<Fence> fence = withDescriptor(Fence::createSignalled(now));
        number++;
        host.onBufferQueued(number, static_cast<int>(number % BUFFERS), buffer, now, fence);
        host.onBufferAcquired(number, static_cast<int>(number % BUFFERS), buffer, now, fence);
    };
    queueFrame();
    queueFrame();

    std::vector<nsecs_t> samples;
    for (auto _ : state) {
        // Announced before the frame comes, so that no step sees the frame with the previous
        // composition, and again once it is acquired, which by itself wakes nobody.
        const nsecs_t releasedBefore = released;
        const nsecs_t composition = systemTime(SYSTEM_TIME_MONOTONIC) + COMPOSITION_AHEAD;
        const nsecs_t target = composition - MARGIN_MS * MS;
        EventDispatcher::broadcastEvent(config.uid, eCompositionEstimateEvent, 0, composition);
        queueFrame();
        EventDispatcher::broadcastEvent(config.uid, eCompositionEstimateEvent, 0, composition);
        sleepUntil(target + MS);
        while (released == releasedBefore)
            sleepUntil(systemTime(SYSTEM_TIME_MONOTONIC) + 100'000);
        const nsecs_t lateness = released - target;
        samples.push_back(lateness);
        state.SetIterationTime(static_cast<double>(lateness) / 1e9);
    }
    reportPercentiles(state, samples);
    host.stop();
}
BENCHMARK(BM_JustInTimeReleaseLateness)->UseManualTime()->Iterations(300);

// The floor of BM_JustInTimeReleaseLateness: a plain wait_until on a condition variable to the
// same deadline, on a thread set up the same way.
void BM_JustInTimeReleaseLatenessFloor(benchmark::State& state) {
    std::mutex mutex;
    std::condition_variable condition;
    ReleaseThreadSetup releaseThread;
    std::vector<nsecs_t> samples;
    for (auto _ : state) {
        const nsecs_t deadline =
                systemTime(SYSTEM_TIME_MONOTONIC) + COMPOSITION_AHEAD - MARGIN_MS * MS;
        {
            std::unique_lock lock(mutex);
            condition.wait_until(lock, Clock::time_point(std::chrono::nanoseconds(deadline)));
        }
        const nsecs_t lateness = systemTime(SYSTEM_TIME_MONOTONIC) - deadline;
        samples.push_back(lateness);
        state.SetIterationTime(static_cast<double>(lateness) / 1e9);
    }
    reportPercentiles(state, samples);
}
BENCHMARK(BM_JustInTimeReleaseLatenessFloor)->UseManualTime()->Iterations(300);

}  // namespace
}  // namespace android::Interpolation
