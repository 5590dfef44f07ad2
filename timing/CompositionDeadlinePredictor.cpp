#include "CompositionDeadlinePredictor.h"

#include "EventDispatcher.h"
#include "Log.h"
#include "Saturating.h"

namespace android::Interpolation::MachineLearning {

CompositionDeadlinePredictor::CompositionDeadlinePredictor(uint32_t uid, uint32_t intervalMemory)
    : mUid(uid), mIntervals(intervalMemory) {}

nsecs_t CompositionDeadlinePredictor::getNextCompositionLocked() const {
    return saturatingAdd(mLastComposition,
                         truncateTo<nsecs_t>(mIntervals.mean() - mIntervals.stddev()));
}

void CompositionDeadlinePredictor::dump(String8& out, const char* prefix) const {
    std::lock_guard lock(mMutex);
    out.appendFormat(
            "%sCompositionDeadlinePredictor uid=%u interval avg=%.0f std=%.0f samples=%u "
            "lastComposition=%ld next=%ld\n",
            prefix, mUid, mIntervals.mean(), mIntervals.stddev(), mIntervals.size(),
            mLastComposition, getNextCompositionLocked());
}

void CompositionDeadlinePredictor::onComposition(nsecs_t t) {
    nsecs_t next;
    {
        std::lock_guard lock(mMutex);
        if (mLastComposition == 0) {
            mLastComposition = t;
            return;
        }
        if (logLevel.load(std::memory_order_relaxed) >= 1) {
            const nsecs_t predicted = getNextCompositionLocked();
            ILOG(1,
                 "CompositionDeadlinePredictor::onComposition composition time: %lu, estimated "
                 "next composition time: %lu diff %f",
                 t, predicted, static_cast<float>(saturatingSub(t, predicted)) / 1e9f);
        }
        mIntervals.update(saturatingSub(t, mLastComposition));
        mLastComposition = t;
        next = getNextCompositionLocked();
    }
    EventDispatcher::broadcastEvent(mUid, eCompositionEstimateEvent,
                                    systemTime(SYSTEM_TIME_MONOTONIC), next);
}

}  // namespace android::Interpolation::MachineLearning
