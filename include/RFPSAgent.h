#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>

#include "Settings.h"
#include "SettingsController.h"
#include "Timer.h"

namespace android {

// Paces the presentation of one game layer at a render FPS (RFPS): the game's FPS plus the
// settings' offset, rising at once and falling smoothly, bounded by the settings and the refresh
// rate; with a negative offset, the settings' fixed rfps. A private fake vsync ticks at the RFPS,
// and the layer presents when it has ticked since the last presentation. A presentation that fails
// at a fake vsync earns a chance to present off the grid later, up to a limit.
//
// Every new RFPS is announced as eDFSChangedEvent with the agent's mutex held, so that the
// announcements keep the order of the rates. Its receivers therefore must not call into the agent,
// nor into the settings controller, which calls the agent under its own mutex; so a receiver of it
// must not be a settings observer either, since the broadcast may drop its last reference, which
// unsubscribes it from the controller. None of the library's receivers subscribes to it. A
// refused presentation is announced as ePresentationRefusedEvent after the mutex is released.
class RFPSAgent final : public Interpolation::SettingsController::Observer {
public:
    static constexpr nsecs_t UPDATE_PERIOD = 500'000'000;
    static constexpr int32_t INIT_CURRENTRFPS = 60;
    static constexpr int32_t INIT_CURRENTFPS = 60;
    // Fake vsyncs between two checks that the fake-vsync clock has not run ahead.
    static constexpr int32_t RESET_VSYNC_CLOCK = 60;
    // Not used by the pacing; kept for the exported interface.
    static constexpr double EPSILON_PROPORTION = 0.1;

    RFPSAgent(const unsigned int& uid, String8& name);

    // The game's FPS and the display's refresh rate, as the host last measured them; runs the
    // RFPS update when it is due.
    void update(int fps, int refreshRate);
    // Whether the layer presents at this refresh: after a fake vsync, or as a make-up for a
    // presentation that failed.
    bool shouldPresentNow();
    // What became of the presentation that shouldPresentNow allowed.
    void onPresentSuccess();
    void onPresentFail();
    // Moves the fake vsync to `rfps`, keeping its next tick in place relative to the new period.
    void setRFPS(int rfps);
    // The timer callbacks: one RFPS update, one fake vsync.
    void tick();
    void fakeVsync();

    void onSettingsChanged(const Interpolation::Settings& s) override;
    uint32_t getUID() const override { return mUid; }
    void onFirstRef() override;

private:
    void setRFPSLocked(int rfps);
    void tickLocked();
    void fakeVsyncLocked();
    void announceRFPSLocked(nsecs_t now);

    const uint32_t mUid;
    const String8 mName;
    int32_t mRFPSOffset;                    // guarded by mMutex; negative: the fixed rfps
    float mSmoothness;                      // guarded by mMutex
    float mCurrentRFPS = INIT_CURRENTRFPS;  // guarded by mMutex
    int32_t mGameFPS = INIT_CURRENTFPS;     // guarded by mMutex
    int32_t mRefreshRate = 60;              // guarded by mMutex
    int32_t mMinimumRFPS;                   // guarded by mMutex
    int32_t mMaximumRFPS;                   // guarded by mMutex
    Interpolation::Timer mUpdateTimer;      // guarded by mMutex; its callback runs under it
    mutable std::mutex mMutex;
    const nsecs_t mCreationTime;
    // Period and next tick of the fake vsync; a tick up to an eighth of a period early counts.
    Interpolation::Timer mFakeVsyncTimer;  // guarded by mMutex; its callback runs under it
    bool mPresentNow = false;              // guarded by mMutex; a fake vsync since presenting
    int32_t mSkippedFrames = 0;            // guarded by mMutex; make-up chances left
    int32_t mMaxSkippedFrames;             // guarded by mMutex
    int32_t mResetVsyncClock = RESET_VSYNC_CLOCK;  // guarded by mMutex
    // The time of the poll that runs the timers, so that their callbacks read no clock.
    nsecs_t mPollTime = 0;  // guarded by mMutex
};

}  // namespace android
