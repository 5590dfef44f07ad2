#pragma once

#include "ReleasePicker.h"
#include "SettingsController.h"

namespace android::Interpolation {

// Holds frames until the queue is full, then releases the oldest: at once when the newest frame is
// already on screen, otherwise as late as possible before the next composition, a margin (from the
// settings) ahead of it. Low latency without starving the compositor.
class JustInTimeReleasePicker final : public SettingsController::Observer,
                                      public virtual ReleasePicker {
public:
    JustInTimeReleasePicker(sp<FrameList>& frameList, String8& name, const uint32_t& uid);

    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;
    void onSettingsChanged(const Settings& settings) override;
    uint32_t getUID() const override;
    ~JustInTimeReleasePicker() override = default;
    ReleaseChoice tryRelease() override;

    // The name is part of the exported interface.
    ReleaseChoice attempEarlyRelease();

private:
    nsecs_t mEarlyReleaseMargin = 0;  // guarded by mMutex
};

}  // namespace android::Interpolation
