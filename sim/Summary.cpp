#include "sim/Summary.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <functional>
#include <numeric>
#include <vector>

#include "EventDispatcher.h"

namespace verolux::sim {

using namespace android::Interpolation;

namespace {

constexpr double NS_PER_MS = 1e6;
constexpr double NS_PER_US = 1e3;

// Nearest rank: the smallest value with at least p percent of the values at or below it.
std::optional<double> percentile(std::vector<double> values, double p) {
    if (values.empty()) return std::nullopt;
    std::sort(values.begin(), values.end());
    const auto rank = static_cast<size_t>(std::ceil(p / 100.0 * values.size()));
    return values[std::max<size_t>(rank, 1) - 1];
}

std::optional<double> mean(const std::vector<double>& values) {
    if (values.empty()) return std::nullopt;
    return std::accumulate(values.begin(), values.end(), 0.0) / values.size();
}

std::optional<double> deviation(const std::vector<double>& values) {
    const auto average = mean(values);
    if (!average) return std::nullopt;
    double sum = 0;
    for (double v : values)
        sum += (v - *average) * (v - *average);
    return std::sqrt(sum / values.size());
}

void summarizeDelay(const Recording& recording, Summary& summary) {
    summary.delayChanges = recording.delayChanges.size();
    if (!recording.delayChanges.empty()) {
        summary.startDelayMs = recording.delayChanges.front().delay / NS_PER_MS;
        summary.endDelayMs = recording.delayChanges.back().delay / NS_PER_MS;
        return;
    }
    for (const RefreshRecord& refresh : recording.refreshes) {
        if (refresh.delay < 0) continue;
        if (!summary.startDelayMs) summary.startDelayMs = refresh.delay / NS_PER_MS;
        summary.endDelayMs = refresh.delay / NS_PER_MS;
    }
}

}  // namespace

Summary summarize(const Recording& recording) {
    Summary summary;
    summary.mode = recording.mode;
    if (recording.startTime >= 0 && recording.endTime > recording.startTime) {
        summary.runSec = (recording.endTime - recording.startTime) / 1e9;
    }

    std::vector<double> latencies;
    for (const FrameRecord& frame : recording.frames) {
        if (frame.queueTime < 0) continue;
        summary.queuedFrames++;
        if (frame.firstDisplayTime >= 0) {
            latencies.push_back((frame.firstDisplayTime - frame.queueTime) / NS_PER_MS);
        }
    }
    summary.displayedFrames = latencies.size();
    summary.latencyP50Ms = percentile(latencies, 50);
    summary.latencyP99Ms = percentile(latencies, 99);

    size_t blends = 0;
    size_t repeats = 0;
    size_t news = 0;
    std::vector<double> steps;
    std::vector<double> cpu;
    size_t pictures = 0;
    double lastPicture = -1;
    const RefreshRecord* previous = nullptr;
    for (const RefreshRecord& refresh : recording.refreshes) {
        // A new picture is one whose content differs from what the screen showed before; counting
        // kinds instead would count a frame shown again after an empty state as new.
        if (refresh.contentTime >= 0 && refresh.contentTime != lastPicture) {
            pictures++;
            lastPicture = refresh.contentTime;
        }
        blends += refresh.kind == eBlendedCompositionEvent;
        repeats += refresh.kind == eRepeatedCompositionEvent;
        news += refresh.kind == eNewFrameCompositionEvent;
        cpu.push_back(refresh.cpuTime / NS_PER_US);
        if (previous != nullptr && previous->contentTime >= 0 && refresh.contentTime >= 0) {
            steps.push_back((refresh.contentTime - previous->contentTime) / NS_PER_MS);
        }
        previous = &refresh;
    }
    summary.refreshes = recording.refreshes.size();
    if (summary.refreshes > 0) {
        const double n = summary.refreshes;
        summary.blendShare = blends / n;
        summary.repeatShare = repeats / n;
        summary.newShare = news / n;
        summary.noStateShare = (summary.refreshes - blends - repeats - news) / n;
    }
    if (summary.runSec) {
        summary.gameFps = summary.queuedFrames / *summary.runSec;
        summary.displayedFps = pictures / *summary.runSec;
    }
    summary.meanStepMs = mean(steps);
    summary.judderMs = deviation(steps);
    summary.cpuMeanUs = mean(cpu);
    summary.cpuP99Us = percentile(cpu, 99);
    summarizeDelay(recording, summary);
    return summary;
}

namespace {

std::string format(const char* pattern, std::optional<double> value) {
    if (!value) return "n/a";
    char text[64];
    snprintf(text, sizeof(text), pattern, *value);
    return text;
}

struct Line {
    const char* label;
    std::function<std::string(const Summary&)> value;
};

const std::vector<Line>& lines() {
    static const std::vector<Line> LINES = {
            {"run length", [](const Summary& s) { return format("%.3f s", s.runSec); }},
            {"game fps (frames queued)", [](const Summary& s) { return format("%.2f", s.gameFps); }},
            {"displayed fps (new pictures)",
             [](const Summary& s) { return format("%.2f", s.displayedFps); }},
            {"refreshes", [](const Summary& s) { return std::to_string(s.refreshes); }},
            {"blended (kind 8)",
             [](const Summary& s) { return format("%.1f %%", s.blendShare * 100); }},
            {"repeated (kind 16)",
             [](const Summary& s) { return format("%.1f %%", s.repeatShare * 100); }},
            {"new frame (kind 64)",
             [](const Summary& s) { return format("%.1f %%", s.newShare * 100); }},
            {"no state", [](const Summary& s) { return format("%.1f %%", s.noStateShare * 100); }},
            {"display delay at start",
             [](const Summary& s) { return format("%.1f ms", s.startDelayMs); }},
            {"display delay at end",
             [](const Summary& s) {
                 return format("%.1f ms", s.endDelayMs) + " (" + std::to_string(s.delayChanges) +
                        " changes)";
             }},
            {"latency queue to display p50",
             [](const Summary& s) {
                 return format("%.2f ms", s.latencyP50Ms) + " (" +
                        std::to_string(s.displayedFrames) + " frames)";
             }},
            {"latency queue to display p99",
             [](const Summary& s) { return format("%.2f ms", s.latencyP99Ms); }},
            {"judder (content step deviation)",
             [](const Summary& s) { return format("%.3f ms", s.judderMs); }},
            {"mean content step", [](const Summary& s) { return format("%.3f ms", s.meanStepMs); }},
            {"library CPU per refresh, mean",
             [](const Summary& s) { return format("%.1f us", s.cpuMeanUs); }},
            {"library CPU per refresh, p99",
             [](const Summary& s) { return format("%.1f us", s.cpuP99Us); }},
    };
    return LINES;
}

void appendRow(std::string& out, const std::string& label, const std::string& run,
               const std::string* reference) {
    char text[160];
    if (reference == nullptr) {
        snprintf(text, sizeof(text), "%-33s %s\n", label.c_str(), run.c_str());
    } else {
        snprintf(text, sizeof(text), "%-33s %-26s %s\n", label.c_str(), run.c_str(),
                 reference->c_str());
    }
    out += text;
}

}  // namespace

std::string formatSummary(const Summary& run, const Summary* reference) {
    std::string out;
    const std::string runTitle = "run (mode " + std::to_string(run.mode) + ")";
    const std::string referenceTitle =
            reference != nullptr ? "reference (mode " + std::to_string(reference->mode) + ")" : "";
    appendRow(out, "", runTitle, reference != nullptr ? &referenceTitle : nullptr);
    for (const Line& line : lines()) {
        const std::string referenceValue = reference != nullptr ? line.value(*reference) : "";
        appendRow(out, line.label, line.value(run),
                  reference != nullptr ? &referenceValue : nullptr);
    }
    return out;
}

}  // namespace verolux::sim
