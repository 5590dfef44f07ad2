#include "LayerHost.h"

#include <pthread.h>
#include <sys/prctl.h>
#include <ui/FenceTime.h>

#include <algorithm>
#include <chrono>
#include <limits>
#include <memory>

#include "SettingsController.h"

namespace verolux::host {

using android::FrameItem;
using android::sp;
using android::String8;
using namespace android::Interpolation;

namespace {

// `wait` after `now` (a time of the monotonic clock), at most the largest time: a policy's wait is
// bounded, though not tightly.
nsecs_t timeAfter(nsecs_t now, nsecs_t wait) {
    constexpr nsecs_t LATEST = std::numeric_limits<nsecs_t>::max();
    return wait >= LATEST - now ? LATEST : now + wait;
}

}  // namespace

// Hands every frame that leaves the list back to the host's owner.
class LayerHost::ReleaseListener : public EventDispatcher::EventReceiver {
public:
    explicit ReleaseListener(LayerHost* host) : mHost(host) {}

    void onEvent(const EventType& type, const nsecs_t&, const EventData& data) override {
        if (type != eFrameReleasedEvent) {
            mHost->noteQueueChange();
            return;
        }
        const auto* frame = std::get_if<FrameItem>(&data);
        if (frame == nullptr) return;
        mHost->mOnFrameReleased(*frame);
        mHost->noteFrameLeft(frame->mIndex, frame->mTextureSlot);
    }

private:
    LayerHost* const mHost;
};

LayerHost::LayerHost(Config config, FrameReleasedCallback onFrameReleased)
    : mConfig(std::move(config)),
      mFrameList(new android::FrameList(mConfig.uid)),
      mTimings(new FrameTimingsAggregator(mConfig.uid)),
      mRealFps(new MachineLearning::RealFPSTracker(mConfig.uid)),
      mDeadlinePredictor(new MachineLearning::CompositionDeadlinePredictor(mConfig.uid)),
      mOnFrameReleased(std::move(onFrameReleased)),
      mSettings(new LayerSettings(mConfig.uid)),
      mMonitor(mConfig.name, mConfig.uid, mConfig.mode, mRealFps),
      mRates(mConfig.name, mConfig.uid) {
    String8 name = mConfig.name;
    sp<android::FrameList> frameList = mFrameList;
    sp<FrameTimingsAggregator> timings = mTimings;
    mInterceptor = new FrameInterceptor(name, mConfig.uid, mConfig.mode, frameList, timings);
    mBuilder = RenderStateBuilder::newBuilderFromMode(name, mConfig.uid, frameList, mConfig.mode);
    mPicker = ReleasePicker::newPickerFromMode(frameList, timings, name, mConfig.uid, mConfig.mode);
    mPicker->setFrameListCapacity(mConfig.frameListCapacity);
    mReleaseListener = new ReleaseListener(this);
    mListenedEvents = eFrameReleasedEvent | mPicker->decisionEvents();
    EventDispatcher::subscribe(mConfig.uid, mListenedEvents, mReleaseListener);
    mReleasedSlots.reserve(64);
    mReleasedScratch.reserve(64);
    mQueuedFrames.reserve(64);
}

LayerHost::~LayerHost() {
    stop();
    EventDispatcher::unsubscribe(mConfig.uid, mListenedEvents, mReleaseListener);
}

void LayerHost::start() {
    if (mRunning.exchange(true)) return;
    mReleaseThread = std::thread(&LayerHost::releaseLoop, this, mPicker);
}

void LayerHost::stop() {
    mRunning = false;
    noteQueueChange();
    // Removals waiting on a frame lock give up. The release thread holds its own reference to the
    // picker, so dropping ours would not stop it: stopping it ends the selection's wait at once.
    mFrameList->killLocks();
    if (mPicker != nullptr) mPicker->stop();
    if (mReleaseThread.joinable()) mReleaseThread.join();
    mPicker.clear();
    mFrameList->clearEveryFrame();
    recordReleases();
    mRetiredFences.drop();
}

void LayerHost::noteQueueChange() {
    {
        std::lock_guard lock(mChangeMutex);
        mQueueChanges++;
    }
    mQueueChanged.notify_all();
}

void LayerHost::noteFrameLeft(uint64_t frameNumber, int slot) {
    std::lock_guard lock(mReleasedMutex);
    mReleasedSlots.push_back(slot);
    const auto queued = std::find(mQueuedFrames.begin(), mQueuedFrames.end(), frameNumber);
    if (queued != mQueuedFrames.end()) mQueuedFrames.erase(queued);
}

void LayerHost::releaseLoop(sp<ReleasePicker> picker) {
    configureReleaseThread();
    while (mRunning) {
        const uint64_t changesBefore = [this] {
            std::lock_guard lock(mChangeMutex);
            return mQueueChanges;
        }();
        const FrameItem frame = picker->selectFrameForRelease();
        if (frame.mIndex != NO_FRAME) {
            // The game waits for this buffer: let it go first, and record after.
            releaseFrame(frame);
            continue;
        }
        recordReleases();
        // Nothing to release. Some policies say so at once (an empty queue), so ask again only
        // after an event the picker decides on, or after the picker's own event wait.
        std::unique_lock lock(mChangeMutex);
        mQueueChanged.wait_for(lock, std::chrono::nanoseconds(ReleasePicker::EVENT_WAIT_TIMEOUT),
                               [&] { return mQueueChanges != changesBefore || !mRunning; });
    }
}

void LayerHost::releaseFrame(const FrameItem& frame) {
    setLeavingFrame(frame.mIndex);
    mFrameList->clearFrameAtLocking(frame.mID);
    setLeavingFrame(NO_FRAME);
    // At once, while this thread still holds the frame: the timings let go of its fence here, not
    // on the composition thread.
    recordReleases();
}

LayerHost::ReleaseStep LayerHost::stepRelease() {
    using Next = ReleaseStep::Next;
    if (mPicker == nullptr) return {Next::WAIT_FOR_EVENT, std::numeric_limits<nsecs_t>::max()};
    const uint64_t eventsBefore = releaseEvents();
    const ReleaseChoice choice = mPicker->decideRelease();
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    // The selection does not wait when an event came while it decided, and asks again.
    const bool eventCame = releaseEvents() != eventsBefore;
    switch (choice.action) {
        case ReleaseChoice::RELEASE:
            if (choice.frame.mIndex != NO_FRAME) {
                releaseFrame(choice.frame);
                return {Next::DECIDE, now};
            }
            recordReleases();
            // Nothing to release: the release thread waits for an event, as below.
            break;
        case ReleaseChoice::WAIT_FOR_TIME:
            if (eventCame) return {Next::DECIDE, now};
            // A wait of nothing is asked again at once, which on a thread takes some time; one
            // nanosecond lets a clock that moves only with the host's events move on.
            return {Next::WAIT_UNTIL, timeAfter(now, std::max<nsecs_t>(choice.waitTime, 1))};
        case ReleaseChoice::RELEASE_AFTER_SLEEP:
            // The blocking policy sleeps with usleep(), in whole microseconds.
            return {Next::SLEEP_UNTIL,
                    timeAfter(now, std::max<nsecs_t>(choice.waitTime, 0) / 1000 * 1000)};
        default:
            break;
    }
    if (eventCame) return {Next::DECIDE, now};
    return {Next::WAIT_FOR_EVENT, timeAfter(now, ReleasePicker::EVENT_WAIT_TIMEOUT)};
}

void LayerHost::finishSleepingRelease() {
    if (mPicker == nullptr) return;
    const FrameItem frame = mPicker->chooseOldestFrame().frame;
    if (frame.mIndex != NO_FRAME) {
        releaseFrame(frame);
    } else {
        recordReleases();
    }
}

uint64_t LayerHost::releaseEvents() const {
    std::lock_guard lock(mChangeMutex);
    return mQueueChanges;
}

void LayerHost::setLeavingFrame(uint64_t frameNumber) {
    std::lock_guard acquiring(mAcquireMutex);
    mLeavingFrame = frameNumber;
}

void LayerHost::recordReleases() {
    // The release and composition threads both record; each batch is recorded by one of them.
    std::lock_guard recording(mRecordingMutex);
    {
        std::lock_guard lock(mReleasedMutex);
        mReleasedScratch.swap(mReleasedSlots);
    }
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    for (int slot : mReleasedScratch) {
        mTimings->releaseFrameTimings(now, slot);
        mTimings->releaseBufferTimings(now, slot);
    }
    mReleasedScratch.clear();
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
    {
        std::lock_guard lock(mReleasedMutex);
        mQueuedFrames.push_back(frameNumber);
    }
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
    std::lock_guard acquiring(mAcquireMutex);
    if (frameNumber == mLeavingFrame) return;
    {
        std::lock_guard lock(mReleasedMutex);
        if (std::find(mQueuedFrames.begin(), mQueuedFrames.end(), frameNumber) ==
            mQueuedFrames.end()) {
            return;
        }
    }
    mInterceptor->interceptFrame(frameNumber, slot, buffer, timestamp, acquireFence, true);
    mTimings->receivedFrameTimings(systemTime(SYSTEM_TIME_MONOTONIC), slot);
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
    recordReleases();

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

void configureReleaseThread() {
    pthread_setname_np(pthread_self(), "verolux-release");
    // A release just in time must not be deferred to merge with other timers: the kernel's
    // default slack (50 us) is most of the lateness of a timed wait.
    prctl(PR_SET_TIMERSLACK, 1UL, 0UL, 0UL, 0UL);
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
