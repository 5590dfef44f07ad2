#pragma once

#include <atomic>
#include <condition_variable>
#include <functional>
#include <limits>
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
// refresh reaches the screen one period after its vsync, when its present fence signals.
//
// In real time the display runs on a thread of its own (start, stop); a display that fell behind
// real time skips the vsyncs it missed, as a real one would, and refresh indices count vsyncs, so
// the skipped ones show as gaps. In simulated time the caller calls refresh() at every vsync.
class Compositor {
public:
    struct Config {
        nsecs_t refreshPeriod = 0;
        nsecs_t firstVsync = 0;
        uint32_t width = 0;                 // of the picture, in pixels
        double clientCompositionShare = 0;  // compositions that fall back to client composition
        uint64_t seed = 1;
        // Whether a refresh records the library's CPU time, from the thread's CPU clock.
        bool measureCpu = true;
        // Only the pictures presented before this time are blended into pixels and recorded as
        // scanlines: nothing looks at the later ones. What each picture is made of is always
        // recorded.
        nsecs_t picturesUntil = std::numeric_limits<nsecs_t>::max();
    };

    Compositor(const Config& config, std::vector<DisplayedLayer> layers);
    ~Compositor();
    Compositor(const Compositor&) = delete;
    Compositor& operator=(const Compositor&) = delete;

    void start();
    void stop();
    // Composes every layer at `vsync`, a whole number of periods after the previous one.
    void refresh(nsecs_t vsync);
    // Simulated time: the display's rate changes; its next vsync is at `nextVsync`.
    void setRefreshPeriod(nsecs_t period, nsecs_t nextVsync);
    // Simulated time: from now on this share of compositions falls back to client composition.
    void setClientCompositionShare(double share) { mClientCompositionShare = share; }
    // Simulated time: called with the layer's index once a layer's composition is done, before its
    // refresh is recorded. On threads, the release side acts on a composition at once, while the
    // display records the refresh; a simulation lets it act here.
    void setAfterComposition(std::function<void(size_t layer)> afterComposition) {
        mAfterComposition = std::move(afterComposition);
    }

private:
    struct Screen {
        std::vector<uint8_t> scanline;  // what the layer shows now
        nsecs_t nextStatistics = 0;     // the vsync from which the statistics are due
    };

    void run();
    void refreshLayer(size_t layer, uint64_t index, nsecs_t vsync, nsecs_t present,
                      const std::shared_ptr<android::FenceTime>& presentFence, bool clientComposed);
    // Notes the state's items and their weights in the record, and blends them into the layer's
    // scanline when `pixels` is set.
    void blend(const android::Interpolation::RenderState& state, RefreshRecord& record,
               Screen& screen, bool pixels);

    const Config mConfig;
    const std::vector<DisplayedLayer> mLayers;
    std::vector<Screen> mScreens;     // display thread only
    std::vector<float> mAccumulator;  // RGBA, as the buffers' rows
    std::mt19937_64 mRandom;          // display thread only
    std::uniform_real_distribution<double> mClientDraw{0.0, 1.0};
    const android::Interpolation::RenderState mNothing;  // what a layer that does not present composes
    std::function<void(size_t)> mAfterComposition;
    // The display's rate, and the vsync and index that refresh indices count from (display
    // thread only).
    nsecs_t mPeriod;
    nsecs_t mBaseVsync;
    uint64_t mBaseIndex = 0;
    uint64_t mLastIndex = 0;
    double mClientCompositionShare;

    std::mutex mMutex;
    std::condition_variable mStopped;
    bool mStopping = false;  // guarded by mMutex
    std::thread mThread;
};

}  // namespace verolux::sim
