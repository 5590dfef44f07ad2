#pragma once

#include <ui/Fence.h>
#include <utils/Timers.h>

namespace verolux::sim {

// The simulated GPU's side of the game's frames: signals each acquire fence when the frame's
// rendering is done, on a thread of its own in real time or as an event in simulated time.
class FenceScheduler {
public:
    virtual ~FenceScheduler() = default;
    virtual void signalAt(android::sp<android::Fence> fence, nsecs_t time) = 0;
};

}  // namespace verolux::sim
