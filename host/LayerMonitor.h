#pragma once

#include <utils/String8.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>

#include "ClientCompositionWatchdog.h"
#include "FrameItem.h"
#include "LatencyReductionWatchdog.h"
#include "LogOutput.h"
#include "PerformanceWatchdog.h"
#include "RealFPSTracker.h"
#include "Ringlog.h"
#include "Timer.h"
#include "host/FrameRateStatistics.h"
#include "host/RefreshClassifier.h"

namespace verolux::host {

// What a compositor watches of one layer: it counts the layer's frame events in the layer's
// EventAggregator, has LogOutput log the statistics, and polls the watchdogs after every
// composition. A watchdog that switches the game off only stores the uid's reset settings; as the
// platform's settings service, the monitor then delivers them (notifyChanges) at most a second
// later, from the composition thread with no lock of the layer held.
//
// The layer's ring log records every event of its uid by itself; the monitor adds what only the
// host sees: a picture shown again, a producer that found no free buffer, a new game-rate limit.
//
// The latency-reduction watchdog judges a game's steadiness for latency reduction alone, so only
// a layer in that mode has one.
class LayerMonitor {
public:
    static constexpr nsecs_t SETTINGS_DELIVERY_PERIOD = 1'000'000'000;

    LayerMonitor(const android::String8& name, uint32_t uid,
                 android::Interpolation::InterpolationMode mode,
                 const android::sp<android::Interpolation::MachineLearning::RealFPSTracker>& realFps);
    LayerMonitor(const LayerMonitor&) = delete;
    LayerMonitor& operator=(const LayerMonitor&) = delete;

    // Buffer thread: the game queued a frame.
    void onGameFrame(nsecs_t queueTime);
    // Buffer thread: the game found no free buffer and had to wait for one.
    void onBackpressure();
    // Any thread: the game-rate agent set a limit other than the last one logged.
    void onGameRateLimit(int32_t limit);
    // Composition thread, after every composition: what the refresh showed, whether it fell back
    // to client composition, and its display time.
    void afterComposition(const RefreshClassifier::Outcome& outcome, bool clientComposed,
                          nsecs_t displayTime);

    FrameRateStatistics statistics(nsecs_t now, uint32_t realFps) const;
    // The statistics line and the version block.
    void dump(android::String8& out, const char* prefix) const;
    // The ring log as the controlling service reads it.
    void writeRingLog(android::Parcel& out) const;

private:
    using Counter = android::Interpolation::EventAggregator::Counter;

    const android::sp<android::Interpolation::EventAggregator> mAggregator;
    const android::sp<android::Interpolation::LogOutput> mLogOutput;
    android::sp<
            android::Interpolation::PerformanceWatchdog<android::Interpolation::RealWatchdogInterface>>
            mPerformanceWatchdog;
    android::sp<android::Interpolation::LatencyReductionWatchdog> mLatencyWatchdog;  // may be null
    const android::sp<android::Interpolation::ClientCompositionWatchdog> mClientWatchdog;
    const android::sp<android::Interpolation::Ringlog> mRinglog;
    std::atomic<int32_t> mLoggedGameRateLimit{0};
    android::Interpolation::Timer mSettingsDelivery;  // composition thread only
};

}  // namespace verolux::host
