#pragma once

#include <ui/FenceTime.h>
#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <memory>
#include <mutex>

#include "EventDispatcher.h"
#include "FenceTimePool.h"
#include "RingBuffer.h"

namespace android::Interpolation {

// A fence's signal time shared between the stages that track one frame; may be empty.
template <typename T>
using SharedPtrWrapper = std::shared_ptr<T>;

// The time stamps of one frame's life in its buffer slot. -1 (all ones for the frame number) means
// "not recorded yet".
struct FrameTimings {
    // Slots are reset by copying this, which allocates nothing.
    static const FrameTimings DEFAULT;

    uint64_t mFrameNumber = UINT64_MAX;
    nsecs_t mRequestTime = -1;
    nsecs_t mDequeueTime = -1;
    nsecs_t mQueueTime = -1;
    SharedPtrWrapper<FenceTime> mAcquireFence;  // emptied once it has signalled
    nsecs_t mAcquireTime = -1;                  // the acquire fence's signal time
    nsecs_t mCompositionTime = -1;
    SharedPtrWrapper<FenceTime> mPresentFence;  // emptied once it has signalled
    nsecs_t mPresentTime = -1;                  // the present fence's signal time
    nsecs_t mReceivedTime = -1;
    nsecs_t mReleaseFrameTime = -1;
    nsecs_t mReleaseBufferTime = -1;

    // Whether any stage a frame in flight must have passed was recorded. The fence times,
    // composition and frame release are not consulted.
    bool isValid() const {
        return mFrameNumber != UINT64_MAX || mRequestTime != -1 || mDequeueTime != -1 ||
               mQueueTime != -1 || mReceivedTime != -1 || mReleaseBufferTime != -1;
    }
};

// Collects the stage times of each buffer slot of one game layer while its frame is in flight, and
// keeps the finished records of the last HISTORY_SIZE frames. The dequeue, queue, fence and release
// stages are announced on the event bus for the layer's uid, always with the mutex released, so
// receivers may call back in.
//
// A slot outside 0..NUM_BUFFER_SLOTS-1 makes every operation do nothing.
class FrameTimingsAggregator final : public virtual RefBase {
public:
    static constexpr int NUM_BUFFER_SLOTS = 64;
    static constexpr uint32_t HISTORY_SIZE = 100;
    // One entry per slot the table accepts holds every set of distinct slots in flight; more would
    // only feed repeats to getNewestFrameTimings.
    static constexpr uint32_t DEQUEUE_ORDER_SIZE = NUM_BUFFER_SLOTS;

    explicit FrameTimingsAggregator(uint32_t uid);

    // The game asked for a buffer; the next dequeue carries this time.
    void requestTiming(const nsecs_t& t);
    void dequeueTimings(const nsecs_t& t, const int& slot);
    void queueTimings(const nsecs_t& t, const int& slot);
    void acquireFenceTimings(const SharedPtrWrapper<FenceTime>& fence, const int& slot);
    void receivedFrameTimings(const nsecs_t& t, const int& slot);
    void presentFenceTimings(const SharedPtrWrapper<FenceTime>& fence, const int& slot);
    void compositionTimings(const nsecs_t& t, const int& slot);
    void releaseFrameTimings(const nsecs_t& t, const int& slot);
    // Finishes the slot's record: polls its fences, stamps it and moves it into the history.
    void releaseBufferTimings(const nsecs_t& t, const int& slot);
    void frameNumberForIndex(const uint64_t& frameNumber, const int& slot);
    // A wrapper of `fence` for the stage records, from this aggregator's pool.
    SharedPtrWrapper<FenceTime> wrapFence(const sp<Fence>& fence) const {
        return mFenceTimes->wrap(fence);
    }

    // Takes the signal times of the slot's fences that have signalled. Pending and invalid fences
    // stay attached, to be polled again.
    void checkFenceTimes(const int& slot);
    // The same under a lock that already holds this aggregator's mutex; it is released around each
    // broadcast (std::unique_lock raises its usual error if it does not hold it then).
    void checkFenceTimes(const int& slot, std::unique_lock<std::mutex>& lock);

    // Fills out with up to count records: the frames in flight, newest dequeue first, then the
    // newest finished frames. Returns the number written.
    uint32_t getNewestFrameTimings(uint32_t count, FrameTimings* out);

    void dump(String8& out, const char* prefix) const;

private:
    static bool isValidSlot(int slot) { return slot >= 0 && slot < NUM_BUFFER_SLOTS; }
    void broadcast(EventType type, nsecs_t time, int slot) const;

    mutable std::mutex mMutex;
    const uint32_t mUid;
    FrameTimings mSlots[NUM_BUFFER_SLOTS];  // guarded by mMutex
    RingBuffer<FrameTimings> mHistory;      // guarded by mMutex
    nsecs_t mLastRequestTime = -1;          // guarded by mMutex
    RingBuffer<int> mDequeueOrder;          // guarded by mMutex; slots, in order of dequeue
    const sp<FenceTimePool> mFenceTimes;
};

}  // namespace android::Interpolation
