#include "ReleasePicker.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include "../timing/Saturating.h"
#include "FillInReleasePicker.h"
#include "JustInTimeReleasePicker.h"
#include "Log.h"
#include "MLLatencyReductionReleasePicker.h"
#include "NoInterpReleasePicker.h"
#include "RetimeReleasePicker.h"
#include "UnlimitedReleasePicker.h"

namespace android::Interpolation {

namespace {

using std::chrono::steady_clock;

// now + waitTime, saturating at the largest time point rather than overflowing.
steady_clock::time_point deadlineAfter(nsecs_t waitTime) {
    const steady_clock::time_point now = steady_clock::now();
    const std::chrono::nanoseconds wait(waitTime);
    if (wait >= steady_clock::time_point::max() - now) return steady_clock::time_point::max();
    return now + wait;
}

// Keeps a composed state for the policies, which read its frames' identities and display times,
// without the frames' fences: the last reference to a fence closes its descriptor, and the copies
// kept here are overwritten inside the event delivery on the composition thread, possibly after
// the frames have left the queue. The event's own state still holds every fence dropped here.
void keepComposedItems(const std::vector<RenderItem>& from, std::vector<RenderItem>& to) {
    to = from;  // reuses the storage
    for (RenderItem& item : to)
        item.frame.mAcquireFence.clear();
}

}  // namespace

sp<ReleasePicker> ReleasePicker::newPickerFromMode(sp<FrameList>& frameList,
                                                   sp<FrameTimingsAggregator>& timings,
                                                   String8& name, unsigned int const& uid,
                                                   InterpolationMode const& mode) {
    switch (mode) {
        case eFillInMode:
            return new FillInReleasePicker(frameList, name, uid);
        case eNoInterpMode:
            return new NoInterpReleasePicker(frameList, name, uid);
        case eJustInTimeMode:
            return new JustInTimeReleasePicker(frameList, name, uid);
        case eUnlimitedMode:
            return new UnlimitedReleasePicker(frameList, name, uid);
        case eLatencyReductionMode:
            return new MLLatencyReductionReleasePicker(frameList, timings, name, uid);
        default:
            return new RetimeReleasePicker(frameList, name, uid);
    }
}

ReleasePicker::ReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid,
                             uint32_t decisionEvents)
    : mFrameList(frameList), mName(name), mUid(uid), mDecisionEvents(decisionEvents) {}

ReleasePicker::~ReleasePicker() {
    ILOG(2, "Interpolation::ReleasePicker [%s] destructor", mName.c_str());
    ILOG(2, "Interpolation::ReleasePicker: [%s] stop", mName.c_str());
    stopAndWaitForSelections();
}

void ReleasePicker::onFirstRef() {
    std::lock_guard lock(mMutex);
    ILOG(2, "Interpolation::ReleasePicker [%s] onFirstRef", mName.c_str());
    EventDispatcher::subscribe(mUid, EVENT_FLAGS, this);
}

void ReleasePicker::onLastStrongRef(const void* /*id*/) {
    EventDispatcher::unsubscribe(mUid, EVENT_FLAGS, this);
    // Stopping here rather than in the destructor keeps a selection that is still running from
    // calling into a subclass that is already destroyed.
    stopAndWaitForSelections();
}

void ReleasePicker::onEvent(const EventType& type, const nsecs_t& /*time*/, const EventData& data) {
    ILOG(2, "ReleasePicker::onEvent %u received", type);
    switch (type) {
        case eCompositionEstimateEvent:
            if (const auto* estimate = std::get_if<nsecs_t>(&data)) {
                std::lock_guard lock(mInboxMutex);
                mInbox.compositionEstimate = *estimate;
                mInbox.hasCompositionEstimate = true;
            } else {
                ILOG(2,
                     "ReleasePicker::onEvent eCompositionEstimateEvent received with no nsecs_t "
                     "data");
            }
            break;
        case eBufferComposedEvent:
            if (const auto* state = std::get_if<RenderState>(&data)) {
                std::lock_guard lock(mInboxMutex);
                keepComposedItems(state->items, mInbox.composedState.items);
                mInbox.hasComposedState = true;
            } else {
                ILOG(2,
                     "ReleasePicker::onEvent eBufferComposedEvent received with no RenderState "
                     "data");
            }
            break;
        case eFrameReceivedEvent:
            break;
        default:
            ILOG(1, "ReleasePicker::onEvent EventType %u not handled", type);
            return;
    }
    wakeSelection((type & mDecisionEvents) != 0);
}

void ReleasePicker::applyInboxLocked() {
    std::lock_guard lock(mInboxMutex);
    if (mInbox.hasCompositionEstimate) {
        mUpcomingCompositionTime = mInbox.compositionEstimate;
        mInbox.hasCompositionEstimate = false;
    }
    if (mInbox.hasComposedState) {
        mLastComposedState.items.swap(mInbox.composedState.items);
        mLatestFrameDisplayedTime = mLastComposedState.meanFrameID();
        mInbox.hasComposedState = false;
    }
}

void ReleasePicker::wakeSelection(bool decisionEvent) {
    if (decisionEvent) mEventCount.fetch_add(1);
    // A running step re-reads the count before it waits. Otherwise mMutex is only held for
    // moments that never wait on the frame list or the bus, and taking it here orders this wake-up
    // after the selection's wait has begun.
    while (!mDeciding.load()) {
        if (mMutex.try_lock()) {
            applyInboxLocked();
            mMutex.unlock();
            break;
        }
        std::this_thread::yield();
    }
    // An event the policy does not read cannot change its decision; waking the selection for it
    // would cost the sender (mostly the composition thread) a system call and the release thread a
    // step for nothing.
    if (decisionEvent) mCondition.notify_all();
}

