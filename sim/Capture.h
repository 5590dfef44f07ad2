#pragma once

#include <utils/Timers.h>

#include <cstddef>
#include <istream>
#include <string>
#include <vector>

#include "sim/Result.h"

namespace verolux::sim {

// A frame-time capture, replayed by verolux-sim --capture instead of the generated game.
//
// Format: CSV, cells separated by commas, no quoting, spaces around cells ignored, LF or CRLF.
//   - Line 1 names the columns. queue_ns is required, render_done_ns optional; any other column
//     (frame, display_ns, ...) is ignored. Names are case-sensitive and appear once each.
//   - Every further non-blank line is one frame, in queue order, with one cell per column.
//   - Values are integer nanoseconds relative to the first frame, from 0 to 24 hours: queue_ns is
//     when the game queued the frame and never decreases from row to row; render_done_ns is when
//     its GPU work completed, at or after queue_ns, or empty when unknown.
//   - At most MAX_CAPTURE_FRAMES frames.
// This is the format of the *.frames.csv captures: frame,queue_ns,render_done_ns,display_ns.

constexpr size_t MAX_CAPTURE_FRAMES = 1'000'000;

struct CaptureFrame {
    nsecs_t queueTime = 0;
    nsecs_t renderDoneTime = -1;  // -1: unknown
};

struct Capture {
    // Shifted so that the first frame is queued at 0.
    std::vector<CaptureFrame> frames;
};

// name stands for the input in error lines ("name:7: queue_ns is not a number").
Result<Capture> parseCapture(std::istream& in, const std::string& name,
                             size_t maxFrames = MAX_CAPTURE_FRAMES);
Result<Capture> readCapture(const std::string& path);

}  // namespace verolux::sim
