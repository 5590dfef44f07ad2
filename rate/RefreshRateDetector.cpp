#include "RefreshRateDetector.h"

#include <limits>

#include "Log.h"

namespace android {

namespace {

constexpr const char* LOG_TAG = "RefreshRateDetector";
constexpr nsecs_t NS_PER_S = 1'000'000'000;

}  // namespace

RefreshRateDetector::RefreshRateDetector(const unsigned int& uid)
    : mUid(uid), mDetectRefreshRate(Interpolation::defaultSettings.detectRefreshRate) {
    mIntervals.reserve(MAX_INTERVALS);
}

void RefreshRateDetector::onFirstRef() {
    Interpolation::SettingsController::Observer::onFirstRef();
    std::lock_guard lock(mMutex);
    mTimer.arm(
            UPDATE_PERIOD, systemTime(SYSTEM_TIME_MONOTONIC), [this] { updateRefreshRateLocked(); },
            /*once=*/false);
}

void RefreshRateDetector::addVsync(nsecs_t timestamp) {
    std::lock_guard lock(mMutex);
    if (mLastVsync != 0) {
        nsecs_t delta;
        if (!__builtin_sub_overflow(timestamp, mLastVsync, &delta) && delta > MIN_INTERVAL &&
            delta < MAX_INTERVAL) {
            if (mIntervals.size() < MAX_INTERVALS) {
                mIntervals.push_back(delta);
            } else {
                mIntervals[mRingPosition] = delta;
            }
            mRingPosition = (mRingPosition + 1) % static_cast<int32_t>(MAX_INTERVALS);
        }
    }
    mLastVsync = timestamp;
    mTimer.check();
}

int RefreshRateDetector::getRefreshRate() const {
    std::lock_guard lock(mMutex);
    return mRefreshRate;
}

void RefreshRateDetector::updateRefreshRate() {
    std::lock_guard lock(mMutex);
    updateRefreshRateLocked();
}

void RefreshRateDetector::updateRefreshRateLocked() {
    if (!mDetectRefreshRate || mIntervals.size() < 2) return;

    // Each term of a mean is truncated on its own: the sum never overflows.
    const auto n = static_cast<nsecs_t>(mIntervals.size());
    nsecs_t mean = 0;
    nsecs_t maximum = 0;
    nsecs_t minimum = std::numeric_limits<nsecs_t>::max();
    for (nsecs_t interval : mIntervals) {
        mean += interval / n;
        // Only an interval that is not a new maximum can be the minimum, so the first never is.
        if (interval > maximum) {
            maximum = interval;
        } else if (interval < minimum) {
            minimum = interval;
        }
    }
    ILOG_TAGGED(2, LOG_TAG, "RefreshRateDetector::updateRefreshRate Mean interval = %lu", mean);

    nsecs_t average = mean;
    // A wide spread means missed vsyncs: the long intervals above halfway are left out.
    if (maximum - minimum > mean / 2) {
        const nsecs_t halfway = (minimum + maximum) / 2;
        ILOG_TAGGED(2, LOG_TAG, "Halfway interval = %lu", halfway);
        nsecs_t kept = 0;
        for (nsecs_t interval : mIntervals)
            kept += interval < halfway;
        if (kept > 0) {
            average = 0;
            for (nsecs_t interval : mIntervals)
                if (interval < halfway) average += interval / kept;
        }
    }
    mAverageInterval = average;
    if (average == 0) return;

    const auto rate = static_cast<int32_t>(NS_PER_S / average);
    // To the nearest multiple of 5 Hz: remainders up to 2 round down, 3 and 4 up.
    const int32_t rounded = (rate + 2) / 5 * 5;
    mRefreshRate = rounded;
    ILOG_TAGGED(2, LOG_TAG,
                "RefreshRateDetector::updateRefreshRate Average interval = %lu, refresh rate = %d "
                "rounded to %d",
                average, rate, rounded);
}

void RefreshRateDetector::onSettingsChanged(const Interpolation::Settings& s) {
    std::lock_guard lock(mMutex);
    mDetectRefreshRate = s.detectRefreshRate;
    if (!mDetectRefreshRate) mRefreshRate = DEFAULT_REFRESH_RATE;
}

}  // namespace android
