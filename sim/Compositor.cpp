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

nsecs_t threadCpuTime() {
    timespec ts{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return nsecs_t{ts.tv_sec} * 1'000'000'000 + ts.tv_nsec;
}

}  // namespace

Compositor::Compositor(nsecs_t refreshPeriod, uint32_t width, std::vector<DisplayedLayer> layers)
    : mRefreshPeriod(refreshPeriod),
      mWidth(width),
      mLayers(std::move(layers)),
      mScreens(mLayers.size()),
      mAccumulator(size_t{width} * 3) {
    for (Screen& screen : mScreens)
        screen.scanline.assign(size_t{width} * 3, 0);
}

Compositor::~Compositor() {
    stop();
}

void Compositor::start(nsecs_t firstVsync) {
    mThread = std::thread(&Compositor::run, this, firstVsync);
}

void Compositor::stop() {
    {
        std::lock_guard lock(mMutex);
        mStopping = true;
    }
    mStopped.notify_all();
    if (mThread.joinable()) mThread.join();
}

void Compositor::run(nsecs_t firstVsync) {
    nsecs_t vsync = firstVsync;
    while (true) {
        {
            std::unique_lock lock(mMutex);
            const auto deadline =
                    std::chrono::steady_clock::time_point(std::chrono::nanoseconds(vsync));
            if (mStopped.wait_until(lock, deadline, [this] { return mStopping; })) return;
        }
        const auto index = static_cast<uint64_t>((vsync - firstVsync) / mRefreshPeriod);
        const nsecs_t present = vsync + mRefreshPeriod;
        const auto presentFence =
                std::make_shared<android::FenceTime>(android::Fence::createSignalled(present));
        for (size_t layer = 0; layer < mLayers.size(); layer++) {
            refresh(layer, index, vsync, present, presentFence);
        }
        vsync += mRefreshPeriod;
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        while (vsync < now)
            vsync += mRefreshPeriod;
    }
}

void Compositor::refresh(size_t layerIndex, uint64_t index, nsecs_t vsync, nsecs_t present,
                         const std::shared_ptr<android::FenceTime>& presentFence) {
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

    const nsecs_t cpuBefore = threadCpuTime();
    const RenderState state = layer.host->compose(vsync);
    const nsecs_t cpuComposed = threadCpuTime();

    // With nothing to draw, the previous picture stays on screen.
    Screen& screen = mScreens[layerIndex];
    blend(state, record, screen);
    recorder.composed(record);

    const nsecs_t cpuReturning = threadCpuTime();
    layer.host->onCompositionDone(state, vsync, presentFence);
    record.cpuTime = (cpuComposed - cpuBefore) + (threadCpuTime() - cpuReturning);
    record.queueLength = static_cast<uint32_t>(layer.host->frameList()->size());
    record.scanline = screen.scanline;
    recorder.refreshed(std::move(record));
}

void Compositor::blend(const RenderState& state, RefreshRecord& record, Screen& screen) {
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
        if (item.frame.isEmpty() || weights[i] <= 0.0f) continue;

        android::GraphicBuffer& buffer = *item.frame.mGraphicBuffer;
        void* pixels = nullptr;
        if (buffer.lock(android::GraphicBuffer::USAGE_SW_READ_OFTEN, &pixels) != android::NO_ERROR) {
            continue;
        }
        const auto* row = static_cast<const uint8_t*>(pixels) +
                          size_t{buffer.getHeight() / 2} * buffer.getStride() * 4;
        const uint32_t width = std::min(mWidth, buffer.getWidth());
        for (uint32_t x = 0; x < width; x++) {
            for (int c = 0; c < 3; c++)
                mAccumulator[x * 3 + c] += weights[i] * row[x * 4 + c];
        }
        buffer.unlock();
        drawn = true;
    }
    if (!drawn) return;
    for (size_t i = 0; i < mAccumulator.size(); i++) {
        screen.scanline[i] = static_cast<uint8_t>(std::lround(std::min(255.0f, mAccumulator[i])));
    }
}

}  // namespace verolux::sim
