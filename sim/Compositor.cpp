#include "sim/Compositor.h"

#include <time.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>

namespace verolux::sim {

using android::Interpolation::RenderItem;
using android::Interpolation::RenderState;

namespace {

constexpr nsecs_t SECOND = 1'000'000'000;

nsecs_t threadCpuTime() {
    timespec ts{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return nsecs_t{ts.tv_sec} * 1'000'000'000 + ts.tv_nsec;
}

}  // namespace

Compositor::Compositor(const Config& config, std::vector<DisplayedLayer> layers)
    : mConfig(config),
      mLayers(std::move(layers)),
      mScreens(mLayers.size()),
      mAccumulator(size_t{config.width} * 4),
      mRandom(config.seed),
      mPeriod(config.refreshPeriod),
      mBaseVsync(config.firstVsync),
      mClientCompositionShare(config.clientCompositionShare) {
    for (Screen& screen : mScreens) {
        screen.scanline.assign(size_t{config.width} * 3, 0);
        screen.nextStatistics = config.firstVsync + SECOND;
    }
}

Compositor::~Compositor() {
    stop();
}

void Compositor::start() {
    mThread = std::thread(&Compositor::run, this);
}

void Compositor::stop() {
    {
        std::lock_guard lock(mMutex);
        mStopping = true;
    }
    mStopped.notify_all();
    if (mThread.joinable()) mThread.join();
}

void Compositor::run() {
    nsecs_t vsync = mConfig.firstVsync;
    while (true) {
        {
            std::unique_lock lock(mMutex);
            const auto deadline =
                    std::chrono::steady_clock::time_point(std::chrono::nanoseconds(vsync));
            if (mStopped.wait_until(lock, deadline, [this] { return mStopping; })) return;
        }
        refresh(vsync);
        vsync += mPeriod;
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        while (vsync < now)
            vsync += mPeriod;
    }
}

void Compositor::setRefreshPeriod(nsecs_t period, nsecs_t nextVsync) {
    mBaseIndex = mLastIndex + 1;
    mBaseVsync = nextVsync;
    mPeriod = period;
}

void Compositor::refresh(nsecs_t vsync) {
    const auto index = mBaseIndex + static_cast<uint64_t>((vsync - mBaseVsync) / mPeriod);
    mLastIndex = index;
    const nsecs_t present = vsync + mPeriod;
    const auto presentFence =
            std::make_shared<android::FenceTime>(android::Fence::createSignalled(present));
    const bool clientComposed =
            mClientCompositionShare > 0 && mClientDraw(mRandom) < mClientCompositionShare;
    for (size_t layer = 0; layer < mLayers.size(); layer++) {
        refreshLayer(layer, index, vsync, present, presentFence, clientComposed);
    }
}

void Compositor::refreshLayer(size_t layerIndex, uint64_t index, nsecs_t vsync, nsecs_t present,
                              const std::shared_ptr<android::FenceTime>& presentFence,
                              bool clientComposed) {
    const DisplayedLayer& layer = mLayers[layerIndex];
    LayerRecorder& recorder = *layer.recorder;
    layer.queue->acquireReady([&](const BufferQueue::QueuedBuffer& queued) {
        layer.host->onBufferAcquired(queued.frameNumber, queued.slot,
                                     layer.queue->buffer(queued.slot), queued.timestamp,
                                     queued.fence);
        recorder.frameAcquired(queued.frameNumber, systemTime(SYSTEM_TIME_MONOTONIC),
                               queued.fence->getSignalTime());
    });

    RefreshRecord record;
    record.index = index;
    record.vsyncTime = vsync;
    record.presentTime = present;

    const bool measureCpu = mConfig.measureCpu;
    const nsecs_t cpuBefore = measureCpu ? threadCpuTime() : 0;
    const bool presents = layer.host->onVsync(vsync);
    const RenderState& state = presents ? layer.host->compose(vsync) : mNothing;
    const nsecs_t cpuComposed = measureCpu ? threadCpuTime() : 0;
    record.refused = !presents;
    record.clientComposed = clientComposed;

    // With nothing to draw, the previous picture stays on screen.
    Screen& screen = mScreens[layerIndex];
    const bool pixels = present < mConfig.picturesUntil;
    blend(state, record, screen, pixels);
    recorder.composed(record);

    const nsecs_t cpuReturning = measureCpu ? threadCpuTime() : 0;
    layer.host->onCompositionDone(state, vsync, presentFence,
                                  clientComposed ? host::LayerHost::CompositionType::CLIENT
                                                 : host::LayerHost::CompositionType::DEVICE);
    if (measureCpu) record.cpuTime = (cpuComposed - cpuBefore) + (threadCpuTime() - cpuReturning);
    if (mAfterComposition) mAfterComposition(layerIndex);
    record.queueLength = static_cast<uint32_t>(layer.host->frameList()->size());
    if (pixels) record.scanline = screen.scanline;
    const host::LayerHost::Status status = layer.host->status();
    record.interpolating = status.interpolating;
    record.refreshRate = status.refreshRate;
    record.gameRateLimit = status.gameRateLimit;
    record.gameRateLimitApplied = status.gameRateLimitApplied;
    recorder.refreshed(std::move(record));

    if (vsync >= screen.nextStatistics) {
        recorder.statistics({vsync, layer.host->statistics(vsync)});
        screen.nextStatistics += SECOND * ((vsync - screen.nextStatistics) / SECOND + 1);
    }
}

void Compositor::blend(const RenderState& state, RefreshRecord& record, Screen& screen,
                       bool pixels) {
    // Each item covers what is below it by its alpha; the bottom item is opaque.
    const size_t count = std::min(state.items.size(), RefreshRecord::MAX_ITEMS);
    std::array<float, RefreshRecord::MAX_ITEMS> weights{};
    for (size_t i = 0; i < count; i++) {
        const RenderItem& item = state.items[i];
        const float cover = i == 0 || item.blend == 0 ? 1.0f : item.alpha;
        for (size_t below = 0; below < i; below++)
            weights[below] *= 1.0f - cover;
        weights[i] = cover;
    }

    bool drawn = false;
    std::fill(mAccumulator.begin(), mAccumulator.end(), 0.0f);
    for (size_t i = 0; i < count; i++) {
        const RenderItem& item = state.items[i];
        ComposedItem& composed = record.items[record.itemCount++];
        composed.frameNumber = item.frame.isEmpty() ? 0 : item.frame.mIndex;
        composed.alpha = item.alpha;
        composed.weight = item.frame.isEmpty() ? 0.0f : weights[i];
        if (!pixels || item.frame.isEmpty() || weights[i] <= 0.0f) continue;

        android::GraphicBuffer& buffer = *item.frame.mGraphicBuffer;
        void* pixels = nullptr;
        if (buffer.lock(android::GraphicBuffer::USAGE_SW_READ_OFTEN, &pixels) != android::NO_ERROR) {
            continue;
        }
        const auto* row = static_cast<const uint8_t*>(pixels) +
                          size_t{buffer.getHeight() / 2} * buffer.getStride() * 4;
        // The row as it lies (RGBA), so that this loop runs over contiguous values.
        const size_t values = size_t{std::min(mConfig.width, buffer.getWidth())} * 4;
        const float weight = weights[i];
        float* accumulator = mAccumulator.data();
        for (size_t v = 0; v < values; v++)
            accumulator[v] += weight * static_cast<float>(row[v]);
        buffer.unlock();
        drawn = true;
    }
    if (!drawn) return;
    const float* accumulator = mAccumulator.data();
    uint8_t* scanline = screen.scanline.data();
    for (size_t x = 0; x < mConfig.width; x++) {
        for (size_t c = 0; c < 3; c++) {
            // Rounded to the nearest value; the sum is never negative.
            scanline[x * 3 + c] =
                    static_cast<uint8_t>(std::min(255.0f, accumulator[x * 4 + c]) + 0.5f);
        }
    }
}

}  // namespace verolux::sim
