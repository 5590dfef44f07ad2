#include "LatencyReduction.h"

#include <algorithm>

#include "Log.h"
#include "Saturating.h"
#include "Trace.h"

namespace android::Interpolation::MachineLearning {

DistributionBasedLRDelayer::DistributionBasedLRDelayer(unsigned int const& uid,
                                                       sp<FrameTimingsAggregator> aggregator)
    : mUid(uid), mAggregator(std::move(aggregator)) {}

nsecs_t DistributionBasedLRDelayer::getDelay(nsecs_t deadline) {
    ScopedTrace trace("getDelay");
    nsecs_t delay = 0;
    nsecs_t now;
    {
        std::lock_guard lock(mMutex);
        if (logLevel.load(std::memory_order_relaxed) >= 2) {
            const nsecs_t start = systemTime(SYSTEM_TIME_MONOTONIC);
            ILOG(2, "DistributionBasedLRDelayer getDelay(%lu, %lu) diff %ld", start, deadline,
                 saturatingSub(deadline, start));
        }
        mNumFrames = 0;
        if (mAggregator != nullptr) {
            mNumFrames = std::min(mAggregator->getNewestFrameTimings(FRAMES_PER_CALL, mFrames),
                                  FRAMES_PER_CALL);
        }
        const nsecs_t renderTime = getRenderTime();
        const nsecs_t margin = getSafetyMargin();
        now = systemTime(SYSTEM_TIME_MONOTONIC);
        if (mNumFrames >= MIN_FRAMES) {
            ILOG(2, "DistributionBasedLRDelayer mNumFrames=%d, now=%lu, rendertime %ld", mNumFrames,
                 now, renderTime);
            delay = saturatingSub(saturatingSub(saturatingSub(deadline, renderTime), margin), now);
            if (delay >= MAX_DELAY) delay = MAX_DELAY;
            if (delay < 1) delay = 0;
        }
        ILOG(2, "DistributionBasedLRDelayer delay: %ldns", delay);
    }
    EventDispatcher::broadcastEvent(mUid, eReleaseDelayed, now, delay);
    return delay;
}

void DistributionBasedLRDelayer::setFrameListCapacity(size_t capacity) {
    std::lock_guard lock(mMutex);
    mFrameListCapacity = static_cast<uint32_t>(capacity);
}

void DistributionBasedLRDelayer::dump(String8& out, const char* prefix) const {
    std::lock_guard lock(mMutex);
    out.appendFormat(
            "%sDistributionBasedLRDelayer uid=%u frames=%u capacity=%u renderTime=%ld "
            "releaseToDequeue avg=%.0f std=%.0f samples=%u lastMarginFrame=%lu\n",
            prefix, mUid, mNumFrames, mFrameListCapacity, mRenderTimePercentile.estimate(),
            mReleaseToDequeue.mean(), mReleaseToDequeue.stddev(), mReleaseToDequeue.size(),
            mLastMarginFrameNumber);
}

nsecs_t DistributionBasedLRDelayer::getRenderTime() {
    // With no record fetched there is no newest frame to measure.
    const nsecs_t renderTime =
            mNumFrames == 0 ? -1 : saturatingSub(mFrames[0].mAcquireTime, mFrames[0].mDequeueTime);
    if (renderTime < 0 || renderTime > MAX_RENDER_TIME) {
        // An acquire fence that has not signalled yet leaves the acquire time at -1.
        ILOG(2, "DistributionBasedLRDelayer render time: %fms (impossible)", renderTime / 1e6);
        return mRenderTimePercentile.estimate();
    }
    const nsecs_t estimate = mRenderTimePercentile.update(renderTime);
    ILOG(2, "DistributionBasedLRDelayer render time: %fms, avg: %fms, std:%fms, percentile: %f",
         renderTime / 1e6, mRenderTimePercentile.metrics().mean() / 1e6,
         mRenderTimePercentile.metrics().stddev() / 1e6, estimate / 1e6);
    return estimate;
}

nsecs_t DistributionBasedLRDelayer::getSafetyMargin() {
    // The buffer dequeued for frame k was released by frame k + C, C being the number of buffers
    // the game cycles through. The walk stops at the first frame already learnt from.
    const uint32_t cycle = mFrameListCapacity;
    if (mNumFrames != cycle + 1) {
        uint64_t newest = 0;
        // The bound leaves the oldest pair out. It wraps when there are no more records than
        // buffers; no pair qualifies then, and the walk still stays within the records fetched.
        const uint32_t end = mNumFrames - cycle - 1;
        for (uint32_t k = 0;
             k < end && k < mNumFrames && mFrames[k].mFrameNumber > mLastMarginFrameNumber; k++) {
            const uint64_t j = uint64_t{k} + cycle;
            // The older frame's dequeue time is tested, not the release time that is used.
            if (j >= mNumFrames || mFrames[k].mDequeueTime == -1 || mFrames[j].mDequeueTime == -1) {
                continue;
            }
            const nsecs_t sample =
                    saturatingSub(mFrames[k].mDequeueTime, mFrames[j].mReleaseFrameTime);
            // An outlier is not learnt, but the walk still moves past it.
            if (!isOutlierLocked(sample)) mReleaseToDequeue.update(sample);
            if (newest == 0) newest = mFrames[k].mFrameNumber;
        }
        if (newest != 0) mLastMarginFrameNumber = newest;
    }
    ILOG(2, "DistributionBasedLRDelayer ReleaseToDequeue avg: %lf std: %lf",
         mReleaseToDequeue.mean(), mReleaseToDequeue.stddev());
    return truncateTo<nsecs_t>(mReleaseToDequeue.mean() + mReleaseToDequeue.stddev());
}

bool DistributionBasedLRDelayer::isOutlierLocked(nsecs_t sample) const {
    // Judged only once the statistics have settled: enough frames, a full ring, a real spread.
    if (mNumFrames < MIN_FRAMES || mReleaseToDequeue.size() != mReleaseToDequeue.capacity() ||
        mReleaseToDequeue.variance() <= VARIANCE_FLOOR) {
        return false;
    }
    const double distance = sample - mReleaseToDequeue.mean();
    const double limit = OUTLIER_DEVIATIONS * mReleaseToDequeue.stddev();
    return distance * distance > limit * limit;
}

}  // namespace android::Interpolation::MachineLearning
