#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <array>
#include <cstdint>
#include <mutex>

#include "RealFPSTracker.h"
#include "RingBuffer.h"
#include "Timer.h"

namespace android {

// The library's version, as the dump and the ring log's header report it.
extern const uint32_t INTERPOLATION_MAJOR_VERSION;
extern const uint32_t INTERPOLATION_MINOR_VERSION;
extern const uint32_t INTERPOLATION_REVISION;
extern const char* INTERPOLATION_BRANCH;
// 64 lowercase hexadecimal digits fixed at build time from the library's sources.
extern const char* INTERPOLATION_CHECKSUM;

namespace Interpolation {

// The recent times of each kind of frame event of one layer, so that anyone can ask how many
// happened in the last second. The host records one time per event of a kind; the rates it reads
// back are what LogOutput logs and the watchdogs judge.
class EventAggregator final : public virtual RefBase {
public:
    enum Counter : uint32_t {
        eGameFrames = 0,          // each buffer the game queues
        eInterpolatedFrames = 1,  // each blended picture shown
        eMissedFrames = 2,        // each refresh whose chosen picture was not ready in time
        // Counters 3 and 4 with the interpolated pictures make the actual rate: the distinct
        // pictures shown.
        eOriginalFrames = 3,        // each game frame shown as it is, for the first time
        eUninterpolatedFrames = 4,  // each new picture composed without the library's state
        eRepeatedFrames = 5,        // each refresh that showed the previous picture again
        eSkippedFrames = 6,         // each game frame released without ever being shown
    };
    static constexpr uint32_t COUNTER_COUNT = 7;
    // Times kept per counter: a rate counts exactly up to this many events per second (a 480 Hz
    // display) and reads as this many above it.
    static constexpr uint32_t RING_CAPACITY = 480;
    static constexpr nsecs_t COUNTING_PERIOD = 1'000'000'000;

    explicit EventAggregator(uint32_t capacity = RING_CAPACITY);

    // Adds an event at `time` to the counter. Never allocates.
    void record(Counter counter, nsecs_t time);
    // The events of the counter at or after now - 1 s, counted newest first up to the first older
    // one (all of them if none is older).
    int count(Counter counter, nsecs_t now) const;
    // The distinct pictures shown in the last second: counters 3, 1 and 4, in that order.
    int getActualFPS(const long& now) const;

private:
    struct EventTimes {
        explicit EventTimes(uint32_t capacity) : mTimes(capacity) {}
        mutable std::mutex mMutex;
        RingBuffer<long> mTimes;  // guarded by mMutex
    };

    std::array<EventTimes, COUNTER_COUNT> mCounters;
};

// The layer's frame-rate statistics: trace counters of the game and actual rates at up to display
// rate, a block of log lines once a second, a line for the state dump and the version block.
class LogOutput final : public virtual RefBase {
public:
    static constexpr nsecs_t TICK_PERIOD = 16'666'666;  // one 60 Hz refresh
    static constexpr nsecs_t TOCK_PERIOD = 1'000'000'000;

    LogOutput(sp<EventAggregator> aggregator, sp<MachineLearning::RealFPSTracker> realFps);

    void onFirstRef() override;

    // The host calls it after each composition: at most one tick per call, and a tock for every
    // second that has passed.
    void outputLogs();
    // Publishes the "Game FPS" and "Actual FPS" trace counters.
    void tick();
    // Logs the rates of the last second, at log level 1 and above.
    void tock();

    void dumpState(String8& out, const char* prefix) const;
    void dumpVersionInfo(String8& out, const char* prefix) const;

private:
    int gameFps(nsecs_t now) const;

    std::mutex mMutex;
    const sp<EventAggregator> mAggregator;
    const sp<MachineLearning::RealFPSTracker> mRealFps;
    Timer mTickTimer;  // guarded by mMutex; its callback runs under it
    Timer mTockTimer;  // guarded by mMutex; its callback runs under it
};

}  // namespace Interpolation
}  // namespace android
