#include "host/RetiredFences.h"

namespace verolux::host {

RetiredFences::RetiredFences() {
    mFences.reserve(CAPACITY);
    mDropping.reserve(CAPACITY);
}

void RetiredFences::retire(android::Interpolation::RenderState& done) {
    std::lock_guard lock(mMutex);
    for (android::Interpolation::RenderItem& item : done.items)
        keepLocked(std::move(item.frame.mAcquireFence));
}

void RetiredFences::retire(std::vector<android::FrameItem>& removed) {
    std::lock_guard lock(mMutex);
    for (android::FrameItem& frame : removed)
        keepLocked(std::move(frame.mAcquireFence));
}

void RetiredFences::keepLocked(android::sp<android::Fence> fence) {
    // An invalid fence has no descriptor to close.
    if (fence == nullptr || !fence->isValid() || mFences.size() == CAPACITY) return;
    mFences.push_back(std::move(fence));
}

void RetiredFences::drop() {
    {
        std::lock_guard lock(mMutex);
        mDropping.swap(mFences);
    }
    mDropping.clear();
}

}  // namespace verolux::host
