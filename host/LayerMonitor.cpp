#include "host/LayerMonitor.h"

#include <algorithm>

#include "SettingsController.h"

namespace verolux::host {

using android::sp;
using android::String8;
using namespace android::Interpolation;

LayerMonitor::LayerMonitor(const String8& name, uint32_t uid, InterpolationMode mode,
                           const sp<MachineLearning::RealFPSTracker>& realFps)
    : mAggregator(new EventAggregator()),
      mLogOutput(new LogOutput(mAggregator, realFps)),
      mClientWatchdog(new ClientCompositionWatchdog(uid, name)),
      mRinglog([&] {
          String8 ringName = name;
          return new Ringlog(ringName, mode, uid);
      }()) {
    sp<RealWatchdogInterface> source = new RealWatchdogInterface(mAggregator);
    mPerformanceWatchdog = new PerformanceWatchdog<RealWatchdogInterface>(uid, name, source);
    if (mode == eLatencyReductionMode) {
        sp<EventAggregator> aggregator = mAggregator;
        mLatencyWatchdog = new LatencyReductionWatchdog(uid, name, aggregator);
    }
}

void LayerMonitor::onGameFrame(nsecs_t queueTime) {
    mAggregator->record(Counter::eGameFrames, queueTime);
}

void LayerMonitor::onBackpressure() {
    mRinglog->logBackpressure();
}

void LayerMonitor::onGameRateLimit(int32_t limit) {
    if (mLoggedGameRateLimit.exchange(limit, std::memory_order_relaxed) != limit) {
        mRinglog->logGFPSChangedEvent(limit);
    }
}

void LayerMonitor::afterComposition(const RefreshClassifier::Outcome& outcome, bool clientComposed,
                                    nsecs_t displayTime) {
    if (outcome.counted) mAggregator->record(outcome.counter, displayTime);
    if (outcome.counted && outcome.counter == Counter::eRepeatedFrames) {
        mRinglog->logFrameRepeated();
    }
    // More than a ring's worth adds nothing to a count of the last second.
    const uint64_t skipped =
            std::min<uint64_t>(outcome.skippedFrames, EventAggregator::RING_CAPACITY);
    for (uint64_t i = 0; i < skipped; i++)
        mAggregator->record(Counter::eSkippedFrames, displayTime);

    mLogOutput->outputLogs();
    if (clientComposed) mClientWatchdog->onClientComposition();
    mClientWatchdog->onPostComposition();
    mPerformanceWatchdog->update();
    if (mLatencyWatchdog != nullptr) mLatencyWatchdog->update();

    if (mSettingsDelivery.period <= 0) {
        mSettingsDelivery.arm(
                SETTINGS_DELIVERY_PERIOD, displayTime,
                [] { SettingsController::getInstance()->notifyChanges(); }, /*once=*/true);
    }
    mSettingsDelivery.check(displayTime);
}

FrameRateStatistics LayerMonitor::statistics(nsecs_t now, uint32_t realFps) const {
    FrameRateStatistics s;
    s.gameFps = mAggregator->count(Counter::eGameFrames, now);
    s.realFps = realFps;
    s.actualFps = mAggregator->getActualFPS(now);
    s.interpolatedFps = mAggregator->count(Counter::eInterpolatedFrames, now);
    s.missedFps = mAggregator->count(Counter::eMissedFrames, now);
    s.repeatedFps = mAggregator->count(Counter::eRepeatedFrames, now);
    s.skippedFps = mAggregator->count(Counter::eSkippedFrames, now);
    return s;
}

void LayerMonitor::writeRingLog(android::Parcel& out) const {
    mRinglog->writeToParcel(out);
}

void LayerMonitor::dump(String8& out, const char* prefix) const {
    mLogOutput->dumpState(out, prefix);
    mLogOutput->dumpVersionInfo(out, prefix);
}

}  // namespace verolux::host
