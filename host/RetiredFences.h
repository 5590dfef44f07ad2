#pragma once

#include <ui/Fence.h>
#include <utils/StrongPointer.h>

#include <mutex>
#include <vector>

#include "FrameItem.h"

namespace verolux::host {

// Keeps the fences of frames the composition thread is done with, so that their last references
// drop on another thread: dropping a fence's last reference closes its descriptor, a system call
// the composition thread has no time for. At most CAPACITY are kept, in storage reserved once;
// past that a fence is left to drop where it would have.
class RetiredFences {
public:
    static constexpr size_t CAPACITY = 64;

    RetiredFences();

    // The fences of a composed state that is done with, which the queue may have let go of
    // meanwhile, and of frames taken out of the queue. The frames give their fences up.
    void retire(android::Interpolation::RenderState& done);
    void retire(std::vector<android::FrameItem>& removed);
    // Drops what was kept, on the calling thread. Not called on two threads at once.
    void drop();

private:
    void keepLocked(android::sp<android::Fence> fence);

    std::mutex mMutex;
    std::vector<android::sp<android::Fence>> mFences;    // guarded by mMutex
    std::vector<android::sp<android::Fence>> mDropping;  // used by drop() alone
};

}  // namespace verolux::host
