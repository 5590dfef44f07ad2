#pragma once

#include <atomic>
#include <condition_variable>
#include <mutex>
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
// asks the engine what to compose, blends the buffers' pixels with the state's alphas into the
// picture on screen (one scanline of it is recorded), and hands the frames back. Each refresh
// reaches the screen one period after its vsync, when its present fence signals. A display that
// fell behind real time skips the vsyncs it missed, as a real one would; refresh indices count
// vsyncs, so the skipped ones show as gaps.
class Compositor {
public:
    Compositor(nsecs_t refreshPeriod, uint32_t width, std::vector<DisplayedLayer> layers);
    ~Compositor();
    Compositor(const Compositor&) = delete;
    Compositor& operator=(const Compositor&) = delete;

    void start(nsecs_t firstVsync);
    void stop();

private:
    struct Screen {
        std::vector<uint8_t> scanline;  // what the layer shows now
    };

    void run(nsecs_t firstVsync);
    void refresh(size_t layer, uint64_t index, nsecs_t vsync, nsecs_t present,
                 const std::shared_ptr<android::FenceTime>& presentFence);
    // Blends the state's items into the layer's scanline, and notes each item's weight in it.
    void blend(const android::Interpolation::RenderState& state, RefreshRecord& record,
               Screen& screen);

    const nsecs_t mRefreshPeriod;
    const uint32_t mWidth;
    const std::vector<DisplayedLayer> mLayers;
    std::vector<Screen> mScreens;  // display thread only
    std::vector<float> mAccumulator;

    std::mutex mMutex;
    std::condition_variable mStopped;
    bool mStopping = false;  // guarded by mMutex
    std::thread mThread;
};

}  // namespace verolux::sim
