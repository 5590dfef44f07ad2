#pragma once

#include "ReleasePicker.h"

namespace android::Interpolation {

// The default policy: release the oldest frame once two frames are at or before the upcoming
// display time. That time is never advanced by the picker, so in practice the host's own removals
// after each composition do the releasing.
class RetimeReleasePicker final : public virtual ReleasePicker {
public:
    RetimeReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid);

    ReleaseChoice tryRelease() override;
};

}  // namespace android::Interpolation
