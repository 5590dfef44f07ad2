#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <thread>

#include "host/LayerHost.h"
#include "sim/BufferQueue.h"
#include "sim/Capture.h"
#include "sim/FenceSignaller.h"
#include "sim/LayerRecorder.h"

namespace verolux::sim {

struct GameConfig {
    double fps = 30;
    double jitterMs = 1;  // standard deviation of the frame interval's jitter
    double renderMs = 8;  // mean GPU time of a frame
    uint64_t seed = 1;
    const Capture* capture = nullptr;  // when set, replayed instead of fps and jitter
    bool loop = false;                 // replay the capture again when it ends
};

// The simulated game: a producer thread that paces frames, dequeues a buffer (waiting while none
// is free), draws a bar moving at constant speed through its own time, lets the simulated GPU
// finish it after the render time, and queues it. A replayed capture gives the intervals between
// frames and their render times. A game that had to wait starts its next frame one interval after
// the late one, not at its old time: waiting slows it down, as it would a real game. While the
// host applies a game-rate limit, the game starts no frame sooner than one limit period after the
// previous one started.
class Game {
public:
    Game(GameConfig config, BufferQueue& queue, host::LayerHost& host, FenceSignaller& gpu,
         LayerRecorder& recorder);
    ~Game();
    Game(const Game&) = delete;
    Game& operator=(const Game&) = delete;

    void start(nsecs_t startTime);
    void stop();
    // When the game queued the last frame of its capture; -1 while it has not (or has none).
    nsecs_t captureEndTime() const { return mCaptureEnd.load(); }

    // The bar's position in a picture `width` pixels wide at game time `contentTime`.
    static uint32_t barPosition(nsecs_t contentTime, uint32_t width);

private:
    void run(nsecs_t startTime);
    bool sleepUntil(nsecs_t time);
    static void draw(android::GraphicBuffer& buffer, nsecs_t contentTime);

    const GameConfig mConfig;
    BufferQueue& mQueue;
    host::LayerHost& mHost;
    FenceSignaller& mGpu;
    LayerRecorder& mRecorder;

    std::atomic<nsecs_t> mCaptureEnd{-1};
    std::mutex mMutex;
    std::condition_variable mStopped;
    bool mStopping = false;  // guarded by mMutex
    std::thread mThread;
};

}  // namespace verolux::sim
