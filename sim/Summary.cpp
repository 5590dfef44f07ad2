#include "sim/Summary.h"

#include <algorithm>
#include <cinttypes>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <initializer_list>
#include <iterator>

#include "sim/WarningLedger.h"

namespace verolux::sim {

namespace {

constexpr double MIB = 1024.0 * 1024.0;
// Animation errors this much apart count as smoother or rougher; closer ones as alike.
constexpr double CLEARLY_BETTER = 0.8;
constexpr size_t STUTTER_TIMES_SHOWN = 4;

std::string format(const char* pattern, ...) __attribute__((format(printf, 1, 2)));

std::string format(const char* pattern, ...) {
    char text[256];
    va_list args;
    va_start(args, pattern);
    vsnprintf(text, sizeof(text), pattern, args);
    va_end(args);
    return text;
}

std::string number(std::optional<double> value, const char* pattern = "%.2f") {
    return value ? format(pattern, *value) : "n/a";
}

// "a / b unit" and so on, or "n/a" when the first is missing.
std::string values(std::initializer_list<std::optional<double>> list, const char* unit,
                   const char* pattern = "%.2f") {
    if (!*list.begin()) return "n/a";
    std::string text;
    for (const auto& value : list)
        text += (text.empty() ? "" : " / ") + number(value, pattern);
    return text + " " + unit;
}

std::string share(uint64_t part, uint64_t whole) {
    return whole > 0 ? format("%.1f", 100.0 * part / whole) : "n/a";
}

std::optional<double> perSecond(uint64_t count, double seconds) {
    if (seconds <= 0) return std::nullopt;
    return count / seconds;
}

std::string stutterTimes(const Summary& s) {
    const MeasuredLayer& m = s.measured;
    if (m.stutters.empty()) return "none";
    std::string text;
    for (size_t i = 0; i < m.stutters.size() && i < STUTTER_TIMES_SHOWN; i++) {
        text += format("%s%.2f", i == 0 ? "" : " ", (m.stutters[i].time - s.facts.startTime) / 1e9);
    }
    if (m.stutterCount > STUTTER_TIMES_SHOWN)
        text += format(" +%" PRIu64, m.stutterCount - STUTTER_TIMES_SHOWN);
    return text + " s";
}

std::string buffers(const Summary& s) {
    return format("%u, %.1f MiB at %s%s", s.facts.buffers, s.facts.bufferBytes / MIB,
                  s.facts.resolution.c_str(), s.facts.buffersFixed ? " (fixed)" : "");
}

std::string delay(const MeasuredLayer& m) {
    if (!m.startDelayMs) return "none";
    return format("%.0f / %.0f ms, %" PRIu64 " change%s", *m.startDelayMs, *m.endDelayMs,
                  m.delayChanges, m.delayChanges == 1 ? "" : "s");
}

std::string seconds(const Summary& s, nsecs_t time) {
    return format("%.2f s", (time - s.facts.startTime) / 1e9);
}

std::string refreshRate(const Summary& s) {
    const MeasuredLayer& m = s.measured;
    if (!m.detectedRefreshRate) return "n/a";
    return format("%d / %.0f Hz (from %s)", *m.detectedRefreshRate, s.facts.refreshHz,
                  seconds(s, *m.refreshRateSettled).c_str());
}

std::string refused(const Summary& s) {
    const MeasuredLayer& m = s.measured;
    return format("%.1f per second (%" PRIu64 " refused, %s %%)",
                  perSecond(m.refreshes - m.refusedPresentations, s.facts.runSec).value_or(0),
                  m.refusedPresentations, share(m.refusedPresentations, m.refreshes).c_str());
}

std::string gameRateLimit(const Summary& s) {
    const MeasuredLayer& m = s.measured;
    if (!m.lastGameRateLimit) return "none";
    std::string text = format("%d / %d / %d fps, ", *m.firstGameRateLimit, *m.lastGameRateLimit,
                              *m.lowestGameRateLimit);
    if (m.gameRateLimitAppliedFrom)
        return text + "applied from " + seconds(s, *m.gameRateLimitAppliedFrom);
    return text + "not applied";
}

std::string interpolation(const Summary& s) {
    const MeasuredLayer& m = s.measured;
    if (m.interpolationOffAt) return "switched off at " + seconds(s, *m.interpolationOffAt);
    return m.interpolatedAtAll ? "on throughout" : "off";
}

std::string statistic(const Summary& s, size_t i) {
    const MeasuredLayer& m = s.measured;
    if (m.statisticSeconds == 0) return "n/a";
    const MeasuredLayer::Spread& spread = m.statistics[i];
    return format("%.1f / %" PRId64 " / %" PRId64, spread.mean, spread.min, spread.max);
}

template <size_t I>
std::string statisticAt(const Summary& s) {
    return statistic(s, I);
}

struct Line {
    const char* label;
    std::string (*value)(const Summary&);
};

// A label with nullptr value is a section title.
const Line LINES[] = {
        {"Motion on screen", nullptr},
        {"animation error p50 / p95 / p99",
         [](const Summary& s) {
             const MeasuredLayer& m = s.measured;
             return values({m.errorP50Ms, m.errorP95Ms, m.errorP99Ms}, "ms");
         }},
        {"animation error max",
         [](const Summary& s) { return number(s.measured.errorMaxMs) + " ms"; }},
        {"refreshes off by over half a period",
         [](const Summary& s) {
             const auto& share = s.measured.errorOverHalfPeriodShare;
             return share ? format("%.1f %%", *share * 100) : "n/a";
         }},
        {"stutters (gaps over 1.5 x median)",
         [](const Summary& s) {
             return format("%" PRIu64 " (median gap %s ms)", s.measured.stutterCount,
                           number(s.measured.medianGapMs).c_str());
         }},
        {"stutters at", stutterTimes},
        {"Display side", nullptr},
        {"frame rate avg / 1% low / 0.1% low",
         [](const Summary& s) {
             const Rates& r = s.measured.displayFps;
             return values({r.average, r.low1, r.low01}, "fps", "%.1f");
         }},
        {"new pictures per second",
         [](const Summary& s) {
             const auto& p = s.measured.pictures;
             return number(
                     perSecond(p[size_t(Picture::BLEND)] + p[size_t(Picture::NEW)], s.facts.runSec),
                     "%.1f");
         }},
        {"game frames shown per second",
         [](const Summary& s) {
             return number(perSecond(s.measured.framesShown, s.facts.runSec), "%.1f") +
                    format(" (%" PRIu64 " dropped)", s.measured.framesDropped);
         }},
        {"refresh rate detected / display", refreshRate},
        {"render rate (presentations)", refused},
        {"client compositions",
         [](const Summary& s) {
             return format("%" PRIu64 " (%s %%)", s.measured.clientCompositions,
                           share(s.measured.clientCompositions, s.measured.refreshes).c_str());
         }},
        {"pictures blend / new / repeat / held",
         [](const Summary& s) {
             const MeasuredLayer& m = s.measured;
             return share(m.pictures[0], m.refreshes) + " / " + share(m.pictures[1], m.refreshes) +
                    " / " + share(m.pictures[2], m.refreshes) + " / " +
                    share(m.pictures[3], m.refreshes) + " %";
         }},
        {"Game side", nullptr},
        {"frame rate avg / 1% low / 0.1% low",
         [](const Summary& s) {
             const Rates& r = s.measured.gameFps;
             return values({r.average, r.low1, r.low01}, "fps", "%.1f");
         }},
        {"its own rate",
         [](const Summary& s) {
             return number(s.facts.ownFps, "%.1f") + " fps" + (throttled(s) ? " (held back)" : "");
         }},
        {"game-rate limit first / last / lowest", gameRateLimit},
        {"frame timestamps",
         [](const Summary& s) -> std::string {
             const auto& from = s.measured.clockTimeFrom;
             return from ? "the engine's clock from " + seconds(s, *from) : "the game's";
         }},
        {"waited for a free buffer",
         [](const Summary& s) {
             return format("%.0f ms (%.1f %% of the run)", s.measured.bufferWaitMs,
                           s.facts.runSec > 0 ? s.measured.bufferWaitMs / 10 / s.facts.runSec : 0);
         }},
        {"Cost", nullptr},
        {"latency queue to screen p50 / p99",
         [](const Summary& s) {
             return values({s.measured.latencyP50Ms, s.measured.latencyP99Ms}, "ms");
         }},
        {"content age p50 / p99",
         [](const Summary& s) {
             return values({s.measured.contentAgeP50Ms, s.measured.contentAgeP99Ms}, "ms");
         }},
        {"buffers", buffers},
        {"display delay start / end", [](const Summary& s) { return delay(s.measured); }},
        {"library CPU per refresh mean / p99",
         [](const Summary& s) -> std::string {
             if (s.facts.time == TimeMode::SIMULATED) return "not measured in simulated time";
             return values({s.measured.cpuMeanUs, s.measured.cpuP99Us}, "us", "%.1f");
         }},
        {"Run", nullptr},
        {"time", [](const Summary& s) -> std::string { return timeModeName(s.facts.time); }},
        {"run length", [](const Summary& s) { return format("%.2f s", s.facts.runSec); }},
        {"interpolation", interpolation},
        {"refreshes",
         [](const Summary& s) {
             return format("%" PRIu64 " (%" PRIu64 " vsyncs skipped)", s.measured.refreshes,
                           s.measured.skippedVsyncs);
         }},
        {"Library statistics per second: mean / min / max", nullptr},
        {"game fps (frames queued)", statisticAt<0>},
        {"real game fps (tracker)", statisticAt<1>},
        {"actual fps (distinct pictures)", statisticAt<2>},
        {"interpolated fps", statisticAt<3>},
        {"missed fps", statisticAt<4>},
        {"repeated fps", statisticAt<5>},
        {"skipped fps", statisticAt<6>},
};

std::string title(const Summary& s) {
    return s.facts.role + ": mode " + std::to_string(s.facts.mode) + " " + modeName(s.facts.mode);
}

std::string motionFinding(const Summary& run, const Summary& reference) {
    const auto& a = run.measured.errorP95Ms;
    const auto& b = reference.measured.errorP95Ms;
    if (!a || !b) return "Motion: not enough pictures on screen to compare.";
    const char* verdict = "about as smooth as";
    if (*a < CLEARLY_BETTER * *b) verdict = "smoother than";
    if (*b < CLEARLY_BETTER * *a) verdict = "rougher than";
    return format(
            "Motion: %s without interpolation: 95 %% of refreshes within %.2f ms of even "
            "motion, against %.2f ms in mode 2; %" PRIu64 " stutter%s against %" PRIu64 ".",
            verdict, *a, *b, run.measured.stutterCount, run.measured.stutterCount == 1 ? "" : "s",
            reference.measured.stutterCount);
}

std::string costFinding(const Summary& run, const Summary& reference) {
    std::string text = "Cost: ";
    const auto& a = run.measured.latencyP50Ms;
    const auto& b = reference.measured.latencyP50Ms;
    if (a && b) {
        text +=
                format("%+.1f ms of latency at the median (%.1f against %.1f ms from queue to "
                       "screen); ",
                       *a - *b, *a, *b);
    }
    text += format("%+.1f MiB of buffers (%u against %u).",
                   (static_cast<double>(run.facts.bufferBytes) - reference.facts.bufferBytes) / MIB,
                   run.facts.buffers, reference.facts.buffers);
    return text;
}

void warnings(const Summary& s, std::vector<std::string>& out) {
    const MeasuredLayer& m = s.measured;
    if (m.interpolationOffAt) {
        std::string why;
        for (const WarningRecord& warning : m.warnings) {
            if (warning.time <= *m.interpolationOffAt) {
                why = " after " + warningCodeName(warning.code) + " (see the ledger)";
            }
        }
        out.push_back(
                format("Note: %s: interpolation was switched off at %.2f s%s; the game went "
                       "on without it.",
                       s.facts.role.c_str(), (*m.interpolationOffAt - s.facts.startTime) / 1e9,
                       why.c_str()));
    }
    if (m.gameRateLimitApplied && m.lastGameRateLimit && m.lastStatistics) {
        out.push_back(
                format("Note: %s: the game was held to the game-rate limit (gfpsOffsetEnabled), "
                       "which ended at %d fps; the game queued %d frames in the last second, "
                       "against its own %.1f fps.",
                       s.facts.role.c_str(), *m.lastGameRateLimit, m.lastStatistics->gameFps,
                       s.facts.ownFps.value_or(0)));
    }
    if (throttled(s)) {
        out.push_back(
                format("Warning: %s: the game was held back to %.1f fps against its own "
                       "%.1f fps; it waited %.0f ms for a free buffer (raise --slots or "
                       "queueSize).",
                       s.facts.role.c_str(), s.measured.gameFps.average.value_or(0),
                       s.facts.ownFps.value_or(0), s.measured.bufferWaitMs));
    }
    if (s.measured.skippedVsyncs > 0) {
        out.push_back(format("Warning: %s: the simulated display skipped %" PRIu64
                             " vsyncs: the host fell behind real time, so these measures are not "
                             "what a device would show.",
                             s.facts.role.c_str(), s.measured.skippedVsyncs));
    }
}

// Notes on the run as a whole, which its layers share.
void runNotes(const Summary& s, std::vector<std::string>& out) {
    if (s.facts.captureEnded) {
        out.push_back(
                format("Note: the run stopped at the end of its capture, after %.2f s "
                       "(--loop replays it).",
                       s.facts.runSec));
    }
    if (s.facts.refreshRateChanged) {
        out.push_back(
                "Note: the display changed its refresh rate during the run: stutters are gaps "
                "over 1.5 x the median gap of the whole run, so a stretch at a slower rate "
                "counts its gaps as stutters.");
    }
}

}  // namespace

const char* modeName(uint32_t mode) {
    static const char* const NAMES[] = {"retime",       "fill-in",   "no interpolation",
                                        "just in time", "unlimited", "latency reduction"};
    return mode < std::size(NAMES) ? NAMES[mode] : "unknown";
}

bool throttled(const Summary& summary) {
    const auto& own = summary.facts.ownFps;
    const auto& achieved = summary.measured.gameFps.average;
    // A game held to its game-rate limit is held back on purpose; its own note says so.
    return own && achieved && *achieved < THROTTLE_SHARE * *own &&
           !summary.measured.gameRateLimitAppliedFrom;
}

std::vector<std::string> ledgerLines(const std::vector<const Summary*>& layers) {
    std::vector<std::pair<nsecs_t, std::string>> lines;
    uint64_t unlisted = 0;
    for (const Summary* s : layers) {
        if (s == nullptr) continue;
        for (const WarningRecord& warning : s->measured.warnings)
            lines.emplace_back(warning.time, ledgerLine(warning, s->facts.startTime, s->facts.role));
        unlisted += s->measured.warningCount - s->measured.warnings.size();
    }
    std::stable_sort(lines.begin(), lines.end(),
                     [](const auto& a, const auto& b) { return a.first < b.first; });
    std::vector<std::string> out;
    for (auto& [time, line] : lines)
        out.push_back(std::move(line));
    if (unlisted > 0) out.push_back(format("(and %" PRIu64 " more)", unlisted));
    if (out.empty()) out.push_back("none");
    return out;
}

std::vector<SummaryColumn> runColumns(const Summary& run, const Summary* reference) {
    std::vector<SummaryColumn> columns = {{title(run), &run}};
    if (reference != nullptr) columns.push_back({title(*reference), reference});
    return columns;
}

std::vector<SummaryRow> summaryRows(const std::vector<SummaryColumn>& columns) {
    std::vector<SummaryRow> rows;
    SummaryRow& titles = rows.emplace_back();
    titles.section = true;
    for (const SummaryColumn& column : columns)
        titles.values.push_back(column.title);
    for (const Line& line : LINES) {
        SummaryRow& row = rows.emplace_back();
        row.label = line.label;
        row.section = line.value == nullptr;
        for (const SummaryColumn& column : columns)
            row.values.push_back(row.section ? "" : line.value(*column.summary));
    }
    return rows;
}

std::string formatTable(const std::vector<SummaryRow>& rows, size_t minWidth) {
    std::vector<size_t> widths;
    for (const SummaryRow& row : rows) {
        widths.resize(std::max(widths.size(), row.values.size()), minWidth);
        for (size_t i = 0; i < row.values.size(); i++)
            widths[i] = std::max(widths[i], row.values[i].size() + 2);
    }
    std::string out;
    for (const SummaryRow& row : rows) {
        const bool titleOnly = row.section && !row.label.empty();
        std::string line = titleOnly ? row.label : format("  %-37s", row.label.c_str());
        for (size_t i = 0; i < row.values.size() && !titleOnly; i++) {
            line += " " + row.values[i] + std::string(widths[i] - row.values[i].size() - 1, ' ');
        }
        while (!line.empty() && line.back() == ' ')
            line.pop_back();
        out += line + "\n";
    }
    return out;
}

std::string summaryValue(const Summary& summary, std::string_view label) {
    for (const Line& line : LINES) {
        if (line.value != nullptr && label == line.label) return line.value(summary);
    }
    return {};
}

std::vector<std::string> findings(const Summary& run, const Summary* reference) {
    std::vector<std::string> out;
    if (reference != nullptr) {
        out.push_back(motionFinding(run, *reference));
        out.push_back(costFinding(run, *reference));
    }
    warnings(run, out);
    if (reference != nullptr) warnings(*reference, out);
    runNotes(run, out);
    return out;
}

std::vector<std::string> comparisonFindings(const std::vector<SummaryColumn>& columns,
                                            const Summary* baseline) {
    std::vector<std::string> out;
    for (const SummaryColumn& column : columns) {
        if (baseline == nullptr || column.summary == baseline) continue;
        out.push_back(column.title + ": " + motionFinding(*column.summary, *baseline));
        out.push_back(column.title + ": " + costFinding(*column.summary, *baseline));
    }
    for (const SummaryColumn& column : columns)
        warnings(*column.summary, out);
    if (!columns.empty() && columns.front().summary->facts.captureEnded) {
        out.push_back(
                format("Note: the runs stopped at the end of their capture, after %.2f s "
                       "(--loop replays it).",
                       columns.front().summary->facts.runSec));
    }
    return out;
}

std::string formatSummary(const Summary& run, const Summary* reference) {
    std::string out;
    for (const std::string& line : findings(run, reference))
        out += line + "\n";
    if (!out.empty()) out += "\n";
    // Columns as wide as the widest value of a summary, so that runs line up whatever they show.
    constexpr size_t COLUMN_WIDTH = 37;
    out += formatTable(summaryRows(runColumns(run, reference)), COLUMN_WIDTH);
    out += "Watchdog warnings: time in the run, time of day, game, code, value\n";
    for (const std::string& line : ledgerLines({&run, reference}))
        out += "  " + line + "\n";
    return out;
}

std::string formatCopies(const std::vector<Summary>& copies) {
    if (copies.empty()) return {};
    std::string out = "Copies of the run (the same game and mode, each a layer of its own):\n";
    for (const Summary& s : copies) {
        const MeasuredLayer& m = s.measured;
        const auto& p = m.pictures;
        const auto newPictures =
                perSecond(p[size_t(Picture::BLEND)] + p[size_t(Picture::NEW)], s.facts.runSec);
        // Two pieces, each well within format()'s line.
        out +=
                format("  %s: animation error p95 %s ms, new pictures %s per second, latency p50 / "
                       "p99 %s, ",
                       s.facts.role.c_str(), number(m.errorP95Ms).c_str(),
                       number(newPictures, "%.1f").c_str(),
                       values({m.latencyP50Ms, m.latencyP99Ms}, "ms").c_str());
        out += format("stutters %" PRIu64 ", vsyncs skipped %" PRIu64 ", warnings %" PRIu64
                      ", interpolation %s\n",
                      m.stutterCount, m.skippedVsyncs, m.warningCount, interpolation(s).c_str());
    }
    return out;
}

}  // namespace verolux::sim
