#pragma once

#include <string>
#include <utility>
#include <vector>

#include "sim/Result.h"
#include "sim/Summary.h"

namespace verolux::sim {

// The figures the figure script draws from a run's files, with what each shows.
struct Figure {
    const char* file;
    const char* caption;
};
const std::vector<Figure>& figures();

// Runs the figure script (sim/figures.py, with Debian's python3 and its matplotlib) on the output
// folder, which holds run.json and the CSV files. An error line when it could not draw them.
Status drawFigures(const std::string& folder);

// A grid of one measure over the cells of a two-key sweep: rows by the first key's values,
// columns by the second's; marked cells are the sweep's best.
struct ReportGrid {
    std::string title;                   // "animation error p95 (ms)"
    std::string corner;                  // "delayMs down, smartDelay across"
    std::vector<std::string> rowLabels;  // "delayMs=32"
    std::vector<std::string> columnLabels;
    std::vector<std::vector<std::string>> cells;  // [row][column]
    std::vector<std::vector<bool>> marked;
};

// What report.html shows, top to bottom.
struct ReportPage {
    std::string heading;
    std::vector<std::string> findings;
    std::vector<std::pair<std::string, std::string>> options;
    std::vector<SummaryRow> table;
    std::vector<ReportGrid> grids;
    std::vector<std::string> expectations;  // PASS / FAIL lines
    std::vector<std::string> ledger;
    std::vector<Figure> figures;  // those found in the folder are shown
};

// The page of one run: its options and the summary table side by side, the findings above them,
// and the run's figures below.
ReportPage runPage(const std::vector<std::pair<std::string, std::string>>& options,
                   const Summary& run, const Summary* reference);

// report.html in the folder.
Status writeReport(const std::string& folder, const ReportPage& page);

}  // namespace verolux::sim
