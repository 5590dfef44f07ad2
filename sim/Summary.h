#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "sim/Recording.h"

namespace verolux::sim {

// The numbers verolux-sim prints after a run. Values that a recording cannot give (a rate without
// a run length, a latency without a displayed frame) are empty and print as "n/a".
struct Summary {
    uint32_t mode = 0;
    std::optional<double> runSec;  // endTime - startTime
    size_t queuedFrames = 0;       // frames with a queue time
    size_t refreshes = 0;
    std::optional<double> gameFps;       // queued frames per second of run
    std::optional<double> displayedFps;  // refreshes showing a picture unlike the last, per second
    // Shares of all refreshes, 0 to 1, by composition kind; "no state" is any other kind (0: the
    // library announced none), so the four add up to 1.
    double blendShare = 0;
    double repeatShare = 0;
    double newShare = 0;
    double noStateShare = 0;
    // The first and last delays announced; without announcements, those the refreshes carried.
    std::optional<double> startDelayMs;
    std::optional<double> endDelayMs;
    size_t delayChanges = 0;
    // From queue to the first refresh that showed the frame, over frames that were shown;
    // nearest-rank percentiles.
    size_t displayedFrames = 0;
    std::optional<double> latencyP50Ms;
    std::optional<double> latencyP99Ms;
    // Content-time steps between adjacent refreshes that both showed something: their mean and
    // their standard deviation (over n), the judder.
    std::optional<double> meanStepMs;
    std::optional<double> judderMs;
    // Library CPU time per refresh, over all refreshes; p99 nearest-rank.
    std::optional<double> cpuMeanUs;
    std::optional<double> cpuP99Us;
};

Summary summarize(const Recording& recording);

// One line per number, units stated; the reference run, when given, in a second column.
std::string formatSummary(const Summary& run, const Summary* reference = nullptr);

}  // namespace verolux::sim
