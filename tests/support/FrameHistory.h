#pragma once

#include <memory>

#include "FrameTimings.h"

namespace android::test {

constexpr nsecs_t FRAME_PERIOD = 10'000'000;

// Records frames first..last of a game cycling through three buffers, in slot 0 as the host
// would: frame n is dequeued at n * FRAME_PERIOD and rendered in `render`; its buffer is released
// releaseToDequeue(n + 3) before frame n + 3 dequeues it again.
template <typename ReleaseToDequeue>
void addFrames(Interpolation::FrameTimingsAggregator& timings, uint64_t first, uint64_t last,
               nsecs_t render, ReleaseToDequeue releaseToDequeue) {
    for (uint64_t n = first; n <= last; n++) {
        const nsecs_t dequeue = static_cast<nsecs_t>(n) * FRAME_PERIOD;
        const nsecs_t release = dequeue + 3 * FRAME_PERIOD - releaseToDequeue(n + 3);
        timings.dequeueTimings(dequeue, 0);
        timings.frameNumberForIndex(n, 0);
        timings.acquireFenceTimings(
                std::make_shared<FenceTime>(Fence::createSignalled(dequeue + render)), 0);
        timings.releaseFrameTimings(release, 0);
        timings.releaseBufferTimings(release, 0);
    }
}

inline void addSteadyFrames(Interpolation::FrameTimingsAggregator& timings, uint64_t first,
                            uint64_t last, nsecs_t render, nsecs_t releaseToDequeue) {
    addFrames(timings, first, last, render, [=](uint64_t) { return releaseToDequeue; });
}

}  // namespace android::test
