// Feeds arbitrary bytes to the simulator's capture reader as a capture file's text: the project's
// frames CSV and PresentMon's CSV, told apart by the header. What the reader accepts must also
// give the replay finite rates.

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "fuzz/ErrorLine.h"
#include "sim/Capture.h"

namespace {

using verolux::sim::Capture;
using verolux::sim::CaptureFrame;

// Small enough that inputs of the fuzzer's lengths reach the frame limit's own checks.
constexpr size_t FEW_FRAMES = 4;

void checkReplayable(const Capture& capture) {
    if (capture.frames.empty() || capture.frames.front().queueTime != 0) abort();
    for (size_t i = 1; i < capture.frames.size(); i++) {
        const CaptureFrame& frame = capture.frames[i];
        if (frame.queueTime < capture.frames[i - 1].queueTime) abort();
        if (frame.renderDoneTime != -1 && frame.renderDoneTime < frame.queueTime) abort();
    }
    if (capture.meanInterval() <= 0 || !std::isfinite(capture.fps())) abort();
    for (size_t count : {size_t{0}, size_t{2}, capture.frames.size() / 2, capture.frames.size()}) {
        if (!std::isfinite(capture.fpsOverFirst(count))) abort();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    for (size_t maxFrames : {verolux::sim::MAX_CAPTURE_FRAMES, FEW_FRAMES}) {
        const auto capture = verolux::sim::parseCapture(text, "fuzz.csv", maxFrames);
        if (capture.ok()) {
            checkReplayable(capture.value);
        } else if (!verolux::fuzz::isErrorLine(capture.error)) {
            abort();
        }
    }
    return 0;
}
