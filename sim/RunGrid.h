#pragma once

#include <atomic>
#include <ostream>
#include <string>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/FolderRun.h"
#include "sim/Options.h"
#include "sim/Report.h"
#include "sim/Scenario.h"
#include "sim/Summary.h"

namespace verolux::sim {

// One run of several on the same game (a mode of --compare, a cell of --sweep), into a folder of
// its own (options.outDir).
struct GridCell {
    std::string title;  // "mode 0 retime", "delayMs=32 smartDelay=false"
    Options options;
    std::vector<host::SettingValue> settings;
};

struct GridRuns {
    std::vector<FolderRun> runs;      // in the order of the cells; fewer when interrupted
    std::vector<std::string> titles;  // theirs; an interrupted run's says so
    bool interrupted = false;
    std::vector<std::string> errors;  // files that could not be written, one line each

    // Each run's layer under its title, its role the title too (so that notes and the ledger name
    // it).
    std::vector<SummaryColumn> columns() const;
};

// Runs the cells one after the other, as runIntoFolder, each announced on `progress` with its
// place in the grid ("[2/4] mode 2 no interpolation"); stops after one that was interrupted, and
// keeps what finished. Fails, with a one-line error, only when a cell's folder cannot be opened.
Result<GridRuns> runGrid(const std::vector<GridCell>& cells, const Capture* capture,
                         const Scenario* scenario, const std::atomic<bool>& interrupted,
                         std::ostream* progress);

// 0 when the grid has runs to report on; else prints why there are none and returns the exit
// status: 2 when a cell's folder could not be opened, 130 when interrupted before a run finished.
int gridFailure(const Result<GridRuns>& ran);

// The options of the grid's first run as the report lists them, less what differs from cell to
// cell (the buffers) and with the settings every cell shares.
std::vector<std::pair<std::string, std::string>> gridOptions(
        const GridRuns& grid, const std::vector<host::SettingValue>& settings);

// What a grid leaves beside its cells' folders: summary.txt with `summary` and report.html with
// `page`, the ledger and the expectations of every run added to both. Prints all that and the
// files, or with --quiet the failed expectations only; returns the exit status: 130 when
// interrupted, 1 when an expectation failed or a file could not be written, else 0.
int finishGrid(const Options& options, GridRuns& grid, const std::string& summary, ReportPage page,
               const std::string& cellsText);

}  // namespace verolux::sim
