#include "Settings.h"

namespace android::Interpolation {

const Settings defaultSettings;

namespace {

const char* toString(bool value) {
    return value ? "true" : "false";
}

}  // namespace

String8 Settings::dump() const {
    // The render-FPS offset reads as enabled from 0 here but only from 1 in the JSON policy; the
    // service's tools expect both.
    return String8::format(
            "{ %d, %d, %s, %f, %f, %d, %f, %d, %s, %s, %d, %f, %s, %s, %d, %d, %d, %d, %d, %d, %d, "
            "%s, (AF), %u, %f, %d, %f, %d, %d }",
            gameFpsLimit, delayMs, toString(smartDelay), delayUpdatePeriodSec, hitTarget,
            delayChangeRateMs, hitThreshold, static_cast<int>(mode), toString(writeToFrametracker),
            toString(rfpsOffset >= 0), rfpsOffset, rfpsSmoothness, toString(spareFlag),
            toString(gfpsOffsetEnabled), gfpsOffset, gfpsMinimum, gfpsMaximum, rfpsMinimum,
            rfpsMaximum, rfps, rfpsMaxSkippedFrames, toString(detectRefreshRate),
            justInTimeMarginMs, minimumRegalStability, maxConsecutiveGlCompositions,
            maxPercentGlCompositions, minAcceptableFps, maxAcceptableFps);
}

}  // namespace android::Interpolation
