#pragma once

#include "RenderStateBuilder.h"

namespace android::Interpolation {

// Always shows the newest frame, once it is ready.
class UnlimitedRenderStateBuilder final : public virtual RenderStateBuilder {
public:
    UnlimitedRenderStateBuilder(String8& name, unsigned int const& uid, sp<FrameList>& frameList);

    RenderState getFramesFor(nsecs_t const& displayTime) override;
    RenderState setupFramesFor(RenderState&& state, nsecs_t const& displayTime) override;
};

}  // namespace android::Interpolation
