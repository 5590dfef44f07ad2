#pragma once

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <random>
#include <thread>
#include <vector>

#include "host/LayerHost.h"
#include "sim/BufferQueue.h"
#include "sim/LayerRecorder.h"

namespace verolux::sim {

// One layer as the display sees it.
struct DisplayedLayer {
    BufferQueue* queue;
    host::LayerHost* host;
    LayerRecorder* recorder;
};

// The simulated display and compositor: at every vsync it latches the layers' finished buffers,
// asks each layer's host whether it presents and, when it does, what to compose, blends the
// buffers' pixels with the state's alphas into the picture on screen (one scanline of it is
// recorded), and hands the frames back. A layer that does not present keeps its picture. A share of
// the compositions, drawn at random from the seed, falls back to client composition (the same
// picture, composed by the GPU). Once a second of vsyncs it records each layer's statistics. Each
// refresh reaches the screen one period after its vsync, when its present fence signals. A display
// that fell behind real time skips the vsyncs it missed, as a real one would; refresh indices count
// vsyncs, so the skipped ones show as gaps.
class Compositor {
public:
    Compositor(nsecs_t refreshPeriod, uint32_t width, std::vector<DisplayedLayer> layers,
               double clientCompositionShare = 0, uint64_t seed = 1);
    ~Compositor();
    Compositor(const Compositor&) = delete;
    Compositor& operator=(const Compositor&) = delete;

    void start(nsecs_t firstVsync);
    void stop();

private:
    struct Screen {
        std::vector<uint8_t> scanline;  // what the layer shows now
        nsecs_t nextStatistics = 0;     // the vsync from which the statistics are due
    };

    void run(nsecs_t firstVsync);
    void refresh(size_t layer, uint64_t index, nsecs_t vsync, nsecs_t present,
                 const std::shared_ptr<android::FenceTime>& presentFence, bool clientComposed);
    // Blends the state's items into the layer's scanline, and notes each item's weight in it.
    void blend(const android::Interpolation::RenderState& state, RefreshRecord& record,
               Screen& screen);

    const nsecs_t mRefreshPeriod;
    const uint32_t mWidth;
    const std::vector<DisplayedLayer> mLayers;
    std::vector<Screen> mScreens;  // display thread only
    std::vector<float> mAccumulator;
    const double mClientCompositionShare;
    std::mt19937_64 mRandom;                             // display thread only
    const android::Interpolation::RenderState mNothing;  // what a layer that does not present composes

    std::mutex mMutex;
    std::condition_variable mStopped;
    bool mStopping = false;  // guarded by mMutex
    std::thread mThread;
};

}  // namespace verolux::sim
