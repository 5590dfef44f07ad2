#include "MLLatencyReductionReleasePicker.h"

#include <unistd.h>

#include <algorithm>

#include "Log.h"
#include "Trace.h"

namespace android::Interpolation {

MLLatencyReductionReleasePicker::MLLatencyReductionReleasePicker(sp<FrameList>& frameList,
                                                                 sp<FrameTimingsAggregator>& timings,
                                                                 String8& name,
                                                                 unsigned int const& uid)
    : ReleasePicker(frameList, name, uid),
      mDelayer(new MachineLearning::DistributionBasedLRDelayer(uid, timings)) {}

EventDispatcher::EventReceiver* MLLatencyReductionReleasePicker::primaryReceiver() {
    // C++ has no conversion that names one of two bases of the same type. The first base is the
    // primary base, which the Itanium C++ ABI (the platform's) places at the object's address.
    return reinterpret_cast<EventDispatcher::EventReceiver*>(this);
}

void MLLatencyReductionReleasePicker::onEvent(const EventType& type, const nsecs_t& time,
                                              const EventData& data) {
    ReleasePicker::onEvent(type, time, data);
}

void MLLatencyReductionReleasePicker::onFirstRef() {
    ReleasePicker::onFirstRef();
    std::lock_guard lock(mMutex);
    EventDispatcher::subscribe(mUid, eFrameReceivedEvent, primaryReceiver());
}

void MLLatencyReductionReleasePicker::onLastStrongRef(const void* /*id*/) {
    EventDispatcher::unsubscribe(mUid, EVENT_FLAGS, static_cast<ReleasePicker*>(this));
    EventDispatcher::unsubscribe(mUid, eFrameReceivedEvent, primaryReceiver());
    // Before the destructors run, so that no selection is left inside this object (see the base).
    stopAndWaitForSelections();
}

void MLLatencyReductionReleasePicker::setFrameListCapacity(size_t capacity) {
    ReleasePicker::setFrameListCapacity(capacity);
    mDelayer->setFrameListCapacity(capacity);
}

ReleaseChoice MLLatencyReductionReleasePicker::tryRelease() {
    ScopedTrace trace("tryRelease");
    const ReleaseChoice choice = decideLocked();
    if (choice.action != ReleaseChoice::RELEASE_AFTER_SLEEP) return choice;
    const nsecs_t delay = choice.waitTime;
    // A delayer never returns a negative delay; were one to, it must not become a sleep of hours.
    const nsecs_t sleep = std::max<nsecs_t>(delay, 0) / 1000;
    if (usleep(static_cast<useconds_t>(sleep)) != 0) {
        ILOG(1,
             "Interpolation::MLLatencyReductionReleasePicker: [%s] tryRelease usleep failed for "
             "delay %ld",
             mName.c_str(), delay);
    }
    return chooseOldestFrame();
}

ReleaseChoice MLLatencyReductionReleasePicker::decideLocked() {
    beginTryReleaseLocked("MLLatencyReductionReleasePicker");
    if (mFrameList->size() < mFrameListCapacity) return {};

    FrameItem newest = mFrameList->getNewestFrame();
    if (newest.mID == 0) return {};
    if (newest.mAcquireFence != nullptr) newest.mAcquireFence->wait(0);
    if (!newest.mAcquired) return {};

    const auto& items = mLastComposedState.items;
    const bool newestOnScreen = std::any_of(items.begin(), items.end(), [&](const RenderItem& item) {
        return item.frame.mTimestamp == newest.mTimestamp;
    });
    if (!newestOnScreen) return {};

    return {ReleaseChoice::RELEASE_AFTER_SLEEP, FrameItem(),
            mDelayer->getDelay(mUpcomingCompositionTime)};
}

}  // namespace android::Interpolation
