#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>

#include "LogOutput.h"
#include "RollingStatistics.h"
#include "Settings.h"
#include "SettingsController.h"
#include "Timer.h"

namespace android::Interpolation {

// Judges whether the game's frame rate is steady enough for latency reduction. Each update counts
// the frames of the last second and calls it stable when it lies within 20 % of the running
// median; the stability is the share of stable updates over the whole measured time. Measuring
// starts 30 s after the first reference, decisions 300 s after it; every 30 s from then on a
// stability below the minimum switches the feature off for the game.
class LatencyReductionWatchdog final : public SettingsController::Observer {
public:
    static constexpr nsecs_t WARM_UP_PERIOD = 300'000'000'000;
    static constexpr nsecs_t DECISION_PERIOD = 30'000'000'000;
    static constexpr int INITIAL_MEDIAN_FPS = 60;
    static constexpr uint32_t MEDIAN_SAMPLES = 100;
    static constexpr double STABLE_BAND = 0.2;

    LatencyReductionWatchdog(unsigned int uid, String8 name, sp<EventAggregator>& aggregator);

    void onFirstRef() override;
    void onSettingsChanged(const Settings& s) override;
    uint32_t getUID() const override { return mUid; }
    ~LatencyReductionWatchdog() override = default;

    // The host calls it regularly, e.g. after each composition, always from the same thread.
    void update();
    // Stable updates over all measured ones: NaN before the first.
    float getStability() const;
    void enableDecisions();
    void makeDecision();

private:
    const uint32_t mUid;
    const String8 mName;
    const sp<EventAggregator> mAggregator;
    // Everything below but the minimum belongs to the thread that calls update; the minimum
    // arrives from the settings notification.
    bool mMeasuring = false;
    bool mDecisionsEnabled = false;
    std::atomic<float> mMinimumStability;
    uint64_t mStableCount = 0;
    uint64_t mTotalCount = 0;
    MachineLearning::RollingPercentile<int> mMedian;
    Timer mWarmUpTimer;
    Timer mDecisionTimer;
};

}  // namespace android::Interpolation
