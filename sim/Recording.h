#pragma once

#include <utils/Timers.h>

#include <cstdint>
#include <string>
#include <vector>

namespace verolux::sim {

// What one simulated layer did, recorded by the simulator while it runs and turned into the
// summary, the per-refresh CSV, the trace and the picture afterwards. All times are monotonic
// nanoseconds; -1 means "did not happen".

// One game frame, from the producer's dequeue to the release of its buffer.
struct FrameRecord {
    uint64_t number = 0;       // the producer's frame number, from 1
    int slot = -1;             // buffer-queue slot
    nsecs_t contentTime = -1;  // the game time the frame's picture shows
    nsecs_t dequeueTime = -1;
    nsecs_t queueTime = -1;       // also the frame's timestamp
    nsecs_t renderDoneTime = -1;  // when its acquire fence signalled
    nsecs_t acquireTime = -1;
    nsecs_t releaseTime = -1;       // when its buffer went back to the producer
    nsecs_t firstDisplayTime = -1;  // vsync of the first refresh that showed any of it
};

// One item of a composed state.
struct ComposedItem {
    uint64_t frameNumber = 0;  // 0: the empty frame
    float alpha = 0.0f;
    uint32_t blend = 0;
    float weight = 0.0f;  // its share of the composed picture: 1 - alpha of the item above, etc.
};

// One display refresh of the layer.
struct RefreshRecord {
    uint64_t index = 0;
    nsecs_t vsyncTime = -1;
    nsecs_t displayTime = -1;  // the time the state was asked for
    uint32_t kind = 0;         // 8 blend, 16 same picture again, 64 new picture; 0 none announced
    std::vector<ComposedItem> items;
    double contentTime = -1;  // weighted game time of the composed picture; -1 when nothing shown
    nsecs_t delay = -1;       // display delay in force (the last delay announced), -1 when none
    nsecs_t cpuTime = 0;      // library CPU time spent on this refresh (thread CPU clock)
};

struct DelayChange {
    nsecs_t time = -1;
    nsecs_t delay = 0;
};

struct Recording {
    std::string layerName;
    uint32_t uid = 0;
    uint32_t mode = 0;
    nsecs_t refreshPeriod = 0;
    nsecs_t startTime = -1;
    nsecs_t endTime = -1;
    std::vector<FrameRecord> frames;  // in frame-number order: frames[i].number == i + 1
    std::vector<RefreshRecord> refreshes;
    std::vector<DelayChange> delayChanges;
    // One scanline of the composed picture per refresh: scanlineWidth RGB pixels (3 bytes each).
    uint32_t scanlineWidth = 0;
    std::vector<std::vector<uint8_t>> scanlines;
};

// The time the output files count from: the start of the run, or 0 when it was not recorded.
inline nsecs_t timeOrigin(const Recording& recording) {
    return recording.startTime >= 0 ? recording.startTime : 0;
}

}  // namespace verolux::sim
