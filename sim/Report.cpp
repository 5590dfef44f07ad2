#include "sim/Report.h"

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>

extern char** environ;

namespace verolux::sim {

namespace {

// Debian's python3-matplotlib installs for Debian's own interpreter, which another python3 ahead
// of it on the PATH may lack.
constexpr const char* SYSTEM_PYTHON = "/usr/bin/python3";
// The script's exit status when matplotlib is missing; it has printed why.
constexpr int NO_MATPLOTLIB = 3;

std::string html(const std::string& text) {
    std::string out;
    for (char c : text) {
        switch (c) {
            case '<':
                out += "&lt;";
                break;
            case '>':
                out += "&gt;";
                break;
            case '&':
                out += "&amp;";
                break;
            case '"':
                out += "&quot;";
                break;
            default:
                out += c;
        }
    }
    return out;
}

constexpr const char* STYLE = R"(
body { font-family: sans-serif; margin: 24px; color: #222; }
h1 { font-size: 22px; margin: 0 0 12px; }
h2 { font-size: 16px; margin: 20px 0 6px; }
ul.findings { background: #f4f6fa; padding: 10px 10px 10px 28px; border-radius: 6px; }
ul.findings li { margin: 4px 0; }
.tables { display: flex; gap: 32px; align-items: flex-start; flex-wrap: wrap; }
table { border-collapse: collapse; font-size: 13px; }
table.options { max-width: 380px; }
td, th { padding: 3px 10px; text-align: left; border-bottom: 1px solid #e3e3e3; }
table.grid td { text-align: right; } td.best { background: #d8f5d0; font-weight: bold; }
th.section { padding-top: 10px; background: #fafafa; }
.figures { display: grid; grid-template-columns: 1fr 1fr; gap: 16px; margin-top: 20px; }
.figures.single { grid-template-columns: 1fr; }
figure { margin: 0; } figure img { width: 100%; border: 1px solid #ddd; }
figcaption { font-size: 13px; color: #444; }
)";

}  // namespace

const std::vector<Figure>& figures() {
    static const std::vector<Figure> FIGURES = {
            {"frame-times.png",
             "Frame times over the run: the game's (between queued frames) and the display's "
             "(between new pictures on screen), run against reference."},
            {"animation-error.png",
             "Animation error per refresh: how far the motion on screen strayed from even "
             "motion. Smaller is smoother."},
            {"latency.png",
             "Latency from queue to screen per frame, and content age per refresh: what "
             "interpolation costs."},
            {"delay.png",
             "The display delay over the run, and what the screen showed each second (the delay "
             "is tuned so that most refreshes blend)."},
            {"spacetime.png",
             "Space-time picture: the moving bar on screen, one row per refresh. A straight edge "
             "is smooth motion; steps are judder."},
    };
    return FIGURES;
}

Status drawFigures(const std::string& folder) {
    const std::string script = VEROLUX_FIGURE_SCRIPT;
    const char* python = access(SYSTEM_PYTHON, X_OK) == 0 ? SYSTEM_PYTHON : "python3";
    std::vector<std::string> args = {python, script, folder};
    std::vector<char*> argv;
    for (std::string& arg : args)
        argv.push_back(arg.data());
    argv.push_back(nullptr);
    pid_t pid = 0;
    const int spawned = posix_spawnp(&pid, python, nullptr, nullptr, argv.data(), environ);
    if (spawned != 0) {
        return {errorLine(std::string("figures skipped: cannot run ") + python + ": " +
                          strerror(spawned))};
    }
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    if (WIFEXITED(status) && WEXITSTATUS(status) == 0) return {};
    if (WIFEXITED(status) && WEXITSTATUS(status) == NO_MATPLOTLIB) {
        return {errorLine(std::string("figures skipped: ") + python +
                          " has no matplotlib (./scripts/install-deps installs "
                          "python3-matplotlib)")};
    }
    return {errorLine("figures incomplete: " + script + " failed")};
}

ReportPage runPage(const std::vector<std::pair<std::string, std::string>>& options,
                   const Summary& run, const Summary* reference) {
    ReportPage page;
    page.heading = std::string("verolux-sim: ") + modeName(run.facts.mode) + " (mode " +
                   std::to_string(run.facts.mode) + ")" +
                   (reference != nullptr ? " against no interpolation (mode 2)" : "");
    page.findings = findings(run, reference);
    page.options = options;
    page.table = summaryRows(runColumns(run, reference));
    page.ledger = ledgerLines({&run, reference});
    page.figures = figures();
    return page;
}

namespace {

void writeTable(std::ostream& out, const std::vector<SummaryRow>& rows) {
    out << "<table>\n";
    for (const SummaryRow& row : rows) {
        const char* cell = row.section ? "th class=\"section\"" : "td";
        const char* end = row.section ? "th" : "td";
        out << "<tr><" << cell << ">" << html(row.label) << "</" << end << ">";
        for (const std::string& value : row.values)
            out << "<" << cell << ">" << html(value) << "</" << end << ">";
        out << "</tr>\n";
    }
    out << "</table>\n";
}

void writeGrid(std::ostream& out, const ReportGrid& grid) {
    out << "<h2>" << html(grid.title) << "</h2>\n<table class=\"grid\"><tr><th>"
        << html(grid.corner) << "</th>";
    for (const std::string& label : grid.columnLabels)
        out << "<th>" << html(label) << "</th>";
    out << "</tr>\n";
    for (size_t r = 0; r < grid.rowLabels.size(); r++) {
        out << "<tr><th>" << html(grid.rowLabels[r]) << "</th>";
        for (size_t c = 0; c < grid.cells[r].size(); c++) {
            out << (grid.marked[r][c] ? "<td class=\"best\">" : "<td>") << html(grid.cells[r][c])
                << "</td>";
        }
        out << "</tr>\n";
    }
    out << "</table>\n";
}

}  // namespace

Status writeReport(const std::string& folder, const ReportPage& page) {
    const std::string path = (std::filesystem::path(folder) / "report.html").string();
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    if (!out) return {errorLine("cannot write " + path + ": " + strerror(errno))};
    out << "<!DOCTYPE html>\n<html><head><meta charset=\"utf-8\"><title>verolux-sim report</title>"
        << "<style>" << STYLE << "</style></head><body>\n<h1>" << html(page.heading)
        << "</h1>\n<ul class=\"findings\">\n";
    for (const std::string& line : page.findings)
        out << "<li>" << html(line) << "</li>\n";
    out << "</ul>\n";
    if (!page.expectations.empty()) {
        out << "<h2>Expectations</h2>\n<pre>";
        for (const std::string& line : page.expectations)
            out << html(line) << "\n";
        out << "</pre>\n";
    }
    for (const ReportGrid& grid : page.grids)
        writeGrid(out, grid);
    out << "<div class=\"tables\">\n<table class=\"options\"><tr><th colspan=\"2\" "
           "class=\"section\">Options</th></tr>\n";
    for (const auto& [name, value] : page.options)
        out << "<tr><td>" << html(name) << "</td><td>" << html(value) << "</td></tr>\n";
    out << "</table>\n";
    writeTable(out, page.table);
    out << "</div>\n<h2>Watchdog warnings</h2>\n<pre>";
    for (const std::string& line : page.ledger)
        out << html(line) << "\n";
    out << "</pre>\n<div class=\"figures" << (page.figures.size() == 1 ? " single" : "") << "\">\n";
    for (const Figure& figure : page.figures) {
        if (!std::filesystem::exists(std::filesystem::path(folder) / figure.file)) continue;
        out << "<figure><img src=\"" << figure.file << "\" alt=\"" << figure.file
            << "\"><figcaption>" << html(figure.caption) << "</figcaption></figure>\n";
    }
    out << "</div>\n</body></html>\n";
    out.close();
    if (!out) return {errorLine("cannot write " + path)};
    return {};
}

}  // namespace verolux::sim
