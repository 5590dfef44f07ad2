#include "ClientCompositionWatchdog.h"

#include "CurrentSettings.h"
#include "Log.h"

namespace android::Interpolation {

ClientCompositionWatchdog::ClientCompositionWatchdog(unsigned int uid, String8 name)
    : mUid(uid),
      mName(std::move(name)),
      mMaxConsecutive(defaultSettings.maxConsecutiveGlCompositions),
      mMaxPercent(defaultSettings.maxPercentGlCompositions),
      mShare(SHARE_SAMPLES) {}

void ClientCompositionWatchdog::onFirstRef() {
    SettingsController::Observer::onFirstRef();
    applyCurrentSettings(*this);
    mStartTimer.arm(
            START_DELAY, systemTime(SYSTEM_TIME_MONOTONIC), [this] { mEnabled = true; },
            /*once=*/true);
}

void ClientCompositionWatchdog::onSettingsChanged(const Settings& s) {
    mMaxConsecutive.store(s.maxConsecutiveGlCompositions);
    mMaxPercent.store(s.maxPercentGlCompositions);
}

void ClientCompositionWatchdog::onClientComposition() {
    mClientComposed = true;
}

void ClientCompositionWatchdog::onPostComposition() {
    if (mEnabled && !mSuspended) {
        if (mClientComposed) {
            mShare.update(1);
            mConsecutive++;
        } else {
            mShare.update(0);
            mConsecutive = 0;
        }
        ILOG(2,
             "ClientCompositionWatchdog::onPostComposition [%s] %f%% client composed frames (%d "
             "in a row)",
             mName.c_str(), mShare.mean() * 100, mConsecutive);
        makeDecision();
    }
    mClientComposed = false;
    mStartTimer.check();
}

void ClientCompositionWatchdog::suspend() {
    ILOG(2, "ClientCompositionWatchdog::suspend [%s] ", mName.c_str());
    mSuspended = true;
}

void ClientCompositionWatchdog::resume() {
    ILOG(2, "ClientCompositionWatchdog::resume [%s] ", mName.c_str());
    mSuspended = false;
}

void ClientCompositionWatchdog::makeDecision() {
    const double share = mShare.mean();
    const float maxPercent = mMaxPercent.load();
    const int32_t maxConsecutive = mMaxConsecutive.load();
    if (share > maxPercent) {
        ILOG(1,
             "ClientCompositionWatchdog::makeDecision [%s] too many client frames (%f%% > %f%%), "
             "stopping interpolation",
             mName.c_str(), share * 100, static_cast<double>(maxPercent * 100.0f));
    } else if (mConsecutive >= maxConsecutive) {
        ILOG(1,
             "ClientCompositionWatchdog::makeDecision [%s] too many client frames (%d >= %d in a "
             "row), stopping interpolation",
             mName.c_str(), mConsecutive, maxConsecutive);
    }
}

}  // namespace android::Interpolation
