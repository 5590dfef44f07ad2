#include "MirrorSurfaceFlingerRenderState.h"

namespace android::Interpolation {

MirrorSurfaceFlingerRenderState::MirrorSurfaceFlingerRenderState(String8& name,
                                                                 unsigned int const& uid,
                                                                 sp<FrameList>& frameList)
    : RenderStateBuilder(name, uid, frameList) {}

RenderState MirrorSurfaceFlingerRenderState::getFramesFor(nsecs_t const& /*displayTime*/) {
    RenderState state = newState();
    // Pushed even when it is the empty frame: the host then composes nothing new for the layer.
    const FrameItem latest = mFrameList->getLatestAcquiredFrameAndLock();
    pushFrame(state, latest);
    return announce(latest.mID == mLastStateDisplayTime ? eRepeatedCompositionEvent
                                                        : eNewFrameCompositionEvent,
                    std::move(state));
}

RenderState MirrorSurfaceFlingerRenderState::setupFramesFor(RenderState&& state,
                                                            nsecs_t const& /*displayTime*/) {
    return setupOpaqueFrame(std::move(state));
}

}  // namespace android::Interpolation
