#pragma once

#include "RenderStateBuilder.h"

namespace android::Interpolation {

// Steps through the queue from the picture shown last; when only one new frame is ready it first
// shows a half-way blend of the last picture and the new one.
class FillInRenderStateBuilder final : public virtual RenderStateBuilder {
public:
    FillInRenderStateBuilder(String8& name, unsigned int const& uid, sp<FrameList>& frameList);

    RenderState getFramesFor(nsecs_t const& displayTime) override;
    RenderState setupFramesFor(RenderState&& state, nsecs_t const& displayTime) override;
};

}  // namespace android::Interpolation
