#include "LogOutput.h"

#include "Log.h"
#include "Trace.h"

namespace android {

const uint32_t INTERPOLATION_MAJOR_VERSION = 1;
const uint32_t INTERPOLATION_MINOR_VERSION = 5;
const uint32_t INTERPOLATION_REVISION = 39;
const char* INTERPOLATION_BRANCH = "release";

namespace Interpolation {

EventAggregator::EventAggregator(uint32_t capacity)
    : mCounters{EventTimes(capacity), EventTimes(capacity), EventTimes(capacity),
                EventTimes(capacity), EventTimes(capacity), EventTimes(capacity),
                EventTimes(capacity)} {}

void EventAggregator::record(Counter counter, nsecs_t time) {
    if (counter >= COUNTER_COUNT) {
        ILOG(1, "EventAggregator: no counter %u", static_cast<uint32_t>(counter));
        return;
    }
    EventTimes& events = mCounters[counter];
    std::lock_guard lock(events.mMutex);
    events.mTimes.push(time);
}

int EventAggregator::count(Counter counter, nsecs_t now) const {
    if (counter >= COUNTER_COUNT) return 0;
    const EventTimes& events = mCounters[counter];
    const nsecs_t since = now - COUNTING_PERIOD;
    std::lock_guard lock(events.mMutex);
    const uint32_t size = events.mTimes.size();
    for (uint32_t i = 0; i < size; i++) {
        if (events.mTimes.at(static_cast<int32_t>(i)) < since) return static_cast<int>(i);
    }
    return static_cast<int>(size);
}

int EventAggregator::getActualFPS(const long& now) const {
    ScopedTrace trace("getActualFPS");
    int actual = count(eOriginalFrames, now);
    actual += count(eInterpolatedFrames, now);
    actual += count(eUninterpolatedFrames, now);
    return actual;
}

LogOutput::LogOutput(sp<EventAggregator> aggregator, sp<MachineLearning::RealFPSTracker> realFps)
    : mAggregator(std::move(aggregator)), mRealFps(std::move(realFps)) {}

void LogOutput::onFirstRef() {
    std::lock_guard lock(mMutex);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    mTickTimer.arm(
            TICK_PERIOD, now, [this] { tick(); }, /*once=*/true);
    mTockTimer.arm(
            TOCK_PERIOD, now, [this] { tock(); }, /*once=*/false);
}

void LogOutput::outputLogs() {
    ScopedTrace trace("outputLogs");
    std::lock_guard lock(mMutex);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    mTickTimer.check(now);
    mTockTimer.check(now);
}

int LogOutput::gameFps(nsecs_t now) const {
    ScopedTrace trace("getGameFPS");
    return mAggregator->count(EventAggregator::eGameFrames, now);
}

void LogOutput::tick() {
    ScopedTrace trace("tick");
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    traceCounter("Game FPS", gameFps(now));
    traceCounter("Actual FPS", mAggregator->getActualFPS(now));
}

void LogOutput::tock() {
    ScopedTrace trace("tock");
    if (logLevel.load(std::memory_order_relaxed) < 1) return;
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    ILOG(1, "LogOutput: Game FPS %d\n", gameFps(now));
    ILOG(1, "LogOutput: Real Game FPS %d\n", static_cast<int>(mRealFps->getRealFPS(now)));
    ILOG(1, "LogOutput: Actual FPS %d\n", mAggregator->getActualFPS(now));
    ILOG(1, "LogOutput: Interpolated FPS %d\n",
         mAggregator->count(EventAggregator::eInterpolatedFrames, now));
    ILOG(1, "LogOutput: Missed FPS %d\n", mAggregator->count(EventAggregator::eMissedFrames, now));
    ILOG(1, "LogOutput: Repeated FPS %d\n",
         mAggregator->count(EventAggregator::eRepeatedFrames, now));
    ILOG(1, "LogOutput: Skipped FPS %d\n", mAggregator->count(EventAggregator::eSkippedFrames, now));
    ILOG(1, "FrameInterpolation: Original FPS: %d, FPS with interpolation: %d",
         mAggregator->count(EventAggregator::eGameFrames, now), mAggregator->getActualFPS(now));
}

void LogOutput::dumpState(String8& out, const char* prefix) const {
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    out.appendFormat(
            "%sLog: game fps=%d, actual fps=%d, interpolated fps=%d, missed fps=%d, repeated "
            "fps=%d\n",
            prefix, mAggregator->count(EventAggregator::eGameFrames, now),
            mAggregator->getActualFPS(now),
            mAggregator->count(EventAggregator::eInterpolatedFrames, now),
            mAggregator->count(EventAggregator::eMissedFrames, now),
            mAggregator->count(EventAggregator::eRepeatedFrames, now));
}

void LogOutput::dumpVersionInfo(String8& out, const char* prefix) const {
    out.appendFormat("%sVersion: %u.%u\n", prefix, INTERPOLATION_MAJOR_VERSION,
                     INTERPOLATION_MINOR_VERSION);
    out.appendFormat("%sChecksum: %s\n", prefix, INTERPOLATION_CHECKSUM);
}

}  // namespace Interpolation
}  // namespace android
