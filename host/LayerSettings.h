#pragma once

#include <atomic>
#include <cstdint>

#include "Settings.h"
#include "SettingsController.h"

namespace verolux::host {

// What the compositor itself takes from a game's settings: whether the game is interpolated at all
// (a gameFpsLimit of 1 or more, as the controlling service reads it) and whether its frame rate is
// held to the game-rate agent's limit (gfpsOffsetEnabled). A watchdog that switches the game off
// resets both through the settings controller.
class LayerSettings final : public android::Interpolation::SettingsController::Observer {
public:
    explicit LayerSettings(uint32_t uid) : mUid(uid) {}

    // Subscribes and takes the uid's current settings at once, so that the layer is composed
    // as they say from its first refresh.
    void onFirstRef() override;
    void onSettingsChanged(const android::Interpolation::Settings& s) override;
    uint32_t getUID() const override { return mUid; }

    bool interpolating() const { return mInterpolating.load(std::memory_order_relaxed); }
    bool gameRateLimited() const { return mGameRateLimited.load(std::memory_order_relaxed); }

private:
    const uint32_t mUid;
    std::atomic<bool> mInterpolating{false};
    std::atomic<bool> mGameRateLimited{false};
};

}  // namespace verolux::host
