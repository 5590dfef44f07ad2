#include "LayerHost.h"

#include <ui/FenceTime.h>

#include <memory>

#include "SettingsController.h"

namespace verolux::host {

using android::FrameItem;
using android::sp;
using android::String8;
using namespace android::Interpolation;

LayerHost::LayerHost(Config config, FrameReleasedCallback onFrameReleased)
    : mConfig(std::move(config)),
      mFrameList(new android::FrameList(mConfig.uid)),
      mTimings(new FrameTimingsAggregator(mConfig.uid)),
      mRealFps(new MachineLearning::RealFPSTracker(mConfig.uid)),
      mDeadlinePredictor(new MachineLearning::CompositionDeadlinePredictor(mConfig.uid)),
      mSettings(new LayerSettings(mConfig.uid)),
      mMonitor(mConfig.name, mConfig.uid, mConfig.mode, mRealFps),
      mRates(mConfig.name, mConfig.uid) {
    String8 name = mConfig.name;
    sp<android::FrameList> frameList = mFrameList;
    sp<FrameTimingsAggregator> timings = mTimings;
    mInterceptor = new FrameInterceptor(name, mConfig.uid, mConfig.mode, frameList, timings);
    mBuilder = RenderStateBuilder::newBuilderFromMode(name, mConfig.uid, frameList, mConfig.mode);
    sp<ReleasePicker> picker =
            ReleasePicker::newPickerFromMode(frameList, timings, name, mConfig.uid, mConfig.mode);
    picker->setFrameListCapacity(mConfig.frameListCapacity);
    mRelease = new FrameRelease(mConfig.uid, mFrameList, mTimings, std::move(picker),
                                std::move(onFrameReleased));
}

LayerHost::~LayerHost() {
    stop();
}

void LayerHost::start() {
    mRelease->start();
}

void LayerHost::stop() {
    mRelease->stop();
    // Removals waiting on a frame lock give up, the release thread's among them.
    mFrameList->killLocks();
    mFrameList->clearEveryFrame();
    mRelease->recordReleases();
    mRelease->stopHandingBack();
    mRetiredFences.drop();
}

LayerHost::ReleaseStep LayerHost::stepRelease() {
    return mRelease->step();
}

void LayerHost::finishSleepingRelease() {
    mRelease->finishSleep();
}

uint64_t LayerHost::releaseEvents() const {
    return mRelease->events();
}

void LayerHost::onBufferDequeued(int slot, nsecs_t requestTime, nsecs_t dequeueTime) {
    mTimings->requestTiming(requestTime);
    mTimings->dequeueTimings(dequeueTime, slot);
}

void LayerHost::onBufferBackpressure() {
    mMonitor.onBackpressure();
}

void LayerHost::onBufferQueued(uint64_t frameNumber, int slot,
                               const sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                               const sp<android::Fence>& acquireFence) {
    mRelease->noteQueued(frameNumber);
    mInterceptor->interceptFrame(frameNumber, slot, buffer, timestamp, acquireFence, false);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    mRealFps->setReferenceTime(now);
    mRealFps->logBufferProvided(now);
    mMonitor.onGameFrame(now);
    mRates.onRealFps(mRealFps->getRealFPS(now));
    mMonitor.onGameRateLimit(mRates.gameRateLimit());
    mRetiredFences.drop();
}

void LayerHost::onBufferAcquired(uint64_t frameNumber, int slot,
                                 const sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                                 const sp<android::Fence>& acquireFence) {
    mRelease->acquireIfQueued(frameNumber, [&] {
        mInterceptor->interceptFrame(frameNumber, slot, buffer, timestamp, acquireFence, true);
        mTimings->receivedFrameTimings(systemTime(SYSTEM_TIME_MONOTONIC), slot);
    });
}

bool LayerHost::onVsync(nsecs_t vsync) {
    mPresenting = mRates.onVsync(vsync);
    return mPresenting;
}

const RenderState& LayerHost::compose(nsecs_t displayTime) {
    // The previous refresh's state is done with; the release thread may have let its frames go.
    mRetiredFences.retire(mState);
    mLatchedByHost = !mSettings->interpolating();
    if (mLatchedByHost) {
        latchNewestFrame();
    } else {
        mState = mBuilder->lockStateFor(displayTime);
    }
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    for (const RenderItem& item : mState.items) {
        if (!item.frame.isEmpty()) mTimings->compositionTimings(now, item.frame.mTextureSlot);
    }
    mDeadlinePredictor->onComposition(now);
    return mState;
}

void LayerHost::latchNewestFrame() {
    mState.items.clear();
    const FrameItem frame = mFrameList->getLatestAcquiredFrameAndLock();
    if (frame.isEmpty()) return;
    mState.items.push_back({frame, 1.0f, 0});
}

void LayerHost::onCompositionDone(const RenderState& state, nsecs_t displayTime,
                                  const std::shared_ptr<android::FenceTime>& presentFence,
                                  CompositionType type) {
    for (const RenderItem& item : state.items) {
        if (!item.frame.isEmpty())
            mTimings->presentFenceTimings(presentFence, item.frame.mTextureSlot);
    }
    // Every lock the composition took goes, not only those of the composed items: a builder may
    // lock a frame it looked at but did not compose (the unlimited builder's unready newest frame,
    // the mirror's frame at the display time), and such a lock would otherwise hold that frame's
    // removal, and so its buffer, until tear-down.
    mFrameList->unlockAll();
    clearUnusedFrames(displayTime);
    mRelease->recordReleases();

    const bool latchedByHost = mPresenting && mLatchedByHost;
    const RefreshClassifier::Outcome outcome =
            mClassifier.classify(mPresenting, state, latchedByHost);
    if (mPresenting) {
        const bool presented = presentFence != nullptr && presentFence->isValid();
        mRates.onPresented(presented && outcome.newPicture());
    }
    mMonitor.afterComposition(outcome, type == CompositionType::CLIENT, displayTime);
    mPresenting = true;
}

void LayerHost::clearUnusedFrames(nsecs_t displayTime) {
    // Without interpolation every frame older than the one on screen is done with. Otherwise the
    // retime picker never advances its display time, so the frames that no display time from here
    // on can use are removed here: the oldest, once two frames are at or before now.
    nsecs_t usedUpTo = -1;
    if (mLatchedByHost && !mState.items.empty()) {
        usedUpTo = mState.items.front().frame.mID;
    } else if (mConfig.mode == eRetimeMode) {
        usedUpTo = displayTime;
    }
    if (usedUpTo < 0) return;
    for (size_t n = mFrameList->size(); n > 0 && mFrameList->isOldestFrameUnused(usedUpTo); n--) {
        std::vector<FrameItem> removed = mFrameList->clearOldestFrameIfUnusedLocking(usedUpTo);
        mRetiredFences.retire(removed);
    }
}

LayerHost::Status LayerHost::status() const {
    Status status;
    status.refreshRate = mRates.refreshRate();
    status.gameRateLimit = mRates.gameRateLimit();
    status.gameRateLimitApplied = mSettings->gameRateLimited() && status.gameRateLimit > 0;
    status.interpolating = mSettings->interpolating();
    return status;
}

FrameRateStatistics LayerHost::statistics(nsecs_t now) const {
    return mMonitor.statistics(now, mRates.realFps());
}

void LayerHost::dump(String8& out) const {
    out.appendFormat("Verolux layer [%s] uid %u mode %u\n", mConfig.name.c_str(), mConfig.uid,
                     static_cast<uint32_t>(mConfig.mode));
    out.appendFormat("  Frames (%zu):\n", mFrameList->size());
    mFrameList->dump(out, "    ");
    const size_t before = out.size();
    mInterceptor->dumpState(out, "  ");
    if (out.size() == before) out.append("  Delay=none\n");
    mMonitor.dump(out, "  ");
    const Status now = status();
    out.appendFormat(
            "  Rates: refresh rate=%d Hz, real fps=%u, game-rate limit=%d fps (%s), "
            "interpolation %s\n",
            now.refreshRate, mRates.realFps(), now.gameRateLimit,
            now.gameRateLimitApplied ? "applied" : "not applied", now.interpolating ? "on" : "off");
    SettingsController* controller = SettingsController::getInstance();
    std::lock_guard lock(controller->getMutex());
    out.appendFormat("  Settings: %s\n", controller->getSettingsLocked(mConfig.uid).dump().c_str());
}

void LayerHost::writeRingLog(android::Parcel& out) const {
    mMonitor.writeRingLog(out);
}

bool deliverSettings(uint32_t uid, const std::vector<SettingValue>& values) {
    android::Parcel parcel;
    writeSettingsMessage(values, parcel);
    parcel.setDataPosition(0);
    SettingsController* controller = SettingsController::getInstance();
    const bool stored = controller->updateSettings(uid, parcel);
    controller->notifyChanges();
    return stored;
}

}  // namespace verolux::host
