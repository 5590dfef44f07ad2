#pragma once

#include <mutex>

#include "Function.h"
#include "RenderStateBuilder.h"
#include "SettingsController.h"

namespace android::Interpolation {

// The interpolating builder: for a display time between two queued frames it shows the earlier
// frame opaque and the later one over it, weighted by the layer's alpha curve at the position of
// the display time between them.
class RetimeRenderStateBuilder final : public SettingsController::Observer,
                                       public virtual RenderStateBuilder {
public:
    RetimeRenderStateBuilder(String8& name, unsigned int const& uid, sp<FrameList>& frameList);

    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;
    // Arrives on the settings thread, possibly during a build.
    void onSettingsChanged(const Settings& settings) override;
    uint32_t getUID() const override;
    ~RetimeRenderStateBuilder() override = default;
    RenderState getFramesFor(nsecs_t const& displayTime) override;
    RenderState setupFramesFor(RenderState&& state, nsecs_t const& displayTime) override;

    float getAlphaFromFunction(float x);

private:
    // A build evaluates the curve while the settings thread may replace it; this lock, held only
    // for an evaluation or a replacement, lets each evaluation see one whole curve.
    std::mutex mAlphaMutex;
    Function mAlphaFunction;  // guarded by mAlphaMutex
};

}  // namespace android::Interpolation
