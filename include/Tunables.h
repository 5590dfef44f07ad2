#pragma once

#include <utils/String8.h>

#include <atomic>
#include <cstdint>
#include <vector>

namespace android::Interpolation {

// Process-wide tunables written by the settings parcel and read lock-free everywhere.

// 0 prints nothing, 1 warnings, rejected input and decisions, 2 adds traces.
extern std::atomic<int32_t> logLevel;
// The frame-list capacity the host should apply; -1 leaves it to the host.
extern std::atomic<int32_t> queueSize;
// Display delay in milliseconds that a new Delayer starts with.
extern std::atomic<int32_t> defaultDelay;
extern std::atomic<bool> keepTwoHwcLayers;
// Whether mode 0 adds a Delayer's display delay to the frames it intercepts.
extern std::atomic<bool> applyDelayToFrames;
// Layers whose names contain one of these are never intercepted.
extern std::vector<String8> layerNameBlockList;

}  // namespace android::Interpolation
