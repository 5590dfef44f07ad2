#include "Delayer.h"

#include <cmath>
#include <limits>

#include "Log.h"
#include "Tunables.h"

namespace android {

using Interpolation::EventDispatcher;
using Interpolation::EventType;
using Interpolation::Settings;

namespace {

constexpr nsecs_t NS_PER_MS = 1'000'000;
constexpr nsecs_t NS_PER_S = 1'000'000'000;
// Announcements a single locked section makes: one per tick or settings change. More only grow
// the vectors.
constexpr size_t ANNOUNCEMENT_CAPACITY = 4;

// Float results land in int64 without undefined behaviour: NaN becomes 0, out-of-range values
// the nearest bound.
nsecs_t toNs(double value) {
    constexpr double LIMIT = 9.2e18;  // just inside the int64 range
    if (std::isnan(value)) return 0;
    if (value >= LIMIT) return static_cast<nsecs_t>(LIMIT);
    if (value <= -LIMIT) return static_cast<nsecs_t>(-LIMIT);
    return static_cast<nsecs_t>(value);
}

// Bounded to a quarter of the int64 range, so that due-time arithmetic on it cannot overflow.
nsecs_t secondsToNs(float seconds) {
    constexpr double LIMIT = static_cast<double>(std::numeric_limits<nsecs_t>::max() / 4);
    const double ns = static_cast<double>(seconds) * 1e9;
    if (std::isnan(ns)) return 0;
    return static_cast<nsecs_t>(std::fmax(-LIMIT, std::fmin(LIMIT, ns)));
}

nsecs_t saturatingAdd(nsecs_t a, nsecs_t b) {
    nsecs_t sum;
    if (!__builtin_add_overflow(a, b, &sum)) return sum;
    return b > 0 ? std::numeric_limits<nsecs_t>::max() : std::numeric_limits<nsecs_t>::min();
}

}  // namespace

Delayer::Delayer(const unsigned int& uid, String8 name)
    : mUid(uid),
      mName(std::move(name)),
      mDelay(nsecs_t{Interpolation::defaultDelay.load()} * NS_PER_MS),
      mDelayChangeRateMs(Interpolation::defaultSettings.delayChangeRateMs),
      mHitTarget(Interpolation::defaultSettings.hitTarget),
      mHitThreshold(Interpolation::defaultSettings.hitThreshold) {
    mPendingAnnouncements.reserve(ANNOUNCEMENT_CAPACITY);
    mAnnouncing.reserve(ANNOUNCEMENT_CAPACITY);
}

void Delayer::onFirstRef() {
    Interpolation::SettingsController::Observer::onFirstRef();
    {
        std::lock_guard lock(mMutex);
        armUpdateTimerLocked(secondsToNs(Interpolation::defaultSettings.delayUpdatePeriodSec),
                             systemTime(SYSTEM_TIME_MONOTONIC), /*once=*/true);
    }
    EventDispatcher::subscribe(mUid, EVENT_FLAGS, this);
}

void Delayer::onLastStrongRef(const void* id) {
    Interpolation::SettingsController::Observer::onLastStrongRef(id);
    EventDispatcher::unsubscribe(mUid, EVENT_FLAGS, this);
}

void Delayer::armUpdateTimerLocked(nsecs_t period, nsecs_t now, bool once) {
    mTimer.arm(
            period, now, [this] { updateFrameDelayTickLocked(); }, once);
}

void Delayer::countFrameLocked(bool hit) {
    if (mFramesToIgnore >= 1) {
        mFramesToIgnore--;
        return;
    }
    // A layer whose frames never arrive acquired never ticks; its count stops rather than wraps.
    if (mProcessedFrames < std::numeric_limits<int32_t>::max()) {
        mProcessedFrames++;
        if (hit) mHitFrames++;
    }
    // The frames right after a miss would be judged by the same disturbance.
    if (!hit) mFramesToIgnore = IGNORE_AFTER_MISS;
}

void Delayer::processFrame(const FrameType& type) {
    std::lock_guard lock(mMutex);
    countFrameLocked(type == eHit);
}

void Delayer::onEvent(const EventType& type, const nsecs_t& /*time*/,
                      const Interpolation::EventData& /*data*/) {
    switch (type) {
        case Interpolation::eBlendedCompositionEvent: {
            std::lock_guard lock(mMutex);
            countFrameLocked(true);
            break;
        }
        case Interpolation::eRepeatedCompositionEvent:
        case Interpolation::eNewFrameCompositionEvent: {
            std::lock_guard lock(mMutex);
            countFrameLocked(false);
            break;
        }
        default:
            ILOG(1, "Delayer::onEvent EventType %u not handled", static_cast<uint32_t>(type));
            break;
    }
}

void Delayer::onSettingsChanged(const Settings& s) {
    {
        std::lock_guard lock(mMutex);
        if (mAutoDelay) {
            if (s.gameFpsLimit != 0 && s.gameFpsLimit != mLastGameFps) {
                const nsecs_t newPeriod = NS_PER_S / s.gameFpsLimit;
                nsecs_t newDelay;
                if (mLastGameFps != -1) {
                    const nsecs_t oldPeriod = mLastGameFps == 0 ? 0 : NS_PER_S / mLastGameFps;
                    newDelay = estimateNewDelayLocked(oldPeriod, newPeriod);
                } else {
                    newDelay = getExpectedDelay(newPeriod);
                    ILOG(2, "Cold start auto-delay: %lu", newDelay);
                }
                setDelayNsLocked(newDelay / NS_PER_MS * NS_PER_MS);
                mLastGameFps = s.gameFpsLimit;
            }
        } else if (s.delayMs != mDelay / NS_PER_MS) {
            setDelayNsLocked(nsecs_t{s.delayMs} * NS_PER_MS);
            ILOG(2, "Delayer: Delay %dms", s.delayMs);
        }

        const nsecs_t period = secondsToNs(s.delayUpdatePeriodSec);
        const nsecs_t now = systemTime(SYSTEM_TIME_MONOTONIC);
        if (!mAutoDelay && s.smartDelay) {
            armUpdateTimerLocked(period, now, mTimer.fireOnce);
        } else {
            // The next re-estimation keeps its place relative to the new period.
            mTimer.nextTime = saturatingAdd(mTimer.nextTime, period - mTimer.period);
            mTimer.period = period;
        }
        ILOG(2, "Delayer: Delay calculated every %fs", static_cast<double>(period) / 1e9);
        mAutoDelay = s.smartDelay;
        ILOG(2, "Delayer: AutoDelay enabled %s", mAutoDelay ? "yes" : "no");
        mHitTarget = s.hitTarget;
        ILOG(2, "Delayer: Hit target %f", mHitTarget);
        mHitThreshold = s.hitThreshold;
        ILOG(2, "Delayer: Hit Threshold %f", mHitThreshold);
        mDelayChangeRateMs = s.delayChangeRateMs;
        ILOG(2, "Delayer: Delay change rate %dms", mDelayChangeRateMs);
        if (!mAutoDelay)
            mTimer.arm(
                    period, now, [] {}, mTimer.fireOnce);
    }
    // Under the controller's mutex, which comes before the bus's.
    announceDelayChanges();
}

nsecs_t Delayer::getExpectedDelay(const nsecs_t& framePeriod) const {
    return static_cast<nsecs_t>(static_cast<float>(framePeriod) * EXPECTED_GRADIENT) +
           EXPECTED_INTERCEPT;
}

nsecs_t Delayer::estimateNewDelayLocked(nsecs_t oldPeriod, nsecs_t newPeriod) {
    const float ratio = static_cast<float>(getExpectedDelay(newPeriod)) /
                        static_cast<float>(getExpectedDelay(oldPeriod));
    return toNs(static_cast<float>(mDelay) * ratio);
}

void Delayer::setDelayNsLocked(const nsecs_t& delay) {
    if (mAutoDelay && delay > MAX_DELAY_MS * NS_PER_MS) {
        ILOG(1, "Trying to set delay too high (%lums), clamping to %ums", delay / NS_PER_MS,
             MAX_DELAY_MS);
        mDelay = MAX_DELAY_MS * NS_PER_MS;
    } else {
        mDelay = delay / NS_PER_MS * NS_PER_MS;
        if (mAutoDelay && delay < MIN_DELAY_MS * NS_PER_MS) {
            ILOG(1, "Trying to set delay too low (%lums), clamping to %ums", delay / NS_PER_MS,
                 MIN_DELAY_MS);
            mDelay = MIN_DELAY_MS * NS_PER_MS;
        }
    }
    mPendingAnnouncements.push_back({systemTime(SYSTEM_TIME_MONOTONIC), mDelay});
}

void Delayer::setDelayNs(const nsecs_t& delay) {
    {
        std::lock_guard lock(mMutex);
        setDelayNsLocked(delay);
    }
    announceDelayChanges();
}

nsecs_t Delayer::getDelay() const {
    std::lock_guard lock(mMutex);
    return mDelay;
}

void Delayer::updateFrameDelayTick() {
    {
        std::lock_guard lock(mMutex);
        updateFrameDelayTickLocked();
    }
    announceDelayChanges();
}

void Delayer::updateFrameDelayTickLocked() {
    if (mProcessedFrames == 0) {
        ILOG(1, "Attempting to update the frame delay with %d processed frames.", mProcessedFrames);
        return;
    }
    const float rate = static_cast<float>(mHitFrames) / static_cast<float>(mProcessedFrames);
    const auto delayMs = static_cast<int32_t>(mDelay / NS_PER_MS);
    // The first move in a direction, and every reversal, takes half a step; only consecutive
    // moves the same way take the full one, so the delay settles instead of oscillating.
    if (rate < mHitTarget - mHitThreshold) {
        if (delayMs < MAX_DELAY_MS) {
            const int32_t step = mLastStepMs <= 0 ? mDelayChangeRateMs / 2 : mDelayChangeRateMs;
            const nsecs_t newDelayMs = nsecs_t{delayMs} + step;
            ILOG(1, "Interpolation rate too low (%f), increasing delay by %dms to %dms", rate, step,
                 static_cast<int32_t>(newDelayMs));
            setDelayNsLocked(newDelayMs * NS_PER_MS);
            mLastStepMs = step;
        } else {
            ILOG(1, "Interpolation rate too low (%f), but delay is already at max (%dms)!", rate,
                 delayMs);
        }
    } else if (rate > mHitTarget + mHitThreshold) {
        if (delayMs > MIN_DELAY_MS) {
            const int32_t step = mLastStepMs < 0 ? mDelayChangeRateMs : mDelayChangeRateMs / 2;
            const nsecs_t newDelayMs = nsecs_t{delayMs} - step;
            ILOG(2, "Interpolation rate is high (%f), decreasing delay by %dms to %dms", rate, step,
                 static_cast<int32_t>(newDelayMs));
            setDelayNsLocked(newDelayMs * NS_PER_MS);
            mLastStepMs = static_cast<int32_t>(-nsecs_t{step});
        } else {
            ILOG(1, "Interpolation rate too high (%f), but delay is already at min (%dms)!", rate,
                 delayMs);
        }
    } else {
        ILOG(2, "Interpolation rate is on target (%f), keeping delay at %ums", rate, delayMs);
        mLastStepMs = 0;
        setDelayNsLocked(nsecs_t{delayMs} * NS_PER_MS);
    }
    mProcessedFrames = 0;
    mHitFrames = 0;
}

void Delayer::pollUpdateTimer() {
    bool announce;
    {
        std::lock_guard lock(mMutex);
        mTimer.check();
        announce = !mPendingAnnouncements.empty();
    }
    if (announce) announceDelayChanges();
}

void Delayer::announceDelayChanges() {
    std::lock_guard announceLock(mAnnounceMutex);
    {
        std::lock_guard lock(mMutex);
        if (mPendingAnnouncements.empty()) return;
        mAnnouncing.swap(mPendingAnnouncements);
    }
    for (const DelayAnnouncement& announcement : mAnnouncing) {
        EventDispatcher::broadcastEvent(mUid, Interpolation::eDelayChangedEvent, announcement.time,
                                        announcement.delay);
    }
    mAnnouncing.clear();
}

void Delayer::dumpState(String8& out, const char* prefix) {
    std::lock_guard lock(mMutex);
    out.appendFormat("%sDelay=%dms\n", prefix, static_cast<int>(mDelay / NS_PER_MS));
}

}  // namespace android
