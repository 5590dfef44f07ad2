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

// report.html: the run's options and the summary table side by side, the findings above them,
// and the figures found in the folder below.
Status writeReport(const std::string& folder,
                   const std::vector<std::pair<std::string, std::string>>& options,
                   const Summary& run, const Summary* reference);

}  // namespace verolux::sim
