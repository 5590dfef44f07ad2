#pragma once

#include <utils/Timers.h>

#include <cstddef>
#include <istream>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "sim/Result.h"

namespace verolux::sim {

// A frame-time capture, replayed by verolux-sim --capture instead of the generated game. Two
// formats are read, told apart by their header line:
//
// The project's own (*.frames.csv: frame,queue_ns,render_done_ns,display_ns):
//   - queue_ns is required, render_done_ns optional; other columns are ignored;
//   - values are integer nanoseconds, from 0 to 24 hours: queue_ns when the game queued the
//     frame, never decreasing from row to row; render_done_ns when its GPU work completed, at or
//     after queue_ns, or empty when unknown.
//
// PresentMon's (a header naming MsBetweenPresents):
//   - TimeInSeconds gives the present times; without it they add up from MsBetweenPresents;
//   - MsUntilRenderComplete, when present, gives the render times ("NA" or empty: unknown);
//   - the file may hold several swap chains (Application, ProcessID, SwapChainAddress): the one
//     with the most presents is the game's and the only one replayed.
//
// Both: CSV, cells separated by commas, no quoting, spaces around cells ignored, LF or CRLF,
// column names case-sensitive and once each, lines of at most MAX_LINE_CHARS, at most
// MAX_CAPTURE_FRAMES frames.

constexpr size_t MAX_CAPTURE_FRAMES = 1'000'000;
constexpr size_t MAX_LINE_CHARS = 4096;

struct CaptureFrame {
    nsecs_t queueTime = 0;
    nsecs_t renderDoneTime = -1;  // -1: unknown
};

struct Capture {
    std::string format;  // "frames" or "PresentMon"
    // Shifted so that the first frame is queued at 0.
    std::vector<CaptureFrame> frames;

    // The mean interval between frames (the span over the intervals, at least 1 ns; 1 s for a
    // single frame).
    nsecs_t meanInterval() const;
    // The rate the game ran at: 1 / the mean interval.
    double fps() const { return 1e9 / static_cast<double>(meanInterval()); }
    // The rate over the first `count` frames, what a run that replayed only those asked of the
    // game; the whole capture's beyond its end.
    double fpsOverFirst(size_t count) const;
    nsecs_t span() const { return frames.empty() ? 0 : frames.back().queueTime; }
};

// name stands for the input in error lines ("name:7: queue_ns is not a number").
Result<Capture> parseCapture(std::istream& in, const std::string& name,
                             size_t maxFrames = MAX_CAPTURE_FRAMES);
// The same, from a capture's whole text in memory.
Result<Capture> parseCapture(std::string_view text, const std::string& name,
                             size_t maxFrames = MAX_CAPTURE_FRAMES);
Result<Capture> readCapture(const std::string& path);

}  // namespace verolux::sim
