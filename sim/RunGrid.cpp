#include "sim/RunGrid.h"

#include <filesystem>
#include <fstream>
#include <iostream>

#include "sim/SettingsKeys.h"

namespace verolux::sim {

std::vector<SummaryColumn> GridRuns::columns() const {
    std::vector<SummaryColumn> out;
    for (size_t i = 0; i < runs.size(); i++)
        out.push_back({titles[i], &runs[i].run()});
    return out;
}

Result<GridRuns> runGrid(const std::vector<GridCell>& cells, const Capture* capture,
                         const Scenario* scenario, const std::atomic<bool>& interrupted,
                         std::ostream* progress) {
    using R = Result<GridRuns>;
    R result;
    GridRuns& grid = result.value;
    for (size_t i = 0; i < cells.size() && !interrupted.load(); i++) {
        const GridCell& cell = cells[i];
        if (progress != nullptr) {
            *progress << "verolux-sim: [" << i + 1 << "/" << cells.size() << "] " << cell.title
                      << std::endl;
        }
        Result<FolderRun> ran = runIntoFolder(cell.options, cell.settings, capture, interrupted,
                                              progress, scenario);
        if (!ran.ok()) return R::failure(ran.error);
        FolderRun& run = grid.runs.emplace_back(std::move(ran.value));
        grid.interrupted = run.result.interrupted;
        grid.titles.push_back(cell.title + (grid.interrupted ? " (interrupted)" : ""));
        run.summaries.front().facts.role = cell.title;
        grid.errors.insert(grid.errors.end(), run.errors.begin(), run.errors.end());
    }
    grid.interrupted = grid.interrupted || grid.runs.size() < cells.size();
    return result;
}

int gridFailure(const Result<GridRuns>& ran) {
    if (!ran.ok()) {
        std::cerr << ran.error << std::endl;
        return 2;
    }
    if (!ran.value.runs.empty()) return 0;
    std::cerr << "verolux-sim: interrupted before the first run finished" << std::endl;
    return 130;
}

std::vector<std::pair<std::string, std::string>> gridOptions(
        const GridRuns& grid, const std::vector<host::SettingValue>& settings) {
    std::vector<std::pair<std::string, std::string>> out;
    for (const auto& [name, value] : grid.runs.front().described) {
        if (name.size() > 8 && name.compare(name.size() - 8, 8, " buffers") == 0) continue;
        if (name != "settings") {
            out.emplace_back(name, value);
            continue;
        }
        std::string shared;
        for (const auto& setting : settings)
            shared += (shared.empty() ? "" : " ") + describeSetting(setting);
        out.emplace_back(name, shared.empty() ? "defaults" : shared);
    }
    return out;
}

int finishGrid(const Options& options, GridRuns& grid, const std::string& summary, ReportPage page,
               const std::string& cellsText) {
    int status = grid.interrupted ? 130 : 0;
    std::string text = summary;
    std::vector<const Summary*> layers;
    for (const SummaryColumn& column : grid.columns())
        layers.push_back(column.summary);
    page.ledger = ledgerLines(layers);
    text += "Watchdog warnings: time in the run, time of day, game, code, value\n";
    for (const std::string& line : page.ledger)
        text += "  " + line + "\n";
    for (size_t i = 0; i < grid.runs.size(); i++) {
        for (const CheckedExpectation& checked : grid.runs[i].expectations) {
            const std::string line = grid.titles[i] + ": " + checked.line;
            if (!checked.passed) {
                status = status == 0 ? 1 : status;
                if (options.quiet) std::cout << line << "\n";
            }
            text += (page.expectations.empty() ? "Expectations:\n" : "") + ("  " + line + "\n");
            page.expectations.push_back(line);
        }
    }

    const std::filesystem::path out(options.outDir);
    {
        std::ofstream file(out / "summary.txt", std::ios::binary);
        file << text;
        if (!file)
            grid.errors.push_back(errorLine("cannot write " + (out / "summary.txt").string()));
    }
    if (Status written = writeReport(options.outDir, page); !written.ok()) {
        grid.errors.push_back(written.error);
    }
    for (const std::string& error : grid.errors) {
        std::cerr << error << std::endl;
        status = status == 0 ? 1 : status;
    }
    if (options.quiet) return status;
    if (grid.interrupted) std::cout << "Interrupted: results cover the runs so far.\n";
    std::cout << text << "\nIn " << options.outDir << ":\n"
              << "  report.html     the table" << (page.figures.empty() ? "" : " and the figure")
              << " on one page (open in a browser)\n"
              << "  summary.txt     the summary above\n"
              << "  " << cellsText << std::flush;
    return status;
}

}  // namespace verolux::sim
