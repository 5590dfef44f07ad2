#pragma once

#include <ui/Fence.h>
#include <ui/FenceTime.h>
#include <ui/GraphicBuffer.h>
#include <utils/String8.h>

#include <atomic>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "CompositionDeadlinePredictor.h"
#include "EventDispatcher.h"
#include "FrameInterceptor.h"
#include "FrameList.h"
#include "FrameTimings.h"
#include "RealFPSTracker.h"
#include "ReleasePicker.h"
#include "RenderStateBuilder.h"
#include "host/SettingsMessage.h"

namespace verolux::host {

// What a compositor does for one game layer that the engine paces: it creates the layer's objects
// for its mode, hands them every buffer the game queues and acquires, asks for a state at every
// refresh and gives the frames back after composing, and runs the release thread. Frames that leave
// the frame list, by whichever path, are handed back through the FrameReleasedCallback.
class LayerHost {
public:
    struct Config {
        android::String8 name;
        uint32_t uid = 0;
        android::Interpolation::InterpolationMode mode = android::Interpolation::eRetimeMode;
        size_t frameListCapacity = 3;
    };

    // Runs on the thread whose removal took the frame out of the list, with the list's and the
    // event bus's mutexes held: it must be short and must not call into the host or the library.
    using FrameReleasedCallback = std::function<void(const android::FrameItem& frame)>;

    LayerHost(Config config, FrameReleasedCallback onFrameReleased);
    ~LayerHost();
    LayerHost(const LayerHost&) = delete;
    LayerHost& operator=(const LayerHost&) = delete;

    // Starts the release thread.
    void start();
    // Tear-down, in the order that never blocks: no more waiting on frame locks, the release thread
    // ends, the frames still queued are handed back. Refreshes and buffers must have stopped.
    void stop();

    // The buffer queue's side. An acquisition that comes after the engine has already let the frame
    // go (a release picker may release a queued frame while the queue is acquiring it) is ignored,
    // so that the frame does not come back into the engine's queue.
    void onBufferDequeued(int slot, nsecs_t requestTime, nsecs_t dequeueTime);
    void onBufferQueued(uint64_t frameNumber, int slot,
                        const android::sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                        const android::sp<android::Fence>& acquireFence);
    void onBufferAcquired(uint64_t frameNumber, int slot,
                          const android::sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                          const android::sp<android::Fence>& acquireFence);

    // The display's side: the state to compose for `displayTime`; its frames stay locked until
    // onCompositionDone.
    android::Interpolation::RenderState compose(nsecs_t displayTime);
    void onCompositionDone(const android::Interpolation::RenderState& state, nsecs_t displayTime,
                           const std::shared_ptr<android::FenceTime>& presentFence);

    const Config& config() const { return mConfig; }
    const android::sp<android::FrameList>& frameList() const { return mFrameList; }

private:
    class ReleaseListener;

    // Frames leaving the list are handed back; frame arrivals and compositions wake the release
    // thread when its picker had nothing to release.
    static constexpr uint32_t LISTENED_EVENTS = android::Interpolation::eFrameReleasedEvent |
                                                android::Interpolation::eFrameReceivedEvent |
                                                android::Interpolation::eBufferComposedEvent;

    void noteQueueChange();
    void noteFrameLeft(uint64_t frameNumber, int slot);
    void releaseLoop(android::sp<android::Interpolation::ReleasePicker> picker);
    void recordReleases();

    const Config mConfig;
    const android::sp<android::FrameList> mFrameList;
    const android::sp<android::Interpolation::FrameTimingsAggregator> mTimings;
    android::sp<android::Interpolation::FrameInterceptor> mInterceptor;
    android::sp<android::Interpolation::RenderStateBuilder> mBuilder;
    android::sp<android::Interpolation::ReleasePicker> mPicker;
    const android::sp<android::Interpolation::MachineLearning::RealFPSTracker> mRealFps;
    const android::sp<android::Interpolation::MachineLearning::CompositionDeadlinePredictor>
            mDeadlinePredictor;
    const FrameReleasedCallback mOnFrameReleased;
    android::sp<ReleaseListener> mReleaseListener;

    std::atomic<bool> mRunning{false};
    std::thread mReleaseThread;

    std::mutex mChangeMutex;  // a leaf lock: taken from event delivery
    std::condition_variable mQueueChanged;
    uint64_t mQueueChanges = 0;  // guarded by mChangeMutex

    // Held across the acquisition of a frame and across the release thread's removals, so that
    // a frame is never acquired into the queue after it left it. Taken before the list's mutex.
    std::mutex mAcquireMutex;

    // Frames that left the list, whose release the frame timings have not recorded yet: the
    // listener cannot record them itself, since that broadcasts from inside a broadcast.
    std::mutex mReleasedMutex;
    std::vector<int> mReleasedSlots;  // guarded by mReleasedMutex
    // Frames queued into the engine that have not left it yet; at most one per buffer.
    std::vector<uint64_t> mQueuedFrames;  // guarded by mReleasedMutex
    std::mutex mRecordingMutex;
    std::vector<int> mReleasedScratch;  // guarded by mRecordingMutex
};

// Delivers settings as the controlling service does: an updateSettings parcel for the uid, then
// notifyChanges. Returns updateSettings' result.
bool deliverSettings(uint32_t uid, const std::vector<SettingValue>& values);

}  // namespace verolux::host
