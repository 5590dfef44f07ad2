#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <atomic>
#include <cstdint>

#include "RollingStatistics.h"
#include "Settings.h"
#include "SettingsController.h"
#include "Timer.h"

namespace android::Interpolation {

// Watches how often the compositor falls back to client (GPU) composition for the game's layer:
// the share over the last 600 compositions and the current run of them. Its verdict is a log line
// only; it raises no warning and changes no setting.
class ClientCompositionWatchdog final : public SettingsController::Observer {
public:
    static constexpr uint32_t SHARE_SAMPLES = 600;
    static constexpr nsecs_t START_DELAY = 10'000'000'000;

    ClientCompositionWatchdog(unsigned int uid, String8 name);

    // Subscribes, applies the uid's current settings, and starts counting 10 s later.
    void onFirstRef() override;
    void onSettingsChanged(const Settings& s) override;
    uint32_t getUID() const override { return mUid; }
    ~ClientCompositionWatchdog() override = default;

    // The host calls these from its composition thread: onClientComposition when the current
    // composition falls back to client composition for this layer, onPostComposition after every
    // composition.
    void onClientComposition();
    void onPostComposition();
    void suspend();
    void resume();
    void makeDecision();

private:
    const uint32_t mUid;
    const String8 mName;
    // Everything below but the two limits belongs to the composition thread; the limits arrive
    // from the settings notification.
    bool mEnabled = false;
    bool mSuspended = false;
    bool mClientComposed = false;
    std::atomic<int32_t> mMaxConsecutive;
    std::atomic<float> mMaxPercent;                 // a fraction: 0.1 is 10 %
    MachineLearning::RollingMetrics<short> mShare;  // 1 per client-composed composition, else 0
    int32_t mConsecutive = 0;
    Timer mStartTimer;
};

}  // namespace android::Interpolation
