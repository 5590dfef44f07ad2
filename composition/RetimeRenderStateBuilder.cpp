#include "RetimeRenderStateBuilder.h"

#include "Log.h"

namespace android::Interpolation {

namespace {

// Where `t` lies between two display times, as a fraction; each difference is converted to
// single precision before the division.
float positionBetween(nsecs_t t, nsecs_t earlier, nsecs_t later) {
    return static_cast<float>(t - earlier) / static_cast<float>(later - earlier);
}

}  // namespace

RetimeRenderStateBuilder::RetimeRenderStateBuilder(String8& name, unsigned int const& uid,
                                                   sp<FrameList>& frameList)
    : RenderStateBuilder(name, uid, frameList) {}

void RetimeRenderStateBuilder::onFirstRef() {
    SettingsController::Observer::onFirstRef();
}

void RetimeRenderStateBuilder::onLastStrongRef(const void* id) {
    SettingsController::Observer::onLastStrongRef(id);
}

void RetimeRenderStateBuilder::onSettingsChanged(const Settings& settings) {
    ILOG(2, "Interpolation::RetimeRenderStateBuilder [%s] onSettingsChanged", mName.c_str());
    std::lock_guard lock(mAlphaMutex);
    if (&mAlphaFunction != &settings.alphaFunction) mAlphaFunction = settings.alphaFunction;
}

uint32_t RetimeRenderStateBuilder::getUID() const {
    return mUid;
}

float RetimeRenderStateBuilder::getAlphaFromFunction(float x) {
    std::lock_guard lock(mAlphaMutex);
    return mAlphaFunction.getY(x);
}

RenderState RetimeRenderStateBuilder::getFramesFor(nsecs_t const& displayTime) {
    RenderState state = newState();
    EventType kind = eRepeatedCompositionEvent;
    bool picked = true;
    {
        // What is composed is decided from the neighbours' display times and readiness alone, and
        // the frames chosen are locked without the list changing in between.
        FrameList::NeighbourPick pick(*mFrameList, displayTime);
        const FrameList::Neighbours& around = pick.neighbours();
        if (around.beforeValid && around.afterValid) {
            const float alpha = getAlphaFromFunction(
                    positionBetween(displayTime, around.beforeID, around.afterID));
            ILOG(2,
                 "Interpolation::RetimeRenderStateBuilder [%s] getFramesFor: Retime interpolating "
                 "with alpha %f",
                 mName.c_str(), alpha);
            if (alpha < 1.0f) pushFrame(state, pick.lockBefore());
            if (alpha > 0.0f) {
                pushFrame(state, pick.lockAfter());
            } else if (!state.items.empty() && state.items[0].frame.mID == mLastStateDisplayTime) {
                // The earlier frame is already on screen: blend towards the next one rather than
                // show it alone once more.
                pushFrame(state, pick.lockAfter());
            }
            kind = eBlendedCompositionEvent;
        } else if (around.beforeValid) {
            FrameItem shown = pick.lockBefore();
            if (!shown.isValid()) return RenderState();  // gone meanwhile
            kind = shown.mID == mLastStateDisplayTime ? eRepeatedCompositionEvent
                                                      : eNewFrameCompositionEvent;
            pushFrame(state, std::move(shown));
        } else if (around.afterValid) {
            pushFrame(state, pick.lockAfter());
            kind = eNewFrameCompositionEvent;
        } else {
            picked = false;
        }
    }

    // Neither neighbour is usable: hold the last picture, or failing that the newest ready frame.
    if (!picked) {
        if (FrameItem last = mFrameList->getFrameAtAndLock(mLastStateDisplayTime); last.isValid()) {
            pushFrame(state, std::move(last));
        } else if (FrameItem newest = mFrameList->getLatestValidFrameAndLock(); newest.isValid()) {
            pushFrame(state, std::move(newest));
        } else {
            ILOG(1, "Interpolation::RetimeRenderStateBuilder [%s]: no valid frame!", mName.c_str());
        }
    }
    return announce(kind, std::move(state));
}

RenderState RetimeRenderStateBuilder::setupFramesFor(RenderState&& state,
                                                     nsecs_t const& displayTime) {
    RenderState opaque = setupOpaqueFrame(std::move(state));
    if (opaque.items.size() > 1) {
        RenderItem& later = opaque.items[1];
        later.alpha = getAlphaFromFunction(
                positionBetween(displayTime, opaque.items[0].frame.mID, later.frame.mID));
        later.blend = 1;
    }
    return opaque;
}

}  // namespace android::Interpolation
