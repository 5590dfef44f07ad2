#pragma once

#include <utils/Timers.h>

#include <array>
#include <cstdint>
#include <vector>

#include "host/FrameRateStatistics.h"

namespace verolux::sim {

// What one simulated layer did, as records that the measures and the output writers take one at
// a time, however the run is driven. All times are monotonic nanoseconds; -1 means "did not
// happen".

// One game frame, complete once its buffer went back to the game.
struct FrameRecord {
    uint64_t number = 0;       // the producer's frame number, from 1
    int slot = -1;             // buffer-queue slot
    nsecs_t contentTime = -1;  // the game time the frame's picture shows
    nsecs_t startTime = -1;    // when the game asked for a buffer to draw it into
    nsecs_t dequeueTime = -1;  // when it got one; the difference is the wait for a free buffer
    nsecs_t queueTime = -1;
    nsecs_t timestamp = -1;        // the timestamp the game queued it with: its queue time, or
                                   // a reused one
    nsecs_t engineTimestamp = -1;  // the timestamp the engine's queue gave it; -1: never entered
    nsecs_t renderDoneTime = -1;   // when its acquire fence signalled
    nsecs_t acquireTime = -1;
    // The first and last present at which the frame carried the larger weight of the picture on
    // screen; -1 when it never did (a dropped frame).
    nsecs_t firstPresentTime = -1;
    nsecs_t lastPresentTime = -1;
    nsecs_t releaseTime = -1;  // when its buffer went back to the producer

    bool dropped() const { return firstPresentTime < 0; }
};

// What the screen showed at a refresh, compared with the refresh before: a blend of two frames,
// a single frame unlike the previous picture, the same picture again, or the previous picture
// held because the engine gave an empty state.
enum class Picture : uint8_t { BLEND, NEW, REPEAT, HELD };

const char* pictureName(Picture picture);

// One item of the state the engine gave for a refresh.
struct ComposedItem {
    uint64_t frameNumber = 0;  // 0: the empty frame
    float alpha = 0.0f;        // as the engine set it
    float weight = 0.0f;       // its share of the picture on screen
};

// One display refresh of the layer, as seen on screen at its present time.
struct RefreshRecord {
    static constexpr size_t MAX_ITEMS = 2;

    uint64_t index = 0;        // vsyncs since the first one; a gap is a skipped vsync
    nsecs_t vsyncTime = -1;    // when it was composed
    nsecs_t presentTime = -1;  // when it reached the screen (the present fence)
    Picture picture = Picture::HELD;
    std::array<ComposedItem, MAX_ITEMS> items{};  // the engine's state, first itemCount used
    uint8_t itemCount = 0;
    double contentTime = -1;        // game time on screen, weighted over the picture; -1 before any
    nsecs_t delay = -1;             // display delay in force, -1 when there is none
    nsecs_t cpuTime = -1;           // the library's CPU time for this refresh (thread CPU clock)
    uint32_t queueLength = 0;       // frames in the engine's queue after composing
    std::vector<uint8_t> scanline;  // one RGB scanline of the picture; may be empty

    // The host's side of the refresh.
    bool refused = false;         // the render-rate agent refused the presentation
    bool clientComposed = false;  // the composition fell back to client composition
    bool interpolating = true;    // the layer's settings interpolated it
    int32_t refreshRate = 0;      // the detected refresh rate, Hz
    int32_t gameRateLimit = 0;    // the game-rate agent's limit, 0 before the first
    bool gameRateLimitApplied = false;
};

// The layer's frame-rate statistics as the library counts them, sampled once a second.
struct StatisticsRecord {
    nsecs_t time = -1;
    host::FrameRateStatistics rates;
};

// A watchdog's warning, as the settings client read it back.
struct WarningRecord {
    nsecs_t time = -1;   // on the run's clock, from the warning's wall-clock time
    int64_t wallMs = 0;  // the warning's own time stamp: wall-clock ms since the epoch
    int32_t code = 0;    // WarningCode
    bool floatValue = false;
    double value = 0;
};

// Receives a layer's records in the order they complete: refreshes in present order, frames in
// frame-number order (a frame completes after the refreshes that showed it). Implementations
// compute or write from them alone: they own no thread and read no clock.
class RecordSink {
public:
    virtual ~RecordSink() = default;
    virtual void onFrame(const FrameRecord& frame) {}
    virtual void onRefresh(const RefreshRecord& refresh) {}
    virtual void onDelayChange(nsecs_t time, nsecs_t delay) {}
    virtual void onStatistics(const StatisticsRecord& statistics) {}
    virtual void onWarning(const WarningRecord& warning) {}
};

// Hands every record on to several sinks, in the order they were added.
class SinkFanout final : public RecordSink {
public:
    void add(RecordSink* sink) { mSinks.push_back(sink); }
    void onFrame(const FrameRecord& frame) override {
        for (RecordSink* sink : mSinks)
            sink->onFrame(frame);
    }
    void onRefresh(const RefreshRecord& refresh) override {
        for (RecordSink* sink : mSinks)
            sink->onRefresh(refresh);
    }
    void onDelayChange(nsecs_t time, nsecs_t delay) override {
        for (RecordSink* sink : mSinks)
            sink->onDelayChange(time, delay);
    }
    void onStatistics(const StatisticsRecord& statistics) override {
        for (RecordSink* sink : mSinks)
            sink->onStatistics(statistics);
    }
    void onWarning(const WarningRecord& warning) override {
        for (RecordSink* sink : mSinks)
            sink->onWarning(warning);
    }

private:
    std::vector<RecordSink*> mSinks;
};

}  // namespace verolux::sim
