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
    // frame came within the event wait, and at once after the picker has stopped.
    virtual FrameItem selectFrameForRelease();
    // The mode's policy; runs with mMutex held.
    virtual ReleaseChoice tryRelease() = 0;

protected:
    ReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid);

    // Release the oldest queued frame now (the empty frame when there is none).
    ReleaseChoice chooseOldestFrame();
    // Reads the queue's size and logs the policy step of `pickerName`.
    size_t beginTryReleaseLocked(const char* pickerName);
    // Release the oldest frame once the composed picture has reached its display time.
    ReleaseChoice chooseOldestFrameOnceDisplayedLocked();
    // Ends every selection for good; waits until the threads inside selectFrameForRelease() have
    // left, so that the picker can be torn down under them.
    void stop();

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
    void wakeSelection();
    ReleaseChoice decideLocked(uint32_t& eventsSeen);

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
};

}  // namespace android::Interpolation
