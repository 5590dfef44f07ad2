#pragma once

#include "ReleasePicker.h"

namespace android::Interpolation {

// Releases the oldest frame as soon as the composed picture has reached its display time.
class UnlimitedReleasePicker final : public virtual ReleasePicker {
public:
    UnlimitedReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid);

    ReleaseChoice tryRelease() override;
};

}  // namespace android::Interpolation
