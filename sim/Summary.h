#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "sim/Measures.h"
#include "sim/Options.h"

namespace verolux::sim {

// What the run knew of a layer besides its records.
struct LayerFacts {
    std::string role;  // "run" or "reference"
    uint32_t mode = 0;
    double runSec = 0;
    uint32_t buffers = 0;
    bool buffersFixed = false;            // by --slots or queueSize rather than sized for the delay
    uint64_t bufferBytes = 0;             // all the layer's buffers at the game's resolution
    std::string resolution;               // "1920x1080"
    std::optional<double> ownFps;         // the rate the game runs at on its own
    double refreshHz = 0;                 // the display's true refresh rate
    nsecs_t startTime = 0;                // stutter times count from here
    bool captureEnded = false;            // the run stopped because its capture ran out
    bool refreshRateChanged = false;      // the display changed its rate during the run
    TimeMode time = TimeMode::SIMULATED;  // how the run kept time
};

struct Summary {
    LayerFacts facts;
    MeasuredLayer measured;
};

// The game queued under this share of its own rate: it was held back.
constexpr double THROTTLE_SHARE = 0.98;

bool throttled(const Summary& summary);

// A column of the summary table: a layer's summary under a title.
struct SummaryColumn {
    std::string title;
    const Summary* summary;
};

// The run, and the reference beside it when there is one, under their titles ("run: mode 0
// retime").
std::vector<SummaryColumn> runColumns(const Summary& run, const Summary* reference);

// One line of the summary table: the titles (first, as a section), a section title (no values) or
// a measure with a value per column.
struct SummaryRow {
    std::string label;
    std::vector<std::string> values;
    bool section = false;
};

std::vector<SummaryRow> summaryRows(const std::vector<SummaryColumn>& columns);

// The table as text: the labels, then each column as wide as its widest value and two spaces, and
// at least `minWidth`.
std::string formatTable(const std::vector<SummaryRow>& rows, size_t minWidth);

// A measure of the table as the table gives it, by its row's label; empty for no such row.
std::string summaryValue(const Summary& summary, std::string_view label);

// Plain sentences above the table: whether interpolation made the motion smoother and what it
// cost, then warnings about the run itself (a held-back game, skipped vsyncs).
std::vector<std::string> findings(const Summary& run, const Summary* reference);

// The same for runs of one game side by side: each run's motion and cost against the baseline's
// (when there is one; its own column is not compared), then each one's notes and warnings.
std::vector<std::string> comparisonFindings(const std::vector<SummaryColumn>& columns,
                                            const Summary* baseline);

// The name of an interpolation mode: "retime" for 0, ... "latency reduction" for 5.
const char* modeName(uint32_t mode);

// The watchdog warnings of the layers in time order, one line each ("none" when there were none),
// as the settings client read them back; each names its layer by its role.
std::vector<std::string> ledgerLines(const std::vector<const Summary*>& layers);

// The findings, a blank line, the table with the reference in a second column, and the ledger of
// watchdog warnings.
std::string formatSummary(const Summary& run, const Summary* reference = nullptr);

// The further copies of the run (--layers), a line each with the measures that tell them apart
// from the run; empty without copies.
std::string formatCopies(const std::vector<Summary>& copies);

}  // namespace verolux::sim
