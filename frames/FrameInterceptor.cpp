#include "FrameInterceptor.h"

#include "Tunables.h"

namespace android::Interpolation {

namespace {

sp<Delayer> newDelayerFor(const String8& name, uint32_t uid, InterpolationMode mode) {
    if (mode != eRetimeMode || !applyDelayToFrames.load()) return nullptr;
    return new Delayer(uid, name);
}

}  // namespace

FrameInterceptor::FrameInterceptor(String8& name, const uint32_t& uid, const InterpolationMode& mode,
                                   sp<FrameList>& frameList, sp<FrameTimingsAggregator>& timings)
    : mName(name),
      mDelayer(newDelayerFor(name, uid, mode)),
      mFrameList(frameList),
      mTimings(timings),
      mTimestampChecker(frameList) {}

void FrameInterceptor::interceptFrame(const uint64_t& frameNumber, const int& slot,
                                      const sp<GraphicBuffer>& buffer, nsecs_t timestamp,
                                      const sp<Fence>& acquireFence, bool acquired) {
    std::lock_guard lock(mMutex);
    const nsecs_t ts = mTimestampChecker.sanitize(frameNumber, timestamp, acquired);

    mTimings->frameNumberForIndex(frameNumber, slot);
    if (!acquired) mTimings->queueTimings(systemTime(SYSTEM_TIME_MONOTONIC), slot);
    mTimings->acquireFenceTimings(mTimings->wrapFence(acquireFence), slot);
    mTimings->checkFenceTimes(slot);

    const nsecs_t delay = mDelayer != nullptr ? mDelayer->getDelay() : 0;
    FrameItem item;
    item.mIndex = frameNumber;
    item.mTextureSlot = slot;
    item.mGraphicBuffer = buffer;
    item.mID = ts + delay;
    item.mTimestamp = ts;
    item.mAcquireFence = acquireFence;
    item.mAcquired = acquired;
    mFrameList->insertFrame(std::move(item));

    // The delay is re-estimated only as acquired frames arrive; the delayer announces a change
    // after releasing its own mutex.
    if (mDelayer != nullptr && acquired) mDelayer->pollUpdateTimer();
}

void FrameInterceptor::dumpState(String8& out, const char* prefix) {
    if (mDelayer != nullptr) mDelayer->dumpState(out, prefix);
}

}  // namespace android::Interpolation
