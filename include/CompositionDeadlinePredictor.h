#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>

#include "RollingStatistics.h"

namespace android::Interpolation::MachineLearning {

// Learns the interval between compositions and predicts the next one, announcing each prediction
// as eCompositionEstimateEvent. The prediction is the last composition plus the mean interval
// minus one deviation: it errs early, so that whoever waits for it is not late.
class CompositionDeadlinePredictor final : public virtual RefBase {
public:
    // About half a second of compositions at 60 Hz: enough to smooth jitter, short enough to
    // follow a change of refresh rate.
    static constexpr uint32_t INTERVAL_MEMORY = 30;

    explicit CompositionDeadlinePredictor(uint32_t uid, uint32_t intervalMemory = INTERVAL_MEMORY);

    void onComposition(nsecs_t t);
    // The predicted time of the next composition; the caller holds getMutex().
    nsecs_t getNextCompositionLocked() const;
    std::mutex& getMutex() const { return mMutex; }

    void dump(String8& out, const char* prefix) const;

private:
    mutable std::mutex mMutex;
    const uint32_t mUid;
    RollingMetrics<nsecs_t> mIntervals;  // guarded by mMutex
    nsecs_t mLastComposition = 0;        // guarded by mMutex; 0 until the first composition
};

}  // namespace android::Interpolation::MachineLearning
