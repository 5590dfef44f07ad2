#pragma once

#include <utils/RefBase.h>
#include <utils/Timers.h>

#include <atomic>
#include <condition_variable>
#include <functional>
#include <limits>
#include <mutex>
#include <vector>

#include "EventDispatcher.h"
#include "FrameList.h"
#include "FrameTimings.h"
#include "ReleasePicker.h"

namespace verolux::host {

// How a layer's frames leave the engine: the release thread and its picker, the listener that hands
// every departing frame back to the host's owner, and the record of which frames are still in the
// engine. The release thread holds its own reference to all of it, so tear-down tells the thread
// to stop and never waits for it to be scheduled: a woken thread on an idle core can take
// milliseconds to run, and the compositor's tear-down must not.
class FrameRelease : public android::Interpolation::EventDispatcher::EventReceiver {
public:
    // Runs on the thread whose removal took the frame out of the list, with the list's and the
    // event bus's mutexes held: it must be short and must not call into the host or the library.
    using FrameReleasedCallback = std::function<void(const android::FrameItem& frame)>;

    // What the release side does next after step(), for a host that keeps time itself and runs no
    // release thread (a simulation). A wait ends at the time given or, unless it is a sleep, at the
    // next event the picker decides on (events() moves), whichever comes first; then the host
    // calls step() again (after a sleep, finishSleep()).
    struct Step {
        enum class Next {
            DECIDE,          // decide again at once: a frame went, or an event came meanwhile
            WAIT_FOR_EVENT,  // nothing to release; `until` is where the event wait runs out
            WAIT_UNTIL,      // the policy asked to be asked again at `until`
            SLEEP_UNTIL,     // the latency picker's sleep: no decision until `until`
        };
        Next next = Next::DECIDE;
        nsecs_t until = 0;
    };

    FrameRelease(uint32_t uid, android::sp<android::FrameList> frameList,
                 android::sp<android::Interpolation::FrameTimingsAggregator> timings,
                 android::sp<android::Interpolation::ReleasePicker> picker,
                 FrameReleasedCallback onFrameReleased);

    // Subscribes the listener; the last reference unsubscribes it, if stopHandingBack() has not.
    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;
    void onEvent(const android::Interpolation::EventType& type, const nsecs_t& time,
                 const android::Interpolation::EventData& data) override;

    // Starts the release thread. It ends on its own after stop(), at the latest once the policy
    // step it is in has ended (the latency picker's sleep, 16 ms at most).
    void start();
    // Ends the release thread's waits and every later selection, without waiting for the thread.
    void stop();
    // Once it returns no frame reaches the owner any more: the bus's mutex, held through every
    // delivery, orders it after a hand-back in progress. Waits for nothing else.
    void stopHandingBack();

    // One step of the release thread without its waits (see Step): one decision through the
    // picker's decideRelease(), the release it names, and what to wait for. Never called while
    // the release thread runs.
    Step step();
    // The end of a SLEEP_UNTIL: releases the oldest frame as it is now, as the latency picker does
    // after its sleep.
    void finishSleep();
    // Counts the events after which the picker may decide otherwise.
    uint64_t events() const;

    // The buffer queue's side: a frame queued into the engine, and its acquisition, which runs
    // `acquire` unless the frame has already left the engine (a picker may release a queued frame
    // while the queue is acquiring it) and keeps the frame from leaving meanwhile.
    void noteQueued(uint64_t frameNumber);
    template <typename Acquire>
    void acquireIfQueued(uint64_t frameNumber, Acquire&& acquire);

    // Records the release of the frames that left since the last call in the frame timings.
    void recordReleases();

private:
    static constexpr uint64_t NO_FRAME = std::numeric_limits<uint64_t>::max();

    static void run(android::sp<FrameRelease> self);
    void releaseLoop();
    // Takes the frame the picker chose out of the list; the listener hands it back.
    void releaseFrame(const android::FrameItem& frame);
    void setLeavingFrame(uint64_t frameNumber);
    void noteEvent();
    void noteFrameLeft(uint64_t frameNumber, int slot);
    bool isQueued(uint64_t frameNumber);

    const uint32_t mUid;
    const android::sp<android::FrameList> mFrameList;
    const android::sp<android::Interpolation::FrameTimingsAggregator> mTimings;
    const android::sp<android::Interpolation::ReleasePicker> mPicker;
    // Frames leaving the list, to hand them back, and the events after which the picker may
    // decide otherwise, to ask it again when it had nothing to release.
    const uint32_t mListenedEvents;
    // Called only from event deliveries; cleared, once unsubscribed, by the thread that stops.
    FrameReleasedCallback mOnFrameReleased;
    std::atomic<bool> mHandingBack{true};

    std::atomic<bool> mRunning{false};
    mutable std::mutex mEventMutex;  // a leaf lock: taken from event delivery
    std::condition_variable mEventCame;
    uint64_t mEvents = 0;  // guarded by mEventMutex

    // Held across the acquisition of a frame, so that a frame is never acquired into the queue
    // after it left it: a frame that has left is no longer among mQueuedFrames, and the one the
    // release thread is taking out is mLeavingFrame. The removal itself waits on frame locks, which
    // a composition may hold for as long as it likes, so it never holds this mutex: the
    // composition thread acquires. Taken before the list's mutex.
    std::mutex mAcquireMutex;
    uint64_t mLeavingFrame = NO_FRAME;  // guarded by mAcquireMutex

    // Frames that left the list, whose release the frame timings have not recorded yet: the
    // listener cannot record them itself, since that broadcasts from inside a broadcast.
    std::mutex mReleasedMutex;
    std::vector<int> mReleasedSlots;  // guarded by mReleasedMutex
    // Frames queued into the engine that have not left it yet; at most one per buffer.
    std::vector<uint64_t> mQueuedFrames;  // guarded by mReleasedMutex
    std::mutex mRecordingMutex;
    std::vector<int> mReleasedScratch;  // guarded by mRecordingMutex
};

template <typename Acquire>
void FrameRelease::acquireIfQueued(uint64_t frameNumber, Acquire&& acquire) {
    std::lock_guard acquiring(mAcquireMutex);
    if (frameNumber == mLeavingFrame || !isQueued(frameNumber)) return;
    acquire();
}

// Sets up the calling thread as the host sets up its release thread: named, and with the least
// timer slack, so that a timed release wakes when it is due.
void configureReleaseThread();

}  // namespace verolux::host
