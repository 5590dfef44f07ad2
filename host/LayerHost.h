#pragma once

#include <ui/Fence.h>
#include <ui/FenceTime.h>
#include <ui/GraphicBuffer.h>
#include <utils/String8.h>

#include <memory>
#include <vector>

#include "CompositionDeadlinePredictor.h"
#include "EventDispatcher.h"
#include "FrameInterceptor.h"
#include "FrameList.h"
#include "FrameTimings.h"
#include "RealFPSTracker.h"
#include "ReleasePicker.h"
#include "RenderStateBuilder.h"
#include "host/FrameRelease.h"
#include "host/LayerMonitor.h"
#include "host/LayerRates.h"
#include "host/LayerSettings.h"
#include "host/RefreshClassifier.h"
#include "host/RetiredFences.h"
#include "host/SettingsMessage.h"

namespace verolux::host {

// What a compositor does for one game layer that the engine paces: it creates the layer's objects
// for its mode, hands them every buffer the game queues and acquires, asks for a state at every
// refresh and gives the frames back after composing, and runs the release thread. Frames that leave
// the frame list, by whichever path, are handed back through the FrameReleasedCallback.
//
// Around that it runs the layer's rates (LayerRates), statistics and watchdogs (LayerMonitor). A
// layer whose settings do not interpolate it (gameFpsLimit below 1, as after a watchdog switched
// the game off) is composed as the platform composes any layer: the host latches the newest
// acquired frame itself, shows it whole, and lets every older frame go.
class LayerHost {
public:
    enum class CompositionType { DEVICE, CLIENT };

    // What the host reports of the layer besides its pictures.
    struct Status {
        int32_t refreshRate = 0;            // the detected refresh rate, Hz
        int32_t gameRateLimit = 0;          // the game-rate agent's limit, 0 before the first
        bool gameRateLimitApplied = false;  // the game is held to it (gfpsOffsetEnabled)
        bool interpolating = false;         // the settings interpolate the layer
    };

    struct Config {
        android::String8 name;
        uint32_t uid = 0;
        android::Interpolation::InterpolationMode mode = android::Interpolation::eRetimeMode;
        size_t frameListCapacity = 3;
    };

    // Runs on the thread whose removal took the frame out of the list, with the list's and the
    // event bus's mutexes held: it must be short and must not call into the host or the library.
    using FrameReleasedCallback = FrameRelease::FrameReleasedCallback;

    LayerHost(Config config, FrameReleasedCallback onFrameReleased);
    ~LayerHost();
    LayerHost(const LayerHost&) = delete;
    LayerHost& operator=(const LayerHost&) = delete;

    // Starts the release thread.
    void start();

    // The release side, one decision at a time, for a host that keeps time itself and runs no
    // release thread (a simulation): see FrameRelease::step(). Called between compositions (a
    // composed frame stays locked until onCompositionDone), never while the release thread runs.
    using ReleaseStep = FrameRelease::Step;
    ReleaseStep stepRelease();
    void finishSleepingRelease();
    uint64_t releaseEvents() const;
    // Tear-down, in an order that never waits for the release thread to run: the thread is told to
    // stop (its waits end, and it ends on its own), waits on frame locks end, the frames still
    // queued are handed back, and then no frame reaches the FrameReleasedCallback any more.
    // Refreshes and buffers must have stopped.
    void stop();

    // The buffer queue's side. An acquisition that comes after the engine has already let the frame
    // go (a release picker may release a queued frame while the queue is acquiring it) is ignored,
    // so that the frame does not come back into the engine's queue.
    void onBufferDequeued(int slot, nsecs_t requestTime, nsecs_t dequeueTime);
    // The producer found no free buffer and waits for one.
    void onBufferBackpressure();
    void onBufferQueued(uint64_t frameNumber, int slot,
                        const android::sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                        const android::sp<android::Fence>& acquireFence);
    void onBufferAcquired(uint64_t frameNumber, int slot,
                          const android::sp<android::GraphicBuffer>& buffer, nsecs_t timestamp,
                          const android::sp<android::Fence>& acquireFence);

    // The display's side, on one thread, at every refresh: onVsync, which says whether the layer
    // presents at this refresh; when it does, compose, the state for `displayTime`, whose frames
    // stay locked until onCompositionDone; then onCompositionDone always, with the composed state
    // (an empty one when the layer did not present: it keeps its previous picture).
    bool onVsync(nsecs_t vsync);
    const android::Interpolation::RenderState& compose(nsecs_t displayTime);
    void onCompositionDone(const android::Interpolation::RenderState& state, nsecs_t displayTime,
                           const std::shared_ptr<android::FenceTime>& presentFence,
                           CompositionType type = CompositionType::DEVICE);

    Status status() const;
    // The frame-event counts of the second before `now`.
    FrameRateStatistics statistics(nsecs_t now) const;
    // The layer in the platform's dumpsys style: the frame list, the delay, the statistics line,
    // the version block and the settings line.
    void dump(android::String8& out) const;
    // The layer's event ring log, as the controlling service reads it.
    void writeRingLog(android::Parcel& out) const;

    const Config& config() const { return mConfig; }
    const android::sp<android::FrameList>& frameList() const { return mFrameList; }

private:
    void latchNewestFrame();
    // Lets go the frames that no later refresh will show.
    void clearUnusedFrames(nsecs_t displayTime);

    const Config mConfig;
    const android::sp<android::FrameList> mFrameList;
    const android::sp<android::Interpolation::FrameTimingsAggregator> mTimings;
    android::sp<android::Interpolation::FrameInterceptor> mInterceptor;
    android::sp<android::Interpolation::RenderStateBuilder> mBuilder;
    const android::sp<android::Interpolation::MachineLearning::RealFPSTracker> mRealFps;
    const android::sp<android::Interpolation::MachineLearning::CompositionDeadlinePredictor>
            mDeadlinePredictor;
    android::sp<FrameRelease> mRelease;
    const android::sp<LayerSettings> mSettings;
    // Before the rates, so that the ring log hears the render-rate agent's first announcement.
    LayerMonitor mMonitor;
    LayerRates mRates;

    // The composition thread's own.
    android::Interpolation::RenderState mState;  // reused, so that latching allocates nothing
    bool mPresenting = true;
    bool mLatchedByHost = false;
    RefreshClassifier mClassifier;

    // The fences of frames the composition thread is done with; the buffer queue's thread drops
    // them.
    RetiredFences mRetiredFences;
};

// Delivers settings as the controlling service does: an updateSettings parcel for the uid, then
// notifyChanges. Returns updateSettings' result.
bool deliverSettings(uint32_t uid, const std::vector<SettingValue>& values);

}  // namespace verolux::host
