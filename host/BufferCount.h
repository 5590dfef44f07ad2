#pragma once

#include <utils/Timers.h>

#include <cstdint>

#include "FrameItem.h"
#include "Settings.h"

namespace verolux::host {

// How many buffers a game layer's queue gets. A frame that the engine holds for the display delay
// keeps its buffer that long, so a game running at the refresh rate has about delay x rate frames
// waiting, plus the one on screen and the one it is drawing: without that many it waits for a
// free buffer and runs slower than it would on its own.
struct BufferCount {
    // Triple buffering, what a layer gets without a delay.
    static constexpr uint32_t MIN_BUFFERS = 3;
    // The platform's buffer queue has no more slots.
    static constexpr uint32_t MAX_BUFFERS = 64;

    uint32_t count = MIN_BUFFERS;
    bool fixed = false;  // set by queueSize or the user, not sized for the delay
};

// The longest display delay the layer's frames may be held for: none outside mode 0 or without
// applyDelayToFrames; the automatic delay may climb to the delayer's ceiling.
nsecs_t longestDisplayDelay(android::Interpolation::InterpolationMode mode, bool applyDelayToFrames,
                            int32_t defaultDelayMs,
                            const android::Interpolation::Settings& settings);

// queueSize >= 1 fixes the count (within the bounds); otherwise it is sized as above for the
// refresh period, and never below what the mode's release picker keeps queued plus the frame
// being drawn.
BufferCount bufferCountFor(int32_t queueSize, android::Interpolation::InterpolationMode mode,
                           nsecs_t longestDelay, nsecs_t refreshPeriod);

// The same for a layer of `uid` now, from the library's tunables and the uid's settings.
BufferCount bufferCountFor(uint32_t uid, android::Interpolation::InterpolationMode mode,
                           nsecs_t refreshPeriod);

}  // namespace verolux::host
