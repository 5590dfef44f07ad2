#pragma once

#include <cmath>
#include <cstdint>
#include <limits>
#include <mutex>

#include "RingBuffer.h"

namespace android::Interpolation::MachineLearning {

// Truncates toward zero, saturating at T's limits (NaN gives 0), so that no statistic ever
// converts out of range.
template <typename T>
T truncateTo(double value) {
    if (std::isnan(value)) return 0;
    if (value <= static_cast<double>(std::numeric_limits<T>::min())) {
        return std::numeric_limits<T>::min();
    }
    if (value >= static_cast<double>(std::numeric_limits<T>::max())) {
        return std::numeric_limits<T>::max();
    }
    return static_cast<T>(value);
}

// Mean, variance and standard deviation of the last `capacity` samples.
//
// While the ring fills, every update recomputes the population statistics (divided by n). Once it
// is full, an update is O(1): Welford's step for replacing the oldest sample, which divides by
// n - 1. The two denominators disagree on purpose; the predictors are tuned to this behaviour.
template <typename T>
class RollingMetrics {
public:
    // Some owners start from a known mean (a display rate, say) rather than from 0.
    explicit RollingMetrics(uint32_t capacity, double initialMean = 0.0)
        : mSamples(capacity), mMean(initialMean) {}

    void update(T x) {
        std::lock_guard lock(mMutex);
        const uint32_t n = mSamples.size();
        // With fewer than two samples the incremental step would divide by zero.
        if (n != mSamples.capacity() || n < 2) {
            mSamples.push(x);
            recomputeLocked();
            return;
        }
        const T old = mSamples.at(-1);
        const double delta = static_cast<double>(x - old);
        const double meanNew = mMean + delta / n;
        mVariance = mVariance + (old - mMean + (x - meanNew)) * delta / (n - 1);
        mStddev = std::sqrt(mVariance);
        mMean = meanNew;
        mSamples.push(x);
        // Rounding drifts the running variance to zero or below on flat input.
        if (mVariance <= std::numeric_limits<double>::epsilon()) recomputeLocked();
    }

    double mean() const {
        std::lock_guard lock(mMutex);
        return mMean;
    }
    double variance() const {
        std::lock_guard lock(mMutex);
        return mVariance;
    }
    double stddev() const {
        std::lock_guard lock(mMutex);
        return mStddev;
    }
    uint32_t size() const {
        std::lock_guard lock(mMutex);
        return mSamples.size();
    }
    uint32_t capacity() const {
        std::lock_guard lock(mMutex);
        return mSamples.capacity();
    }

private:
    void recomputeLocked() {
        const uint32_t n = mSamples.size();
        if (n == 0) return;
        double sum = 0.0;
        for (uint32_t i = 0; i < n; i++) {
            sum += static_cast<double>(mSamples.at(static_cast<int32_t>(i)));
        }
        mMean = sum / n;
        double squares = 0.0;
        for (uint32_t i = 0; i < n; i++) {
            const double d = static_cast<double>(mSamples.at(static_cast<int32_t>(i))) - mMean;
            squares += d * d;
        }
        mVariance = squares / n;
        mStddev = std::sqrt(mVariance);
    }

    mutable std::mutex mMutex;
    RingBuffer<T> mSamples;  // guarded by mMutex
    double mMean;            // guarded by mMutex
    double mVariance = 0.0;  // guarded by mMutex
    double mStddev = 0.0;    // guarded by mMutex
};

// A stochastic estimate of the p-th percentile of recent samples. A sample above the estimate
// raises it by step / (1 - p), one below lowers it by step / p, with step a fraction (stepScale)
// of the rolling deviation; the estimate settles where a fraction p of the samples lie below it.
// It never exceeds mean + 3 deviations; there is no lower clamp.
template <typename T>
class RollingPercentile {
public:
    RollingPercentile(uint32_t capacity, float percentile, float stepScale, T initialEstimate = 0,
                      double initialMean = 0.0)
        : mEstimate(initialEstimate),
          mPercentile(percentile),
          mStepScale(stepScale),
          mMetrics(capacity, initialMean) {}

    // Adds a sample and returns the new estimate.
    T update(T x) {
        std::lock_guard lock(mMutex);
        // During warm-up the estimate follows the mean of the samples before this one.
        if (mMetrics.size() != mMetrics.capacity()) mEstimate = truncateTo<T>(mMetrics.mean());
        mMetrics.update(x);
        const T step = truncateTo<T>(mMetrics.stddev() * static_cast<double>(mStepScale));
        // In single precision, as the estimates this was tuned on were.
        if (mEstimate > x) {
            mEstimate -= truncateTo<T>(static_cast<float>(step) / mPercentile);
        } else if (mEstimate < x) {
            mEstimate += truncateTo<T>(static_cast<float>(step) / (1.0f - mPercentile));
        }
        const double ceiling = mMetrics.mean() + 3.0 * mMetrics.stddev();
        if (ceiling < mEstimate) mEstimate = truncateTo<T>(ceiling);
        return mEstimate;
    }

    // The current estimate, without a new sample.
    T estimate() const {
        std::lock_guard lock(mMutex);
        return mEstimate;
    }

    const RollingMetrics<T>& metrics() const { return mMetrics; }

private:
    // Lock order: mMutex, then the metrics' own mutex, taken for each read.
    mutable std::mutex mMutex;
    T mEstimate;              // guarded by mMutex
    const float mPercentile;  // p, e.g. 0.99
    const float mStepScale;   // fraction of the deviation moved per sample, e.g. 0.005
    RollingMetrics<T> mMetrics;
};

}  // namespace android::Interpolation::MachineLearning
