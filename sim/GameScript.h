#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "sim/Scenario.h"

namespace verolux::sim {

// How the game plays each frame: its rate, jitter and render time from the options, changed by a
// scenario's game segments while they last (the later segment deciding each value it sets), with
// the segments' render-time spikes and reused timestamps.
class GameScript {
public:
    struct Pace {
        double fps = 30;
        double jitterMs = 1;
        double renderMs = 8;
        std::optional<double> spikeRenderMs;  // this frame's render time, a spike
        bool reuseTimestamp = false;          // this frame carries the previous one's timestamp
    };

    // Without segments (nullptr or none), every frame plays the options' values.
    GameScript(double fps, double jitterMs, double renderMs,
               const std::vector<GameSegment>* segments);

    // The pace of the next frame, which starts `sec` seconds into the run. Called once per frame,
    // in order.
    Pace next(double sec);

    // The game's own mean rate over the first `sec` seconds of the run: the frames it would queue
    // if nothing held it back, per second.
    double meanFps(double sec) const;

private:
    // The rate, jitter and render time at `sec`.
    Pace paceAt(double sec) const;

    const Pace mBase;
    const std::vector<GameSegment>* const mSegments;
    std::vector<int64_t> mSpikesTaken;  // per segment: the last spike it played, -1 for none
    std::vector<uint64_t> mFramesIn;    // per segment: the frames it played
};

}  // namespace verolux::sim
