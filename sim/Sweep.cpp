#include "sim/Sweep.h"

#include <cstdio>
#include <filesystem>
#include <iostream>

#include "sim/Report.h"
#include "sim/RunGrid.h"

namespace verolux::sim {

namespace {

// The rows of the summary table that a sweep's own table shows per cell, under shorter headings.
struct CellMeasure {
    std::string_view row;
    std::string_view heading;
};
constexpr CellMeasure CELL_MEASURES[] = {
        {"animation error p50 / p95 / p99", "animation error p50 / p95 / p99"},
        {"latency queue to screen p50 / p99", "latency p50 / p99"},
        {"stutters (gaps over 1.5 x median)", "stutters"},
        {"new pictures per second", "new pictures/s"},
        {"interpolation", "interpolation"},
};

std::string number(std::optional<double> value, const char* pattern = "%.2f") {
    if (!value) return "n/a";
    char text[32];
    snprintf(text, sizeof(text), pattern, *value);
    return text;
}

// The cells with the lowest animation error p95 among those whose latency p50 is within the
// budget (all of them without one); every cell of that lowest value when several share it.
std::vector<bool> bestCells(const std::vector<SummaryColumn>& columns,
                            std::optional<double> budgetMs) {
    std::optional<double> lowest;
    auto fits = [&](const MeasuredLayer& m) {
        return m.errorP95Ms && m.latencyP50Ms && (!budgetMs || *m.latencyP50Ms <= *budgetMs);
    };
    for (const SummaryColumn& column : columns) {
        const MeasuredLayer& m = column.summary->measured;
        if (fits(m)) lowest = std::min(lowest.value_or(*m.errorP95Ms), *m.errorP95Ms);
    }
    std::vector<bool> best;
    for (const SummaryColumn& column : columns) {
        const MeasuredLayer& m = column.summary->measured;
        best.push_back(fits(m) && *m.errorP95Ms == *lowest);
    }
    return best;
}

// What the marks mean, or that no cell fits the budget.
std::string bestLine(const std::vector<SummaryColumn>& columns, const std::vector<bool>& best,
                     std::optional<double> budgetMs) {
    std::string marked;
    for (size_t i = 0; i < columns.size(); i++) {
        if (!best[i]) continue;
        const MeasuredLayer& m = columns[i].summary->measured;
        marked += (marked.empty() ? "" : "; ") + columns[i].title + " (animation error p95 " +
                  number(m.errorP95Ms) + " ms, latency p50 " + number(m.latencyP50Ms) + " ms)";
    }
    const std::string budget = budgetMs ? number(budgetMs, "%g") + " ms" : "";
    if (!marked.empty()) {
        return "Best (*): the lowest animation error p95" +
               (budgetMs ? " with latency p50 within " + budget : " (no --latency-budget-ms)") +
               ": " + marked + ".";
    }
    const SummaryColumn* quickest = nullptr;
    for (const SummaryColumn& column : columns) {
        const auto& latency = column.summary->measured.latencyP50Ms;
        if (latency &&
            (quickest == nullptr || *latency < *quickest->summary->measured.latencyP50Ms)) {
            quickest = &column;
        }
    }
    if (quickest == nullptr) return "Best: none; no cell showed enough frames to measure.";
    return "Best: none; no cell keeps latency p50 within " + budget + ": the lowest is " +
           number(quickest->summary->measured.latencyP50Ms) + " ms (" + quickest->title + ").";
}

// A two-key sweep's grid of one measure, cells by the first key's values down and the second's
// across.
ReportGrid grid(const std::string& title, const std::vector<SweepAxis>& axes,
                const std::vector<SummaryColumn>& columns, const std::vector<bool>& best,
                std::optional<double> (*value)(const MeasuredLayer&)) {
    ReportGrid out;
    out.title = title;
    out.corner = axes[0].key + " down, " + axes[1].key + " across";
    for (const std::string& text : axes[0].texts)
        out.rowLabels.push_back(axes[0].key + "=" + text);
    for (const std::string& text : axes[1].texts)
        out.columnLabels.push_back(axes[1].key + "=" + text);
    const size_t across = axes[1].texts.size();
    out.cells.assign(out.rowLabels.size(), std::vector<std::string>(across, "-"));
    out.marked.assign(out.rowLabels.size(), std::vector<bool>(across, false));
    for (size_t i = 0; i < columns.size(); i++) {
        out.cells[i / across][i % across] = number(value(columns[i].summary->measured));
        out.marked[i / across][i % across] = best[i];
    }
    return out;
}

std::string gridText(const ReportGrid& grid) {
    std::vector<SummaryRow> rows;
    rows.push_back({"", grid.columnLabels, true});
    for (size_t r = 0; r < grid.rowLabels.size(); r++) {
        SummaryRow& row = rows.emplace_back();
        row.label = grid.rowLabels[r];
        for (size_t c = 0; c < grid.cells[r].size(); c++)
            row.values.push_back(grid.cells[r][c] + (grid.marked[r][c] ? " *" : ""));
    }
    return grid.title + ", " + grid.corner + ":\n" + formatTable(rows, 0);
}

}  // namespace

int sweepSettings(const Options& options, const std::vector<host::SettingValue>& settings,
                  const Capture* capture, const Scenario* scenario,
                  const std::atomic<bool>& interrupted) {
    const std::vector<SweepAxis>& axes = options.sweep;
    const size_t across = axes.size() > 1 ? axes[1].values.size() : 1;
    std::vector<GridCell> cells;
    for (size_t i = 0; i < axes[0].values.size() * across; i++) {
        GridCell& cell = cells.emplace_back();
        cell.options = options;
        cell.options.reference = false;
        cell.settings = settings;
        std::string folder;
        for (size_t k = 0; k < axes.size(); k++) {
            const size_t value = k == 0 ? i / across : i % across;
            const std::string text = axes[k].key + "=" + axes[k].texts[value];
            cell.title += (cell.title.empty() ? "" : " ") + text;
            folder += (folder.empty() ? "" : ",") + text;
            // After the run's own settings, so that the swept value wins.
            cell.settings.push_back(axes[k].values[value]);
        }
        cell.options.outDir = (std::filesystem::path(options.outDir) / folder).string();
    }
    Result<GridRuns> ran =
            runGrid(cells, capture, scenario, interrupted, options.quiet ? nullptr : &std::cerr);
    if (const int failed = gridFailure(ran)) return failed;
    GridRuns& runs = ran.value;
    const std::vector<SummaryColumn> columns = runs.columns();
    const std::vector<bool> best = bestCells(columns, options.latencyBudgetMs);

    ReportPage page;
    std::string keys;
    for (const SweepAxis& axis : axes)
        keys += (keys.empty() ? "" : " x ") + axis.key;
    page.heading = "verolux-sim: " + keys + " swept in mode " + std::to_string(options.mode) + " " +
                   modeName(options.mode);
    page.findings = comparisonFindings(columns, nullptr);
    page.findings.insert(page.findings.begin(), bestLine(columns, best, options.latencyBudgetMs));
    page.options = gridOptions(runs, settings);
    page.options.push_back({"sweep", keys + ": " + std::to_string(cells.size()) +
                                             " cells, one run each in a folder named after it"});
    page.table = summaryRows(columns);

    std::vector<SummaryRow> rows;
    SummaryRow& header = rows.emplace_back(SummaryRow{"", {}, true});
    for (const CellMeasure& measure : CELL_MEASURES)
        header.values.emplace_back(measure.heading);
    for (size_t i = 0; i < columns.size(); i++) {
        SummaryRow& row = rows.emplace_back();
        row.label = (best[i] ? "* " : "  ") + columns[i].title;
        for (const CellMeasure& measure : CELL_MEASURES)
            row.values.push_back(summaryValue(*columns[i].summary, measure.row));
    }
    std::string text = "Sweep of " + keys + ", " + std::to_string(cells.size()) + " cells:\n" +
                       formatTable(rows, 0) + "\n";
    if (axes.size() == 2) {
        page.grids.push_back(grid("Animation error p95 (ms)", axes, columns, best,
                                  [](const MeasuredLayer& m) { return m.errorP95Ms; }));
        page.grids.push_back(grid("Latency p50 (ms)", axes, columns, best,
                                  [](const MeasuredLayer& m) { return m.latencyP50Ms; }));
        for (const ReportGrid& each : page.grids)
            text += gridText(each) + "\n";
    }
    for (const std::string& line : page.findings)
        text += line + "\n";
    return finishGrid(
            options, runs, text, page,
            "KEY=VALUE,.../  each cell's run: frames.csv, refreshes.csv, trace.json, ...\n"
            "                  (sim/figures.py FOLDER draws its figures)\n");
}

}  // namespace verolux::sim
