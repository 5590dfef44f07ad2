#include "FrameItem.h"

#include <limits>

namespace android {

std::atomic<uint64_t> FrameItem::mEmptyFrameCounter{0};

FrameItem::FrameItem()
    : mIndex(std::numeric_limits<uint64_t>::max()),
      mTextureSlot(0),
      mID(0),
      mTimestamp(static_cast<nsecs_t>(mEmptyFrameCounter.fetch_add(1))),
      mAcquireFence(Fence::NO_FENCE),
      mAcquired(false) {}

void FrameItem::update(const FrameItem& other) {
    mID = other.mID;
    mIndex = other.mIndex;
    mTextureSlot = other.mTextureSlot;
    // A frame's acquire call usually brings the same buffer and fence again; assigning them anew
    // would only take and drop references.
    if (mGraphicBuffer != other.mGraphicBuffer) mGraphicBuffer = other.mGraphicBuffer;
    mTimestamp = other.mTimestamp;
    if (mAcquireFence != other.mAcquireFence) mAcquireFence = other.mAcquireFence;
    // What either copy has seen of the fence kept.
    if (other.mSignalledFence == mAcquireFence.get()) {
        mSignalledFence = other.mSignalledFence;
    } else if (mSignalledFence != mAcquireFence.get()) {
        mSignalledFence = nullptr;
    }
    mAcquired = mAcquired || other.mAcquired;
}

bool FrameItem::isReady() const {
    // Acquired frames, and fences seen signalled before, skip the poll, which costs a syscall.
    return mAcquired || mAcquireFence == nullptr || mSignalledFence == mAcquireFence.get() ||
           mAcquireFence->wait(0) == NO_ERROR;
}

namespace Interpolation {

nsecs_t RenderState::meanFrameID() const {
    // A state holds one or two items: their divisors are constants, which cost no division.
    switch (items.size()) {
        case 0:
            return 0;
        case 1:
            return items[0].frame.mID;
        case 2:
            return items[0].frame.mID / 2 + items[1].frame.mID / 2;
        default:
            break;
    }
    const nsecs_t count = static_cast<nsecs_t>(items.size());
    nsecs_t mean = 0;
    for (const RenderItem& item : items) {
        mean += item.frame.mID / count;
    }
    return mean;
}

}  // namespace Interpolation
}  // namespace android
