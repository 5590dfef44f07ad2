#pragma once

#include <ui/Fence.h>
#include <ui/GraphicBuffer.h>
#include <utils/StrongPointer.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>
#include <vector>

namespace android {

// One game buffer as it travels through the engine. A default-constructed FrameItem is the empty
// frame that every failed look-up returns; each empty frame gets a timestamp of its own, so it
// never matches another frame by identity.
struct FrameItem {
    static std::atomic<uint64_t> mEmptyFrameCounter;

    uint64_t mIndex;       // the producer's frame number
    int32_t mTextureSlot;  // buffer-queue slot
    sp<GraphicBuffer> mGraphicBuffer;
    nsecs_t mID;         // desired display time: timestamp + display delay
    nsecs_t mTimestamp;  // sanitised queue timestamp; the frame's identity
    sp<Fence> mAcquireFence;
    bool mAcquired;
    // mAcquireFence once it has been seen signalled: a fence that has signalled stays signalled,
    // so it is not polled again. Tied to the fence object, so that a frame given another fence
    // polls that one.
    const Fence* mSignalledFence = nullptr;

    FrameItem();
    FrameItem(const FrameItem&) = default;
    FrameItem& operator=(const FrameItem&) = default;
    FrameItem(FrameItem&&) = default;
    FrameItem& operator=(FrameItem&&) = default;
    ~FrameItem() = default;

    // Merges a newer copy of the same frame; unlike assignment it never clears mAcquired.
    void update(const FrameItem& other);

    bool isEmpty() const { return mGraphicBuffer == nullptr; }
    // Its acquire fence has signalled (polled, never waited on) or it came in acquired.
    bool isReady() const;
    // A queued frame that can be composed: a desired display time, and ready.
    bool isValid() const { return mID != 0 && isReady(); }
    // The same, remembering a signal it sees. Defined here so that the poll is made from the
    // caller's own frame: after a system call each return above it is mispredicted.
    bool pollReady() {
        if (mAcquired || mAcquireFence == nullptr || mSignalledFence == mAcquireFence.get()) {
            return true;
        }
        if (mAcquireFence->wait(0) != NO_ERROR) return false;
        mSignalledFence = mAcquireFence.get();
        return true;
    }
    bool pollValid() { return mID != 0 && pollReady(); }
};

namespace Interpolation {

// Selects the render-state builder and release picker of a layer.
enum InterpolationMode : uint32_t {
    eRetimeMode = 0,
    eFillInMode = 1,
    eNoInterpMode = 2,
    eJustInTimeMode = 3,
    eUnlimitedMode = 4,
    eLatencyReductionMode = 5,
};

struct RenderItem {
    FrameItem frame;
    float alpha = 0.0f;  // weight over the items below; 1 for the opaque bottom item
    uint32_t blend = 0;  // 0: opaque, 1: blended with alpha
};

// What is composed for one layer at one display time: bottom item first, at most two items, each
// locked in the layer's FrameList until the host unlocks it.
struct RenderState {
    std::vector<RenderItem> items;

    // Mean of the items' mIDs with every term truncated on its own (ts0/2 + ts1/2); 0 when empty.
    nsecs_t meanFrameID() const;
};

}  // namespace Interpolation
}  // namespace android
