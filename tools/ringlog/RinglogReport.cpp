#include "tools/ringlog/RinglogReport.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <iomanip>
#include <iterator>
#include <map>
#include <vector>

#include "EventDispatcher.h"
#include "Ringlog.h"
#include "tools/ringlog/RecordKinds.h"

namespace verolux::ringlog {

namespace {

using namespace android::Interpolation;

constexpr int64_t NS_PER_S = 1'000'000'000;

std::string creationText(int64_t seconds) {
    const auto time = static_cast<time_t>(seconds);
    struct tm utc {};
    char text[64];
    if (gmtime_r(&time, &utc) == nullptr ||
        strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S UTC", &utc) == 0) {
        return std::to_string(seconds) + " s since the epoch";
    }
    return text;
}

std::string csvCell(const std::string& text) {
    if (text.find_first_of(",\"") == std::string::npos) return text;
    std::string quoted = "\"";
    for (char c : text) {
        if (c == '"') quoted += '"';
        quoted += c;
    }
    return quoted + "\"";
}

// Whole seconds, rounded down, so that -0.5 s lies in second -1.
int64_t secondOf(int64_t ns) {
    const int64_t second = ns / NS_PER_S;
    return ns % NS_PER_S < 0 ? second - 1 : second;
}

struct SecondCounts {
    // frames received, blend, repeat, new, repeated, backpressure, refused
    std::array<uint64_t, 7> counts{};
    int32_t longestQueue = -1;  // -1: no queue length this second
    bool delayChanged = false;
    int32_t delayMs = 0;  // the last change of the second
};

constexpr uint32_t COUNTED_TYPES[] = {
        eFrameReceivedEvent,       eBlendedCompositionEvent,       eRepeatedCompositionEvent,
        eNewFrameCompositionEvent, Ringlog::FRAME_REPEATED_RECORD, Ringlog::BACKPRESSURE_RECORD,
        ePresentationRefusedEvent};
constexpr const char* SUMMARY_COLUMNS[] = {"second",    "frames",   "blend",        "repeat",
                                           "new",       "repeated", "backpressure", "refused",
                                           "queue max", "delay ms"};

// Right-aligned under the column names, counts at least 7 wide, the seconds of the monotonic clock
// 12.
void writeSummaryRow(std::ostream& out, const std::vector<std::string>& cells) {
    for (size_t i = 0; i < cells.size(); i++) {
        const size_t width = i == 0 ? 12 : std::max<size_t>(7, strlen(SUMMARY_COLUMNS[i]));
        out << (i == 0 ? "" : "  ") << std::setw(static_cast<int>(width)) << cells[i];
    }
    out << "\n";
}

std::vector<std::string> summaryCells(const std::string& second, const SecondCounts& row,
                                      const std::string& delay) {
    std::vector<std::string> cells{second};
    for (uint64_t count : row.counts)
        cells.push_back(std::to_string(count));
    cells.push_back(row.longestQueue < 0 ? "-" : std::to_string(row.longestQueue));
    cells.push_back(delay);
    return cells;
}

}  // namespace

std::string printable(const std::string& text) {
    std::string shown;
    for (unsigned char c : text) {
        if (c >= 0x20 && c < 0x7f) {
            shown += static_cast<char>(c);
        } else {
            char escaped[5];
            snprintf(escaped, sizeof(escaped), "\\x%02x", c);
            shown += escaped;
        }
    }
    return shown;
}

std::string formatFixed(int64_t value, int64_t scale, int decimals) {
    // The magnitude in unsigned arithmetic, so that INT64_MIN has one too.
    const uint64_t magnitude = value < 0 ? 0 - static_cast<uint64_t>(value) : value;
    const auto unit = static_cast<uint64_t>(scale);
    uint64_t digits = 1;
    for (int i = 0; i < decimals; i++)
        digits *= 10;
    std::string fraction = std::to_string(magnitude % unit * digits / unit);
    fraction.insert(0, static_cast<size_t>(decimals) - fraction.size(), '0');
    return (value < 0 ? "-" : "") + std::to_string(magnitude / unit) + "." + fraction;
}

void writeHeader(const RinglogDump& dump, std::ostream& out) {
    const RinglogHeader& header = dump.header;
    out << "layer \"" << printable(header.layerName) << "\", uid " << header.uid << ", mode "
        << header.mode << " (" << modeName(header.mode) << ")\n";
    out << "version " << header.majorVersion << "." << header.minorVersion << " revision "
        << header.revision << ", checksum " << printable(header.checksum) << ", created "
        << creationText(header.creationTime) << "\n";
    out << dump.records.size() << " records in a ring of " << dump.capacity
        << (dump.records.size() == dump.capacity ? " (full: older records were overwritten)" : "")
        << "\n";
}

void writeTable(const RinglogDump& dump, std::ostream& out) {
    writeHeader(dump, out);
    out << "\n"
        << std::setw(20) << "time (s)"
        << "  " << std::left << std::setw(34) << "event" << std::right << std::setw(11) << "value"
        << "\n";
    for (const SerializableEvent& record : dump.records) {
        out << std::setw(20) << formatFixed(record.time, NS_PER_S, 6) << "  " << std::left
            << std::setw(34) << recordKind(record.type).name << std::right << std::setw(11)
            << record.value << "\n";
    }
}

void writeCsv(const std::vector<RinglogDump>& dumps, std::ostream& out) {
    out << "layer,time_ns,type,event,value\n";
    for (const RinglogDump& dump : dumps) {
        const std::string layer = csvCell(printable(dump.header.layerName));
        for (const SerializableEvent& record : dump.records) {
            out << layer << "," << record.time << "," << static_cast<uint32_t>(record.type) << ","
                << recordKind(record.type).name << "," << record.value << "\n";
        }
    }
}

void writeSummary(const RinglogDump& dump, std::ostream& out) {
    writeHeader(dump, out);
    // Only the seconds that have records: a map bounded by the records, whatever their times.
    std::map<int64_t, SecondCounts> seconds;
    SecondCounts total;
    for (const SerializableEvent& record : dump.records) {
        SecondCounts& row = seconds[secondOf(record.time)];
        for (size_t i = 0; i < std::size(COUNTED_TYPES); i++) {
            if (record.type != COUNTED_TYPES[i]) continue;
            row.counts[i]++;
            total.counts[i]++;
        }
        if (record.type == eFrameListSizeChangedEvent) {
            row.longestQueue = std::max(row.longestQueue, record.value);
            total.longestQueue = std::max(total.longestQueue, record.value);
        } else if (record.type == eDelayChangedEvent) {
            row.delayChanged = true;
            row.delayMs = record.value;
        }
    }

    out << "\n";
    writeSummaryRow(
            out, std::vector<std::string>(std::begin(SUMMARY_COLUMNS), std::end(SUMMARY_COLUMNS)));
    // The delay stays in effect until it changes, so a second without a change shows the last.
    std::string delay = "-";
    for (const auto& [second, row] : seconds) {
        if (row.delayChanged) delay = std::to_string(row.delayMs);
        writeSummaryRow(out, summaryCells(std::to_string(second), row, delay));
    }
    writeSummaryRow(out, summaryCells("total", total, "-"));
}

}  // namespace verolux::ringlog
