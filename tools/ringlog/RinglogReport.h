#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "tools/ringlog/RinglogReader.h"

namespace verolux::ringlog {

// Text from the file as it may be shown: printable ASCII kept, every other byte as \xNN, so that a
// hostile layer name cannot break a line, a CSV cell or a terminal.
std::string printable(const std::string& text);

// value / scale with `decimals` digits, exact for every int64 (e.g. ns as seconds: 1e9, 6).
std::string formatFixed(int64_t value, int64_t scale, int decimals);

// Three lines: the layer, the build and when the ring was created, how full it is.
void writeHeader(const RinglogDump& dump, std::ostream& out);

// The header, then one line per record, oldest first: monotonic time in seconds, event, value.
void writeTable(const RinglogDump& dump, std::ostream& out);

// One CSV line per record of every layer, oldest first, under the line
//   layer,time_ns,type,event,value
void writeCsv(const std::vector<RinglogDump>& dumps, std::ostream& out);

// The header, then per second of the monotonic clock that has records: frames received, the
// composition kinds (blend 8, repeat 16, new 64), the engine's repeated frames and backpressure,
// refused presentations, the longest queue and the display delay in effect; then the totals.
void writeSummary(const RinglogDump& dump, std::ostream& out);

}  // namespace verolux::ringlog
