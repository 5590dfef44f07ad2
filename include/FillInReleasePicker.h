#pragma once

#include "ReleasePicker.h"

namespace android::Interpolation {

// Keeps a fixed queue of frames, whatever capacity the host sets, so that fill-in composition
// always has a last, a current and a next frame.
class FillInReleasePicker final : public virtual ReleasePicker {
public:
    static constexpr size_t QUEUE_DEPTH = 4;

    FillInReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid);

    ReleaseChoice tryRelease() override;
};

}  // namespace android::Interpolation
