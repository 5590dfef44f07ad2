#include "RFPSAgent.h"

#include <algorithm>
#include <limits>

#include "EventDispatcher.h"
#include "Log.h"

namespace android {

using Interpolation::EventDispatcher;
using Interpolation::Settings;

namespace {

// No display refreshes faster. A higher rate would also make a fake vsync that catches up after a
// pause run once per missed period of a few nanoseconds: the compositor would hang.
constexpr int MAX_RFPS = 1000;

// The fake-vsync period of a render rate; 0 for a rate that cannot pace a display.
nsecs_t periodForRate(int rfps) {
    if (rfps < 1 || rfps > MAX_RFPS) return 0;
    return static_cast<nsecs_t>(1e9 / rfps);
}

// A rate truncated to an int, saturating where the float lies beyond the int range.
int truncatedRate(float rfps) {
    return static_cast<int>(std::clamp<double>(rfps, std::numeric_limits<int>::min(),
                                               std::numeric_limits<int>::max()));
}

}  // namespace

RFPSAgent::RFPSAgent(const unsigned int& uid, String8& name)
    : mUid(uid),
      mName(name),
      mRFPSOffset(Interpolation::defaultSettings.rfpsOffset),
      mSmoothness(Interpolation::defaultSettings.rfpsSmoothness),
      mMinimumRFPS(Interpolation::defaultSettings.rfpsMinimum),
      mMaximumRFPS(Interpolation::defaultSettings.rfpsMaximum),
      mCreationTime(systemTime(SYSTEM_TIME_MONOTONIC)),
      mMaxSkippedFrames(Interpolation::defaultSettings.rfpsMaxSkippedFrames) {}

void RFPSAgent::onFirstRef() {
    Interpolation::SettingsController::Observer::onFirstRef();
    std::lock_guard lock(mMutex);
    const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
    mUpdateTimer.arm(
            UPDATE_PERIOD, now, [this] { tickLocked(); }, /*once=*/false);
    const nsecs_t period = periodForRate(Interpolation::defaultSettings.rfps);
    mFakeVsyncTimer.arm(
            period, now, [this] { fakeVsyncLocked(); }, /*once=*/false);
    mFakeVsyncTimer.slack = period / 8;
    announceRFPSLocked(now);
}

void RFPSAgent::update(int fps, int refreshRate) {
    std::lock_guard lock(mMutex);
    mGameFPS = fps;
    mRefreshRate = refreshRate;
    mPollTime = systemTime(SYSTEM_TIME_MONOTONIC);
    ILOG(2, "RFPSAgent [%s] time: %lu newFPS: %d, newRefreshRate: %d", mName.c_str(),
         mPollTime - mCreationTime, fps, refreshRate);
    mUpdateTimer.check(mPollTime);
}

void RFPSAgent::tick() {
    std::lock_guard lock(mMutex);
    mPollTime = systemTime(SYSTEM_TIME_MONOTONIC);
    tickLocked();
}

void RFPSAgent::tickLocked() {
    if (mRFPSOffset < 0) return;
    // In float throughout, so that hostile rates and offsets cannot overflow an int.
    const float target = static_cast<float>(mGameFPS) + static_cast<float>(mRFPSOffset);
    float rfps = mCurrentRFPS <= target ? target
                                        : mCurrentRFPS * mSmoothness + (1 - mSmoothness) * target;
    // The refresh rate has the last word, over the minimum too.
    rfps = std::max(rfps, static_cast<float>(mMinimumRFPS));
    rfps = std::min(rfps, static_cast<float>(mMaximumRFPS));
    rfps = std::min(rfps, static_cast<float>(mRefreshRate));
    setRFPSLocked(truncatedRate(rfps));
    ILOG(2, "RFPSAgent [%s] tick: time: %lu newRFPS: %f", mName.c_str(), mPollTime - mCreationTime,
         static_cast<double>(rfps));
    mCurrentRFPS = rfps;
    announceRFPSLocked(mPollTime);
}

void RFPSAgent::announceRFPSLocked(nsecs_t now) {
    EventDispatcher::broadcastEvent(mUid, Interpolation::eDFSChangedEvent, now,
                                    truncatedRate(mCurrentRFPS));
}

void RFPSAgent::setRFPS(int rfps) {
    std::lock_guard lock(mMutex);
    setRFPSLocked(rfps);
}

void RFPSAgent::setRFPSLocked(int rfps) {
    const nsecs_t period = periodForRate(rfps);
    if (period < 1) {
        ILOG(1, "RFPSAgent [%s] render rate %d out of range, keeping the fake vsync at %lu ns",
             mName.c_str(), rfps, mFakeVsyncTimer.period);
        return;
    }
    mFakeVsyncTimer.changePeriod(period);
    mFakeVsyncTimer.slack = period / 8;
}

void RFPSAgent::fakeVsync() {
    std::lock_guard lock(mMutex);
    mPollTime = systemTime(SYSTEM_TIME_MONOTONIC);
    fakeVsyncLocked();
}

void RFPSAgent::fakeVsyncLocked() {
    mPresentNow = true;
    // Stays at 0 rather than counting down for ever, which would overflow in a long session.
    if (mResetVsyncClock > 0) mResetVsyncClock--;
    if (mResetVsyncClock > 0) return;
    // From the RESET_VSYNC_CLOCK-th fake vsync on, each one checks that the clock has not run more
    // than a period ahead of now, until it has to pull it back and the count starts again.
    const nsecs_t target = mPollTime + mFakeVsyncTimer.period;
    if (mFakeVsyncTimer.nextTime <= target) return;
    ILOG(2, "RFPSAgent::fakeVsync [%s] changeNext from %lu to %lu", mName.c_str(),
         mFakeVsyncTimer.nextTime, target);
    mFakeVsyncTimer.nextTime = target;
    mResetVsyncClock = RESET_VSYNC_CLOCK;
}

bool RFPSAgent::shouldPresentNow() {
    nsecs_t now;
    {
        std::lock_guard lock(mMutex);
        now = systemTime(SYSTEM_TIME_MONOTONIC);
        ILOG(2, "RFPSAgent::shouldPresentNow [%s] now %lu nextVsync %lu", mName.c_str(), now,
             mFakeVsyncTimer.nextTime);
        mPollTime = now;
        mFakeVsyncTimer.check(now);
        if (mPresentNow || mSkippedFrames > 0) return true;
    }
    EventDispatcher::broadcastEvent(mUid, Interpolation::ePresentationRefusedEvent, now, 0);
    return false;
}

void RFPSAgent::onPresentSuccess() {
    std::lock_guard lock(mMutex);
    if (!mPresentNow && mSkippedFrames >= 1) {
        mSkippedFrames--;
        ILOG(2,
             "RFPSAgent [%s] onPresentSuccessPresenting outside of RFPS intervals to make up for a "
             "skipped frame. Remaining chances: %d",
             mName.c_str(), mSkippedFrames);
    }
    mPresentNow = false;
}

void RFPSAgent::onPresentFail() {
    std::lock_guard lock(mMutex);
    if (mPresentNow && mSkippedFrames < mMaxSkippedFrames) {
        mSkippedFrames++;
        ILOG(2, "RFPSAgent [%s] Missed a frame, incrementing skipped frame count to %d",
             mName.c_str(), mSkippedFrames);
    }
    mPresentNow = false;
}

void RFPSAgent::onSettingsChanged(const Settings& s) {
    std::lock_guard lock(mMutex);
    mRFPSOffset = s.rfpsOffset;
    ILOG(2, "InterpolationController: RFPS Offset %d", mRFPSOffset);
    // Only a smoothness of 1 or more is taken, as the largest that still moves.
    if (s.rfpsSmoothness >= 1.0f) mSmoothness = 0.99999f;
    ILOG(2, "InterpolationController: RFPS Smoothness %f", static_cast<double>(mSmoothness));
    mMaximumRFPS = s.rfpsMaximum;
    ILOG(2, "InterpolationController: RFPS Maximum %d", mMaximumRFPS);
    mMinimumRFPS = s.rfpsMinimum;
    ILOG(2, "InterpolationController: RFPS Minimum %d", mMinimumRFPS);
    mMaxSkippedFrames = s.rfpsMaxSkippedFrames;
    ILOG(2, "InterpolationController: RFPS Max Skipped Frames %d", mMaxSkippedFrames);
    if (mRFPSOffset < 0) {
        setRFPSLocked(s.rfps);
        ILOG(2, "InterpolationController: RFPS %d", s.rfps);
    }
}

}  // namespace android
