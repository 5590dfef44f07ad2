#include "GFPSAgent.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "Log.h"

namespace android {

using Interpolation::Settings;

GFPSAgent::GFPSAgent(const unsigned int& uid, String8& name, FunctionWrapper<void(int)>& setter,
                     const sp<RefreshRateDetector>& detector)
    : mUid(uid),
      mName(name),
      mSetter(setter),
      mDetector(detector),
      mGFPSOffset(Interpolation::defaultSettings.gfpsOffset),
      mGFPSMinimum(Interpolation::defaultSettings.gfpsMinimum),
      mGFPSMaximum(Interpolation::defaultSettings.gfpsMaximum) {}

void GFPSAgent::update(int fps) {
    std::lock_guard lock(mMutex);
    const int refresh = mDetector != nullptr ? mDetector->getRefreshRate()
                                             : RefreshRateDetector::DEFAULT_REFRESH_RATE;
    if (mRealFPS < static_cast<float>(fps)) {
        mRealFPS = static_cast<float>(std::min(refresh, fps));
    } else {
        // 1 - SMOOTHNESS in single precision is 0.100000024.
        mRealFPS = static_cast<float>(fps) * (1.0f - SMOOTHNESS) + mRealFPS * SMOOTHNESS;
    }
    setGFPSLocked(gfpsLocked());
}

int GFPSAgent::gfpsLocked() const {
    const float gfps = std::ceil(mRealFPS - static_cast<float>(mGFPSOffset));
    // Saturated into the int range; the bounds bring it back to a sane rate.
    return static_cast<int>(std::clamp<double>(gfps, std::numeric_limits<int>::min(),
                                               std::numeric_limits<int>::max()));
}

void GFPSAgent::setGFPS(const int& gfps) {
    std::lock_guard lock(mMutex);
    setGFPSLocked(gfps);
}

void GFPSAgent::setGFPSLocked(int gfps) {
    gfps = std::min(std::max(gfps, mGFPSMinimum), mGFPSMaximum);
    if (mSetter) mSetter(gfps);
}

void GFPSAgent::onSettingsChanged(const Settings& s) {
    std::lock_guard lock(mMutex);
    mGFPSOffset = s.gfpsOffset;
    ILOG(2, "[%s] GFPSAgent: GFPS Offset %d", mName.c_str(), mGFPSOffset);
    mGFPSMinimum = s.gfpsMinimum;
    ILOG(2, "[%s] GFPSAgent: GFPS Minimum %d", mName.c_str(), mGFPSMinimum);
    mGFPSMaximum = s.gfpsMaximum;
    ILOG(2, "[%s] GFPSAgent: GFPS Maximum %d", mName.c_str(), mGFPSMaximum);
    if (s.gfpsOffsetEnabled) setGFPSLocked(gfpsLocked());
}

}  // namespace android
