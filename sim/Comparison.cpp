#include "sim/Comparison.h"

#include <json/json.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <iostream>

#include "sim/Report.h"
#include "sim/RunGrid.h"

namespace verolux::sim {

namespace {

constexpr uint32_t NO_INTERPOLATION = 2;

std::string modeTitle(uint32_t mode) {
    return "mode " + std::to_string(mode) + " " + modeName(mode);
}

// run.json for the figure script: the modes' runs as the layers to draw, from their subfolders.
Status writeComparisonJson(const Options& options, const GridRuns& grid,
                           const std::vector<std::string>& folders) {
    Json::Value json(Json::objectValue);
    json["comparison"] = true;
    json["refresh_period_ns"] = Json::Int64(std::llround(1e9 / options.hz));
    for (size_t i = 0; i < grid.runs.size(); i++) {
        Json::Value layer(Json::objectValue);
        layer["role"] = grid.titles[i];
        layer["title"] = grid.titles[i];
        layer["prefix"] = folders[i] + "/";
        json["layers"].append(layer);
    }
    const std::filesystem::path path = std::filesystem::path(options.outDir) / "run.json";
    std::ofstream file(path);
    file << json.toStyledString();
    if (!file) return {errorLine("cannot write " + path.string())};
    return {};
}

}  // namespace

int compareModes(const Options& options, const std::vector<host::SettingValue>& settings,
                 const Capture* capture, const Scenario* scenario,
                 const std::atomic<bool>& interrupted) {
    std::vector<GridCell> cells;
    std::vector<std::string> folders;
    std::string modes;
    for (uint32_t mode : options.compare) {
        GridCell& cell = cells.emplace_back();
        cell.title = modeTitle(mode);
        cell.options = options;
        cell.options.mode = mode;
        // Mode 2 is what the compositor shows without the engine: a column when asked for.
        cell.options.reference = false;
        folders.push_back("mode-" + std::to_string(mode));
        cell.options.outDir = (std::filesystem::path(options.outDir) / folders.back()).string();
        cell.settings = settings;
        modes += (modes.empty() ? "" : ", ") + std::to_string(mode);
    }
    Result<GridRuns> ran =
            runGrid(cells, capture, scenario, interrupted, options.quiet ? nullptr : &std::cerr);
    if (const int failed = gridFailure(ran)) return failed;
    GridRuns& grid = ran.value;
    const std::vector<SummaryColumn> columns = grid.columns();
    const Summary* baseline = nullptr;
    for (size_t i = 0; i < grid.runs.size(); i++) {
        if (options.compare[i] == NO_INTERPOLATION) baseline = columns[i].summary;
    }

    ReportPage page;
    page.heading = "verolux-sim: modes " + modes + " compared";
    page.findings = comparisonFindings(columns, baseline);
    page.options = gridOptions(grid, settings);
    for (auto& [name, value] : page.options) {
        if (name == "mode") {
            name = "modes";
            value = modes + " (one run each, in mode-N/)";
        }
    }
    page.table = summaryRows(columns);
    std::string text;
    for (const std::string& line : page.findings)
        text += line + "\n";
    text += (text.empty() ? "" : "\n") + formatTable(page.table, 0);

    if (options.figures) {
        Status written = writeComparisonJson(options, grid, folders);
        if (written.ok()) {
            if (!options.quiet) std::cerr << "verolux-sim: drawing the figure..." << std::endl;
            written = drawFigures(options.outDir);
        }
        if (!written.ok()) std::cerr << written.error << std::endl;
        page.figures = {{"comparison.png",
                         "Animation error per refresh (smaller is smoother) and latency from "
                         "queue to screen per frame, each mode a colour."}};
    }
    return finishGrid(options, grid, text, page,
                      "mode-N/         each mode's run: frames.csv, refreshes.csv, "
                      "presentmon.csv, trace.json, ...\n"
                      "                  (sim/figures.py mode-N draws its figures)\n" +
                              std::string(options.figures ? "  comparison.png  the figure\n" : ""));
}

}  // namespace verolux::sim
