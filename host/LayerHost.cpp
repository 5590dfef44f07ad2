#include "LayerHost.h"

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
      mOnFrameReleased(std::move(onFrameReleased)) {
    String8 name = mConfig.name;
    sp<android::FrameList> frameList = mFrameList;
    sp<FrameTimingsAggregator> timings = mTimings;
    mInterceptor = new FrameInterceptor(name, mConfig.uid, mConfig.mode, frameList, timings);
    mBuilder = RenderStateBuilder::newBuilderFromMode(name, mConfig.uid, frameList, mConfig.mode);
    mPicker = ReleasePicker::newPickerFromMode(frameList, timings, name, mConfig.uid, mConfig.mode);
    mPicker->setFrameListCapacity(mConfig.frameListCapacity);
    mReleaseListener = new ReleaseListener(this);
    EventDispatcher::subscribe(mConfig.uid, LISTENED_EVENTS, mReleaseListener);
    mReleasedSlots.reserve(64);
    mReleasedScratch.reserve(64);
    mQueuedFrames.reserve(64);
}

LayerHost::~LayerHost() {
    stop();
    EventDispatcher::unsubscribe(mConfig.uid, LISTENED_EVENTS, mReleaseListener);
}

void LayerHost::start() {
    if (mRunning.exchange(true)) return;
    mReleaseThread = std::thread(&LayerHost::releaseLoop, this, mPicker);
}

void LayerHost::stop() {
    mRunning = false;
    noteQueueChange();
    // Removals waiting on a frame lock give up; the release thread holds the picker while it
    // selects, and drops it (stopping it) after at most one event wait.
    mFrameList->killLocks();
    mPicker.clear();
    if (mReleaseThread.joinable()) mReleaseThread.join();
    mFrameList->clearEveryFrame();
    recordReleases();
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
    while (mRunning) {
        const uint64_t changesBefore = [this] {
            std::lock_guard lock(mChangeMutex);
            return mQueueChanges;
        }();
        const FrameItem frame = picker->selectFrameForRelease();
        recordReleases();
        if (frame.mIndex != std::numeric_limits<uint64_t>::max()) {
            // The removal only waits for the composition in progress, which gives its frames back
            // before the compositor acquires again.
            std::lock_guard acquiring(mAcquireMutex);
            mFrameList->clearFrameAtLocking(frame.mID);
            continue;
        }
        // Nothing to release. Some policies say so at once (an empty queue), so ask again only
        // once the queue or the screen has changed, or after the picker's own event wait.
        std::unique_lock lock(mChangeMutex);
        mQueueChanged.wait_for(lock, std::chrono::nanoseconds(ReleasePicker::EVENT_WAIT_TIMEOUT),
                               [&] { return mQueueChanges != changesBefore || !mRunning; });
    }
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
}

void LayerHost::onBufferAcquired(uint64_t frameNumber, int slot,
                                 const sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                                 const sp<android::Fence>& acquireFence) {
    std::lock_guard acquiring(mAcquireMutex);
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

RenderState LayerHost::compose(nsecs_t displayTime) {
    RenderState state = mBuilder->lockStateFor(displayTime);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    for (const RenderItem& item : state.items) {
        if (!item.frame.isEmpty()) mTimings->compositionTimings(now, item.frame.mTextureSlot);
    }
    mDeadlinePredictor->onComposition(now);
    return state;
}

void LayerHost::onCompositionDone(const RenderState& state, nsecs_t displayTime,
                                  const std::shared_ptr<android::FenceTime>& presentFence) {
    for (const RenderItem& item : state.items) {
        if (item.frame.isEmpty()) continue;
        mTimings->presentFenceTimings(presentFence, item.frame.mTextureSlot);
        mFrameList->unlock(item.frame.mID);
    }
    if (mConfig.mode == eRetimeMode) {
        // The retime picker never advances its display time, so the frames that no display time
        // from here on can use are removed here: the oldest, once two frames are at or before now.
        for (size_t n = mFrameList->size(); n > 0 && mFrameList->isOldestFrameUnused(displayTime);
             n--) {
            mFrameList->clearOldestFrameIfUnusedLocking(displayTime);
        }
    }
    recordReleases();
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
