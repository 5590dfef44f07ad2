#include "JustInTimeReleasePicker.h"

#include "../timing/Saturating.h"
#include "Log.h"

namespace android::Interpolation {

JustInTimeReleasePicker::JustInTimeReleasePicker(sp<FrameList>& frameList, String8& name,
                                                 const uint32_t& uid)
    : ReleasePicker(frameList, name, uid, EVENT_FLAGS) {}

void JustInTimeReleasePicker::onFirstRef() {
    ILOG(2, "Interpolation::JustInTimeReleasePicker [%s] onFirstRef", mName.c_str());
    ReleasePicker::onFirstRef();
    SettingsController::Observer::onFirstRef();
}

void JustInTimeReleasePicker::onLastStrongRef(const void* /*id*/) {
    ILOG(2, "Interpolation::JustInTimeReleasePicker [%s] onLastStrongRef", mName.c_str());
    EventDispatcher::unsubscribe(mUid, EVENT_FLAGS, static_cast<ReleasePicker*>(this));
    SettingsController::getInstance()->unsubscribe(
            wp<SettingsController::Observer>(static_cast<SettingsController::Observer*>(this)));
    stopAndWaitForSelections();
}

void JustInTimeReleasePicker::onSettingsChanged(const Settings& settings) {
    std::lock_guard lock(mMutex);
    // The margin travels as an unsigned field but is meant as a signed number of milliseconds.
    mEarlyReleaseMargin = nsecs_t{static_cast<int32_t>(settings.justInTimeMarginMs)} * 1'000'000;
}

uint32_t JustInTimeReleasePicker::getUID() const {
    return mUid;
}

ReleaseChoice JustInTimeReleasePicker::tryRelease() {
    beginTryReleaseLocked("JustInTimeReleasePicker");
    if (mFrameList->size() < mFrameListCapacity) return {};

    const FrameItem newest = mFrameList->getNewestFrame();
    if (newest.mID == 0) return {};
    if (newest.mAcquireFence != nullptr) newest.mAcquireFence->wait(0);
    if (!newest.mAcquired) return {};

    for (const RenderItem& item : mLastComposedState.items) {
        // The newest frame is on screen: the oldest is of no more use.
        if (item.frame.mTimestamp == newest.mTimestamp) return chooseOldestFrame();
    }
    return attempEarlyRelease();
}

ReleaseChoice JustInTimeReleasePicker::attempEarlyRelease() {
    // Without a margin, frames only go once the newest is on screen.
    if (mEarlyReleaseMargin == 0) return {};
    const nsecs_t remaining =
            saturatingSub(mUpcomingCompositionTime, systemTime(SYSTEM_TIME_MONOTONIC));
    if (remaining < mEarlyReleaseMargin) return chooseOldestFrame();
    // A negative margin makes this a wait past the composition, as long as the setting says; the
    // selection bounds it.
    return {ReleaseChoice::WAIT_FOR_TIME, FrameItem(),
            saturatingSub(remaining, mEarlyReleaseMargin)};
}

}  // namespace android::Interpolation
