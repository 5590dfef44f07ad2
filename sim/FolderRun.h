#pragma once

#include <atomic>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/Expectations.h"
#include "sim/Options.h"
#include "sim/Result.h"
#include "sim/Scenario.h"
#include "sim/Simulation.h"
#include "sim/Summary.h"

namespace verolux::sim {

// What one run left in its output folder, and its summaries.
struct FolderRun {
    RunResult result;
    // The run's options as the summary and the report show them, row by row.
    std::vector<std::pair<std::string, std::string>> described;
    // One per layer: the run, the reference unless left out, then the copies.
    std::vector<Summary> summaries;
    bool hasReference = false;
    // A scenario's expectations checked against the run's layer.
    std::vector<CheckedExpectation> expectations;
    std::string summaryText;  // as summary.txt holds it, the expectations last
    uint64_t engineLogLines = 0;
    // The files that could not be written, one error line each; the run itself is complete.
    std::vector<std::string> errors;

    const Summary& run() const { return summaries.front(); }
    const Summary* reference() const { return hasReference ? &summaries[1] : nullptr; }
};

// The summary of one layer of a finished run: its measures and what the run knew of it besides.
Summary summarizeLayer(const Options& options, const Simulation& simulation,
                       const RunResult& result, size_t layer, const MeasuredLayer& measured,
                       const Capture* capture, const Scenario* scenario);

// Runs one simulation (Simulation) into options.outDir and writes every file there except the
// figures and the report (drawFigures and writeReport draw them from these): run.json,
// engine.log, the record files, dumpsys.txt, ringlog.bin and summary.txt. Fails, with a one-line
// error, only when the folder or a file cannot be opened before the run. A front end that runs
// several simulations in one process calls it once per run: each run starts from the library's
// process-wide state as the first would (see Simulation), and in simulated time gives the same
// files for the same inputs. With `progress`, it announces the run there, and reports how it goes.
// A scenario (Scenario.h) plays its game, display, client-composition bursts and deliveries of
// settings; its option defaults and first settings are already in `options` and `settings`.
Result<FolderRun> runIntoFolder(const Options& options,
                                const std::vector<host::SettingValue>& settings,
                                const Capture* capture, const std::atomic<bool>& interrupted,
                                std::ostream* progress, const Scenario* scenario = nullptr);

}  // namespace verolux::sim
