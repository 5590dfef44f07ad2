#include "sim/BufferQueue.h"

#include <algorithm>

namespace verolux::sim {

namespace {

std::vector<android::sp<android::GraphicBuffer>> allocate(uint32_t slots, uint32_t width,
                                                          uint32_t height) {
    std::vector<android::sp<android::GraphicBuffer>> buffers;
    for (uint32_t i = 0; i < slots; i++) {
        buffers.push_back(
                new android::GraphicBuffer(width, height, android::PIXEL_FORMAT_RGBA_8888,
                                           android::GraphicBuffer::USAGE_SW_READ_OFTEN |
                                                   android::GraphicBuffer::USAGE_SW_WRITE_OFTEN));
    }
    return buffers;
}

}  // namespace

BufferQueue::BufferQueue(uint32_t slots, uint32_t width, uint32_t height)
    : mBuffers(allocate(slots, width, height)),
      mStates(slots, State::FREE),
      mFrameNumbers(slots, 0) {}

int BufferQueue::dequeue(const std::function<void()>& onNoFreeSlot) {
    std::unique_lock lock(mMutex);
    bool waited = false;
    while (true) {
        if (mClosed) return -1;
        auto free = std::find(mStates.begin(), mStates.end(), State::FREE);
        if (free != mStates.end()) {
            *free = State::DEQUEUED;
            return static_cast<int>(free - mStates.begin());
        }
        if (!waited && onNoFreeSlot) onNoFreeSlot();
        waited = true;
        mSlotFreed.wait(lock);
    }
}

void BufferQueue::markQueued(int slot, uint64_t frameNumber) {
    std::lock_guard lock(mMutex);
    mStates[slot] = State::QUEUED;
    mFrameNumbers[slot] = frameNumber;
}

void BufferQueue::makeAcquirable(const QueuedBuffer& buffer) {
    std::lock_guard lock(mMutex);
    // Released already, before the compositor ever saw it.
    if (mStates[buffer.slot] != State::QUEUED || mFrameNumbers[buffer.slot] != buffer.frameNumber) {
        return;
    }
    mQueued.push_back(buffer);
}

void BufferQueue::acquireReady(const std::function<void(const QueuedBuffer&)>& onAcquired) {
    while (true) {
        QueuedBuffer next;
        {
            std::lock_guard lock(mMutex);
            if (mQueued.empty() || mQueued.front().fence->wait(0) != android::NO_ERROR) return;
            next = mQueued.front();
            mQueued.pop_front();
            mStates[next.slot] = State::ACQUIRED;
        }
        onAcquired(next);
    }
}

void BufferQueue::release(int slot, uint64_t frameNumber) {
    {
        std::lock_guard lock(mMutex);
        if (slot < 0 || slot >= static_cast<int>(mStates.size())) return;
        if (mFrameNumbers[slot] != frameNumber || mStates[slot] == State::FREE) return;
        // A frame may leave the engine before it was acquired.
        auto queued = std::find_if(mQueued.begin(), mQueued.end(),
                                   [&](const QueuedBuffer& q) { return q.slot == slot; });
        if (queued != mQueued.end()) mQueued.erase(queued);
        mStates[slot] = State::FREE;
    }
    mSlotFreed.notify_all();
}

void BufferQueue::close() {
    {
        std::lock_guard lock(mMutex);
        mClosed = true;
    }
    mSlotFreed.notify_all();
}

}  // namespace verolux::sim
