#pragma once

#include <ui/Fence.h>

#include <memory>

namespace android {

// Read-only view of a fence's signal time, shared between the stages that track one frame.
class FenceTime {
public:
    static const std::shared_ptr<FenceTime> NO_FENCE;

    explicit FenceTime(const sp<Fence>& fence);
    FenceTime(const FenceTime&) = delete;
    FenceTime& operator=(const FenceTime&) = delete;

    bool isValid() const { return mFence != nullptr; }

    // The signal time, Fence::SIGNAL_TIME_PENDING while pending, Fence::SIGNAL_TIME_INVALID for an
    // invalid fence.
    nsecs_t getSignalTime() const;

private:
    const sp<Fence> mFence;  // null for an invalid fence
};

}  // namespace android
