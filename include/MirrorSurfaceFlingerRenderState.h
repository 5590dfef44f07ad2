#pragma once

#include "RenderStateBuilder.h"

namespace android::Interpolation {

// Shows what the compositor itself would show: the latest acquired frame.
class MirrorSurfaceFlingerRenderState final : public virtual RenderStateBuilder {
public:
    MirrorSurfaceFlingerRenderState(String8& name, unsigned int const& uid,
                                    sp<FrameList>& frameList);

    RenderState getFramesFor(nsecs_t const& displayTime) override;
    RenderState setupFramesFor(RenderState&& state, nsecs_t const& displayTime) override;
};

}  // namespace android::Interpolation
