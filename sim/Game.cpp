#include "sim/Game.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <random>

namespace verolux::sim {

namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t SECOND = 1'000'000'000;
// The bar crosses the picture in two seconds of game time: a few pixels per refresh, so that even
// pacing draws a straight edge in the space-time picture and uneven pacing draws steps.
constexpr nsecs_t CROSSING_TIME = 2'000'000'000;
constexpr uint32_t BAR_WIDTH = 6;
constexpr uint8_t BACKGROUND[] = {36, 38, 46};
constexpr uint8_t BAR[] = {250, 230, 120};

nsecs_t toNanos(double ms) {
    return static_cast<nsecs_t>(std::llround(ms * MS));
}

}  // namespace

Game::Game(GameConfig config, BufferQueue& queue, host::LayerHost& host, FenceSignaller& gpu,
           LayerRecorder& recorder)
    : mConfig(config), mQueue(queue), mHost(host), mGpu(gpu), mRecorder(recorder) {}

Game::~Game() {
    stop();
}

void Game::start(nsecs_t startTime) {
    mThread = std::thread(&Game::run, this, startTime);
}

void Game::stop() {
    {
        std::lock_guard lock(mMutex);
        mStopping = true;
    }
    mStopped.notify_all();
    mQueue.close();
    if (mThread.joinable()) mThread.join();
}

bool Game::sleepUntil(nsecs_t time) {
    std::unique_lock lock(mMutex);
    const auto deadline = std::chrono::steady_clock::time_point(std::chrono::nanoseconds(time));
    mStopped.wait_until(lock, deadline, [this] { return mStopping; });
    return !mStopping;
}

uint32_t Game::barPosition(nsecs_t contentTime, uint32_t width) {
    const nsecs_t phase = ((contentTime % CROSSING_TIME) + CROSSING_TIME) % CROSSING_TIME;
    return static_cast<uint32_t>(phase * width / CROSSING_TIME);
}

void Game::draw(android::GraphicBuffer& buffer, nsecs_t contentTime) {
    void* pixels = nullptr;
    if (buffer.lock(android::GraphicBuffer::USAGE_SW_WRITE_OFTEN, &pixels) != android::NO_ERROR) {
        return;
    }
    const uint32_t width = buffer.getWidth();
    const uint32_t bar = barPosition(contentTime, width);
    for (uint32_t y = 0; y < buffer.getHeight(); y++) {
        auto* row = static_cast<uint8_t*>(pixels) + size_t{y} * buffer.getStride() * 4;
        for (uint32_t x = 0; x < width; x++) {
            // The bar wraps around the right edge.
            const bool onBar = (x + width - bar) % width < BAR_WIDTH;
            const uint8_t* colour = onBar ? BAR : BACKGROUND;
            std::copy(colour, colour + 3, row + x * 4);
            row[x * 4 + 3] = 255;
        }
    }
    buffer.unlock();
}

void Game::run(nsecs_t startTime) {
    std::mt19937_64 random(mConfig.seed);
    std::normal_distribution<double> jitter(0.0, mConfig.jitterMs);
    std::normal_distribution<double> renderTime(mConfig.renderMs, mConfig.renderMs / 4);
    const nsecs_t period = toNanos(1000.0 / mConfig.fps);
    const std::vector<CaptureFrame>* capture =
            mConfig.capture != nullptr ? &mConfig.capture->frames : nullptr;

    nsecs_t frameStart = startTime;
    size_t replayed = 0;  // the capture frame to play next
    for (uint64_t number = 1;; number++) {
        nsecs_t render = std::max<nsecs_t>(0, toNanos(renderTime(random)));
        if (capture != nullptr) {
            const CaptureFrame& frame = (*capture)[replayed];
            if (frame.renderDoneTime >= 0) render = frame.renderDoneTime - frame.queueTime;
        }
        if (!sleepUntil(frameStart)) return;

        const nsecs_t requestTime = systemTime(SYSTEM_TIME_MONOTONIC);
        const int slot = mQueue.dequeue([this] { mHost.onBufferBackpressure(); });
        if (slot < 0) return;
        const nsecs_t dequeueTime = systemTime(SYSTEM_TIME_MONOTONIC);
        // A game that had to wait for a buffer simulates its world from when it got one.
        const nsecs_t contentTime = std::max(frameStart, dequeueTime);
        mRecorder.frameDequeued(number, slot, contentTime, requestTime, dequeueTime);
        mHost.onBufferDequeued(slot, requestTime, dequeueTime);

        const android::sp<android::GraphicBuffer>& buffer = mQueue.buffer(slot);
        draw(*buffer, contentTime);
        android::sp<android::Fence> fence = android::Fence::createPending();
        const nsecs_t queueTime = systemTime(SYSTEM_TIME_MONOTONIC);
        mGpu.signalAt(fence, queueTime + render);

        mQueue.markQueued(slot, number);
        mRecorder.frameQueued(number, queueTime);
        mHost.onBufferQueued(number, slot, buffer, queueTime, fence);
        mQueue.makeAcquirable({slot, number, queueTime, fence});

        nsecs_t interval = std::max(MS, period + toNanos(jitter(random)));
        if (capture != nullptr) {
            replayed++;
            if (replayed == capture->size()) {
                if (!mConfig.loop) {
                    mCaptureEnd = queueTime;
                    break;
                }
                replayed = 0;
                interval = mConfig.capture->meanInterval();
            } else {
                interval = (*capture)[replayed].queueTime - (*capture)[replayed - 1].queueTime;
            }
        }
        frameStart = std::max(frameStart + interval, systemTime(SYSTEM_TIME_MONOTONIC));
        // Held to the game-rate limit, as the controlling service would hold it.
        const host::LayerHost::Status status = mHost.status();
        if (status.gameRateLimitApplied) {
            frameStart = std::max(frameStart, requestTime + SECOND / status.gameRateLimit);
        }
    }
    // A finished capture leaves the game idle until the run ends.
    sleepUntil(std::numeric_limits<nsecs_t>::max());
}

}  // namespace verolux::sim
