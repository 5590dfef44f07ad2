#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>
#include <vector>

#include "LogOutput.h"
#include "RingBuffer.h"
#include "RollingStatistics.h"
#include "Settings.h"
#include "SettingsController.h"
#include "Timer.h"
#include "WatchdogWarningController.h"

namespace android::Interpolation {

// What the performance watchdog reads a layer's frame times from: the layer's EventAggregator,
// whose game-frame counter the host feeds. The aggregator must not be null.
class RealWatchdogInterface : public virtual RefBase {
public:
    explicit RealWatchdogInterface(sp<EventAggregator> aggregator)
        : mAggregator(std::move(aggregator)) {}

    const sp<EventAggregator>& getAggregator() const { return mAggregator; }

private:
    const sp<EventAggregator> mAggregator;
};

// Switches the feature off for a game whose frame rate, averaged over the last 30 seconds, falls
// below the minimum acceptable rate or rises above the maximum. A loading screen (a steep fall
// over three seconds) and the first minute after start suspend the low-rate rule for 60 s.
//
// `WatchdogInterface` gives the layer's aggregator through getAggregator(); the library holds the
// one instantiation, over RealWatchdogInterface.
//
// A decision is made under the watchdog's mutex but its warning leaves after the mutex is
// released: addWarning takes the settings controller's mutex, under which onSettingsChanged takes
// ours.
template <typename WatchdogInterface>
class PerformanceWatchdog final : public SettingsController::Observer {
public:
    static constexpr int MIN_GFPS_SAFETY_MARGIN = 5;
    static constexpr float STEEP_DROP_FACTOR = 0.5f;
    static constexpr int FPS_AVERAGE_PERIOD = 30;
    static constexpr int FPS_SHORT_TERM_MEASUREMENTS = 3;
    static constexpr nsecs_t LOADING_SCREEN_PERIOD = 60'000'000'000;
    static constexpr nsecs_t RECALCULATE_PERIOD = 1'000'000'000;

    PerformanceWatchdog(unsigned int uid, String8 name, sp<WatchdogInterface>& interface);

    // Subscribes, applies the uid's current settings, and starts the 60 s grace period.
    void onFirstRef() override;
    void onSettingsChanged(const Settings& s) override;
    uint32_t getUID() const override { return mUid; }
    ~PerformanceWatchdog() override = default;

    // The host calls it regularly, e.g. after each composition: once a second it measures the
    // game's rate and decides.
    void update();
    void setMakingDecisions(bool makingDecisions);
    // Whether the last three rates fell to below 75 % and then 50 % of the first.
    bool hasRecentSteepDrop();
    void recalculate();
    // The low-rate rule: the 30 s average below the minimum switches the game off.
    void makeDecision();
    // The high-rate rule: the 30 s average above the maximum switches the game off.
    void makeMaxDecision();
    void onLoadingScreenDetected();

private:
    struct PendingWarning {
        WarningCode code;
        int value;
        bool record;
    };

    int currentFps(nsecs_t now) const;
    void recalculateLocked();
    bool hasRecentSteepDropLocked() const;
    void makeDecisionLocked();
    void makeMaxDecisionLocked();
    void onLoadingScreenDetectedLocked(nsecs_t now);
    // Sends the warnings the decisions made; call it with mMutex released.
    void issuePendingWarnings();

    const uint32_t mUid;
    const String8 mName;
    const sp<WatchdogInterface> mInterface;
    mutable std::mutex mMutex;
    bool mActive = true;            // guarded by mMutex; false switches every decision off
    bool mMakingDecisions = false;  // guarded by mMutex; false during a grace period
    int32_t mMinFps;                // guarded by mMutex
    int32_t mMaxFps;                // guarded by mMutex
    MachineLearning::RollingMetrics<int> mAverages;  // guarded by mMutex (and its own)
    RingBuffer<int> mShortTerm;                      // guarded by mMutex
    Timer mRecalculateTimer;                       // guarded by mMutex; its callback runs under it
    Timer mLoadingScreenTimer;                     // guarded by mMutex; its callback runs under it
    std::vector<PendingWarning> mPendingWarnings;  // guarded by mMutex
};

extern template class PerformanceWatchdog<RealWatchdogInterface>;

}  // namespace android::Interpolation
