#include "UnlimitedRenderStateBuilder.h"

namespace android::Interpolation {

UnlimitedRenderStateBuilder::UnlimitedRenderStateBuilder(String8& name, unsigned int const& uid,
                                                         sp<FrameList>& frameList)
    : RenderStateBuilder(name, uid, frameList) {}

RenderState UnlimitedRenderStateBuilder::getFramesFor(nsecs_t const& /*displayTime*/) {
    const FrameItem newest = mFrameList->getNewestFrameAndLock();
    if (!newest.isValid()) return RenderState();
    RenderState state = newState();
    pushFrame(state, newest);
    return announce(newest.mID == mLastStateDisplayTime ? eRepeatedCompositionEvent
                                                        : eNewFrameCompositionEvent,
                    std::move(state));
}

RenderState UnlimitedRenderStateBuilder::setupFramesFor(RenderState&& state,
                                                        nsecs_t const& /*displayTime*/) {
    return setupOpaqueFrame(std::move(state));
}

}  // namespace android::Interpolation
