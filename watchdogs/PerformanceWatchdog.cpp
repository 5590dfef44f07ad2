#include "PerformanceWatchdog.h"

#include "CurrentSettings.h"
#include "Log.h"

namespace android::Interpolation {

namespace {

// Warnings one update can make: a low-rate and a high-rate decision. More only follow a long gap
// between updates, whose missed seconds are caught up.
constexpr size_t PENDING_WARNING_CAPACITY = 2;

}  // namespace

template <typename WatchdogInterface>
PerformanceWatchdog<WatchdogInterface>::PerformanceWatchdog(unsigned int uid, String8 name,
                                                            sp<WatchdogInterface>& interface)
    : mUid(uid),
      mName(std::move(name)),
      mInterface(interface),
      mMinFps(defaultSettings.minAcceptableFps),
      mMaxFps(defaultSettings.maxAcceptableFps),
      mAverages(FPS_AVERAGE_PERIOD, currentFps(systemTime(SYSTEM_TIME_MONOTONIC))),
      mShortTerm(FPS_SHORT_TERM_MEASUREMENTS) {
    mPendingWarnings.reserve(PENDING_WARNING_CAPACITY);
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::onFirstRef() {
    SettingsController::Observer::onFirstRef();
    applyCurrentSettings(*this);
    std::lock_guard lock(mMutex);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    mRecalculateTimer.arm(
            RECALCULATE_PERIOD, now, [this] { recalculateLocked(); }, /*once=*/false);
    onLoadingScreenDetectedLocked(now);
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::onSettingsChanged(const Settings& s) {
    std::lock_guard lock(mMutex);
    if (s.maxAcceptableFps < 1 && s.minAcceptableFps < 1) {
        mActive = false;
        return;
    }
    mActive = s.gameFpsLimit >= 1;
    if (!mActive) return;
    mRecalculateTimer.nextTime = systemTime(SYSTEM_TIME_MONOTONIC) + mRecalculateTimer.period;

    // The game's own limit, less a margin, is the highest minimum that can be met.
    const int32_t limit = s.gameFpsLimit - MIN_GFPS_SAFETY_MARGIN;
    mMinFps = s.minAcceptableFps;
    if (mMinFps > limit) {
        ILOG(1,
             "PerformanceWatchdog<WatchdogInterface>::onSettingsChanged Warning! Interpolation FPS "
             "(%d) is set lower or near to min acceptable FPS (%d). Min acceptable FPS has been "
             "lowered accordingly (%d).",
             s.gameFpsLimit, s.minAcceptableFps, limit);
        mMinFps = limit;
    }
    mMaxFps = s.maxAcceptableFps;
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::update() {
    bool warned;
    {
        std::lock_guard lock(mMutex);
        if (!mActive || mRecalculateTimer.period < 1) return;
        mRecalculateTimer.check();
        warned = !mPendingWarnings.empty();
    }
    if (warned) issuePendingWarnings();
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::setMakingDecisions(bool makingDecisions) {
    std::lock_guard lock(mMutex);
    mMakingDecisions = makingDecisions;
}

template <typename WatchdogInterface>
bool PerformanceWatchdog<WatchdogInterface>::hasRecentSteepDrop() {
    std::lock_guard lock(mMutex);
    return hasRecentSteepDropLocked();
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::recalculate() {
    {
        std::lock_guard lock(mMutex);
        recalculateLocked();
    }
    issuePendingWarnings();
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::makeDecision() {
    {
        std::lock_guard lock(mMutex);
        makeDecisionLocked();
    }
    issuePendingWarnings();
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::makeMaxDecision() {
    {
        std::lock_guard lock(mMutex);
        makeMaxDecisionLocked();
    }
    issuePendingWarnings();
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::onLoadingScreenDetected() {
    std::lock_guard lock(mMutex);
    onLoadingScreenDetectedLocked(systemTime(SYSTEM_TIME_MONOTONIC));
}

template <typename WatchdogInterface>
int PerformanceWatchdog<WatchdogInterface>::currentFps(nsecs_t now) const {
    if (mInterface == nullptr || mInterface->getAggregator() == nullptr) return 0;
    return mInterface->getAggregator()->count(EventAggregator::eGameFrames, now);
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::recalculateLocked() {
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    const int fps = currentFps(now);
    mAverages.update(fps);
    mShortTerm.push(fps);
    if (hasRecentSteepDropLocked()) onLoadingScreenDetectedLocked(now);
    ILOG(2, "PerformanceWatchdog::update [%s] currentFPS %d", mName.c_str(), fps);
    if (mMakingDecisions) {
        makeDecisionLocked();
    } else {
        mLoadingScreenTimer.check(now);
    }
    makeMaxDecisionLocked();
}

template <typename WatchdogInterface>
bool PerformanceWatchdog<WatchdogInterface>::hasRecentSteepDropLocked() const {
    if (mShortTerm.size() < static_cast<uint32_t>(FPS_SHORT_TERM_MEASUREMENTS)) return false;
    // The k-th rate after the first must be below first * (1 - k / 2 * (1 - STEEP_DROP_FACTOR)):
    // 75 % of it for the middle rate and 50 % for the newest. In single precision.
    const auto first = static_cast<float>(mShortTerm.at(-1));
    for (int k = 1; k < FPS_SHORT_TERM_MEASUREMENTS; k++) {
        const float w = static_cast<float>(k) / static_cast<float>(FPS_SHORT_TERM_MEASUREMENTS - 1);
        const float threshold = first * STEEP_DROP_FACTOR * w + (1.0f - w) * first;
        if (!(static_cast<float>(mShortTerm.at(-1 - k)) < threshold)) return false;
    }
    return true;
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::makeDecisionLocked() {
    if (mMinFps < 1) return;
    const double average = mAverages.mean();
    if (average < mMinFps) {
        ILOG(1,
             "PerformanceWatchdog::makeDecision [%s] UID %d average FPS %f TOO LOW (less than %d), "
             "disabling Verolux",
             mName.c_str(), static_cast<int>(mUid), average, mMinFps);
        mPendingWarnings.push_back(
                {LOW_GAME_FPS, MachineLearning::truncateTo<int>(average), /*record=*/true});
        mActive = false;
    } else {
        ILOG(2, "PerformanceWatchdog::makeDecision [%s] average FPS %f is OK", mName.c_str(),
             average);
    }
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::makeMaxDecisionLocked() {
    if (mMaxFps < 1) return;
    const double average = mAverages.mean();
    if (average > mMaxFps) {
        ILOG(1,
             "PerformanceWatchdog::makeMaxDecision [%s] UID %d average FPS %f TOO HIGH (higher "
             "than %d), disabling Verolux",
             mName.c_str(), static_cast<int>(mUid), average, mMaxFps);
        mPendingWarnings.push_back(
                {HIGH_GAME_FPS, MachineLearning::truncateTo<int>(average), /*record=*/false});
        mActive = false;
    } else {
        ILOG(2, "PerformanceWatchdog::makeMaxDecision [%s] average FPS %f is OK", mName.c_str(),
             average);
    }
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::onLoadingScreenDetectedLocked(nsecs_t now) {
    mMakingDecisions = false;
    mLoadingScreenTimer.arm(
            LOADING_SCREEN_PERIOD, now, [this] { mMakingDecisions = true; }, /*once=*/true);
}

template <typename WatchdogInterface>
void PerformanceWatchdog<WatchdogInterface>::issuePendingWarnings() {
    // One at a time, each sent with the mutex released.
    for (;;) {
        PendingWarning warning;
        {
            std::lock_guard lock(mMutex);
            if (mPendingWarnings.empty()) return;
            warning = mPendingWarnings.front();
            mPendingWarnings.erase(mPendingWarnings.begin());
        }
        WatchdogWarningController::addWarning(mUid, warning.code, warning.value, warning.record);
    }
}

template class PerformanceWatchdog<RealWatchdogInterface>;

}  // namespace android::Interpolation
