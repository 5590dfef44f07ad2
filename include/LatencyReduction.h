#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstddef>
#include <cstdint>
#include <mutex>

#include "FrameTimings.h"
#include "RollingStatistics.h"

namespace android::Interpolation::MachineLearning {

// Predicts how long the game's next buffer may still be held back before it must be released.
class LRDelayer : public virtual RefBase {
public:
    ~LRDelayer() override = default;
    // deadline: the monotonic time by which the next frame must be rendered. Returns the delay in
    // nanoseconds.
    virtual nsecs_t getDelay(nsecs_t deadline) = 0;
    // The number of buffers the game cycles through.
    virtual void setFrameListCapacity(size_t capacity) = 0;
};

// The delay is the slack left before the deadline once the game's render time (dequeue to
// acquire-fence signal) and a safety margin are taken off:
//
//   delay = deadline - renderTime - margin - now, clamped to 0..MAX_DELAY
//
// renderTime is a high percentile of the newest frames' render times; margin is the mean plus
// one deviation of the time from a buffer's release to its next dequeue. Until MIN_FRAMES frame
// records exist the delay is 0: better not to hold back at all than on a guess.
class DistributionBasedLRDelayer final : public LRDelayer {
public:
    static constexpr uint32_t FRAMES_PER_CALL = 50;
    static constexpr uint32_t MIN_FRAMES = 20;
    static constexpr nsecs_t MAX_RENDER_TIME = 1'000'000'000;
    static constexpr nsecs_t MAX_DELAY = 16'000'000;
    static constexpr double OUTLIER_DEVIATIONS = 3.0;
    // Below the single-precision epsilon the samples are as good as constant, and everything
    // would be an outlier.
    static constexpr double VARIANCE_FLOOR = 1.1920928955078125e-7;

    DistributionBasedLRDelayer(unsigned int const& uid, sp<FrameTimingsAggregator> aggregator);

    nsecs_t getDelay(nsecs_t deadline) override;
    void setFrameListCapacity(size_t capacity) override;

    void dump(String8& out, const char* prefix) const;

private:
    // Both read the records getDelay fetched, with mMutex held.
    nsecs_t getRenderTime();
    nsecs_t getSafetyMargin();
    // Whether a release-to-dequeue sample lies beyond OUTLIER_DEVIATIONS deviations of the mean.
    bool isOutlierLocked(nsecs_t sample) const;

    mutable std::mutex mMutex;
    const uint32_t mUid;
    const sp<FrameTimingsAggregator> mAggregator;
    FrameTimings mFrames[FRAMES_PER_CALL];  // guarded by mMutex; newest first
    uint64_t mLastMarginFrameNumber = 0;    // guarded by mMutex; the newest frame learnt from
    uint32_t mNumFrames = 0;                // guarded by mMutex; valid entries of mFrames
    uint32_t mFrameListCapacity = 3;        // guarded by mMutex
    // guarded by mMutex, besides their own mutexes
    RollingPercentile<nsecs_t> mRenderTimePercentile{FRAMES_PER_CALL, 0.99f, 0.005f};
    RollingMetrics<nsecs_t> mReleaseToDequeue{FRAMES_PER_CALL};
};

}  // namespace android::Interpolation::MachineLearning
