#pragma once

#include <cstddef>
#include <ostream>
#include <vector>

#include "tools/ringlog/RinglogReader.h"

namespace verolux::ringlog {

// Writes a Chrome trace-event JSON object that Perfetto's UI opens. Each layer is a process named
// after it, its records at their times in microseconds of the monotonic clock:
//   - counters "queue length" (frames), "display delay" (ms), "render rate" (fps) and
//     "real game rate" (fps);
//   - instants on one thread per kind of record: "composition" (blend, repeat, new picture and
//     the slots composed), "releases", "buffer stages", "presentation" (refused presentations),
//     "engine records" (frame repeated, backpressure, game rate limit), "frames" and "other",
//     each with the record's value as an argument.
// The events are streamed, so memory stays that of the records. Returns the number of events.
size_t writePerfettoTrace(const std::vector<RinglogDump>& dumps, std::ostream& out);

}  // namespace verolux::ringlog
