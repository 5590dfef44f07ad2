#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>
#include <utils/Timers.h>

#include <cstdint>
#include <mutex>
#include <vector>

#include "EventDispatcher.h"
#include "Settings.h"
#include "SettingsController.h"
#include "Timer.h"

namespace android {

// The display delay of one game layer: how long after its arrival a frame is shown, so that the
// frame after it is usually in hand for interpolation. With automatic delay on, it counts the
// frames composed as planned in each update period and steps the delay towards the target hit
// rate; a new game FPS rescales it. Every change is announced as eDelayChangedEvent to the uid.
//
// Announcements leave after the mutex is released: the composition thread delivers the kind
// events to onEvent under the bus's mutex, so broadcasting under ours would close a lock cycle.
// Receivers of eDelayChangedEvent may count frames but must not set the delay or re-estimate it.
class Delayer final : public Interpolation::SettingsController::Observer,
                      public Interpolation::EventDispatcher::EventReceiver {
public:
    static constexpr int32_t MAX_DELAY_MS = 100;
    static constexpr int32_t MIN_DELAY_MS = 30;
    static constexpr float EXPECTED_GRADIENT = 0.8f;
    static constexpr nsecs_t EXPECTED_INTERCEPT = 20'000'000;
    static constexpr int32_t IGNORE_AT_START = 20;
    static constexpr int32_t IGNORE_AFTER_MISS = 5;
    // The builders' composition kinds: blended (8), repeated (16) and new single picture (64).
    static constexpr uint32_t EVENT_FLAGS = Interpolation::eBlendedCompositionEvent |
                                            Interpolation::eRepeatedCompositionEvent |
                                            Interpolation::eNewFrameCompositionEvent;

    // Any value other than eHit counts as a miss.
    enum FrameType : int32_t {
        eMiss = 0,
        eHit = 1,
    };

    Delayer(const unsigned int& uid, String8 name);

    void processFrame(const FrameType& type);
    void onEvent(const Interpolation::EventType& type, const nsecs_t& time,
                 const Interpolation::EventData& data) override;
    void onSettingsChanged(const Interpolation::Settings& s) override;
    // (int64)(framePeriod * EXPECTED_GRADIENT in float) + EXPECTED_INTERCEPT.
    nsecs_t getExpectedDelay(const nsecs_t& framePeriod) const;
    // One re-estimation from the frames counted since the last one; what the update timer runs.
    void updateFrameDelayTick();
    void dumpState(String8& out, const char* prefix);

    uint32_t getUID() const override { return mUid; }
    void onFirstRef() override;
    void onLastStrongRef(const void* id) override;

    nsecs_t getDelay() const;
    // Sets the delay as a re-estimation would: clamped while automatic delay is on.
    void setDelayNs(const nsecs_t& delay);
    // Runs the update timer if it is due. The owner calls it as frames arrive; the delayer has no
    // thread of its own.
    void pollUpdateTimer();

private:
    struct DelayAnnouncement {
        nsecs_t time;
        nsecs_t delay;
    };

    nsecs_t estimateNewDelayLocked(nsecs_t oldPeriod, nsecs_t newPeriod);
    void setDelayNsLocked(const nsecs_t& delay);
    void updateFrameDelayTickLocked();
    void countFrameLocked(bool hit);
    void armUpdateTimerLocked(nsecs_t period, nsecs_t now, bool once);
    // Broadcasts the announcements made so far, in the order they were made. Takes both mutexes:
    // never call it with mMutex held.
    void announceDelayChanges();

    const uint32_t mUid;
    const String8 mName;
    nsecs_t mDelay;                             // guarded by mMutex
    int32_t mLastGameFps = -1;                  // guarded by mMutex; -1: none seen yet
    Interpolation::Timer mTimer;                // guarded by mMutex; its callback runs under it
    bool mAutoDelay = false;                    // guarded by mMutex
    int32_t mProcessedFrames = 0;               // guarded by mMutex
    int32_t mHitFrames = 0;                     // guarded by mMutex
    int32_t mFramesToIgnore = IGNORE_AT_START;  // guarded by mMutex
    // > 0 after an increase, < 0 after a decrease, 0 on target.
    int32_t mLastStepMs = 0;     // guarded by mMutex
    int32_t mDelayChangeRateMs;  // guarded by mMutex
    float mHitTarget;            // guarded by mMutex
    float mHitThreshold;         // guarded by mMutex
    mutable std::mutex mMutex;
    std::vector<DelayAnnouncement> mPendingAnnouncements;  // guarded by mMutex

    // Held while announcements go out, so that two threads cannot overtake each other's.
    std::mutex mAnnounceMutex;
    std::vector<DelayAnnouncement> mAnnouncing;  // guarded by mAnnounceMutex
};

}  // namespace android
