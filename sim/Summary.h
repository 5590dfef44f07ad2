#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "sim/Measures.h"

namespace verolux::sim {

// What the run knew of a layer besides its records.
struct LayerFacts {
    std::string role;  // "run" or "reference"
    uint32_t mode = 0;
    double runSec = 0;
    uint32_t buffers = 0;
    bool buffersFixed = false;     // by --slots or queueSize rather than sized for the delay
    uint64_t bufferBytes = 0;      // all the layer's buffers at the game's resolution
    std::string resolution;        // "1920x1080"
    std::optional<double> ownFps;  // the rate the game runs at on its own
    double refreshHz = 0;          // the display's true refresh rate
    nsecs_t startTime = 0;         // stutter times count from here
    bool captureEnded = false;     // the run stopped because its capture ran out
};

struct Summary {
    LayerFacts facts;
    MeasuredLayer measured;
};

// The game queued under this share of its own rate: it was held back.
constexpr double THROTTLE_SHARE = 0.98;

bool throttled(const Summary& summary);

// One line of the summary table: a section title (no values) or a measure with the run's value
// and the reference's.
struct SummaryRow {
    std::string label;
    std::string run;
    std::string reference;
    bool section = false;
};

std::vector<SummaryRow> summaryRows(const Summary& run, const Summary* reference);

// Plain sentences above the table: whether interpolation made the motion smoother and what it
// cost, then warnings about the run itself (a held-back game, skipped vsyncs).
std::vector<std::string> findings(const Summary& run, const Summary* reference);

// The name of an interpolation mode: "retime" for 0, ... "latency reduction" for 5.
const char* modeName(uint32_t mode);

// The watchdog warnings of both layers in time order, one line each ("none" when there were none),
// as the settings client read them back.
std::vector<std::string> ledgerLines(const Summary& run, const Summary* reference);

// The findings, a blank line, the table with the reference in a second column, and the ledger of
// watchdog warnings.
std::string formatSummary(const Summary& run, const Summary* reference = nullptr);

// The further copies of the run (--layers), a line each with the measures that tell them apart
// from the run; empty without copies.
std::string formatCopies(const std::vector<Summary>& copies);

}  // namespace verolux::sim
