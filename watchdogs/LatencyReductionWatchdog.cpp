#include "LatencyReductionWatchdog.h"

#include <cmath>

#include "Log.h"
#include "WatchdogWarningController.h"

namespace android::Interpolation {

LatencyReductionWatchdog::LatencyReductionWatchdog(unsigned int uid, String8 name,
                                                   sp<EventAggregator>& aggregator)
    : mUid(uid),
      mName(std::move(name)),
      mAggregator(aggregator),
      mMinimumStability(defaultSettings.minimumRegalStability),
      mMedian(MEDIAN_SAMPLES, 0.5f, 0.005f, INITIAL_MEDIAN_FPS, INITIAL_MEDIAN_FPS) {}

void LatencyReductionWatchdog::onFirstRef() {
    SettingsController::Observer::onFirstRef();
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    mWarmUpTimer.arm(
            WARM_UP_PERIOD, now, [this] { enableDecisions(); }, /*once=*/true);
    mDecisionTimer.arm(
            DECISION_PERIOD, now, [this] { makeDecision(); }, /*once=*/false);
}

void LatencyReductionWatchdog::onSettingsChanged(const Settings& s) {
    mMinimumStability.store(s.minimumRegalStability);
}

void LatencyReductionWatchdog::update() {
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    if (mMeasuring) {
        const int fps =
                mAggregator == nullptr ? 0 : mAggregator->count(EventAggregator::eGameFrames, now);
        const auto median = static_cast<double>(mMedian.update(fps));
        if (std::fabs(fps - median) < median * STABLE_BAND) mStableCount++;
        mTotalCount++;
        ILOG(2,
             "LatencyReductionWatchdog::update [%s] currentFPS %d median %f (20%%) %f stability %f",
             mName.c_str(), fps, median, median * STABLE_BAND, static_cast<double>(getStability()));
    }
    mWarmUpTimer.check(now);
    mDecisionTimer.check(now);
}

float LatencyReductionWatchdog::getStability() const {
    return static_cast<float>(mStableCount) / static_cast<float>(mTotalCount);
}

void LatencyReductionWatchdog::enableDecisions() {
    mDecisionsEnabled = true;
}

void LatencyReductionWatchdog::makeDecision() {
    const float stability = getStability();
    // NaN (nothing measured yet) compares false and never warns.
    if (mDecisionsEnabled && stability < mMinimumStability.load()) {
        ILOG(1,
             "LatencyReductionWatchdog::makeDecision [%s] UID %d stability %f TOO LOW, disabling "
             "Verolux",
             mName.c_str(), static_cast<int>(mUid), static_cast<double>(stability));
        WatchdogWarningController::addWarning(mUid, LATENCY_REDUCTION_UNSTABLE, stability,
                                              /*record=*/true);
        return;
    }
    ILOG(2, "LatencyReductionWatchdog::makeDecision [%s] stability %f is OK", mName.c_str(),
         static_cast<double>(stability));
    mMeasuring = true;
}

}  // namespace android::Interpolation
