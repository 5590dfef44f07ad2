#pragma once

#include <utils/String8.h>

#include <cstdint>

#include "FrameItem.h"
#include "Function.h"

namespace android::Interpolation {

// One game's settings, as the controlling service sends them. The comment on each field is its
// parameter id in the settings parcel. A default-constructed Settings holds the defaults.
struct Settings {
    int32_t gameFpsLimit = 0;              // 0; interpolation is on from 1 upwards
    int32_t delayMs = 64;                  // 1
    bool smartDelay = true;                // 2
    float delayUpdatePeriodSec = 5.0f;     // 3
    float hitTarget = 0.991f;              // 4
    int32_t delayChangeRateMs = 2;         // 5
    float hitThreshold = 0.008f;           // 6
    InterpolationMode mode = eRetimeMode;  // 7
    bool writeToFrametracker = true;       // 8
    int32_t rfpsOffset = -1;               // 9; negative: a fixed render rate of `rfps`
    float rfpsSmoothness = 0.8f;           // 10
    bool spareFlag = false;                // 11
    bool gfpsOffsetEnabled = false;        // 12
    int32_t gfpsOffset = 5;                // 13
    int32_t gfpsMinimum = 15;              // 14
    int32_t gfpsMaximum = 120;             // 15
    int32_t rfpsMinimum = 15;              // 16
    int32_t rfpsMaximum = 120;             // 17
    int32_t rfps = 120;                    // 18
    int32_t rfpsMaxSkippedFrames = 5;      // 19
    bool detectRefreshRate = true;         // 20
    Function alphaFunction{{0.0f, 0.0f, 0.2f, 0.0f, 0.8f, 1.0f, 1.0f, 1.0f}, true};  // 21
    uint32_t justInTimeMarginMs = 0;                                                 // 22
    float minimumRegalStability = 0.9f;                                              // 23
    int32_t maxConsecutiveGlCompositions = 600;                                      // 24
    float maxPercentGlCompositions = 1.0f;                                           // 25
    int32_t minAcceptableFps = 0;                                                    // 26
    int32_t maxAcceptableFps = -1;                                                   // 27

    // Every field but the alpha function, on one line.
    String8 dump() const;
};

// What a uid gets before the controlling service sends anything, and again after a watchdog
// switches the game off.
extern const Settings defaultSettings;

}  // namespace android::Interpolation
