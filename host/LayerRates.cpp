#include "host/LayerRates.h"

#include <algorithm>
#include <limits>

namespace verolux::host {

namespace {

// The tracker reads an empty span as the largest rate; the agents take an int.
int asFps(uint32_t fps) {
    return static_cast<int>(std::min<uint32_t>(fps, std::numeric_limits<int>::max()));
}

}  // namespace

using android::FunctionWrapper;
using android::String8;

LayerRates::LayerRates(const String8& name, uint32_t uid)
    : mDetector(new android::RefreshRateDetector(uid)), mRenderRate([&] {
          String8 agentName = name;
          return new android::RFPSAgent(uid, agentName);
      }()) {
    String8 agentName = name;
    // Runs under the agent's mutex (and the settings controller's): it only keeps the limit.
    FunctionWrapper<void(int)> setter = [this](int gfps) { mGameRateLimit = gfps; };
    mGameRate = new android::GFPSAgent(uid, agentName, setter, mDetector);
}

bool LayerRates::onVsync(nsecs_t vsync) {
    mDetector->addVsync(vsync);
    const int32_t refreshRate = mDetector->getRefreshRate();
    mRefreshRate.store(refreshRate, std::memory_order_relaxed);
    mRenderRate->update(asFps(realFps()), refreshRate);
    return mRenderRate->shouldPresentNow();
}

void LayerRates::onPresented(bool reachedScreen) {
    if (reachedScreen) {
        mRenderRate->onPresentSuccess();
    } else {
        mRenderRate->onPresentFail();
    }
}

void LayerRates::onRealFps(uint32_t realFps) {
    mRealFps.store(realFps, std::memory_order_relaxed);
    mGameRate->update(asFps(realFps));
}

}  // namespace verolux::host
