#include <ui/FenceTime.h>

namespace android {

const std::shared_ptr<FenceTime> FenceTime::NO_FENCE = std::make_shared<FenceTime>(Fence::NO_FENCE);

FenceTime::FenceTime(const sp<Fence>& fence)
    : mFence(fence != nullptr && fence->isValid() ? fence : nullptr) {}

nsecs_t FenceTime::getSignalTime() const {
    return mFence != nullptr ? mFence->getSignalTime() : Fence::SIGNAL_TIME_INVALID;
}

}  // namespace android
