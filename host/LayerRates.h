#pragma once

#include <utils/String8.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>

#include "GFPSAgent.h"
#include "RFPSAgent.h"
#include "RefreshRateDetector.h"

namespace verolux::host {

// A layer's rates as a compositor runs them: every vsync goes to the refresh-rate detector, whose
// rate is the display's rate the host reports; at every refresh the render-rate agent hears the
// game's real rate and the display's and says whether the layer presents; each new real rate goes
// to the game-rate agent, whose limit is kept here.
class LayerRates {
public:
    LayerRates(const android::String8& name, uint32_t uid);
    LayerRates(const LayerRates&) = delete;
    LayerRates& operator=(const LayerRates&) = delete;

    // Composition thread, at every vsync: whether the layer presents at this refresh.
    bool onVsync(nsecs_t vsync);
    // Composition thread: whether the presentation onVsync allowed brought something new to the
    // screen.
    void onPresented(bool reachedScreen);
    // Buffer thread: the game's real rate, measured as it queued a frame.
    void onRealFps(uint32_t realFps);

    int32_t refreshRate() const { return mRefreshRate.load(std::memory_order_relaxed); }
    uint32_t realFps() const { return mRealFps.load(std::memory_order_relaxed); }
    // The game-rate agent's latest limit, 0 before the first.
    int32_t gameRateLimit() const { return mGameRateLimit.load(std::memory_order_relaxed); }

private:
    std::atomic<int32_t> mRefreshRate{android::RefreshRateDetector::DEFAULT_REFRESH_RATE};
    std::atomic<uint32_t> mRealFps{android::RFPSAgent::INIT_CURRENTFPS};
    std::atomic<int32_t> mGameRateLimit{0};
    const android::sp<android::RefreshRateDetector> mDetector;
    const android::sp<android::RFPSAgent> mRenderRate;
    android::sp<android::GFPSAgent> mGameRate;
};

}  // namespace verolux::host
