#include "FrameTimings.h"

#include "Log.h"
#include "Trace.h"
#include "UniqueLock.h"

namespace android::Interpolation {

const FrameTimings FrameTimings::DEFAULT;

namespace {

// Pending (INT64_MAX) and invalid (-1) both mean there is no signal time to take yet.
bool hasSignalled(nsecs_t signalTime) {
    return signalTime != Fence::SIGNAL_TIME_PENDING && signalTime != Fence::SIGNAL_TIME_INVALID;
}

}  // namespace

FrameTimingsAggregator::FrameTimingsAggregator(uint32_t uid)
    : mUid(uid),
      mHistory(HISTORY_SIZE),
      mDequeueOrder(DEQUEUE_ORDER_SIZE),
      mFenceTimes(new FenceTimePool()) {}

void FrameTimingsAggregator::broadcast(EventType type, nsecs_t time, int slot) const {
    EventDispatcher::broadcastEvent(mUid, type, time, slot);
}

void FrameTimingsAggregator::requestTiming(const nsecs_t& t) {
    std::lock_guard lock(mMutex);
    mLastRequestTime = t;
}

void FrameTimingsAggregator::dequeueTimings(const nsecs_t& t, const int& slot) {
    if (!isValidSlot(slot)) return;
    nsecs_t requestTime;
    {
        std::lock_guard lock(mMutex);
        mSlots[slot].mDequeueTime = t;
        mSlots[slot].mRequestTime = requestTime = mLastRequestTime;
        mDequeueOrder.push(slot);
    }
    broadcast(eBufferRequestedEvent, requestTime, slot);
    broadcast(eBufferDequeuedEvent, t, slot);
}

void FrameTimingsAggregator::queueTimings(const nsecs_t& t, const int& slot) {
    if (!isValidSlot(slot)) return;
    {
        std::lock_guard lock(mMutex);
        mSlots[slot].mQueueTime = t;
    }
    broadcast(eBufferQueuedEvent, t, slot);
}

void FrameTimingsAggregator::acquireFenceTimings(const SharedPtrWrapper<FenceTime>& fence,
                                                 const int& slot) {
    if (!isValidSlot(slot)) return;
    std::lock_guard lock(mMutex);
    mSlots[slot].mAcquireFence = fence;
}

void FrameTimingsAggregator::receivedFrameTimings(const nsecs_t& t, const int& slot) {
    if (!isValidSlot(slot)) return;
    std::lock_guard lock(mMutex);
    mSlots[slot].mReceivedTime = t;
}

void FrameTimingsAggregator::presentFenceTimings(const SharedPtrWrapper<FenceTime>& fence,
                                                 const int& slot) {
    if (!isValidSlot(slot)) return;
    std::lock_guard lock(mMutex);
    mSlots[slot].mPresentFence = fence;
}

void FrameTimingsAggregator::compositionTimings(const nsecs_t& t, const int& slot) {
    if (!isValidSlot(slot)) return;
    std::lock_guard lock(mMutex);
    mSlots[slot].mCompositionTime = t;
}

void FrameTimingsAggregator::releaseFrameTimings(const nsecs_t& t, const int& slot) {
    if (!isValidSlot(slot)) return;
    std::lock_guard lock(mMutex);
    mSlots[slot].mReleaseFrameTime = t;
}

void FrameTimingsAggregator::releaseBufferTimings(const nsecs_t& t, const int& slot) {
    if (!isValidSlot(slot)) return;
    checkFenceTimes(slot);
    {
        std::lock_guard lock(mMutex);
        FrameTimings& timings = mSlots[slot];
        timings.mReleaseBufferTime = t;
        // A copy: the history shares the fences that have not signalled yet.
        mHistory.push(timings);
        timings = FrameTimings::DEFAULT;
    }
    broadcast(eBufferReleasedEvent, t, slot);
}

void FrameTimingsAggregator::frameNumberForIndex(const uint64_t& frameNumber, const int& slot) {
    if (!isValidSlot(slot)) return;
    std::lock_guard lock(mMutex);
    mSlots[slot].mFrameNumber = frameNumber;
}

void FrameTimingsAggregator::checkFenceTimes(const int& slot) {
    if (!isValidSlot(slot)) return;
    ScopedTrace trace("checkFenceTimes");
    UniqueLock<std::mutex> lock(mMutex);
    checkFenceTimes(slot, lock);
}

void FrameTimingsAggregator::checkFenceTimes(const int& slot, std::unique_lock<std::mutex>& lock) {
    if (!isValidSlot(slot)) return;
    FrameTimings& timings = mSlots[slot];
    if (timings.mAcquireFence != nullptr) {
        const nsecs_t signalTime = timings.mAcquireFence->getSignalTime();
        if (hasSignalled(signalTime)) {
            timings.mAcquireFence.reset();
            timings.mAcquireTime = signalTime;
            lock.unlock();
            broadcast(eBufferCompletedEvent, signalTime, slot);
            lock.lock();
        }
    }
    if (timings.mPresentFence != nullptr) {
        const nsecs_t signalTime = timings.mPresentFence->getSignalTime();
        if (hasSignalled(signalTime)) {
            timings.mPresentFence.reset();
            timings.mPresentTime = signalTime;
            lock.unlock();
            broadcast(eBufferDisplayedEvent, signalTime, slot);
            lock.lock();
        }
    }
}

uint32_t FrameTimingsAggregator::getNewestFrameTimings(uint32_t count, FrameTimings* out) {
    UniqueLock<std::mutex> lock(mMutex);
    uint32_t n = 0;
    int first = -1;
    // A slot that recurs has been reported already: the walk ends at the newest slot's previous
    // dequeue. The ring is re-read at every step, since polling a fence releases the mutex.
    for (int32_t i = 0; i < static_cast<int32_t>(mDequeueOrder.size()); i++) {
        if (n >= count) return n;
        const int slot = mDequeueOrder.at(i);
        if (slot == first) break;
        if (mSlots[slot].isValid()) {
            checkFenceTimes(slot, lock);
            out[n] = mSlots[slot];
            // The slot was released while its fences were polled; the stale copy still counts.
            if (!out[n].isValid()) ILOG(2, "DistributionBasedLRDelayer Invalid FrameTimings!");
            n++;
        }
        if (first == -1) first = mDequeueOrder.at(i);
    }
    n += mHistory.serialize(out + n, count - n, 0);
    return n;
}

void FrameTimingsAggregator::dump(String8& out, const char* prefix) const {
    std::lock_guard lock(mMutex);
    int inFlight = 0;
    for (const FrameTimings& timings : mSlots) {
        if (timings.isValid()) inFlight++;
    }
    out.appendFormat(
            "%sFrameTimingsAggregator uid=%u inFlight=%d history=%u/%u lastRequestTime=%ld\n",
            prefix, mUid, inFlight, mHistory.size(), mHistory.capacity(), mLastRequestTime);
}

}  // namespace android::Interpolation
