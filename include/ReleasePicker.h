#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>

#include "EventDispatcher.h"
#include "FrameItem.h"
#include "FrameList.h"

namespace android::Interpolation {

class FrameTimingsAggregator;

// The result of one policy step.
struct ReleaseChoice {
    static constexpr int32_t RELEASE = 0;         // release `frame` now
    static constexpr int32_t WAIT_FOR_EVENT = 1;  // nothing to release: wait for the next event
    static constexpr int32_t WAIT_FOR_TIME = 2;   // wait `waitTime`, then ask again
    // Only from decideRelease(): sleep `waitTime` (the picker decides nothing meanwhile), then
    // release the oldest frame as chooseOldestFrame() finds it then. The blocking selection makes
    // this sleep itself, holding the picker.
    static constexpr int32_t RELEASE_AFTER_SLEEP = 3;

    int32_t action = WAIT_FOR_EVENT;
    FrameItem frame;
    nsecs_t waitTime = 0;
};

// Decides, per layer, which queued frame the host's release thread releases next and when. The
// thread blocks in selectFrameForRelease() until the mode's policy, tryRelease(), names a frame or
// a wait runs out; composition events from the bus tell the policy what is on screen and when the
// next composition comes.
class ReleasePicker : public EventDispatcher::EventReceiver {
public:
    static constexpr uint32_t EVENT_FLAGS =
            eCompositionEstimateEvent | eBufferComposedEvent | eFrameReceivedEvent;
    static constexpr nsecs_t EVENT_WAIT_TIMEOUT = 30'000'000;
    // A computed wait never ends later than this after the next composition: one refresh period
    // of the slowest display a compositor drives (20 Hz). By then a new composition estimate has
    // normally woken the selection anyway; the bound only matters when a setting asks for more.
    static constexpr nsecs_t MAX_WAIT_PAST_COMPOSITION = 50'000'000;

    static sp<ReleasePicker> newPickerFromMode(sp<FrameList>& frameList,
                                               sp<FrameTimingsAggregator>& timings, String8& name,
                                               unsigned int const& uid,
                                               InterpolationMode const& mode);

    void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) override;
    ~ReleasePicker() override;
    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;
    virtual void setFrameListCapacity(size_t capacity);
    // Blocks until a frame is to be released, and returns it; returns the empty frame when no
    // frame came within the event wait, and at once after the picker has stopped. It is the
    // blocking loop around the step that decideRelease() makes without blocking.
    virtual FrameItem selectFrameForRelease();
    // The mode's policy; runs with mMutex held.
    virtual ReleaseChoice tryRelease() = 0;

    // One decision that never blocks: applies the events delivered so far, runs one policy step
    // and returns what to do: release a frame now, wait for the next event (or EVENT_WAIT_TIMEOUT,
    // whichever comes first), wait a time, or sleep and then release the oldest frame. Events that
    // arrive while it runs are applied by the next call. After stop() it releases the empty frame.
    // A host that keeps time itself (a simulation) calls it instead of selectFrameForRelease().
    ReleaseChoice decideRelease();
    // Release the oldest queued frame now (the empty frame when there is none).
    ReleaseChoice chooseOldestFrame();
    // The events after which the policy's decision can be different; the others are recorded but
    // never wake a waiting selection.
    uint32_t decisionEvents() const { return mDecisionEvents; }
    // Ends every selection for good: a selection waiting for an event or a time returns the empty
    // frame as soon as its thread runs, later ones return it without deciding. It does not wait for
    // them, and a selection in the middle of a policy step (the latency picker's sleep) finishes
    // that step: a host whose release thread holds its own reference to the picker stops it and
    // goes on. The last reference stops the picker too, and then waits until no thread is inside
    // selectFrameForRelease(), so that no selection runs on in a destroyed picker.
    void stop();

protected:
    // `decisionEvents` are the events the mode's policy reads (see decisionEvents()).
    ReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid,
                  uint32_t decisionEvents = EVENT_FLAGS);

    // The policy step without blocking: the same as tryRelease() unless the policy blocks, which it
    // then expresses as a choice (RELEASE_AFTER_SLEEP). Runs with mMutex held.
    virtual ReleaseChoice decideLocked() { return tryRelease(); }
    // stop(), then waits until no thread is inside selectFrameForRelease(): what the last reference
    // does, before the subclass's part of the picker is destroyed.
    void stopAndWaitForSelections();
    // Reads the queue's size and logs the policy step of `pickerName`.
    size_t beginTryReleaseLocked(const char* pickerName);
    // Release the oldest frame once the composed picture has reached its display time.
    ReleaseChoice chooseOldestFrameOnceDisplayedLocked();

    const sp<FrameList> mFrameList;
    uint64_t mFrameListCapacity = 3;  // guarded by mMutex
    const String8 mName;
    const uint32_t mUid;
    nsecs_t mLatestFrameDisplayedTime = 0;  // guarded by mMutex
    nsecs_t mUpcomingDisplayTime = 0;       // guarded by mMutex; never written by a policy
    nsecs_t mUpcomingCompositionTime = 0;   // guarded by mMutex
    RenderState mLastComposedState;         // guarded by mMutex
    bool mContinue = true;                  // guarded by mMutex
    std::mutex mMutex;
    std::condition_variable mCondition;

private:
    // What the events delivered while a policy step was running brought.
    struct Inbox {
        bool hasComposedState = false;
        RenderState composedState;
        bool hasCompositionEstimate = false;
        nsecs_t compositionEstimate = 0;
    };

    void applyInboxLocked();
    void wakeSelection(bool decisionEvent);
    // One step: the inbox, then the policy in its blocking (tryRelease) or non-blocking
    // (decideLocked) form, then the bound on a computed wait.
    ReleaseChoice stepLocked(bool blocking, uint32_t& eventsSeen);
    void boundWaitLocked(ReleaseChoice& choice);

    // A policy step holds mMutex while it reads the frame list, and may publish events (the
    // latency-reduction delay). Events reach us with the bus's mutex held, and frame arrivals also
    // with the frame list's, so an event that waited for mMutex during a step could deadlock.
    // Events therefore never block on mMutex while a step runs: they leave their data in the inbox
    // and bump mEventCount, and the selection applies the inbox before each step and does not
    // wait when the count moved during the step.
    std::mutex mInboxMutex;  // a leaf lock: nothing is called while it is held
    Inbox mInbox;            // guarded by mInboxMutex
    std::atomic<uint32_t> mEventCount{0};
    std::atomic<bool> mDeciding{false};  // a policy step is running
    int mActiveSelections = 0;           // guarded by mMutex
    std::condition_variable mSelectionsDone;
    const uint32_t mDecisionEvents;
};

}  // namespace android::Interpolation
