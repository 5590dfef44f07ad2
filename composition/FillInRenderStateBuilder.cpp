#include "FillInRenderStateBuilder.h"

namespace android::Interpolation {

FillInRenderStateBuilder::FillInRenderStateBuilder(String8& name, unsigned int const& uid,
                                                   sp<FrameList>& frameList)
    : RenderStateBuilder(name, uid, frameList) {}

RenderState FillInRenderStateBuilder::getFramesFor(nsecs_t const& /*displayTime*/) {
    const nsecs_t last = mLastStateDisplayTime;
    RenderState state = newState();
    if (!mFrameList->hasFrameAt(last)) {
        FrameItem next = mFrameList->getFrameAfterAndLock(last);
        if (next.isValid()) pushFrame(state, next);
        return announce(eNewFrameCompositionEvent, std::move(state));
    }
    FrameItem next = mFrameList->getFrameAfterAndLock(last);
    if (!next.isValid()) {
        pushFrame(state, mFrameList->getFrameAtAndLock(last));
        return announce(eRepeatedCompositionEvent, std::move(state));
    }
    if (mFrameList->getFrameAfterAndLock(next.mID).isValid()) {
        // The game is at least two frames ahead: no time for a fill-in picture.
        pushFrame(state, mFrameList->getFrameAfterAndLock(last));
        return announce(eNewFrameCompositionEvent, std::move(state));
    }
    pushFrame(state, mFrameList->getFrameAtAndLock(last));
    pushFrame(state, mFrameList->getFrameAfterAndLock(last));
    return announce(eBlendedCompositionEvent, std::move(state));
}

RenderState FillInRenderStateBuilder::setupFramesFor(RenderState&& state,
                                                     nsecs_t const& /*displayTime*/) {
    state = setupOpaqueFrame(std::move(state));
    if (state.items.size() > 1) {
        state.items[1].alpha = 0.5f;
        state.items[1].blend = 1;
    }
    return std::move(state);
}

}  // namespace android::Interpolation
