#pragma once

#include <utils/RefBase.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>
#include <vector>

#include "Settings.h"
#include "SettingsController.h"
#include "Timer.h"

namespace android {

// The display refresh rate of one game, measured from the vsync times the host feeds it and
// re-estimated once a second, in multiples of 5 Hz. With refresh-rate detection off in the uid's
// settings it reports a fixed 60.
class RefreshRateDetector final : public Interpolation::SettingsController::Observer {
public:
    static constexpr int32_t DEFAULT_REFRESH_RATE = 60;
    static constexpr nsecs_t UPDATE_PERIOD = 1'000'000'000;
    static constexpr size_t MAX_INTERVALS = 100;
    // Vsync intervals outside (MIN_INTERVAL, MAX_INTERVAL) are glitches or pauses, not refreshes.
    static constexpr nsecs_t MIN_INTERVAL = 1'000;
    static constexpr nsecs_t MAX_INTERVAL = 1'000'000'000;

    explicit RefreshRateDetector(const unsigned int& uid);

    // One vsync at `timestamp`; re-estimates the rate when the update timer is due.
    void addVsync(nsecs_t timestamp);
    int getRefreshRate() const;
    // One re-estimation from the stored intervals; what the update timer runs.
    void updateRefreshRate();

    void onSettingsChanged(const Interpolation::Settings& s) override;
    uint32_t getUID() const override { return mUid; }
    void onFirstRef() override;

private:
    void updateRefreshRateLocked();

    const uint32_t mUid;
    mutable std::mutex mMutex;
    bool mDetectRefreshRate;                      // guarded by mMutex
    int32_t mRefreshRate = DEFAULT_REFRESH_RATE;  // guarded by mMutex
    Interpolation::Timer mTimer;                  // guarded by mMutex; its callback runs under it
    nsecs_t mLastVsync = 0;                       // guarded by mMutex; 0: none yet
    std::vector<nsecs_t> mIntervals;              // guarded by mMutex; a ring once full
    nsecs_t mAverageInterval = 0;                 // guarded by mMutex
    int32_t mRingPosition = 0;                    // guarded by mMutex
};

}  // namespace android
