#pragma once

#include <atomic>

#include "FrameItem.h"

namespace android::test {

// A uid no other test uses: what one test leaves in the process-wide singletons never reaches another.
inline uint32_t nextTestUid() {
    static std::atomic<uint32_t> next{100000};
    return next++;
}

// A queued frame with a 1x1 buffer; its timestamp is its mID unless given.
inline FrameItem makeFrame(nsecs_t id, bool acquired = true, sp<Fence> fence = Fence::NO_FENCE,
                           nsecs_t timestamp = -1) {
    FrameItem frame;
    frame.mIndex = static_cast<uint64_t>(id);
    frame.mTextureSlot = static_cast<int32_t>(id % 64);
    frame.mGraphicBuffer = new GraphicBuffer(1, 1, PIXEL_FORMAT_RGBA_8888);
    frame.mID = id;
    frame.mTimestamp = timestamp >= 0 ? timestamp : id;
    frame.mAcquireFence = fence;
    frame.mAcquired = acquired;
    return frame;
}

}  // namespace android::test
