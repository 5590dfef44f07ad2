#pragma once

#include <cstdint>

namespace verolux::host {

// The frame-rate statistics of one layer, each a count of events in the last second, as the
// layer's LogOutput logs them.
struct FrameRateStatistics {
    int gameFps = 0;          // frames the game queued
    uint32_t realFps = 0;     // the real-rate tracker's latest measure
    int actualFps = 0;        // distinct pictures shown
    int interpolatedFps = 0;  // blended pictures shown
    int missedFps = 0;
    int repeatedFps = 0;
    int skippedFps = 0;
};

}  // namespace verolux::host