ReleaseChoice ReleasePicker::stepLocked(bool blocking, uint32_t& eventsSeen) {
    mDeciding.store(true);
    eventsSeen = mEventCount.load();
    applyInboxLocked();
    ReleaseChoice choice = blocking ? tryRelease() : decideLocked();
    mDeciding.store(false);
    if (choice.action == ReleaseChoice::WAIT_FOR_TIME) boundWaitLocked(choice);
    return choice;
}

void ReleasePicker::boundWaitLocked(ReleaseChoice& choice) {
    // Every bound is at least MAX_WAIT_PAST_COMPOSITION: a shorter wait needs no clock read.
    if (choice.waitTime <= MAX_WAIT_PAST_COMPOSITION) return;
    const nsecs_t untilComposition =
            saturatingSub(mUpcomingCompositionTime, systemTime(SYSTEM_TIME_MONOTONIC));
    const nsecs_t bound =
            saturatingAdd(std::max<nsecs_t>(untilComposition, 0), MAX_WAIT_PAST_COMPOSITION);
    if (choice.waitTime <= bound) return;
    ILOG(1, "Interpolation::ReleasePicker [%s] wait of %ld ns bounded to %ld ns", mName.c_str(),
         choice.waitTime, bound);
    choice.waitTime = bound;
}

ReleaseChoice ReleasePicker::decideRelease() {
    std::lock_guard lock(mMutex);
    if (!mContinue) return {ReleaseChoice::RELEASE, FrameItem(), 0};
    uint32_t eventsSeen;
    return stepLocked(/*blocking=*/false, eventsSeen);
}

FrameItem ReleasePicker::selectFrameForRelease() {
    ILOG(2, "Interpolation::ReleasePicker [%s] selectFrameForRelease", mName.c_str());
    ReleaseChoice choice;
    std::unique_lock lock(mMutex);
    mActiveSelections++;
    bool timedOut = false;
    while (choice.action != ReleaseChoice::RELEASE) {
        if (choice.frame.mID != 0) {
            if (choice.frame.mAcquireFence != nullptr) choice.frame.mAcquireFence->wait(0);
            if (choice.frame.mAcquired) break;
        }
        if (!mContinue) break;

        uint32_t eventsSeen;
        choice = stepLocked(/*blocking=*/true, eventsSeen);
        const bool eventArrived = mEventCount.load() != eventsSeen;

        if (choice.action == ReleaseChoice::WAIT_FOR_TIME) {
            if (mContinue && choice.waitTime > 0 && !eventArrived) {
                mCondition.wait_until(lock, deadlineAfter(choice.waitTime));
            }
        } else if (choice.action == ReleaseChoice::WAIT_FOR_EVENT) {
            if (!mContinue || eventArrived) continue;
            const steady_clock::time_point start = steady_clock::now();
            const std::chrono::nanoseconds timeout(EVENT_WAIT_TIMEOUT);
            mCondition.wait_for(lock, timeout);
            if (steady_clock::now() - start < timeout) continue;
            ILOG(2, "Interpolation::ReleasePicker timed out. mContinue = %d", mContinue);
            timedOut = true;
            break;
        }
    }
    FrameItem frame = timedOut ? FrameItem() : choice.frame;
    if (--mActiveSelections == 0) mSelectionsDone.notify_all();
    return frame;
}

void ReleasePicker::stop() {
    {
        std::lock_guard lock(mMutex);
        mContinue = false;
    }
    mCondition.notify_all();
}

void ReleasePicker::stopAndWaitForSelections() {
    // Woken with the mutex free, a waiting selection runs on at once; woken under it, it would
    // block on the mutex and wait for a second wake-up once this thread waits below.
    stop();
    std::unique_lock lock(mMutex);
    mSelectionsDone.wait(lock, [this] { return mActiveSelections == 0; });
}

ReleaseChoice ReleasePicker::chooseOldestFrame() {
    return {ReleaseChoice::RELEASE, mFrameList->getOldestFrame(), 0};
}

size_t ReleasePicker::beginTryReleaseLocked(const char* pickerName) {
    const size_t size = mFrameList->size();
    ILOG(2,
         "Interpolation::%s: [%s] tryRelease: size %d upcomingDisplayTime %ld "
         "mLatestFrameDisplayedTime %ld mUpcomingCompositionTime %ld",
         pickerName, mName.c_str(), static_cast<int>(size), mUpcomingDisplayTime,
         mLatestFrameDisplayedTime, mUpcomingCompositionTime);
    return size;
}

ReleaseChoice ReleasePicker::chooseOldestFrameOnceDisplayedLocked() {
    const nsecs_t displayed = mLatestFrameDisplayedTime;
    if (displayed < mFrameList->getOldestFrame().mID) return {};
    return chooseOldestFrame();
}

void ReleasePicker::setFrameListCapacity(size_t capacity) {
    ILOG(2, "Interpolation::ReleasePicker [%s] setFrameListCapacity capacity %d", mName.c_str(),
         static_cast<int>(capacity));
    {
        std::lock_guard lock(mMutex);
        mFrameListCapacity = capacity;
    }
    mCondition.notify_all();
}

}  // namespace android::Interpolation
