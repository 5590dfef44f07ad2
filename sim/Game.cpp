#include "sim/Game.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>

namespace verolux::sim {

namespace {

constexpr nsecs_t MS = 1'000'000;
constexpr nsecs_t SECOND = 1'000'000'000;
// The bar crosses the picture in two seconds of game time: a few pixels per refresh, so that even
// pacing draws a straight edge in the space-time picture and uneven pacing draws steps.
constexpr nsecs_t CROSSING_TIME = 2'000'000'000;
constexpr uint32_t BAR_WIDTH = 6;
constexpr uint8_t BACKGROUND[] = {36, 38, 46, 255};
constexpr uint8_t BAR[] = {250, 230, 120, 255};

nsecs_t toNanos(double ms) {
    return static_cast<nsecs_t>(std::llround(ms * MS));
}

nsecs_t now() {
    return systemTime(SYSTEM_TIME_MONOTONIC);
}

}  // namespace

Game::Game(GameConfig config, BufferQueue& queue, host::LayerHost& host, FenceScheduler& gpu,
           LayerRecorder& recorder, nsecs_t startTime)
    : mConfig(config),
      mQueue(queue),
      mHost(host),
      mGpu(gpu),
      mRecorder(recorder),
      mStartTime(startTime),
      mScript(config.fps, config.jitterMs, config.renderMs, config.segments),
      mRandom(config.seed),
      mFrameStart(startTime) {}

Game::~Game() {
    stop();
}

void Game::start() {
    mThread = std::thread(&Game::run, this);
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
    auto* first = static_cast<uint8_t*>(pixels);
    for (uint32_t x = 0; x < width; x++)
        memcpy(first + x * 4, BACKGROUND, 4);
    // The bar wraps around the right edge.
    const uint32_t bar = barPosition(contentTime, width);
    for (uint32_t i = 0; i < BAR_WIDTH; i++)
        memcpy(first + (bar + i) % width * 4, BAR, 4);
    const size_t rowBytes = size_t{buffer.getStride()} * 4;
    for (uint32_t y = 1; y < buffer.getHeight(); y++)
        memcpy(first + y * rowBytes, first, size_t{width} * 4);
    buffer.unlock();
}

void Game::run() {
    while (mFrameStart >= 0) {
        if (!sleepUntil(mFrameStart)) return;
        const nsecs_t requestTime = now();
        const int slot = mQueue.dequeue([this] { mHost.onBufferBackpressure(); });
        if (slot < 0) return;
        produce(slot, requestTime, now());
    }
    // A finished capture leaves the game idle until the run ends.
    sleepUntil(std::numeric_limits<nsecs_t>::max());
}

bool Game::tryProduce() {
    if (mFrameStart < 0) return false;
    const nsecs_t time = now();
    if (!mWaitingForBuffer) mRequestTime = time;
    const int slot = mQueue.tryDequeue();
    if (slot < 0) {
        if (!mWaitingForBuffer) mHost.onBufferBackpressure();
        mWaitingForBuffer = true;
        return false;
    }
    mWaitingForBuffer = false;
    produce(slot, mRequestTime, time);
    return true;
}

void Game::produce(int slot, nsecs_t requestTime, nsecs_t dequeueTime) {
    const uint64_t number = mNumber++;
    using Normal = std::normal_distribution<double>::param_type;
    const GameScript::Pace pace =
            mScript.next(static_cast<double>(mFrameStart - mStartTime) / SECOND);
    // Both drawn for every frame, in this order, so that a seed gives the same game whatever
    // replaces them.
    nsecs_t render = std::max<nsecs_t>(
            0, toNanos(mRenderTime(mRandom, Normal(pace.renderMs, pace.renderMs / 4))));
    nsecs_t interval = std::max(
            MS, toNanos(1000.0 / pace.fps) + toNanos(mJitter(mRandom, Normal(0.0, pace.jitterMs))));
    if (pace.spikeRenderMs) render = toNanos(*pace.spikeRenderMs);
    const std::vector<CaptureFrame>* capture =
            mConfig.capture != nullptr ? &mConfig.capture->frames : nullptr;
    if (capture != nullptr) {
        const CaptureFrame& frame = (*capture)[mReplayed];
        if (frame.renderDoneTime >= 0) render = frame.renderDoneTime - frame.queueTime;
    }

    // A game that had to wait for a buffer simulates its world from when it got one.
    const nsecs_t contentTime = std::max(mFrameStart, dequeueTime);
    mRecorder.frameDequeued(number, slot, contentTime, requestTime, dequeueTime);
    mHost.onBufferDequeued(slot, requestTime, dequeueTime);

    const android::sp<android::GraphicBuffer>& buffer = mQueue.buffer(slot);
    if (dequeueTime < mConfig.drawUntil) draw(*buffer, contentTime);
    android::sp<android::Fence> fence = android::Fence::createPending();
    const nsecs_t queueTime = now();
    mGpu.signalAt(fence, queueTime + render);
    const nsecs_t timestamp =
            pace.reuseTimestamp && mLastTimestamp >= 0 ? mLastTimestamp : queueTime;
    mLastTimestamp = timestamp;

    mQueue.markQueued(slot, number);
    mRecorder.frameQueued(number, queueTime, timestamp);
    mHost.onBufferQueued(number, slot, buffer, timestamp, fence);
    mQueue.makeAcquirable({slot, number, timestamp, std::move(fence)});

    if (capture != nullptr) {
        mReplayed++;
        if (mReplayed == capture->size()) {
            if (!mConfig.loop) {
                mCaptureEnd = queueTime;
                mFrameStart = -1;
                return;
            }
            mReplayed = 0;
            interval = mConfig.capture->meanInterval();
        } else {
            interval = (*capture)[mReplayed].queueTime - (*capture)[mReplayed - 1].queueTime;
        }
    }
    mFrameStart = std::max(mFrameStart + interval, now());
    // Held to the game-rate limit, as the controlling service would hold it.
    const host::LayerHost::Status status = mHost.status();
    if (status.gameRateLimitApplied) {
        mFrameStart = std::max(mFrameStart, requestTime + SECOND / status.gameRateLimit);
    }
}

}  // namespace verolux::sim
