#include "NoInterpRenderStateBuilder.h"

namespace android::Interpolation {

NoInterpRenderStateBuilder::NoInterpRenderStateBuilder(String8& name, unsigned int const& uid,
                                                       sp<FrameList>& frameList)
    : RenderStateBuilder(name, uid, frameList) {}

RenderState NoInterpRenderStateBuilder::getFramesFor(nsecs_t const& /*displayTime*/) {
    const nsecs_t last = mLastStateDisplayTime;
    RenderState state = newState();
    FrameItem shown = mFrameList->getFrameAfterAndLock(last);
    bool pushed = false;
    if (shown.mID != 0) {
        // Only acquisition makes the next frame eligible here; the fence is polled regardless.
        if (shown.mAcquireFence != nullptr) shown.mAcquireFence->wait(0);
        if (shown.mAcquired) {
            pushFrame(state, shown);
            pushed = true;
        }
    }
    if (!pushed && mFrameList->getFrameAtAndLock(last).isValid()) {
        shown = mFrameList->getFrameAtAndLock(last);
        pushFrame(state, shown);
    }
    return announce(shown.mID == last ? eRepeatedCompositionEvent : eNewFrameCompositionEvent,
                    std::move(state));
}

RenderState NoInterpRenderStateBuilder::setupFramesFor(RenderState&& state,
                                                       nsecs_t const& /*displayTime*/) {
    return setupOpaqueFrame(std::move(state));
}

}  // namespace android::Interpolation
