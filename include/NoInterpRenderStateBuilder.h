#pragma once

#include "RenderStateBuilder.h"

namespace android::Interpolation {

// Steps through the queue from the picture shown last, one acquired frame at a time, without
// blending. No mode selects it.
class NoInterpRenderStateBuilder final : public virtual RenderStateBuilder {
public:
    NoInterpRenderStateBuilder(String8& name, unsigned int const& uid, sp<FrameList>& frameList);

    RenderState getFramesFor(nsecs_t const& displayTime) override;
    RenderState setupFramesFor(RenderState&& state, nsecs_t const& displayTime) override;
};

}  // namespace android::Interpolation
