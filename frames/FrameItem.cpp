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
    mGraphicBuffer = other.mGraphicBuffer;
    mTimestamp = other.mTimestamp;
    mAcquireFence = other.mAcquireFence;
    mAcquired = mAcquired || other.mAcquired;
}

bool FrameItem::isReady() const {
    // Acquired frames skip the fence poll, which costs a syscall.
    return mAcquired || mAcquireFence == nullptr || mAcquireFence->wait(0) == NO_ERROR;
}

namespace Interpolation {

nsecs_t RenderState::meanFrameID() const {
    const nsecs_t count = static_cast<nsecs_t>(items.size());
    nsecs_t mean = 0;
    for (const RenderItem& item : items) {
        mean += item.frame.mID / count;
    }
    return mean;
}

}  // namespace Interpolation
}  // namespace android
