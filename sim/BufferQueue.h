#pragma once

#include <ui/Fence.h>
#include <ui/GraphicBuffer.h>

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <vector>

namespace verolux::sim {

// A game's buffer queue: the producer dequeues a free slot, draws and queues it; the compositor
// acquires queued buffers in order once their rendering is done, and releases them back.
class BufferQueue {
public:
    struct QueuedBuffer {
        int slot = -1;
        uint64_t frameNumber = 0;
        nsecs_t timestamp = 0;
        android::sp<android::Fence> fence;
    };

    BufferQueue(uint32_t slots, uint32_t width, uint32_t height);

    // Blocks until a slot is free; -1 once the queue is closed. When none is free at first,
    // `onNoFreeSlot` runs once, under the queue's lock, before the wait.
    int dequeue(const std::function<void()>& onNoFreeSlot = {});
    // Queuing takes two steps, so that the compositor hears of a buffer only after the engine has
    // intercepted it, while a release that comes in between already finds the slot queued.
    void markQueued(int slot, uint64_t frameNumber);
    void makeAcquirable(const QueuedBuffer& buffer);
    const android::sp<android::GraphicBuffer>& buffer(int slot) const { return mBuffers[slot]; }

    // Acquires, in queue order, the queued buffers whose rendering is done.
    void acquireReady(const std::function<void(const QueuedBuffer&)>& onAcquired);
    // Gives the slot back to the producer, if it still holds that frame.
    void release(int slot, uint64_t frameNumber);
    // Ends every wait in dequeue().
    void close();

    uint32_t slotCount() const { return static_cast<uint32_t>(mBuffers.size()); }

private:
    enum class State { FREE, DEQUEUED, QUEUED, ACQUIRED };

    const std::vector<android::sp<android::GraphicBuffer>> mBuffers;
    std::mutex mMutex;
    std::condition_variable mSlotFreed;
    std::vector<State> mStates;           // guarded by mMutex
    std::vector<uint64_t> mFrameNumbers;  // guarded by mMutex
    std::deque<QueuedBuffer> mQueued;     // guarded by mMutex; not yet acquired, oldest first
    bool mClosed = false;                 // guarded by mMutex
};

}  // namespace verolux::sim
