#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>

#include <cstdint>
#include <functional>
#include <mutex>

#include "RefreshRateDetector.h"
#include "Settings.h"
#include "SettingsController.h"

namespace android {

// The owner's callables handed to the library.
template <typename Signature>
using FunctionWrapper = std::function<Signature>;

// The frame-rate limit the game is held to (GFPS): its real FPS, smoothed as it falls and capped
// by the refresh rate as it rises, minus the settings' offset, rounded up and bounded. Each new
// limit goes to the owner's setter, which applies it to the game.
//
// The setter runs with the agent's mutex held, and from onSettingsChanged with the settings
// controller's too: it must not call into the agent or the settings controller.
class GFPSAgent final : public Interpolation::SettingsController::Observer {
public:
    static constexpr float SMOOTHNESS = 0.9f;
    static constexpr int32_t INIT_REALFPS = 60;

    GFPSAgent(const unsigned int& uid, String8& name, FunctionWrapper<void(int)>& setter,
              const sp<RefreshRateDetector>& detector);

    // One measurement of the game's real FPS; always ends in a call of the setter.
    void update(int fps);
    // Calls the setter with `gfps` bounded by the settings; the maximum wins over the minimum.
    void setGFPS(const int& gfps);

    void onSettingsChanged(const Interpolation::Settings& s) override;
    uint32_t getUID() const override { return mUid; }

private:
    int gfpsLocked() const;
    void setGFPSLocked(int gfps);

    const uint32_t mUid;
    const String8 mName;
    const FunctionWrapper<void(int)> mSetter;
    const sp<RefreshRateDetector> mDetector;
    int32_t mGFPSOffset;            // guarded by mMutex
    float mRealFPS = INIT_REALFPS;  // guarded by mMutex
    int32_t mGFPSMinimum;           // guarded by mMutex
    int32_t mGFPSMaximum;           // guarded by mMutex
    mutable std::mutex mMutex;
};

}  // namespace android
