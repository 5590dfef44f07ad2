#include "RealFPSTracker.h"

#include "EventDispatcher.h"
#include "RollingStatistics.h"
#include "Saturating.h"
#include "Trace.h"

namespace android::Interpolation::MachineLearning {

namespace {

constexpr nsecs_t SPAN = 1'000'000'000;

}  // namespace

RealFPSTracker::RealFPSTracker(uint32_t uid) : mUid(uid), mHistory(FRAME_MEMORY) {}

void RealFPSTracker::setReferenceTime(nsecs_t referenceTime) {
    std::lock_guard lock(mMutex);
    mReferenceTime = referenceTime;
}

void RealFPSTracker::logBufferProvided(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    mHistory.push({mReferenceTime, t});
}

void RealFPSTracker::dump(String8& out, const char* prefix) const {
    std::lock_guard lock(mMutex);
    const nsecs_t newest = mHistory.size() == 0 ? -1 : mHistory.at(0).second;
    out.appendFormat("%sRealFPSTracker uid=%u buffers=%u/%u referenceTime=%ld newest=%ld\n", prefix,
                     mUid, mHistory.size(), mHistory.capacity(), mReferenceTime, newest);
}

uint32_t RealFPSTracker::getRealFPS(const nsecs_t& now) {
    ScopedTrace trace("getRealFPS");
    int32_t fps;
    {
        std::lock_guard lock(mMutex);
        float count = 0.0f;
        nsecs_t span = 0;
        const uint32_t size = mHistory.size();
        // Each buffer counts with the time from the one before it, measured from the reference
        // time it was provided at. The span may end just past one second.
        for (uint32_t i = 0; i != size && span <= SPAN; i++) {
            const nsecs_t reference = mHistory.at(static_cast<int32_t>(i)).first;
            if (reference < now && i + 1 != size) {
                count += 1.0f;
                span = saturatingAdd(
                        span,
                        saturatingSub(reference, mHistory.at(static_cast<int32_t>(i + 1)).second));
            }
        }
        // In single precision; an empty span gives 0 (0/0) or the saturated maximum (n/0).
        fps = truncateTo<int32_t>(count / (static_cast<float>(span) / 1e9f));
    }
    EventDispatcher::broadcastEvent(mUid, eRealFPSChangedEvent, now, fps);
    return static_cast<uint32_t>(fps);
}

}  // namespace android::Interpolation::MachineLearning
