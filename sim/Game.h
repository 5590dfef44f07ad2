#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <limits>
#include <mutex>
#include <random>
#include <thread>

#include "host/LayerHost.h"
#include "sim/BufferQueue.h"
#include "sim/Capture.h"
#include "sim/FenceScheduler.h"
#include "sim/GameScript.h"
#include "sim/LayerRecorder.h"

namespace verolux::sim {

struct GameConfig {
    double fps = 30;
    double jitterMs = 1;  // standard deviation of the frame interval's jitter
    double renderMs = 8;  // mean GPU time of a frame
    uint64_t seed = 1;
    const Capture* capture = nullptr;  // when set, replayed instead of fps and jitter
    // A scenario's changes to fps, jitter and render time over the run, its render-time spikes
    // and reused timestamps; null or empty for none.
    const std::vector<GameSegment>* segments = nullptr;
    bool loop = false;  // replay the capture again when it ends
    // Frames that get their buffer from then on are not drawn: no picture shown from then on is
    // looked at (see Compositor::Config::picturesUntil).
    nsecs_t drawUntil = std::numeric_limits<nsecs_t>::max();
};

// The simulated game: a producer that paces frames, dequeues a buffer (waiting while none is
// free), draws a bar moving at constant speed through its own time, lets the simulated GPU finish
// it after the render time, and queues it. A replayed capture gives the intervals between frames
// and their render times. A game that had to wait starts its next frame one interval after the
// late one, not at its old time: waiting slows it down, as it would a real game. While the host
// applies a game-rate limit, the game starts no frame sooner than one limit period after the
// previous one started. A scenario's game segments change its rate, jitter and render time as
// the run goes (GameScript).
//
// In real time the game runs on a thread of its own (start, stop). In simulated time the caller
// keeps the time: at nextFrameStart() it calls tryProduce(), and again whenever a buffer may have
// come free while the game waits for one.
class Game {
public:
    Game(GameConfig config, BufferQueue& queue, host::LayerHost& host, FenceScheduler& gpu,
         LayerRecorder& recorder, nsecs_t startTime);
    ~Game();
    Game(const Game&) = delete;
    Game& operator=(const Game&) = delete;

    void start();
    void stop();

    // When the next frame starts: when the game asks for its buffer; -1 once the capture has
    // played out.
    nsecs_t nextFrameStart() const { return mFrameStart; }
    // The frame due asks for a buffer now, or again after it found none free (then the host heard
    // of the wait once). Returns true when it got one: the frame is drawn and queued.
    bool tryProduce();
    bool waitingForBuffer() const { return mWaitingForBuffer; }

    // When the game queued the last frame of its capture; -1 while it has not (or has none).
    nsecs_t captureEndTime() const { return mCaptureEnd.load(); }

    // The bar's position in a picture `width` pixels wide at game time `contentTime`.
    static uint32_t barPosition(nsecs_t contentTime, uint32_t width);

private:
    void run();
    bool sleepUntil(nsecs_t time);
    // Draws and queues the frame into `slot`, and plans the next one.
    void produce(int slot, nsecs_t requestTime, nsecs_t dequeueTime);
    static void draw(android::GraphicBuffer& buffer, nsecs_t contentTime);

    const GameConfig mConfig;
    BufferQueue& mQueue;
    host::LayerHost& mHost;
    FenceScheduler& mGpu;
    LayerRecorder& mRecorder;

    const nsecs_t mStartTime;

    // The producer's own (its thread's in real time).
    GameScript mScript;
    std::mt19937_64 mRandom;
    std::normal_distribution<double> mJitter;
    std::normal_distribution<double> mRenderTime;
    nsecs_t mLastTimestamp = -1;
    uint64_t mNumber = 1;  // the frame to draw next
    size_t mReplayed = 0;  // the capture frame to play next
    nsecs_t mFrameStart;   // when the frame to draw next starts, -1 after the capture's last
    nsecs_t mRequestTime = -1;
    bool mWaitingForBuffer = false;

    std::atomic<nsecs_t> mCaptureEnd{-1};
    std::mutex mMutex;
    std::condition_variable mStopped;
    bool mStopping = false;  // guarded by mMutex
    std::thread mThread;
};

}  // namespace verolux::sim
